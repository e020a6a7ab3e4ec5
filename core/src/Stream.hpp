#ifndef BRENIXCORE_SRC_STREAM_HPP
#define BRENIXCORE_SRC_STREAM_HPP

#include "Plugin.hpp"
#include "brenixcore/Stream.hpp"

#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <list>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <thread>
#include <utility>
#include <vector>

namespace brenixcore
{

/// What a stream is doing. Data waits in every phase.
enum class Phase {
    Closed,   ///< the device is not there: nothing waits
    Open,     ///< both sides wait for each other
    Draining, ///< closing: the device takes what is left, and nothing waits
    Stopping  ///< closing: the device gets and delivers nothing more
};

/// A waiting packet of which the first `taken` counts are gone.
struct QueuedPacket {
    explicit QueuedPacket(plugin::Packet&& whole) noexcept : packet(std::move(whole)) {}

    plugin::Packet packet;
    std::uint64_t taken = 0;
    bool converted = false;

    std::uint64_t counts() const { return packet.counts - taken; }
};

/// Releases the option objects that an operation of the core takes over.
struct OwnedOptions {
    explicit OwnedOptions(const brenixplugin::PropertyMap& optionMap) : options(optionMap) {}
    OwnedOptions(const OwnedOptions&) = delete;
    OwnedOptions& operator=(const OwnedOptions&) = delete;
    ~OwnedOptions() { brenixplugin::releaseProperties(options); }

    const brenixplugin::PropertyMap& options;
};

/// The queue of packets between a device's thread and the caller's, which both streams are. Packets
/// are list nodes, so that moving them from one list to another cannot fail.
struct BRENIXCORE_INTERNAL Stream::Impl {
    using Packets = std::list<QueuedPacket>;

    Impl(plugin::Device& streamDevice, plugin::Converter& streamConverter,
         std::list<PluginLibrary>& pluginLibraries, std::uint64_t countLimit,
         plugin::StreamInfo streamInfo)
        : device(streamDevice), converter(streamConverter), libraries(pluginLibraries),
          limit(countLimit), info(streamInfo)
    {
    }

    /// Starts a phase and wakes whoever waits. A device that starts is not done.
    void setPhase(Phase newPhase);
    void setDeviceDone();

    /// Draining becomes stopping; any other phase stays.
    void endDraining();

    /// How long read and write wait: seconds, infinity for ever.
    void setTimeout(double seconds);

    /// For the device's thread; see plugin::DeviceStreams.
    bool push(plugin::Packet& packet, bool waits, plugin::DeviceHost& host);
    std::optional<plugin::Packet> pull(bool waits);

    void addFilter(const std::string& name, const brenixplugin::PropertyMap& options);
    void tuneFilters(const brenixplugin::PropertyMap& options);
    void applyFilters(plugin::Packet& packet);

    /// The same for all that a write brings. Returns the counts that are left.
    std::uint64_t applyFilters(Packets& outgoing);

    /// Runs an operation of the converter. Throws when it does, or leaves the packet as it must not.
    void convert(plugin::Packet& packet, void (plugin::Converter::*operation)(plugin::Packet&));

    /// Whether the other side may still take or bring data. Under the mutex.
    bool isFlowing() const { return phase == Phase::Open && !deviceDone; }

    /// Whether the device may bring or take data. Under the mutex.
    bool takesPart() const { return phase == Phase::Open || phase == Phase::Draining; }

    /// Whether `more` counts have room. Under the mutex.
    bool fits(std::uint64_t more) const { return counts <= limit && more <= limit - counts; }

    /// Waits until the condition holds, or for so long. Under the mutex. It gives way a few times before
    /// it sleeps and the time begins: while data flows there is seldom long to wait, and to sleep and be
    /// woken takes longer than most packets do.
    template <typename Condition>
    void waitUntil(std::unique_lock<std::mutex>& lock, const Condition& over,
                   std::optional<std::chrono::steady_clock::duration> atMost = std::nullopt)
    {
        if (atMost == std::chrono::steady_clock::duration::zero()) {
            return;
        }
        for (int turn = 0; turn < 10 && !over() && giveWay(lock); ++turn) {
        }
        if (!atMost) {
            changed.wait(lock, over);
        } else if (!over()) { // without a look at the clock
            changed.wait_for(lock, *atMost, over);
        }
    }

    /// Lets other threads run. Returns whether that is better than to sleep. Under the mutex.
    bool giveWay(std::unique_lock<std::mutex>& lock);

    /// Moves from `pending` to `packets` what has room. When it throws, the rest stays. Under the mutex.
    void refill();

    /// Tells both sides of a change that the caller's made. Unlocks the mutex first, so that who
    /// wakes finds it free.
    void notifyDevice(std::unique_lock<std::mutex>& lock);

    /// Takes the `count` oldest counts: waits for them, or throws SynchronousInputNotPossible.
    Packets takeInTime(std::uint64_t count);

    /// Takes the `count` oldest counts, which are there. Under the mutex.
    Packets take(std::uint64_t count);

    /// Puts packets that were taken back in their place. Under the mutex.
    void putBack(Packets& taken) noexcept;

    /// Why a wait ended without what it waited for. Under the mutex.
    const char* reason() const;

    plugin::Device& device;
    plugin::Converter& converter;
    std::list<PluginLibrary>& libraries; ///< outlive every packet that a filter touched
    const std::uint64_t limit;
    const plugin::StreamInfo info;

    std::mutex filterMutex; ///< guards the filters, which are added only while closed
    std::vector<std::unique_ptr<plugin::Filter>> filters;

    std::mutex mutex; ///< guards what follows
    std::condition_variable changed;
    Phase phase = Phase::Closed;
    bool deviceDone = false;
    std::optional<std::chrono::steady_clock::duration> timeout;
    Packets packets;
    std::uint64_t counts = 0; ///< in `packets`
    std::uint64_t wanted = 0; ///< that a read is waiting for
    unsigned sleeps = 0;      ///< so many waits to come do not give way
    unsigned caution = 16;    ///< and so many after the next time that this takes long
    Packets pending;          ///< pushed by the device, which then waits; not yet all in `packets`
};

} // namespace brenixcore

#endif
