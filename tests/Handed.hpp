// A core channel whose device, converter and filters a test makes itself.
#ifndef BRENIXCODER_TESTS_HANDED_HPP
#define BRENIXCODER_TESTS_HANDED_HPP

#include "Allocations.hpp"
#include "brenixcore/Channel.hpp"
#include "brenixcore/Converter.hpp"
#include "brenixcore/Exceptions.hpp"
#include "brenixcore/Stream.hpp"
#include "brenixcore/plugin/Make.hpp"
#include "brenixcore/plugin/Plugin.hpp"

#include <gtest/gtest.h>

#include <dlfcn.h>

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <cstdlib>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <utility>
#include <vector>

namespace handed
{

using namespace brenixcore::plugin;
using brenixplugin::PropertyMap;
using brenixplugin::kit::coderconverter::TPointerProperty;
using brenixplugin::kit::device::TScalarProperty;
using Counts = std::vector<std::uint64_t>;

/// Makes the plug-in hand out the object when it is loaded next. Returns its path.
template <typename Interface>
std::string hand(const std::string& kind, Interface* object)
{
    std::string path = TEST_PLUGINS "/handed" + kind + ".so";
    void* const library = dlopen(path.c_str(), RTLD_NOW | RTLD_LOCAL); // and stays
    reinterpret_cast<void (*)(Interface*)>(dlsym(library, "brenixcoreCreateFrom"))(object);
    return path;
}

/// A device whose thread does what it is given to do.
class Worker : public Device
{
public:
    using Job = std::function<void(DeviceStreams&)>;

    explicit Worker(const DeviceInfo& deviceInfo) : info(deviceInfo) {}

    DeviceInfo init(const PropertyMap& /*options*/, PropertyMap& /*properties*/,
                    DeviceHost& /*host*/) override
    {
        return info;
    }

    void run(DeviceStreams& streams) override
    {
        while (!streams.isClosing()) {
            await([&] { return job || streams.isClosing(); });
            if (job) {
                job(streams);
                const std::lock_guard lock(mutex);
                job = nullptr;
                changed.notify_all();
            }
        }
        while (info.output && streams.pull()) {
        }
    }

    void wake() noexcept override
    {
        ++wakes;
        notify();
    }
    void notify()
    {
        const std::lock_guard lock(mutex);
        changed.notify_all();
    }

    void close() override { job = nullptr; }

    void start(Job newJob)
    {
        const std::lock_guard lock(mutex);
        job = std::move(newJob);
        changed.notify_all();
    }
    bool isIdle()
    {
        const std::lock_guard lock(mutex);
        return !job;
    }
    /// Has it done.
    void perform(Job newJob)
    {
        start(std::move(newJob));
        await([&] { return !job; });
    }

    /// For both threads; fails after a while in which the other one would have been done.
    template <typename Condition>
    void await(const Condition& condition)
    {
        std::unique_lock lock(mutex);
        if (!changed.wait_for(lock, std::chrono::seconds(20), condition)) {
            ADD_FAILURE() << "waited in vain";
            std::abort(); // a thread that never ends would hold the others up
        }
    }

    std::atomic<unsigned> wakes = 0;

private:
    const DeviceInfo info;
    std::mutex mutex;
    std::condition_variable changed;
    Job job;
};

struct Identity : Converter {
    void convertInput(Packet& /*packet*/) override {}
    void convertOutput(Packet& /*packet*/) override {}
};

/// Keeps what a channel reports.
class Log : public brenixcore::Channel::IEventHandler
{
public:
    void onCustomEvent(brenixcore::CustomEvent& event) override
    {
        const allocations::Allowed allowed;
        const std::lock_guard lock(mutex);
        if (std::string(event.getEventName()) == "error") {
            errors.push_back(event.getIdentifier() + std::string("|") + event.getMessage());
        }
    }
    void onPropertyUpdate(brenixplugin::interfaces::IPropertyInfo* property) override
    {
        const brenixplugin::OwnedProperty owned(property);
        const std::lock_guard lock(mutex);
        if (const auto* const count = dynamic_cast<TScalarProperty<std::uint64_t>*>(property)) {
            lostCounts = count->value;
        }
    }
    void* onDelegatedEvent(brenixcore::DelegatedEvent& event) override { return event.invoke(); }
    void onIgnoredEvent1(void* /*event*/) override {}
    void onIgnoredEvent2(void* /*event*/) override {}

