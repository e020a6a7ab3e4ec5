#include "Writing.hpp"

#include "Elements.hpp"

#include <gst/app/gstappsrc.h>

#include <stdexcept>
#include <utility>

namespace gstreamer
{

using namespace brenixcore::plugin;
using std::chrono::steady_clock;

Writing::Writing(Pipeline& own, const Format& itsFormat,
                 std::chrono::duration<double> itsCloseTimeout, DeviceHost& deviceHost,
                 DeviceStreams& itsStreams)
    : pipeline(own), format(itsFormat), closeTimeout(itsCloseTimeout), host(deviceHost),
      streams(itsStreams)
{
}

void Writing::run()
{
    try {
        write();
    } catch (const std::exception& failure) {
        const std::uint64_t lost =
            dropped + rest.size() / format.type->size + left() + discardOutput(streams);
        throw std::runtime_error(
            std::string(failure.what()) +
            (lost > 0 ? " At least " + std::to_string(lost) + " elements were not taken." : "") +
            besides);
    }
}

void Writing::write()
{
    auto* const source = GST_APP_SRC(pipeline.end());
    for (;;) {
        const bool isLast = streams.isClosing(); // before the last look at the output
        if (pipeline.hasEnded()) {
            throw std::runtime_error("The pipeline has ended by itself.");
        }
        if (gst_app_src_get_current_level_bytes(source) < gst_app_src_get_max_bytes(source)) {
            if (auto packet = streams.tryPull()) {
                take(std::move(*packet));
                continue;
            }
            if (isLast) {
                break;
            }
        }
        if (isLast && isLate()) {
            throw std::runtime_error("The pipeline takes nothing more.");
        }
        pipeline.signal().wait(steady_clock::now() + std::chrono::milliseconds(100));
    }
    end();
}

void Writing::take(Packet packet)
{
    const auto data = takeField(packet, dataField);
    if (const auto found = format.type->find(data.get())) {
        append(*found);
        return;
    }
    refused += packet.counts;
    besides = ' ' + std::to_string(refused) + " counts were not written: elements must be " +
              std::string(format.type->name) + ", not " + bytes::describe(data.get()) + ".";
    host.raise("error", "brenix:Device:wrongType", besides.c_str() + 1);
}

void Writing::append(std::span<unsigned char> elements)
{
    if (format.reverses) {
        bytes::reverseEach(elements.data(), elements.size(), format.type->size);
    }
    const std::size_t all = rest.size() + elements.size();
    const std::size_t whole = all - all % format.frameSize;
    if (whole == 0) {
        rest.insert(rest.end(), elements.begin(), elements.end());
        return;
    }
    GstBuffer* const buffer = gst_buffer_new_allocate(nullptr, whole, nullptr);
    if (buffer == nullptr) {
        throw std::bad_alloc();
    }
    const std::size_t fresh = whole - rest.size();
    gst_buffer_fill(buffer, 0, rest.data(), rest.size());
    gst_buffer_fill(buffer, rest.size(), elements.data(), fresh);
    const auto tail = elements.subspan(fresh);
    rest.assign(tail.begin(), tail.end());
    if (format.rate > 0) {
        const auto rate = static_cast<guint64>(format.rate);
        GST_BUFFER_PTS(buffer) = gst_util_uint64_scale(frames, GST_SECOND, rate);
        frames += whole / format.frameSize;
        GST_BUFFER_DURATION(buffer) =
            gst_util_uint64_scale(frames, GST_SECOND, rate) - GST_BUFFER_PTS(buffer);
    }
    if (gst_app_src_push_buffer(GST_APP_SRC(pipeline.end()), buffer) != GST_FLOW_OK) {
        dropped = whole / format.type->size;
        pipeline.check(); // why, if it tells
        throw std::runtime_error("The pipeline takes nothing more.");
    }
}

/// Tells the pipeline that nothing follows, so that it finishes its files.
void Writing::end()
{
    gst_app_src_end_of_stream(GST_APP_SRC(pipeline.end()));
    while (!pipeline.hasEnded()) {
        if (isLate()) {
            throw std::runtime_error("The pipeline has not ended within CloseTimeout; what it "
                                     "writes may not be complete.");
        }
        pipeline.signal().wait(steady_clock::now() + std::chrono::milliseconds(100));
    }
    if (const auto torn = std::exchange(rest, {}); !torn.empty()) {
        throw std::runtime_error("The last frame has " +
                                 std::to_string(torn.size() / format.type->size) + " of " +
                                 std::to_string(format.channels) + " samples and was not written.");
    }
}

/// Whether the pipeline has taken nothing for the CloseTimeout.
bool Writing::isLate()
{
    const std::uint64_t now = left();
    if (!std::exchange(isClosing, true) || now != lastLeft) {
        lastLeft = now;
        moved = steady_clock::now();
    }
    return steady_clock::now() - moved >= closeTimeout;
}

/// Elements that wait at our end.
std::uint64_t Writing::left() const
{
    return gst_app_src_get_current_level_bytes(GST_APP_SRC(pipeline.end())) / format.type->size;
}

} // namespace gstreamer
