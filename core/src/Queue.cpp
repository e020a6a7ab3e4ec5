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
    const bool running = phase != Phase::Closed;
    lock.unlock();
    changed.notify_all();
    if (running) {
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

// --- The device's side ---

bool Queue::awaitTurn(Lock& lock, bool waits)
{
    const auto isFree = [&] { return !pending || overflow != Overflow::Wait; };
    if (waits) {
        waitUntil(lock, [&] { return isFree() || phase != Phase::Open; });
    }
    return isFree() && takesPart();
}

bool Queue::bring(Lock& lock, plugin::Packet&& packet, double period)
{
    // Whatever throws does so before the packet is taken, or leaves it in `pending`.
    packets.reserve(1 + held);
    if (losses.isFrontPassed()) {
        losses.endAtFront();
    }
    if (pending && overflow != Overflow::Wait) { // since an opening that waited
        dropPending();
    }
    if (packet.lost > 0) {
        losses.addAtEnd(packet.lost, lostByDevice);
        numbered += std::exchange(packet.lost, 0);
    }
    if (packet.counts > 0) {
        const bool hasRoom = fits(packet.counts);
        if (hasRoom || overflow == Overflow::Wait) {
            losses.endAtEnd();
        }
        QueuedPacket queued(std::move(packet));
        queued.index = numbered;
        queued.opening = opening;
        queued.period = period;
        numbered += queued.counts();
        if (hasRoom) {
            enqueue(std::move(queued));
        } else {
            pending = std::move(queued);
            overflow == Overflow::Wait ? refill() : dropPending();
        }
    }
    const bool ends = wanted > 0 && getCounts() >= wanted; // the wait of a read
    const bool isNews = losses.hasNews();
    lock.unlock();
    if (ends) {
        changed.notify_all();
    }
    return isNews;
}

void Queue::enqueue(QueuedPacket&& packet) noexcept
{
    change(packet.counts());
    packets.pushBack(std::move(packet));
}

void Queue::refill()
{
    while (pending) {
        std::uint64_t part = pending->counts();
        if (!fits(part)) {
            // Room for a part is used only where waiting for more would never end: by a packet
            // beyond the limit, or while a read waits for more counts than are there.
            const std::uint64_t present = getCounts();
            if (present >= limit || (present > 0 && wanted <= present)) {
                return;
            }
            part = limit - present;
        }
        packets.reserve(1 + held);
        if (part == pending->counts()) {
            enqueue(*std::move(pending));
            pending.reset();
        } else {
            enqueue(pending->part(part));
            pending->taken += part;
        }
    }
}

void Queue::dropPending()
{
    constexpr const char* reason = "the input stream was full";
    const std::uint64_t brought = pending->counts();
    if (overflow == Overflow::DropOldest && !fits(brought)) {
        const std::uint64_t more = getCounts() + brought - limit;
        std::uint64_t lost = 0;
        const auto loseFrom = [&](QueuedPacket& packet) {
            const std::uint64_t part = std::min(more - lost, packet.counts());
            packet.taken += part;
            lost += part;
            return part;
        };
        const std::size_t oldest = behindListed();
        while (lost < more && oldest < packets.size()) {
            change(-loseFrom(packets[oldest]));
            if (packets[oldest].counts() == 0) {
                packets.erase(oldest);
            }
        }
        loseFrom(*pending);
        losses.addAtFront(lost, reason);
        gapEnd = positionOf(oldest < packets.size() ? packets[oldest] : *pending);
        if (pending->counts() == 0) { // where nothing has room
            pending.reset();
            return;
        }
    }
    refill();
    if (!pending || pending->taken > 0) {
        losses.endAtEnd();
    }
    if (pending) {
        losses.addAtEnd(pending->counts(), reason);
        pending.reset();
    }
}

std::size_t Queue::behindListed() const
{
    std::size_t i = 0;
    for (std::uint64_t seen = 0; seen < listed && i < packets.size(); ++i) {
        seen += packets[i].counts();
    }
    return i;
}

void Queue::passGap(const QueuedPacket& packet, std::uint64_t count)
{
    if (positionOf(packet) + count > gapEnd) {
        losses.passFront();
    }
}

std::uint64_t Queue::takenCounts() const
{
    const std::lock_guard guard(mutex);
    if (const std::uint64_t first = inHand; first != none) {
        return first;
    }
    const QueuedPacket* const next = !packets.empty() ? &packets[0] : pending ? &*pending : nullptr;
    return next == nullptr ? numbered : positionOf(*next);
}

std::uint64_t Queue::positionOf(const QueuedPacket& packet) const
{
    return packet.opening == opening ? packet.index + packet.taken : 0;
}

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
    return atEnd || losses.hasNews() ? std::optional(losses.takeNews()) : std::nullopt;
}

