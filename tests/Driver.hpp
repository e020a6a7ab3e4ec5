// A channel of the built library, driven as generated code would.
#ifndef BRENIXCODER_TESTS_DRIVER_HPP
#define BRENIXCODER_TESTS_DRIVER_HPP

#include "brenixcoder/coder.h"

#include <gtest/gtest.h>

#include <chrono>
#include <cstdint>
#include <initializer_list>
#include <limits>
#include <numeric>
#include <string>
#include <string_view>
#include <thread>
#include <variant>
#include <vector>

namespace driver
{

using namespace std::string_literals;
using Numbers = std::vector<double>;

constexpr double infinity = std::numeric_limits<double>::infinity();
inline const std::string unexpected = "brenix:Channel:unexpectedException|";

inline std::string create(void*& channel, const std::string& device, const std::string& converter,
                          double inputLimit = infinity, double outputLimit = infinity)
{
    char id[CODER_ERROR_SIZE] = "";
    char message[CODER_ERROR_SIZE] = "";
    channel =
        coderChannelCreate(device.c_str(), converter.c_str(), id, message, inputLimit, outputLimit);
    return id + "|"s + message;
}

/// An option whose value is a text or a number. Needs no memory.
struct Option {
    const char* name;
    std::variant<std::string_view, double, int, std::int64_t> value;

    const char* type() const
    {
        constexpr const char* types[] = {"char", "double", "int32", "int64"};
        return types[value.index()];
    }
    std::size_t count() const { return value.index() == 0 ? std::get<0>(value).size() : 1; }
    const void* data() const
    {
        const auto* const text = std::get_if<0>(&value);
        const auto address = [](const auto& number) { return static_cast<const void*>(&number); };
        return text != nullptr ? text->data() : std::visit(address, value);
    }
};
using Options = std::initializer_list<Option>;

/// Calls a function that ends with an option list, of up to seven. It does not look at further ones.
template <typename Function, typename... Arguments>
int withOptions(Options options, Function function, Arguments... arguments)
{
    const Option none{"", 0};
    const auto at = [&](std::size_t i) { return i < options.size() ? options.begin() + i : &none; };
#define OPTION(i) CODER_OPTION(at(i)->name, at(i)->type(), at(i)->count(), at(i)->data())
    return function(arguments..., options.size(), OPTION(0), OPTION(1), OPTION(2), OPTION(3),
                    OPTION(4), OPTION(5), OPTION(6));
}

/// A channel, driven as generated code would.
class Channel
{
public:
    explicit Channel(const std::string& device, double inputLimit = infinity,
                     double outputLimit = infinity, const std::string& converter = "identity")
    {
        EXPECT_EQ(create(handle, device, converter, inputLimit, outputLimit), "|");
    }
    Channel(const Channel&) = delete;
    Channel& operator=(const Channel&) = delete;
    ~Channel() { coderChannelDestroy(handle); }

    int init(Options options = {})
    {
        const int result = withOptions(options, coderChannelInit, handle);
        if (result == 1) {
            input = coderChannelGetInputStream(handle);
            output = coderChannelGetOutputStream(handle);
        }
        return result;
    }

    int open(double timeout = 10) const
    {
        return withOptions({{"Timeout", timeout}}, coderChannelOpen, handle);
    }
    /// Initialises and opens.
    void start(Options options = {}, double timeout = 10)
    {
        ASSERT_EQ(init(options), 1) << error();
        ASSERT_EQ(open(timeout), 1) << error();
    }
    int execute(const char* command, Options options = {}) const
    {
        return withOptions(options, coderChannelExecute, handle, command);
    }
    int close() const { return coderChannelClose(handle); }
    int term() const { return coderChannelTerm(handle); }

    static int addFilter(void* stream, const std::string& filter, Options options = {})
    {
        return withOptions(options, coderStreamAddFilter, stream, filter.c_str());
    }
    static int tune(void* stream, Options options)
    {
        return withOptions(options, coderStreamTuneFilters, stream);
    }

