// Memory runs out in the built libraries and in plug-ins, at each place where it can.

#include "Allocations.hpp"
#include "Calls.hpp"
#include "Driver.hpp"

#include <filesystem>
#include <unistd.h>

#include <algorithm>
#include <functional>
#include <string_view>

using namespace driver;
using allocations::Failing;

namespace
{

const std::string probe = TEST_PLUGINS "/probe.so";
const std::string pickyFilter = TEST_PLUGINS "/pickyFilter.so";

/// Whether an error is one of those that come of a failed allocation.
bool isOutOfMemory(const std::string& error)
{
    constexpr std::string_view errors[] = {
        "brenix:Channel:unexpectedException|std::bad_alloc",
        "brenix:Channel:couldNotLoadDevice|",
        "brenix:Channel:couldNotLoadConverter|",
        "brenix:Channel:couldNotCreateDevice|",
        "brenix:Channel:couldNotCreateConverter|",
        "brenix:Stream:couldNotLoadFilter|",
        "brenix:Stream:couldNotCreateFilter|",
        "brenix:InputStream:couldNotConvertInputData|",
        "brenix:OutputStream:couldNotConvertOutputData|",
        "brenix:Device:failed|std::bad_alloc",
        "brenix:Stream:filterFailed|std::bad_alloc",
    };
    return std::find(std::begin(errors), std::end(errors), error) != std::end(errors) ||
           error.rfind("brenix:Device:failed|The device ended and did not take ", 0) == 0 ||
           error.rfind("brenix:Stream:dataLost|", 0) == 0; // of a device that failed so
}

/// Like allocations::sweep(), of points that leave no memory behind.
template <typename Point>
void sweepWithoutLeak(const Point& point)
{
    allocations::sweep([&](long number, bool lasts) {
        const long before = allocations::live;
        const bool failed = point(number, lasts);
        EXPECT_EQ(allocations::live, before);
        return failed;
    });
}

/// What goes through a channel.
struct Program {
    const char* device;
    const char* converter;
    const char* filter; ///< with an option Factor; of the input stream, if there is one
    double limit;       ///< of the input stream
    int writes;         ///< numbers
    double reads;       ///< counts, twice
    const char* field;
    std::function<int(void* channel)> init;
};

/// A run of a program, step by step. A step that fails can be repeated. Needs no memory itself.
class Life
{
public:
    enum Step { Read = 5, ReadOn = 7, Close = 9, End = 11 };

    explicit Life(const Program& theProgram) : program(theProgram) {}
    Life(const Life&) = delete;
    Life& operator=(const Life&) = delete;
    ~Life() { coderChannelDestroy(channel); }

    /// Does steps up to the first that fails.
    int run(int first)
    {
        constexpr bool (Life::*steps[End])() = {
            &Life::create, &Life::init, &Life::addFilter, &Life::open,  &Life::write, &Life::read,
            &Life::copy,   &Life::read, &Life::copy,      &Life::close, &Life::term};
        while (first < End && (this->*steps[first])()) {
            ++first;
        }
        return first;
    }

    std::string error(int (*query)(void*, char*, char*) noexcept = coderChannelGetLastError)
    {
        if (channel != nullptr) {
            query(channel, id, message);
        }
        return id + "|"s + message;
    }

    double sum = 0; ///< of the values read

private:
    void* input() const { return coderChannelGetInputStream(channel); }
    void* output() const { return coderChannelGetOutputStream(channel); }

    bool create()
    {
        channel = coderChannelCreate(program.device, program.converter, id, message, program.limit,
                                     infinity);
        return channel != nullptr;
    }
    bool init() { return program.init(channel) == 1; }
    bool addFilter()
    {
        return program.filter == nullptr ||
               withOptions({{"Factor", 2}}, coderStreamAddFilter,
                           program.reads > 0 ? input() : output(), program.filter) == 1;
    }
    bool open() { return coderChannelOpen(channel, 0) == 1; }
    bool write()
    {
        return program.writes == 0 ||
               coderOutputStreamWriteTypedDataOld(output(), &written, 1, "double",
                                                  CODER_BUFFER(program.writes, numbers)) == 1;
    }
    bool close() { return coderChannelClose(channel) == 1; }
    bool term() { return coderChannelTerm(channel) == 1; }

