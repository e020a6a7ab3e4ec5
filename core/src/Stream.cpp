#include "Stream.hpp"

#include "Packets.hpp"
#include "brenixcore/plugin/Make.hpp"

#include <algorithm>
#include <chrono>
#include <stdexcept>
#include <string>
#include <utility>
#include <vector>

namespace brenixcore
{

using brenixplugin::PropertyMap;

bool Stream::Impl::push(plugin::Packet& packet, bool waits)
{
    Queue::Lock lock = queue.lock();
    if (!queue.awaitTurn(lock, waits)) {
        return false;
    }
    if (packet.period == 0 && info.rate > 0) {
        packet.period = 1e9 / info.rate;
    }
    if (!filters.empty()) {
        const std::uint64_t brought = packet.counts;
        lock.unlock();
        const std::uint64_t lost = packet.lost; // which filters may look at, but not change
        try {
            filters.apply(packet);
        } catch (...) { // without this packet
            queue.lose(brought, nullptr);
            if (lost > 0) {
                queue.lose(lost, lostByDevice);
            }
            const std::string reason = currentExceptionText();
            tellLosses(false);
            reporter.raise("error", "brenix:Stream:filterFailed", reason.c_str());
            return true;
        }
        packet.lost = lost;
        packet.index.reset(); // what filters leave are other counts
        lock.lock();
    }
    if (queue.bring(lock, std::move(packet))) {
        tellLosses(false);
    }
    return true;
}

void Stream::Impl::tellLosses(bool atEnd)
{
    const auto gaps = queue.takeNews(atEnd);
    if (!gaps) {
        return;
    }
    try {
        reporter.updateLostCounts();
    } catch (...) {
        queue.keepNews();
        throw;
    }
    for (const Gap& gap : *gaps) {
        const std::string message = std::to_string(gap.counts) +
                                    " counts were lost: " + gap.reason.data() + "; " +
                                    std::to_string(gap.sum) + " since open.";
        reporter.raise("error", "brenix:Stream:dataLost", message.c_str());
        queue.forgetGap();
    }
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

void Stream::Impl::send(Queue::Packets& outgoing, std::chrono::steady_clock::time_point begin)
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
    std::erase_if(outgoing, [](const QueuedPacket& queued) { return queued.counts() == 0; });
    queue.add(outgoing, begin);
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
    impl->reporter.explain([&] {
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
    impl->reporter.explain([&] { impl->filters.tune(options); });
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
    impl->reporter.explain([&] { impl->queue.list(limit, total, counts); });
}

void InputStream::read(unsigned long count, std::vector<void*>& buffers, unsigned long& countRead)
{
    Impl& stream = *impl;
    // Whatever is not delivered below goes back to where it was.
    struct Taken {
        ~Taken() { queue.settle(packets); }
        Queue& queue;
        Queue::Packets packets;
    };
    stream.reporter.explain([&] {
        Taken taken{stream.queue, stream.queue.take(count)};
        buffers.reserve(taken.packets.size());
        for (auto current = taken.packets.begin(); current != taken.packets.end(); ++current) {
            if (current->converted) {
                continue;
            }
            const std::uint64_t counts = current->counts(); // which the converter may change
            try {
                stream.convert(current->packet, &plugin::Converter::convertInput);
                current->converted = true;
            } catch (...) {
                current->packet.counts = counts;
                const std::string reason = currentExceptionText();
                stream.queue.loseTaken(counts);
                taken.packets.erase(current);
                stream.reporter.updateLostCounts();
                throw CouldNotConvertInputData(reason);
            }
        }
        if (stream.stamps) {
            for (QueuedPacket& queued : taken.packets) {
                plugin::setField(
                    queued.packet,
                    plugin::makeScalar("Index", queued.packet.index.value_or(queued.index)));
                plugin::setField(queued.packet, plugin::makeScalar("Time", queued.packet.time));
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
    return impl->reporter.explain([&] {
        const auto begin = std::chrono::steady_clock::now();
        Queue::Packets outgoing;
        outgoing.reserve(dataList.size());
        std::uint64_t written = 0; // counts as the caller wrote them
        for (const void* buffer : dataList) {
            outgoing.emplace_back(copyFields(*static_cast<const PropertyMap*>(buffer)));
            written += outgoing.back().counts();
        }
        // First, so that neither the converter nor a filter sees twice what is refused and written again.
        impl->queue.awaitRoom(written);
        impl->send(outgoing, begin);
        return written;
    });
}

unsigned long OwningOutputStream::takeBuffers(std::vector<void*>& dataList)
{
    return impl->reporter.explain([&] {
        const auto begin = std::chrono::steady_clock::now();
        Queue::Packets outgoing;
        outgoing.reserve(dataList.size());
        std::uint64_t written = 0;
        for (const void* buffer : dataList) {
            plugin::Packet packet{plugin::Fields(nullptr)};
            packet.counts = countsOf(*static_cast<const PropertyMap*>(buffer));
            written += packet.counts;
            outgoing.emplace_back(std::move(packet));
        }
        impl->queue.awaitRoom(written); // the buffers are the caller's until here
        for (std::size_t i = 0; i < dataList.size(); ++i) {
            plugin::Fields& fields = outgoing[i].packet.fields;
            fields = plugin::Fields(brenixplugin::OwnedDataBuffer(
                static_cast<PropertyMap*>(std::exchange(dataList[i], nullptr))));
            fields.setChecked(true);
        }
        impl->send(outgoing, begin);
        return written;
    });
}

} // namespace brenixcore