    template <typename T>
    T property(const char* name, const char* type) const
    {
        T value{};
        EXPECT_EQ(coderChannelGetPropertyValue(handle, name, type, 1, &value), 1) << error();
        return value;
    }

    std::string error(int (*query)(void*, char*, char*) noexcept = coderChannelGetLastError) const
    {
        char id[CODER_ERROR_SIZE];
        char message[CODER_ERROR_SIZE];
        EXPECT_EQ(query(handle, id, message), 1);
        return id + "|"s + message;
    }

    /// The core's property: why the last operation failed.
    std::string reason() const
    {
        char text[CODER_ERROR_SIZE] = "";
        coderChannelGetPropertyValue(handle, "Reason", "char", sizeof text, text);
        return text;
    }

    /// Waits for the asynchronous error.
    std::string asyncError() const
    {
        uint8_t has = 0;
        waitUntil([&] { return coderChannelHasAsyncError(handle, &has) == 1 && has == 1; });
        return error(coderChannelGetLastAsyncError);
    }

    void waitForEnd() const
    {
        uint8_t done = 0;
        waitUntil([&] { return coderStreamIsDeviceDone(input, &done) == 1 && done == 1; });
    }

    template <typename Condition>
    static void waitUntil(Condition condition)
    {
        const auto end = std::chrono::steady_clock::now() + std::chrono::seconds(10);
        while (!condition()) {
            ASSERT_LT(std::chrono::steady_clock::now(), end) << "waited in vain";
            std::this_thread::sleep_for(std::chrono::milliseconds(1));
        }
    }

    Numbers peek(double limit = infinity) const
    {
        Numbers counts(16);
        double buffers = 16;
        double total = 0;
        EXPECT_EQ(coderInputStreamPeek(input, &total, counts.data(), &buffers, limit), 1);
        counts.resize(static_cast<std::size_t>(buffers));
        EXPECT_EQ(std::accumulate(counts.begin(), counts.end(), 0.0), total);
        return counts;
    }

    /// Reads counts that arrive in so many buffers; the values of all, or empty when it fails.
    Numbers read(double counts, double buffers, const char* field = "data") const
    {
        Numbers all;
        if (coderInputStreamReadBuffers(input, counts, buffers) == 1) {
            for (int32_t index = 1; index <= static_cast<int32_t>(buffers); ++index) {
                Numbers values(4096, std::numeric_limits<double>::quiet_NaN());
                EXPECT_EQ(coderInputStreamReadBufferData(input, index, 0, field, "double", 4096,
                                                         values.data()),
                          1)
                    << error();
                for (std::size_t i = 0; values[i] == values[i]; ++i) {
                    all.push_back(values[i]);
                }
            }
        }
        return all;
    }

    /// The error of a read or a write that has to fail.
    std::string readError(double counts, double buffers) const
    {
        EXPECT_EQ(coderInputStreamReadBuffers(input, counts, buffers), 0);
        return error();
    }
    std::string writeError(const Numbers& values) const
    {
        EXPECT_EQ(write(values), 0);
        return error();
    }

    /// Writes one buffer; the counts written.
    double write(const Numbers& values) const
    {
        double written = -1;
        const int result = coderOutputStreamWriteTypedDataOld(
            output, &written, 1, "double", CODER_BUFFER(values.size(), values.data()));
        EXPECT_EQ(result == 1, error() == "|");
        return written;
    }

    double ask(int (*query)(void*, double*) noexcept, void* stream) const
    {
        double answer = -1;
        EXPECT_EQ(query(stream, &answer), 1) << error();
        return answer;
    }

    void* handle = nullptr;
    void* input = nullptr;
    void* output = nullptr;
};

inline Numbers range(double first, double end)
{
    Numbers numbers(static_cast<std::size_t>(end - first));
    std::iota(numbers.begin(), numbers.end(), first);
    return numbers;
}

} // namespace driver

#endif