    /// Waits for the counts and reads them; false when they will not come.
    bool read()
    {
        const auto end = std::chrono::steady_clock::now() + std::chrono::seconds(10);
        double available = 0;
        uint8_t failed = 0;
        while (available < program.reads) {
            if (failed == 1 || std::chrono::steady_clock::now() > end) {
                return false;
            }
            coderChannelHasAsyncError(channel, &failed); // before the last look at the data
            coderStreamGetDataAvailable(input(), &available);
            std::this_thread::sleep_for(std::chrono::microseconds(50));
        }
        double total = 0;
        double counts[8];
        buffers = program.reads > 0 ? 8 : 0;
        return program.reads == 0 ||
               (coderInputStreamPeek(input(), &total, counts, &buffers, program.reads) == 1 &&
                coderInputStreamReadBuffers(input(), program.reads, buffers) == 1);
    }

    bool copy()
    {
        double all = 0;
        for (int32_t index = 1; index <= static_cast<int32_t>(buffers); ++index) {
            double values[8] = {};
            if (coderInputStreamReadBufferData(input(), index, 0, program.field, "double", 8,
                                               values) == 0) {
                return false;
            }
            all = std::accumulate(values, values + 8, all);
        }
        sum += all;
        return true;
    }

    static constexpr double numbers[] = {1, 2, 4, 8, 16, 32, 64, 128};
    const Program& program;
    void* channel = nullptr;
    double written = 0, buffers = 0;
    char id[CODER_ERROR_SIZE] = "", message[CODER_ERROR_SIZE] = "";
};

class SweepTest : public testing::Test
{
protected:
    allocations::PrintPoints print;

    const std::string file = testing::TempDir() + "sweep-" + std::to_string(getpid()) + ".wav";
    const std::string host = "127.1." + std::to_string(getpid() >> 8 & 255) + "." +
                             std::to_string(getpid() & 255); // of this process alone
    /// The devices, converters and filters.
    const std::vector<Program> programs = {
        {probe.c_str(), "identity", pickyFilter.c_str(), 4, 0, 4, "data",
         [](void* channel) {
             return init(channel, {{"Packets", "7 1"}});
         }},
        {probe.c_str(), "identity", nullptr, infinity, 0, 4, "data",
         [](void* channel) {
             return init(channel, {{"Packets", "3 5"}});
         }},
        {"loopback", "identity", "decimate", infinity, 8, 2, "data",
         [](void* channel) { return init(channel, {}); }},
        {"signal", "columns", nullptr, infinity, 0, 4, "Data1",
         [](void* channel) {
             return init(channel,
                         {{"Pace", "fast"}, {"BlockSize", 4}, {"Frames", 8}, {"Channels", 2}});
         }},
        {"audiofile", "identity", "decimate", infinity, 8, 0, "",
         [this](void* channel) {
             return init(channel,
                         {{"FileName", file}, {"Mode", "write"}, {"SampleFormat", "DOUBLE"}});
         }},
        {"audiofile", "columns", nullptr, infinity, 0, 2, "Data1",
         [this](void* channel) {
             return init(channel, {{"FileName", file}});
         }},
        {"udp", "identity", nullptr, infinity, 8, 4, "data",
         [this](void* channel) {
             return init(channel, {{"Host", host},
                                   {"LocalHost", host},
                                   {"Port", 27110},
                                   {"LocalPort", 27110},
                                   {"ElementType", "double"}});
         }},
    };

    static int init(void* channel, Options options)
    {
        return withOptions(options, coderChannelInit, channel);
    }
};

} // namespace

