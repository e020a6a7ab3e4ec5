#include "Queue.hpp"

#include "Packets.hpp"
#include "brenixcore/Exceptions.hpp"

#include <algorithm>
#include <string>
#include <thread>
#include <utility>

namespace brenixcore
{

void Queue::setPhase(Phase newPhase)
{
    const std::lock_guard guard(mutex);
    phase = newPhase;
    if (phase == Phase::Open) {
        deviceDone = false;
        ++opening;
        numbered = 0;
        losses.clear();
    }
    changed.notify_all();
}

void Queue::endDraining()
{
    const std::lock_guard guard(mutex);
    if (phase == Phase::Draining) {
        phase = Phase::Stopping;
        changed.notify_all();
    }
}

void Queue::setDeviceDone()
{
    const std::lock_guard guard(mutex);
    deviceDone = true;
    changed.notify_all();
}

void Queue::setTimeout(double seconds)
{
    constexpr double longest = 1e9; // more than a clock's range is as good as for ever
    const std::lock_guard guard(mutex);
    timeout.reset();
    if (seconds < longest) {
        timeout = std::chrono::duration_cast<Duration>(std::chrono::duration<double>(seconds));
    }
}

// --- Waiting ---

bool Queue::giveWay(Lock& lock)
{
    if (sleeps > 0) {
        --sleeps;
        return false;
    }
    using std::chrono::steady_clock;
    lock.unlock();
    const auto begin = steady_clock::now();
    std::this_thread::yield();
    const bool tookLong = steady_clock::now() - begin > std::chrono::microseconds(200);
    lock.lock();
    // Busy threads leave the processor to one that is woken, but not to one that gave it away.
    if (tookLong) {
        sleeps = caution;
        caution = std::min(2 * caution, 1U << 16);
    } else {
        caution = std::max(caution - 1, 16U);
    }
    return !tookLong;
}

void Queue::notifyDevice(Lock& lock)
{
    lock.unlock();
    changed.notify_all();
    wakeDevice();
}

void Queue::wakeDevice() noexcept
{
    if (phase != Phase::Closed && hasAsked && hasAsked.exchange(false)) {
        device.wake();
    }
}

const char* Queue::reason() const
{
    if (phase != Phase::Open) {
        return "the channel is not open";
    }
    return deviceDone ? "the device is done" : "the time is over";
}

void Queue::enqueue(QueuedPacket&& packet) noexcept
{
    change(packet.counts());
    packets.pushBack(std::move(packet));
}

// --- Losses ---

void Queue::lose(std::uint64_t count, const char* reason)
{
    const std::lock_guard guard(mutex);
    if (reason == nullptr) {
        losses.addTold(count);
    } else {
        losses.addAtEnd(count, reason);
    }
    numbered += count;
}

void Queue::loseTaken(std::uint64_t count)
{
    const std::lock_guard guard(mutex);
    losses.addTold(count);
}

std::uint64_t Queue::getLost() const
{
    const std::lock_guard guard(mutex);
    return losses.getSum();
}

std::optional<std::vector<Gap>> Queue::takeNews(bool atEnd)
{
    const std::lock_guard guard(mutex);
    if (atEnd) {
        losses.endAtFront();
        losses.endAtEnd();
    }
    std::optional<std::vector<Gap>> gaps;
    if (losses.hasNews()) {
        gaps = losses.getEnded();
        losses.setNews(false);
    }
    return gaps;
}

void Queue::keepNews()
{
    const std::lock_guard guard(mutex);
    losses.setNews(true);
}

void Queue::forgetGap()
{
    const std::lock_guard guard(mutex);
    losses.forgetGap();
}

// --- Output: what the device pulls ---

std::optional<plugin::Packet> Queue::pull(bool waits)
{
    Lock lock(mutex);
    if (waits) {
        waitUntil(lock, [&] { return !packets.empty() || phase != Phase::Open; });
    }
    if (packets.empty() || !takesPart()) {
        hasAsked = true;
        return std::nullopt;
    }
    plugin::Packet packet = packets.popFront().packet;
    change(-packet.counts);
    lock.unlock();
    changed.notify_all();
    return packet;
}

std::uint64_t Queue::discardRest()
{
    PacketRing rest; // released without the lock
    Lock lock(mutex);
    changed.wait(lock, [&] { return phase != Phase::Open; });
    std::swap(rest, packets);
    const std::uint64_t left = getCounts();
    change(-left);
    return left;
}

// --- Output: what the caller adds ---

void Queue::awaitRoom(std::uint64_t more)
{
    if (fits(more) && !deviceDone) {
        return;
    }
    Lock lock(mutex);
    const auto refuse = [&](const std::string& why) {
        throw SynchronousOutputNotPossible("Cannot write " + std::to_string(more) +
                                           " counts: " + why + ".");
    };
    if (more > limit) {
        refuse("the limit is " + std::to_string(limit));
    }
    waitUntil(
        lock, [&] { return fits(more) || !isFlowing(); }, timeout);
    if (!fits(more)) {
        refuse(std::string("there is no room and ") + reason());
    }
    if (more > 0 && phase == Phase::Open && deviceDone) {
        refuse("the device is done");
    }
}

void Queue::add(Packets& added, std::chrono::steady_clock::time_point begin)
{
    std::uint64_t more = 0;
    for (const QueuedPacket& packet : added) {
        more += packet.counts();
    }
    Lock lock(mutex);
    packets.reserve(added.size());
    if (!fits(more)) {
        std::optional<Duration> left = timeout;
        if (left) {
            *left -= std::chrono::steady_clock::now() - begin;
        }
        waitUntil(
            lock, [&] { return fits(more) || !isFlowing(); }, left);
    }
    for (QueuedPacket& packet : added) {
        enqueue(std::move(packet));
    }
    notifyDevice(lock);
}

void Queue::flush()
{
    PacketRing discarded; // released without the lock
    std::optional<QueuedPacket> last;
    Lock lock(mutex);
    std::swap(discarded, packets);
    last.swap(pending);
    held = 0;
    counts = 0;
    listed = 0;
    losses.passFront();
    notifyDevice(lock);
}

} // namespace brenixcore