void Queue::forgetGap()
{
    const std::lock_guard guard(mutex);
    losses.forgetGap();
}

std::optional<plugin::Packet> Queue::pull(bool waits)
{
    Lock lock(mutex);
    if (waits) {
        waitUntil(lock, [&] { return !packets.empty() || phase != Phase::Open; });
    }
    if (packets.empty() || !takesPart()) {
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

// --- The caller's side, input ---

Queue::Packets Queue::take(std::uint64_t count)
{
    Lock lock(mutex);
    const auto refuse = [&](const std::string& why) {
        throw SynchronousInputNotPossible("Cannot read " + std::to_string(count) +
                                          " counts: " + why + ".");
    };
    if (count > limit) {
        refuse("the limit is " + std::to_string(limit));
    }
    wanted = count;
    Packets taken;
    try {
        refill();
        if (getCounts() < count) { // the device may be waiting for this
            notifyDevice(lock);
            lock.lock();
        }
        waitUntil(
            lock, [&] { return getCounts() >= count || !isFlowing(); }, timeout);
        if (getCounts() < count) {
            refuse("there are " + std::to_string(getCounts()) + " and " + reason());
        }
        wanted = 0;
        taken = takeAvailable(count);
        refill();
    } catch (...) { // whatever has room now may be waited for
        wanted = 0;
        putBackLocked(taken);
        notifyDevice(lock);
        throw;
    }
    if (!taken.empty()) {
        inHand = positionOf(taken[0]);
        passGap(taken.back(), taken.back().counts());
        listed -= std::min(listed, count);
    }
    lock.unlock();
    changed.notify_all(); // settle() wakes the device
    return taken;
}

void Queue::settle() noexcept
{
    inHand = none;
    if (phase != Phase::Closed) { // which this thread alone changes
        device.wake();
    }
}

Queue::Packets Queue::takeAvailable(std::uint64_t count)
{
    std::size_t length = 0;
    for (std::uint64_t found = 0; found < count; ++length) {
        found += packets[length].counts();
    }
    Packets result;
    result.reserve(length);
    packets.reserve(2); // for both ends are put back even where they were divided
    held = length;
    try {
        for (std::uint64_t missing = count; missing > 0;) {
            QueuedPacket& front = packets[0];
            const std::uint64_t part = std::min(missing, front.counts());
            if (part < front.packet.counts) {
                result.push_back(front.part(part));
                front.taken += part;
                if (front.counts() == 0) {
                    packets.popFront();
                }
            } else {
                result.push_back(packets.popFront());
            }
            missing -= part;
            change(-part);
        }
    } catch (...) {
        putBackLocked(result);
        throw;
    }
    return result;
}

void Queue::putBackLocked(Packets& taken) noexcept
{
    for (; !taken.empty(); taken.pop_back()) {
        change(taken.back().counts());
        packets.pushFront(std::move(taken.back()));
    }
}

void Queue::putBack(Packets& taken) noexcept
{
    const std::lock_guard guard(mutex);
    putBackLocked(taken);
}

void Queue::list(std::uint64_t most, std::uint64_t& total, std::vector<unsigned long>& each)
{
    const std::lock_guard guard(mutex);
    total = 0;
    each.reserve(std::min<std::uint64_t>(packets.size(), most));
    for (std::size_t i = 0; i < packets.size() && total < most; ++i) {
        each.push_back(std::min(most - total, packets[i].counts()));
        total += each.back();
        if (overflow == Overflow::DropOldest) {
            passGap(packets[i], each.back());
        }
    }
    listed = total;
}

// --- The caller's side, output ---

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