    std::uint64_t getLostCounts() const
    {
        const std::lock_guard lock(mutex);
        return lostCounts;
    }
    /// Before an init, which brings a new property.
    void forgetLostCounts()
    {
        const std::lock_guard lock(mutex);
        lostCounts = 0;
    }
    /// The errors since the last call.
    std::vector<std::string> takeErrors()
    {
        const std::lock_guard lock(mutex);
        return std::exchange(errors, {});
    }

private:
    mutable std::mutex mutex;
    std::uint64_t lostCounts = 0;
    std::vector<std::string> errors;
};

/// A buffer that was read.
struct Buffer {
    Counts data;
    std::optional<std::uint64_t> index;
    std::optional<std::int64_t> time;
};

inline TPointerProperty<std::uint64_t>& dataOf(const PropertyMap& fields)
{
    return dynamic_cast<TPointerProperty<std::uint64_t>&>(
        *brenixplugin::asProperty(fields.at(dataField)));
}

template <typename T>
std::optional<T> scalarOf(const PropertyMap& fields, const char* name)
{
    const auto found = fields.find(name);
    const auto* const scalar =
        found == fields.end()
            ? nullptr
            : dynamic_cast<TScalarProperty<T>*>(brenixplugin::asProperty(found->second));
    return scalar == nullptr ? std::nullopt : std::optional(scalar->value);
}

/// Gives a packet its counts, numbered from `first` on. Returns it.
inline Packet& number(Packet& packet, std::uint64_t first, std::uint64_t counts)
{
    std::unique_ptr<std::uint64_t[]> data(new std::uint64_t[counts]);
    for (std::uint64_t i = 0; i < counts; ++i) {
        data[i] = first + i;
    }
    setField(packet, makeArray(dataField, std::move(data), counts));
    packet.counts = counts;
    return packet;
}

/// The channel, with its device and its input stream.
struct Rig {
    Rig(const DeviceInfo& info, std::uint64_t limit, Converter* ownConverter = new Identity)
        : device(new Worker(info)), converter(hand("Converter", ownConverter)),
          channel(hand<Device>("Device", device), converter, log, limit, UINT64_MAX)
    {
    }
    Rig(const Rig&) = delete;
    Rig& operator=(const Rig&) = delete;
    ~Rig() { brenixplugin::releaseProperties(properties); }

    /// Empty texts are options that are not given.
    static PropertyMap options(const std::string& overflow, bool stamps = false)
    {
        brenixplugin::OwnedPropertyMap made;
        if (!overflow.empty()) {
            publish(made.map, "Overflow", std::u16string(overflow.begin(), overflow.end()));
        }
        if (stamps) {
            publish(made.map, "Stamps", true);
        }
        return std::exchange(made.map, {});
    }

    void init(const PropertyMap& options = {})
    {
        channel.init(options, properties);
        input = channel.getInputStream();
    }
    void open(const std::string& overflow = "", double timeout = 10)
    {
        PropertyMap given = options(overflow);
        publish(given, "Timeout", timeout);
        channel.open(given);
    }
    void addFilter(Filter* filter) const { input->addFilter(hand("Filter", filter), {}); }

    std::vector<Buffer> read(std::uint64_t count) const
    {
        std::vector<void*> maps;
        std::uint64_t total = 0;
        input->read(count, maps, total);
        EXPECT_EQ(total, count);
        std::vector<Buffer> buffers;
        for (void* const map : maps) {
            const brenixplugin::OwnedDataBuffer owned(static_cast<PropertyMap*>(map));
            const auto& data = dataOf(*owned);
            buffers.push_back({Counts(data.data, data.data + data.count),
                               scalarOf<std::uint64_t>(*owned, "Index"),
                               scalarOf<std::int64_t>(*owned, "Time")});
        }
        return buffers;
    }
    /// Has the device push numbered counts.
    void push(std::uint64_t first, std::uint64_t counts, std::int64_t time = 0)
    {
        device->perform([&](DeviceStreams& streams) {
            Packet packet;
            packet.time = time;
            EXPECT_TRUE(streams.push(std::move(number(packet, first, counts))));
        });
    }
    Counts peek(std::uint64_t most = UINT64_MAX) const
    {
        std::uint64_t total = 0;
        Counts each;
        input->peekCounts(most, total, each);
        return each;
    }
    std::uint64_t available() const { return input->getDataAvailable(); }

    Log log;
    Worker* const device; ///< the channel's
    brenixcore::Converter converter;
    brenixcore::Channel channel;
    brenixcore::InputStream* input = nullptr;
    PropertyMap properties;
};

/// What an error says of a gap; no counts when it is another one.
struct Loss {
    std::uint64_t counts = 0;
    std::uint64_t sum = 0;
};
inline Loss lossOf(const std::string& error)
{
    const std::string start = "brenix:Stream:dataLost|";
    const std::size_t sum = error.rfind("; ");
    if (error.rfind(start, 0) != 0 || sum == std::string::npos) {
        return {};
    }
    return {std::stoull(error.substr(start.size())), std::stoull(error.substr(sum + 2))};
}

} // namespace handed

#endif
