#ifndef BRENIXCORE_SRC_QUEUE_HPP
#define BRENIXCORE_SRC_QUEUE_HPP

#include "Losses.hpp"
#include "PacketRing.hpp"
#include "brenixcore/plugin/Plugin.hpp"

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <mutex>
#include <optional>
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

/// What happens where the device brings more than the input stream has room for.
enum class Overflow {
    Wait,       ///< it is held back
    DropOldest, ///< what has waited longest is lost
    DropNewest  ///< what it brings is lost
};

/// The queue of packets between a device's thread and the caller's, which both streams are: its limit,
/// and how each side waits for the other.
class Queue
{
public:
    using Packets = std::vector<QueuedPacket>;
    using Lock = std::unique_lock<std::mutex>;

    Queue(plugin::Device& queueDevice, std::uint64_t countLimit)
        : device(queueDevice), limit(countLimit)
    {
    }

    // --- For both threads ---

    Lock lock() const { return Lock(mutex); }

    /// The others need the lock where one is passed.
    Phase getPhase(const Lock& /*lock*/) const { return phase; }
    bool isDone() const { return deviceDone; }
    std::uint64_t getLimit() const { return limit; }
    std::uint64_t getCounts() const { return counts.load(std::memory_order_relaxed); }

    /// Starts a phase and wakes whoever waits. A device that starts is not done, and has lost nothing.
    void setPhase(Phase newPhase);
    void setDeviceDone();

    /// While closed.
    void setOverflow(Overflow policy) { overflow = policy; }

    /// Draining becomes stopping; any other phase stays.
    void endDraining();

    /// How long the caller waits: seconds, infinity for ever.
    void setTimeout(double seconds);

    // --- For the device's thread ---

    /// Whether the device may bring a packet; waits for its turn if it is to.
    bool awaitTurn(Lock& lock, bool waits);

    /// Takes the packet, whose turn it is. Unlocks. Returns whether there is news of losses.
    bool bring(Lock& lock, plugin::Packet&& packet);

    std::optional<plugin::Packet> pull(bool waits);

    /// All counts before it, from open on and lost ones included, the caller has done with.
    std::uint64_t takenCounts() const;

    /// The number of the next count.
    std::uint64_t pushedCounts() const;

    /// What is lost behind the last packet, for a reason or, with null, told otherwise.
    void lose(std::uint64_t count, const char* reason);

    /// What is lost of the packets taken last, and told otherwise.
    void loseTaken(std::uint64_t count);

    /// The gaps that ended and are to be told, at the end of its input all; nothing when there is no news of
    /// losses.
    std::optional<std::vector<Gap>> takeNews(bool atEnd);

    /// The sum could not be told.
    void keepNews();

    /// The first of the gaps is told.
    void forgetGap();

    /// Lost since open.
    std::uint64_t getLost() const;

    /// Waits until the channel closes, and discards what the device, which is done, has left. Returns its
    /// counts.
    std::uint64_t discardRest();

    // --- For the caller's thread ---

    /// Takes the `count` oldest counts: waits for them, or throws SynchronousInputNotPossible.
    Packets take(std::uint64_t count);

    /// Puts what is not delivered of the packets that were taken last back in its place. From here on
    /// takenCounts() tells what is.
    void settle(Packets& undelivered) noexcept;

    /// The counts of the packets that take() of `most` counts, or of all there are, would return. What was
    /// listed last, or put back since, is not dropped before it is read.
    void list(std::uint64_t most, std::uint64_t& total, std::vector<unsigned long>& each);

    /// Waits until there is room for so many counts, or throws SynchronousOutputNotPossible. Nobody but
    /// this thread takes the room.
    void awaitRoom(std::uint64_t more);

    /// Adds packets for which awaitRoom() was called. Where filters made more of them, it waits for room for
    /// that, too, but not beyond the caller's time since `begin`; then they are queued all the same.
    void add(Packets& added, std::chrono::steady_clock::time_point begin);

