#include "Stream.hpp"

#include "Packets.hpp"

#include <algorithm>
#include <iterator>
#include <stdexcept>
#include <string>
#include <utility>

namespace brenixcore
{

using brenixplugin::PropertyMap;

// --- The queue ---

void Stream::Impl::setPhase(Phase newPhase)
{
    const std::lock_guard lock(mutex);
    phase = newPhase;
    if (phase == Phase::Open) {
        deviceDone = false;
    }
    changed.notify_all();
}

void Stream::Impl::endDraining()
{
    const std::lock_guard lock(mutex);
    if (phase == Phase::Draining) {
        phase = Phase::Stopping;
        changed.notify_all();
    }
}

void Stream::Impl::setDeviceDone()
{
    const std::lock_guard lock(mutex);
    deviceDone = true;
    changed.notify_all();
}

void Stream::Impl::setTimeout(double seconds)
{
    using namespace std::chrono;
    constexpr double longest = 1e9; // more than a clock's range is as good as for ever
    const std::lock_guard lock(mutex);
    timeout.reset();
    if (seconds < longest) {
        timeout = duration_cast<steady_clock::duration>(duration<double>(seconds));
    }
}

bool Stream::Impl::giveWay(std::unique_lock<std::mutex>& lock)
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

bool Stream::Impl::push(plugin::Packet& packet, bool waits, plugin::DeviceHost& host)
{
    std::unique_lock lock(mutex);
    if (waits) {
        waitUntil(lock, [&] { return pending.empty() || phase != Phase::Open; });
    }
    if (!pending.empty() || !takesPart()) {
        return false;
    }
    if (!filters.empty()) {
        lock.unlock();
        try {
            applyFilters(packet);
        } catch (...) {
            host.raise("error", "brenix:Stream:filterFailed", currentExceptionText().c_str());
            return true; // without this packet
        }
        lock.lock();
    }
    if (packet.counts > 0) {
        pending.emplace_back(std::move(packet));
        refill();
    }
    const bool ends = wanted > 0 && counts >= wanted; // the wait of a read
    lock.unlock();
    if (ends) {
        changed.notify_all();
    }
    return true;
}

void Stream::Impl::refill()
{
    while (!pending.empty()) {
        QueuedPacket& next = pending.front();
        std::uint64_t part = next.counts();
        if (!fits(part)) {
            // Room for a part is used only where waiting for more would never end: by a packet
            // beyond the limit, or while a read waits for more counts than are there.
            if (counts >= limit || (counts > 0 && wanted <= counts)) {
                return;
            }
            part = limit - counts;
        }
        if (part == next.packet.counts) {
            packets.splice(packets.end(), pending, pending.begin());
        } else {
            packets.emplace_back(slice(next.packet, next.taken, part));
            next.taken += part;
            if (next.counts() == 0) {
                pending.pop_front();
            }
        }
        counts += part;
    }
}

std::optional<plugin::Packet> Stream::Impl::pull(bool waits)
{
    std::unique_lock lock(mutex);
    if (waits) {
        waitUntil(lock, [&] { return !packets.empty() || phase != Phase::Open; });
    }
    if (packets.empty() || !takesPart()) {
        return std::nullopt;
    }
    plugin::Packet packet = std::move(packets.front().packet);
    packets.pop_front();
    counts -= packet.counts;
    lock.unlock();
    changed.notify_all();
    return packet;
}

void Stream::Impl::notifyDevice(std::unique_lock<std::mutex>& lock)
{
    const bool running = phase != Phase::Closed;
    lock.unlock();
    changed.notify_all();
    if (running) {
        device.wake();
    }
}

Stream::Impl::Packets Stream::Impl::take(std::uint64_t count)
{
    Packets result;
    try {
        for (std::uint64_t missing = count; missing > 0;) {
            QueuedPacket& front = packets.front();
            const std::uint64_t part = std::min(missing, front.counts());
            if (part < front.packet.counts) {
                result.emplace_back(slice(front.packet, front.taken, part)).converted =
                    front.converted;
                front.taken += part;
                if (front.counts() == 0) {
                    packets.pop_front();
                }
            } else {
                result.splice(result.end(), packets, packets.begin());
            }
            missing -= part;
        }
    } catch (...) {
        packets.splice(packets.begin(), result);
        throw;
    }
    counts -= count;
    return result;
}

void Stream::Impl::putBack(Packets& taken) noexcept
{
    for (const QueuedPacket& queued : taken) {
        counts += queued.counts();
    }
    packets.splice(packets.begin(), taken);
}

Stream::Impl::Packets Stream::Impl::takeInTime(std::uint64_t count)
{
    std::unique_lock lock(mutex);
    const auto refuse = [&](const std::string& why) {
        throw SynchronousInputNotPossible("Cannot read " + std::to_string(count) +
                                          " counts: " + why + ".");
    };
    if (count > limit) {
        refuse("the limit is " + std::to_string(limit));
    }
    wanted = count;
    try {
        refill();
    } catch (...) {
        wanted = 0;
        throw;
    }
    if (counts < count) { // the device may be waiting for this
        notifyDevice(lock);
        lock.lock();
    }
    waitUntil(
        lock, [&] { return counts >= count || !isFlowing(); }, timeout);
    wanted = 0;
    if (counts < count) {
        refuse("there are " + std::to_string(counts) + " and " + reason());
    }
    Packets taken = take(count);
    try {
        refill();
    } catch (...) { // what waits on would be missed by whoever waits for it to arrive
        putBack(taken);
        throw;
    }
    notifyDevice(lock);
    return taken;
}

const char* Stream::Impl::reason() const
{
    if (phase != Phase::Open) {
        return "the channel is not open";
    }
    return deviceDone ? "the device is done" : "the time is over";
}

// --- Filters ---

void Stream::Impl::addFilter(const std::string& name, const PropertyMap& options)
{
    if (const std::lock_guard lock(mutex); phase != Phase::Closed) {
        throw CannotAddFilterWhileOpen("Cannot add filter " + name + " while the channel is open.");
    }
    auto loaded = loadPlugin<plugin::Filter, CouldNotLoadFilter, CouldNotCreateFilter>(name);
    libraries.push_back(std::move(loaded.library));
    plugin::Options given(options);
    loaded.object->tune(given);
    given.requireAllKnown();
    const std::lock_guard lock(filterMutex);
    filters.push_back(std::move(loaded.object));
}

void Stream::Impl::tuneFilters(const PropertyMap& options)
{
    plugin::Options given(options);
    const std::lock_guard lock(filterMutex);
    for (const auto& filter : filters) {
        filter->tune(given);
    }
    given.requireAllKnown(); // to one of them
}

void Stream::Impl::applyFilters(plugin::Packet& packet)
{
    const std::lock_guard lock(filterMutex);
    for (const auto& filter : filters) {
        if (packet.counts > 0) {
            filter->apply(packet);
            requireWhole(packet);
        }
    }
}

std::uint64_t Stream::Impl::applyFilters(Packets& outgoing)
{
    std::uint64_t filtered = 0;
    for (auto queued = outgoing.begin(); queued != outgoing.end();) {
        const plugin::Packet& packet = queued->packet;
        try {
            applyFilters(queued->packet);
            if (packet.counts > limit - filtered) {
                throw std::length_error("The filters made more counts than the limit.");
            }
        } catch (...) {
            throw CouldNotConvertOutputData(currentExceptionText());
        }
        filtered += packet.counts;
        queued = packet.counts > 0 ? std::next(queued) : outgoing.erase(queued);
    }
    return filtered;
}

void Stream::Impl::convert(plugin::Packet& packet,
                           void (plugin::Converter::*operation)(plugin::Packet&))
{
    const std::uint64_t before = packet.counts;
    (converter.*operation)(packet);
    if (packet.counts != before) {
        throw std::logic_error("The converter changed the number of counts.");
    }
    requireWhole(packet);
}

// --- Both directions ---

Stream::Stream(std::unique_ptr<Impl> state) : impl(std::move(state)) {}

Stream::~Stream() = default;

bool Stream::isInput() const
{
    return false;
}

void Stream::addFilter(const std::string& filterName, const PropertyMap& options)
{
    const OwnedOptions owned(options);
    impl->addFilter(filterName, options);
}

void Stream::tuneFilters(const PropertyMap& options)
{
    const OwnedOptions owned(options);
    impl->tuneFilters(options);
}

void Stream::flush()
{
    Impl::Packets discarded;
    std::unique_lock lock(impl->mutex);
    discarded.splice(discarded.end(), impl->packets);
    discarded.splice(discarded.end(), impl->pending);
    impl->counts = 0;
    impl->notifyDevice(lock);
}

bool Stream::isOpen() const
{
    const std::lock_guard lock(impl->mutex);
    return impl->phase != Phase::Closed;
}

bool Stream::isUnlimited() const
{
    return impl->limit == UINT64_MAX;
}

unsigned long Stream::getDataAvailable() const
{
    const std::lock_guard lock(impl->mutex);
    return impl->counts;
}

unsigned long Stream::getSpaceAvailable() const
{
    const std::lock_guard lock(impl->mutex);
    return impl->limit - std::min(impl->limit, impl->counts);
}

// --- Input ---

InputStream::InputStream(std::unique_ptr<Impl> state) : Stream(std::move(state)) {}

InputStream::~InputStream() = default;

bool InputStream::isInput() const
{
    return true;
}

bool InputStream::isDeviceDone() const
{
    const std::lock_guard lock(impl->mutex);
    return impl->deviceDone;
}

unsigned long InputStream::getCountDimension() const
{
    return impl->info.countDimension;
}

void InputStream::peekCounts(unsigned long limit, unsigned long& total,
                             std::vector<unsigned long>& counts)
{
    const std::lock_guard lock(impl->mutex);
    total = 0;
    for (const QueuedPacket& queued : impl->packets) {
        if (total == limit) {
            break;
        }
        counts.push_back(std::min(limit - total, queued.counts()));
        total += counts.back();
    }
}

void InputStream::read(unsigned long count, std::vector<void*>& buffers, unsigned long& countRead)
{
    Impl& stream = *impl;
    // Whatever is not delivered below goes back to where it was.
    struct Taken {
        ~Taken()
        {
            if (!packets.empty()) {
                const std::lock_guard lock(stream.mutex);
                stream.putBack(packets);
            }
        }
        Impl& stream;
        Impl::Packets packets;
    } taken{stream, stream.takeInTime(count)};

    buffers.reserve(taken.packets.size());
    for (auto current = taken.packets.begin(); current != taken.packets.end(); ++current) {
        if (current->converted) {
            continue;
        }
        try {
            stream.convert(current->packet, &plugin::Converter::convertInput);
            current->converted = true;
        } catch (...) {
            taken.packets.erase(current);
            throw CouldNotConvertInputData(currentExceptionText());
        }
    }
    for (QueuedPacket& queued : taken.packets) {
        buffers.push_back(queued.packet.fields.release());
    }
    taken.packets.clear();
    countRead = count;
}

// --- Output ---

OutputStream::OutputStream(std::unique_ptr<Impl> state) : Stream(std::move(state)) {}

OutputStream::~OutputStream() = default;

bool OutputStream::isInput() const
{
    return false;
}

bool OutputStream::isDeviceDone() const
{
    const std::lock_guard lock(impl->mutex);
    return impl->deviceDone;
}

unsigned long OutputStream::getCountDimension() const
{
    return impl->info.countDimension;
}

unsigned long OutputStream::write(const std::vector<void*>& dataList)
{
    Impl& stream = *impl;
    Impl::Packets outgoing;
    std::uint64_t written = 0; // counts as the caller wrote them
    for (const void* buffer : dataList) {
        plugin::Packet packet = copyFields(*static_cast<const PropertyMap*>(buffer));
        try {
            stream.convert(packet, &plugin::Converter::convertOutput);
        } catch (...) {
            throw CouldNotConvertOutputData(currentExceptionText());
        }
        if (packet.counts > 0) {
            written += packet.counts;
            outgoing.emplace_back(std::move(packet));
        }
    }

    const auto refuse = [&](const std::string& why) {
        throw SynchronousOutputNotPossible("Cannot write " + std::to_string(written) +
                                           " counts: " + why + ".");
    };
    const auto requirePossible = [&](std::uint64_t counts) {
        if (!stream.fits(counts)) {
            refuse(std::string("there is no room and ") + stream.reason());
        }
        if (counts > 0 && stream.phase == Phase::Open && stream.deviceDone) {
            refuse("the device is done");
        }
    };
    std::unique_lock lock(stream.mutex);
    if (written > stream.limit) {
        refuse("the limit is " + std::to_string(stream.limit));
    }
    stream.waitUntil(
        lock, [&] { return stream.fits(written) || !stream.isFlowing(); }, stream.timeout);
    requirePossible(written);

    std::uint64_t filtered = written;
    if (!stream.filters.empty()) {
        // Only now, so that a filter does not see twice what is refused and written again. Meanwhile
        // nobody but this thread takes the room.
        lock.unlock();
        filtered = stream.applyFilters(outgoing);
        lock.lock();
        requirePossible(filtered);
    }
    stream.packets.splice(stream.packets.end(), outgoing);
    stream.counts += filtered;
    stream.notifyDevice(lock);
    return written;
}

} // namespace brenixcore
