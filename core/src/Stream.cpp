#include "Stream.hpp"

#include "Packets.hpp"

#include <algorithm>
#include <chrono>
#include <stdexcept>
#include <string>
#include <utility>

namespace brenixcore
{

using brenixplugin::PropertyMap;

bool Stream::Impl::push(plugin::Packet& packet, bool waits, plugin::DeviceHost& host)
{
    Queue::Lock lock = queue.lock();
    if (!queue.awaitTurn(lock, waits)) {
        return false;
    }
    if (!filters.empty()) {
        lock.unlock();
        try {
            filters.apply(packet);
        } catch (...) {
            host.raise("error", "brenix:Stream:filterFailed", currentExceptionText().c_str());
            return true; // without this packet
        }
        lock.lock();
    }
    queue.bring(lock, std::move(packet));
    return true;
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

void Stream::Impl::convertAndFilter(Queue::Packets& outgoing)
{
    try {
        std::uint64_t filtered = 0;
        for (QueuedPacket& queued : outgoing) {
            plugin::Packet& packet = queued.packet;
            convert(packet, &plugin::Converter::convertOutput);
            filters.apply(packet);
            if (packet.counts > queue.getLimit() - filtered) {
                throw std::length_error("The filters made more counts than the limit.");
            }
            filtered += packet.counts;
        }
    } catch (...) {
        throw CouldNotConvertOutputData(currentExceptionText());
    }
    outgoing.erase(std::remove_if(outgoing.begin(), outgoing.end(),
                                  [](const QueuedPacket& queued) { return queued.counts() == 0; }),
                   outgoing.end());
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
    impl->reasons.explain([&] {
        if (isOpen()) {
            throw CannotAddFilterWhileOpen("Cannot add filter " + filterName +
                                           " while the channel is open.");
        }
        impl->filters.add(filterName, options);
    });
}

void Stream::tuneFilters(const PropertyMap& options)
{
    const OwnedOptions owned(options);
    impl->reasons.explain([&] { impl->filters.tune(options); });
}

void Stream::flush()
{
    impl->queue.flush();
}

bool Stream::isOpen() const
{
    return impl->queue.getPhase(impl->queue.lock()) != Phase::Closed;
}

bool Stream::isUnlimited() const
{
    return impl->queue.getLimit() == UINT64_MAX;
}

unsigned long Stream::getDataAvailable() const
{
    return impl->queue.getCounts();
}

unsigned long Stream::getSpaceAvailable() const
{
    const std::uint64_t limit = impl->queue.getLimit();
    return limit - std::min(limit, impl->queue.getCounts());
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
    return impl->queue.isDone();
}

unsigned long InputStream::getCountDimension() const
{
    return impl->info.countDimension;
}

void InputStream::peekCounts(unsigned long limit, unsigned long& total,
                             std::vector<unsigned long>& counts)
{
    impl->reasons.explain([&] { impl->queue.list(limit, total, counts); });
}

void InputStream::read(unsigned long count, std::vector<void*>& buffers, unsigned long& countRead)
{
    Impl& stream = *impl;
    // Whatever is not delivered below goes back to where it was.
    struct Taken {
        ~Taken()
        {
            if (!packets.empty()) {
                queue.putBack(packets);
            }
        }
        Queue& queue;
        Queue::Packets packets;
    };
    stream.reasons.explain([&] {
        Taken taken{stream.queue, stream.queue.take(count)};
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
    });
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
    return impl->queue.isDone();
}

unsigned long OutputStream::getCountDimension() const
{
    return impl->info.countDimension;
}

unsigned long OutputStream::write(const std::vector<void*>& dataList)
{
    Impl& stream = *impl;
    return stream.reasons.explain([&] {
        const auto begin = stream.filters.empty() ? std::chrono::steady_clock::time_point()
                                                  : std::chrono::steady_clock::now();
        Queue::Packets outgoing;
        outgoing.reserve(dataList.size());
        std::uint64_t written = 0; // counts as the caller wrote them
        for (const void* buffer : dataList) {
            outgoing.emplace_back(copyFields(*static_cast<const PropertyMap*>(buffer)));
            written += outgoing.back().counts();
        }
        // First, so that neither the converter nor a filter sees twice what is refused and written again.
        stream.queue.awaitRoom(written);
        stream.convertAndFilter(outgoing);
        stream.queue.add(outgoing, begin);
        return written;
    });
}

} // namespace brenixcore