    /// Discards all.
    void flush();

private:
    using Duration = std::chrono::steady_clock::duration;

    /// Whether the other side may still take or bring data.
    bool isFlowing() const { return phase == Phase::Open && !deviceDone; }

    /// Whether the device may bring or take data.
    bool takesPart() const { return phase == Phase::Open || phase == Phase::Draining; }

    bool fits(std::uint64_t more) const
    {
        const std::uint64_t present = getCounts();
        return present <= limit && more <= limit - present;
    }

    /// Adds to the counts; a negative number wraps.
    void change(std::uint64_t more) { counts.store(getCounts() + more, std::memory_order_relaxed); }

    /// Waits until the condition holds, or for so long. It gives way a few times before it sleeps and the
    /// time begins: while data flows there is seldom long to wait, and to sleep and be woken takes longer
    /// than most packets do.
    template <typename Condition>
    void waitUntil(Lock& lock, const Condition& over, std::optional<Duration> atMost = std::nullopt)
    {
        if (atMost && *atMost <= Duration::zero()) {
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

    /// Lets other threads run. Returns whether that is better than to sleep.
    bool giveWay(Lock& lock);

    /// Moves from `pending` to `packets` what has room. When it throws, the rest stays.
    void refill();

    /// Adds a packet for which `packets` has a place.
    void enqueue(QueuedPacket&& packet) noexcept;

    /// Queues what has room of `pending`, in DropOldest after the oldest counts were lost for it. The rest is
    /// lost. When it throws, it stays.
    void dropPending();

    /// The caller goes as far as to the end of so many counts of a packet.
    void passGap(const QueuedPacket& packet, std::uint64_t count);

    /// Tells both sides of a change that the caller's made. Unlocks the mutex first, so that who
    /// wakes finds it free.
    void notifyDevice(Lock& lock);

    /// If it has asked, by tryPush(), tryPull() or takenCounts(), for what it may have now. For the caller's thread,
    /// with or without the lock: the device's changes the phase only while the caller's waits for its end.
    void wakeDevice() noexcept;

    Packets takeAvailable(std::uint64_t count);

    /// The number of the next count of a packet; 0 for one of an earlier opening.
    std::uint64_t positionOf(const QueuedPacket& packet) const;
    void putBack(Packets& taken) noexcept;

    /// Why a wait ended without what it waited for.
    const char* reason() const;

    plugin::Device& device;
    const std::uint64_t limit;

    mutable std::mutex mutex; ///< guards what follows
    std::condition_variable changed;
    Phase phase = Phase::Closed; ///< changed by the caller's thread, but for endDraining()
    std::optional<Duration> timeout;
    Overflow overflow = Overflow::Wait;
    PacketRing packets;
    std::size_t held = 0;                ///< places for packets that may be put back
    std::optional<QueuedPacket> pending; ///< brought by the device, which then waits for room
    std::uint64_t wanted = 0;            ///< counts that a read is waiting for
    std::size_t listed = 0;   ///< packets at the front that were listed and not read since
    std::uint64_t gapEnd = 0; ///< the position behind what was dropped last
    unsigned sleeps = 0;      ///< so many waits to come do not give way
    unsigned caution = 16;    ///< and so many after the next time that this takes long

    std::uint32_t opening = 0;  ///< the number of this one
    std::uint64_t numbered = 0; ///< counts since open, lost ones included
    Losses losses;

    // Changed under the mutex, but read also without it.
    std::atomic<std::uint64_t> counts = 0; ///< in `packets`
    std::atomic<bool> deviceDone = false;
    mutable std::atomic<bool> hasAsked = false; ///< the device, and was not woken since

    /// The first count that is taken but not delivered; all bits set when there is none.
    static constexpr std::uint64_t none = UINT64_MAX;
    std::atomic<std::uint64_t> inHand = none;
};

} // namespace brenixcore

#endif
