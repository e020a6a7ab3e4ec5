// What the tests of the exported functions share: a core that they script, a channel on it, caller
// buffers that show every byte written, and property objects that count their releases.
#ifndef BRENIXCODER_TESTS_SCRIPTED_CHANNELFIXTURE_HPP
#define BRENIXCODER_TESTS_SCRIPTED_CHANNELFIXTURE_HPP

#include "Allocations.hpp"
#include "brenixcoder/coder.h"
#include "brenixcore/Channel.hpp"

#include <gtest/gtest.h>

#include <atomic>
#include <climits>
#include <cmath>
#include <functional>
#include <thread>

namespace scripted
{

using namespace std::string_literals;
using brenixplugin::PropertyMap;
using brenixplugin::interfaces::IPropertyInfo;
using Log = std::vector<std::string>;
using brenixplugin::kit::coderconverter::TPointerProperty;
using brenixplugin::kit::device::TScalarProperty;
using brenixplugin::kit::device::TVectorProperty;

/// The core keeps a log of every call as text, runs the hook that a test set for the operation,
/// which may throw or raise events, and answers with what the test put here.
struct Core {
    Log log;
    std::map<std::string, std::function<void()>, std::less<>> on; ///< hooks by operation
    bool hasStreams = true, unlimited = false;
    bool flag = false;                 ///< what isOpen() and isDeviceDone() answer
    unsigned long number = 0;          ///< what the other queries and write() answer
    std::vector<unsigned long> counts; ///< what peekCounts() lists
    std::vector<void*> delivery;       ///< what read() hands over
    brenixcore::Channel::IEventHandler* handler = nullptr;
    PropertyMap* properties = nullptr;                  ///< the store; for hooks of init
    brenixplugin::OwnedDataBuffer options;              ///< those of the last call
    std::vector<brenixplugin::OwnedDataBuffer> written; ///< the buffers of the last write
    std::unique_ptr<brenixcore::InputStream> input;
    std::unique_ptr<brenixcore::OutputStream> output;
};

inline Core core;

/// Logs "what(argument)".
inline void log(const std::string_view what, const std::string& argument = "")
{
    const allocations::Allowed allowed;
    core.log.push_back(std::string(what) + '(' + argument + ')');
}

/// A caller's buffer between two zones that nobody may write to.
class Buffer
{
public:
    explicit Buffer(std::size_t size) : bytes(size + 2 * zone, fill) {}
    char* data() { return bytes.data() + zone; }
    operator char*() { return data(); }

    /// What was written: from the start to the last byte that changed, beyond the end if need be.
    std::string written() const
    {
        const bool before = bytes.find_first_not_of(fill) < zone;
        const std::size_t end = bytes.find_last_not_of(fill) + 1;
        return before ? "zone before" : end == 0 ? "" : bytes.substr(zone, end - zone);
    }

