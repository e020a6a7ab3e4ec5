// The queue of an input stream: what the device brings, what is lost where there is no room, and what the
// caller takes.

#include "Queue.hpp"
#include "brenixcore/Exceptions.hpp"

#include <algorithm>
#include <string>
#include <utility>

namespace brenixcore
{

// --- What the device brings ---

bool Queue::awaitTurn(Lock& lock, bool waits)
{
    const auto isFree = [&] { return !pending || overflow != Overflow::Wait; };
    if (waits) {
        waitUntil(lock, [&] { return isFree() || phase != Phase::Open; });
    }
    const bool isItsTurn = isFree() && takesPart();
    if (!isItsTurn) {
        hasAsked = true;
    }
    return isItsTurn;
}

bool Queue::bring(Lock& lock, plugin::Packet&& packet)
{
    // Whatever throws does so before the packet is taken, or leaves it in `pending`.
    if (losses.isFrontPassed()) {
        losses.endAtFront();
    }
    if (pending && overflow != Overflow::Wait) { // since an opening that waited
        dropPending();
    }
    packets.reserve(1 + held);
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
        const std::size_t oldest = listed; // those the caller will want to read as it saw them
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

void Queue::passGap(const QueuedPacket& packet, std::uint64_t count)
{
    if (positionOf(packet) + count > gapEnd) {
        losses.passFront();
    }
}

std::uint64_t Queue::positionOf(const QueuedPacket& packet) const
{
    return packet.opening == opening ? packet.index + packet.taken : 0;
}

std::uint64_t Queue::takenCounts() const
{
    const std::lock_guard guard(mutex);
    hasAsked = true; // before the look at what settle() changes
    if (const std::uint64_t first = inHand; first != none) {
        return first;
    }
    const QueuedPacket* const next = !packets.empty() ? &packets[0] : pending ? &*pending : nullptr;
    return next == nullptr ? numbered : positionOf(*next);
}

std::uint64_t Queue::pushedCounts() const
{
    const std::lock_guard guard(mutex);
    return numbered;
}

// --- What the caller takes ---

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
        putBack(taken);
        notifyDevice(lock);
        throw;
    }
    if (!taken.empty()) {
        inHand = positionOf(taken[0]);
        passGap(taken.back(), taken.back().counts());
    }
    lock.unlock();
    changed.notify_all(); // settle() wakes the device
    return taken;
}

void Queue::settle(Packets& undelivered) noexcept
{
    if (!undelivered.empty()) {
        const std::lock_guard guard(mutex);
        putBack(undelivered);
    }
    inHand = none;
    wakeDevice();
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
    const std::size_t before = packets.size();
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
        putBack(result);
        throw;
    }
    listed -= std::min(listed, before - packets.size());
    return result;
}

void Queue::putBack(Packets& taken) noexcept
{
    for (; !taken.empty(); taken.pop_back()) {
        change(taken.back().counts());
        packets.pushFront(std::move(taken.back()));
        ++listed; // or it could be dropped, as what was not asked for
    }
}

void Queue::list(std::uint64_t most, std::uint64_t& total, std::vector<unsigned long>& each)
{
    const std::lock_guard guard(mutex);
    total = 0;
    each.reserve(std::min<std::uint64_t>(packets.size(), most));
    std::size_t i = 0;
    for (; i < packets.size() && total < most; ++i) {
        each.push_back(std::min(most - total, packets[i].counts()));
        total += each.back();
        if (overflow == Overflow::DropOldest) {
            passGap(packets[i], each.back());
        }
    }
    listed = i;
}

} // namespace brenixcore
