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
    if (waits) {
        waitUntil(lock, [&] { return !pending || phase != Phase::Open; });
    }
    return !pending && takesPart();
}

void Queue::bring(Lock& lock, plugin::Packet&& packet)
{
    if (packet.counts > 0) {
        pending.emplace(std::move(packet));
        refill();
    }
    const bool ends = wanted > 0 && getCounts() >= wanted; // the wait of a read
    lock.unlock();
    if (ends) {
        changed.notify_all();
    }
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
        if (part == pending->packet.counts) {
            packets.pushBack(*std::move(pending));
            pending.reset();
        } else {
            packets.pushBack(QueuedPacket(slice(pending->packet, pending->taken, part)));
            pending->taken += part;
            if (pending->counts() == 0) {
                pending.reset();
            }
        }
        change(part);
    }
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
    notifyDevice(lock);
    return taken;
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
                result.emplace_back(slice(front.packet, front.taken, part)).converted =
                    front.converted;
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
    for (auto packet = taken.rbegin(); packet != taken.rend(); ++packet) {
        change(packet->counts());
        packets.pushFront(std::move(*packet));
    }
    taken.clear();
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
    }
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

void Queue::add(Packets& more, std::chrono::steady_clock::time_point begin)
{
    std::uint64_t added = 0;
    for (const QueuedPacket& packet : more) {
        added += packet.counts();
    }
    Lock lock(mutex);
    packets.reserve(more.size());
    if (!fits(added)) {
        std::optional<Duration> left = timeout;
        if (left) {
            *left -= std::chrono::steady_clock::now() - begin;
        }
        waitUntil(
            lock, [&] { return fits(added) || !isFlowing(); }, left);
    }
    for (QueuedPacket& packet : more) {
        packets.pushBack(std::move(packet));
    }
    change(added);
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
    notifyDevice(lock);
}

} // namespace brenixcore