TEST_F(SweepTest, EveryCall)
{
    Calls calls{"Level", "Stamp", "scale", "Gain"};
    for (const Call& call : calls.rows) {
        const std::size_t handles = call.handles(nullptr, nullptr, nullptr).size();
        for (std::size_t i = 0; i < handles; ++i) {
            SCOPED_TRACE(std::to_string(&call - calls.rows.data()) + " " + call.operation);
            sweepWithoutLeak([&](long number, bool lasts) {
                Channel channel(probe);
                channel.init({{"Streams", "io"}, {"Packets", "10 10"}});
                Channel::addFilter(channel.input, "scale");
                Channel::addFilter(channel.output, "scale");
                channel.open();
                Channel::waitUntil(
                    [&] { return channel.ask(coderStreamGetDataAvailable, channel.input) == 20; });
                EXPECT_EQ(channel.read(5, 1), range(0, 5));
                if (call.operation != "close") {
                    channel.close();
                }
                void* const handle = call.handles(channel.handle, channel.input, channel.output)[i];
                const double unwritten = 0x1.23456789p3;
                double answer = unwritten;
                calls.counts = unwritten;
                Failing failing(number, lasts);
                const bool result = call.run(handle, &answer);
                const bool failed = Failing::end();
                EXPECT_EQ(result, !failed);
                if (failed) {
                    EXPECT_TRUE(isOutOfMemory(channel.error())) << channel.error();
                    EXPECT_EQ(answer, call.resets() ? 0 : unwritten);
                    EXPECT_EQ(calls.counts, unwritten);
                    EXPECT_EQ(calls.buffers, 1);
                    EXPECT_TRUE(call.run(handle, &answer)) << channel.error(); // the next call
                }
                if (call.target == Inputs && call.operation == "read") {
                    EXPECT_EQ(channel.read(14, 2), range(6, 20)); // nothing is lost
                }
                const Failing all(1); // no end needs memory
                coderInputStreamFreeBuffer(coderChannelGetInputStream(channel.handle), 1);
                coderInputStreamFreeBuffer(coderChannelGetInputStream(channel.handle), 9);
                channel.close();
                channel.term();
                coderChannelDestroy(std::exchange(channel.handle, nullptr));
                return failed;
            });
        }
    }
}

TEST_F(SweepTest, PathsWithoutMemory)
{
    const std::string path = std::filesystem::current_path();
    sweepWithoutLeak([&](long number, bool lasts) {
        char absolute[CODER_PATH_SIZE] = "unwritten";
        Failing failing(number, lasts);
        coderComputeAbsolutePath(path.c_str(), absolute);
        const bool failed = Failing::end();
        EXPECT_EQ(absolute, failed ? "" : path);
        return failed;
    });
}

TEST_F(SweepTest, EveryPlugInOnEitherThread)
{
    for (const Program& program : programs) {
        SCOPED_TRACE(program.device);
        Life undisturbed(program);
        ASSERT_EQ(undisturbed.run(0), Life::End) << undisturbed.error();
        sweepWithoutLeak([&](long number, bool lasts) {
            Life run(program);
            Failing failing(number, lasts);
            int step = run.run(0);
            const bool failed = Failing::end();
            if (step < Life::End) {
                const std::string error = run.error();
                EXPECT_TRUE(failed && isOutOfMemory(error)) << step << error;
                if ((step == Life::Read || step == Life::ReadOn) &&
                    program.converter != std::string_view("identity")) {
                    EXPECT_EQ(run.run(Life::Close), Life::End) << run.error();
                    return failed; // for a converter that fails loses its packet
                }
                step = run.run(step); // the next call works, and nothing is lost
            }
            EXPECT_EQ(step, Life::End) << run.error();
            EXPECT_EQ(run.sum, undisturbed.sum);
            return failed;
        });
        sweepWithoutLeak([&](long number, bool lasts) {
            Life run(program);
            Failing failing(number, lasts, true);
            const int step = run.run(0);
            const int end = step < Life::End ? run.run(Life::Close) : step;
            const bool failed = Failing::end();
            EXPECT_EQ(end, Life::End) << run.error();
            const std::string error = run.error(coderChannelGetLastAsyncError);
            EXPECT_EQ(error != "|", failed) << step;
            EXPECT_TRUE(!failed || isOutOfMemory(error)) << error;
            return failed;
        });
    }
    std::remove(file.c_str());
}

TEST_F(SweepTest, AnErrorOfAPlugInIsKept)
{
    sweepWithoutLeak([&](long number, bool lasts) {
        Channel channel(probe);
        channel.init({{"RaiseIn", "term"}});
        Failing failing(number, lasts);
        const int result = channel.term();
        const bool failed = Failing::end();
        EXPECT_EQ(result, 0);
        const std::string error = channel.error(); // without memory for the property, the same
        EXPECT_TRUE(error == "|" || (failed && isOutOfMemory(error))) << error;
        EXPECT_EQ(channel.error(coderChannelGetLastSyncError), "probe:raised|term");
        return failed;
    });
}