    /// What was written, as a text that ends with the last byte that changed.
    std::string text() const
    {
        const std::string all = written();
        return all.ends_with('\0') ? all.substr(0, all.size() - 1) : all + " without NUL";
    }

private:
    static constexpr std::size_t zone = 64;
    static constexpr char fill = '\xA5';
    std::string bytes;
};

/// The bytes of a list of elements, as a buffer should hold them.
inline std::string bytesOf(const auto* data, std::size_t count)
{
    return {reinterpret_cast<const char*>(data), count * sizeof *data};
}

/// Property objects that were made and not yet released.
inline std::atomic<int> liveProperties = 0;

/// A property object of a test, whose release is counted and logged.
template <typename Base>
struct Counted : Base {
    using Base::Base;
    void destroy() override { log("destroy", this->name), --liveProperties, Base::destroy(); }
    const int number = ++liveProperties;
};

inline IPropertyInfo* scalar(const std::string& name, auto value)
{
    return new Counted<TScalarProperty<decltype(value)>>(name, value);
}

template <typename T>
IPropertyInfo* vectorOf(std::initializer_list<T> values)
{
    auto* const property = new Counted<TVectorProperty<T>>("p", values.size());
    property->values.assign(values);
    return property;
}

template <typename T>
IPropertyInfo* arrayOf(std::initializer_list<T> values)
{
    T* const elements = values.size() > 0 ? new T[values.size()] : nullptr;
    std::copy(values.begin(), values.end(), elements);
    return new Counted<TPointerProperty<T>>("p", elements, values.size());
}

/// The property of a map, which has to be of that class and name.
template <typename Property>
const Property& as(const PropertyMap& map, const std::string& name)
{
    const auto& property = dynamic_cast<Property&>(*brenixplugin::asProperty(map.at(name)));
    EXPECT_EQ(property.name, name);
    return property;
}

inline void* dataBuffer(const std::vector<IPropertyInfo*>& fields)
{
    auto* const buffer = new PropertyMap;
    for (IPropertyInfo* field : fields) {
        buffer->emplace(field == nullptr ? "null" : field->getName(), field);
    }
    return buffer;
}

/// Raises an event on the calling thread.
inline void raiseEvent(const std::string& name, const std::string& id, const std::string& message)
{
    struct Event : brenixcore::CustomEvent {
        const char* getEventName() override { return texts[0].c_str(); }
        const char* getIdentifier() override { return texts[1].c_str(); }
        const char* getMessage() override { return log("getMessage"), texts[2].c_str(); }
        void onAccepted() override { log("accept"); }
        Log texts;
    } event;
    {
        const allocations::Allowed allowed;
        event.texts = {name, id, message};
    }
    core.handler->onCustomEvent(event);
}

/// "identifier|message" of one of the three error records.
inline std::string record(void* channel, int (*query)(void*, char*, char*) noexcept)
{
    Buffer id(CODER_ERROR_SIZE);
    Buffer message(CODER_ERROR_SIZE);
    EXPECT_EQ(query(channel, id, message), 1);
    return id.text() + "|" + message.text();
}

inline std::string notSupported(bool isInput)
{
    return isInput ? "brenix:InputStream:notSupported|" : "brenix:OutputStream:notSupported|";
}

inline const auto unexpected = "brenix:Channel:unexpectedException|"s; // NOLINT(cert-err58-cpp)

/// Starts with a channel that is created, not initialised.
class ChannelTest : public testing::Test
{
protected:
    ChannelTest()
    {
        core = {};
        channel = create();
        EXPECT_EQ(id.written() + message.written(), "");
        takeLog();
    }

    ~ChannelTest() override
    {
        coderChannelDestroy(channel);
        EXPECT_EQ(liveProperties, 0);
    }

    void* create(double in = 1, double out = 2, const char* device = "d",
                 const char* converter = "c")
    {
        id = message = Buffer(CODER_ERROR_SIZE);
        return coderChannelCreate(device, converter, id, message, in, out);
    }

    static Log takeLog() { return std::exchange(core.log, {}); }

    /// Initialises the channel, with a property "p" of the device.
    void init(IPropertyInfo* property = nullptr)
    {
        core.on["init"] = [&] {
            storeProperty(*core.properties, "p", brenixplugin::OwnedProperty(property));
        };
        EXPECT_EQ(coderChannelInit(channel, 0), 1);
        core.on.clear();
        input = coderChannelGetInputStream(channel);
        output = coderChannelGetOutputStream(channel);
        takeLog();
    }

    /// "identifier|message" of the two buffers of create().
    std::string error() const { return id.text() + "|" + message.text(); }
    std::string lastError() const { return record(channel, coderChannelGetLastError); }
    std::string syncError() const { return record(channel, coderChannelGetLastSyncError); }
    std::string asyncError() const { return record(channel, coderChannelGetLastAsyncError); }

    /// The message of the last error, which is an unexpected exception.
    std::string unexpectedError() const { return lastError().substr(unexpected.size()); }

    void *channel = nullptr, *input = nullptr, *output = nullptr;
    Buffer id{CODER_ERROR_SIZE}, message{CODER_ERROR_SIZE};
};

} // namespace scripted

#endif
