// What the tests of the exported functions share: a channel on the scripted core, caller buffers
// that show every byte written, and property objects that count their releases.
#ifndef BRENIXCODER_TESTS_SCRIPTED_CHANNELFIXTURE_HPP
#define BRENIXCODER_TESTS_SCRIPTED_CHANNELFIXTURE_HPP

#include "brenixcoder/coder.h"
#include "scripted/ScriptedCore.hpp"

#include <gtest/gtest.h>

#include <atomic>
#include <initializer_list>
#include <string>
#include <thread>
#include <utility>
#include <vector>

namespace scripted
{

using namespace std::string_literals;
using namespace brenixplugin::kit;
using brenixplugin::interfaces::IPropertyInfo;
using Log = std::vector<std::string>;
using Names = std::pair<const char*, const char*>;

/// A caller's buffer between two zones that nobody may write to.
class Buffer
{
public:
    explicit Buffer(std::size_t size) : bytes(size + 2 * zone, fill) {}
    template <typename T>
    T* as()
    {
        return reinterpret_cast<T*>(bytes.data() + zone);
    }
    char* data() { return as<char>(); }

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
template <typename T>
std::string bytesOf(std::initializer_list<T> elements)
{
    return {reinterpret_cast<const char*>(elements.begin()), elements.size() * sizeof(T)};
}

/// Property objects that were made and not yet released.
inline std::atomic<int> liveProperties = 0;

/// A property object of a test, whose release is counted and logged.
template <typename Base>
struct Counted : Base {
    template <typename... Arguments>
    explicit Counted(Arguments&&... arguments) : Base(std::forward<Arguments>(arguments)...)
    {
        ++liveProperties;
    }
    void destroy() override
    {
        const AllocationsAllowed allowed;
        log("destroy(" + this->name + ")");
        --liveProperties;
        Base::destroy();
    }
};

template <typename T>
IPropertyInfo* scalar(const std::string& name, T value)
{
    return new Counted<device::TScalarProperty<T>>(name, value);
}

template <typename T>
IPropertyInfo* vectorOf(const std::string& name, std::initializer_list<T> values)
{
    auto* const property = new Counted<device::TVectorProperty<T>>(name, values.size());
    property->values.assign(values);
    return property;
}

template <typename T>
IPropertyInfo* arrayOf(const std::string& name, std::initializer_list<T> values)
{
    T* const elements = values.size() > 0 ? new T[values.size()] : nullptr;
    std::copy(values.begin(), values.end(), elements);
    return new Counted<coderconverter::TPointerProperty<T>>(name, elements, values.size());
}

inline void* dataBuffer(const std::vector<IPropertyInfo*>& fields)
{
    auto* const buffer = new brenixplugin::PropertyMap;
    for (IPropertyInfo* field : fields) {
        buffer->emplace(field == nullptr ? "null" : field->getName(), field);
    }
    return buffer;
}

struct Event : brenixcore::CustomEvent {
    const char* getEventName() override { return name.c_str(); }
    const char* getIdentifier() override { return identifier.c_str(); }
    const char* getMessage() override { return log("getMessage"), message.c_str(); }
    void onAccepted() override { log("accept"); }
    std::string name, identifier, message;
};

/// Raises an event on the calling thread.
inline void raiseEvent(const std::string& name, const std::string& identifier,
                       const std::string& message)
{
    Event event;
    event.name = name;
    event.identifier = identifier;
    event.message = message;
    core.handler->onCustomEvent(event);
}

inline const std::string unexpected = // NOLINT(cert-err58-cpp)
    "brenix:Channel:unexpectedException|";

/// Starts with a channel that is created, not initialised.
class ChannelTest : public testing::Test
{
protected:
    ChannelTest()
    {
        core = {};
        channel = coderChannelCreate("d", "c", id.data(), message.data(), 1, 2);
        EXPECT_EQ(id.written() + message.written(), "");
        takeLog();
    }

    ~ChannelTest() override
    {
        coderChannelDestroy(channel);
        EXPECT_EQ(liveProperties, 0);
    }

    static Log takeLog() { return std::exchange(core.log, {}); }

    /// Initialises the channel, with a property "p" of the device.
    void init(IPropertyInfo* property = nullptr)
    {
        core.on["init"] = [&] {
            brenixplugin::storeProperty(*core.properties, "p",
                                        brenixplugin::OwnedProperty(property));
        };
        ASSERT_EQ(coderChannelInit(channel, 0), 1);
        core.on.clear();
        input = coderChannelGetInputStream(channel);
        output = coderChannelGetOutputStream(channel);
        takeLog();
    }

    /// "identifier|message" of one of the three error records.
    std::string errorOf(int (*query)(void*, char*, char*) noexcept)
    {
        id = message = Buffer(CODER_ERROR_SIZE);
        EXPECT_EQ(query(channel, id.data(), message.data()), 1);
        return id.text() + "|" + message.text();
    }
    std::string lastError() { return errorOf(coderChannelGetLastError); }
    std::string syncError() { return errorOf(coderChannelGetLastSyncError); }
    std::string asyncError() { return errorOf(coderChannelGetLastAsyncError); }

    std::string flagOf(int (*query)(void*, uint8_t*) noexcept)
    {
        Buffer flag(1);
        EXPECT_EQ(query(channel, flag.as<uint8_t>()), 1);
        return flag.written();
    }

    void* channel = nullptr;
    void* input = nullptr;
    void* output = nullptr;
    Buffer id{CODER_ERROR_SIZE};
    Buffer message{CODER_ERROR_SIZE};
};

} // namespace scripted

#endif
