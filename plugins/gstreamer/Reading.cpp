#include "Reading.hpp"

#include "Elements.hpp"

#include <gst/app/gstappsink.h>

#include <cmath>
#include <cstring>
#include <stdexcept>
#include <utility>

namespace gstreamer
{

using namespace brenixcore::plugin;

namespace
{

/// How far the times of buffers that follow each other may be apart: the clock of a source is not that of the
/// pipeline.
constexpr GstClockTime jitter = 40 * GST_MSECOND;

class Map
{
public:
    explicit Map(GstBuffer* mapped) : buffer(mapped)
    {
        if (gst_buffer_map(buffer, &info, GST_MAP_READ) == FALSE) {
            throw std::runtime_error("A buffer of the pipeline cannot be read.");
        }
    }
    Map(const Map&) = delete;
    Map& operator=(const Map&) = delete;
    ~Map() { gst_buffer_unmap(buffer, &info); }

    GstMapInfo info{};

private:
    GstBuffer* const buffer;
};

} // namespace

Reading::Reading(Pipeline& own, DeviceHost& deviceHost, DeviceStreams& itsStreams,
                 TellFormat tellFormat)
    : pipeline(own), host(deviceHost), streams(itsStreams), tell(std::move(tellFormat))
{
}

void Reading::run()
{
    auto* const sink = GST_APP_SINK(pipeline.end());
    while (!streams.isClosing()) {
        // Before the look for a sample: what comes before the end is delivered.
        const bool isLast = gst_app_sink_is_eos(sink) != FALSE;
        const Owned<GstSample> sample(gst_app_sink_try_pull_sample(sink, 0));
        if (sample) {
            if (!deliver(sample.get())) {
                return;
            }
            continue;
        }
        pipeline.check();
        if (isLast) {
            return;
        }
        pipeline.signal().wait(std::chrono::steady_clock::now() + std::chrono::seconds(1));
    }
}

bool Reading::deliver(GstSample* sample)
{
    GstBuffer* const buffer = gst_sample_get_buffer(sample);
    GstCaps* const now = gst_sample_get_caps(sample);
    if (now != nullptr && (!caps || gst_caps_is_equal(now, caps.get()) == FALSE)) {
        format = formatOf(now);
        caps.reset(gst_caps_ref(now));
        nextOffset = GST_BUFFER_OFFSET_NONE;
        tell(format, now);
    }
    if (buffer == nullptr || gst_buffer_get_size(buffer) == 0) {
        return true;
    }
    Packet packet = convert(buffer);
    follow(buffer, gst_sample_get_segment(sample), packet);
    return streams.push(std::move(packet));
}

Packet Reading::convert(GstBuffer* buffer)
{
    const Map map(buffer);
    Packet packet;
    packet.counts = map.info.size / format.frameSize;
    if (packet.counts * format.frameSize != map.info.size) {
        throw std::runtime_error("A buffer of " + std::to_string(map.info.size) +
                                 " bytes is no whole number of frames of " +
                                 std::to_string(format.frameSize) + " bytes.");
    }
    const std::size_t elements = packet.counts * format.channels;
    auto data = format.type->make(elements);
    const auto space = *format.type->find(data.get());
    if (format.packed != nullptr) {
        format.packed->unpack_func(format.packed, GST_AUDIO_PACK_FLAG_NONE, space.data(),
                                   map.info.data, static_cast<int>(elements));
    } else {
        std::memcpy(space.data(), map.info.data, map.info.size);
        if (format.reverses) {
            bytes::reverseEach(space.data(), space.size(), format.type->size);
        }
    }
    setField(packet, std::move(data));
    packet.period = format.rate > 0 ? 1e9 / format.rate : 0;
    return packet;
}

/// When the buffer is, and what is missing before it.
void Reading::follow(GstBuffer* buffer, const GstSegment* segment, Packet& packet)
{
    GstClockTime time = GST_CLOCK_TIME_NONE;
    if (GST_BUFFER_PTS_IS_VALID(buffer) && segment != nullptr &&
        segment->format == GST_FORMAT_TIME) {
        time = gst_segment_to_running_time(segment, GST_FORMAT_TIME, GST_BUFFER_PTS(buffer));
    }
    const bool isBehindGap = GST_BUFFER_FLAG_IS_SET(buffer, GST_BUFFER_FLAG_DISCONT);
    const bool hasTimes = GST_CLOCK_TIME_IS_VALID(time) && GST_CLOCK_TIME_IS_VALID(nextTime);
    const GstClockTime jump = hasTimes && time > nextTime ? time - nextTime : 0;
    const std::uint64_t offset = GST_BUFFER_OFFSET(buffer);
    if (format.isAudio) {
        const double late = std::round(static_cast<double>(jump) * format.rate / 1e9);
        // Some sources number buffers or bytes instead: then their times tell nothing of the kind.
        const bool hasOffsets = offset != GST_BUFFER_OFFSET_NONE &&
                                nextOffset != GST_BUFFER_OFFSET_NONE && offset > nextOffset;
        if (isBehindGap && hasOffsets && jump > 0) {
            packet.lost = offset - nextOffset;
        } else if (isBehindGap || jump > jitter) {
            packet.lost = static_cast<std::uint64_t>(late);
        }
    } else if (isBehindGap && jump > GST_MSECOND) {
        const std::string what = std::to_string(jump / GST_MSECOND) +
                                 " milliseconds of data are missing; how many bytes is not known.";
        host.raise("error", "brenix:Device:dataLost", what.c_str());
    }
    const bool hasEnd = offset != GST_BUFFER_OFFSET_NONE && format.isAudio;
    nextOffset = hasEnd ? offset + packet.counts : GST_BUFFER_OFFSET_NONE;
    GstClockTime length = GST_BUFFER_DURATION(buffer);
    if (format.isAudio) {
        length = gst_util_uint64_scale_round(packet.counts, GST_SECOND,
                                             static_cast<guint64>(format.rate));
    }
    if (!GST_CLOCK_TIME_IS_VALID(time) || !GST_CLOCK_TIME_IS_VALID(length)) {
        nextTime = GST_CLOCK_TIME_NONE;
    } else {
        nextTime = time + length;
    }
    packet.time = dateOf(time);
}

/// In nanoseconds since 1970; 0 where the pipeline has no clock or the buffer no time.
std::int64_t Reading::dateOf(GstClockTime runningTime)
{
    if (!epoch) {
        const Owned<GstClock> clock(gst_element_get_clock(pipeline.all()));
        if (!clock) {
            return 0;
        }
        const auto now = std::chrono::duration_cast<std::chrono::nanoseconds>(
            std::chrono::system_clock::now().time_since_epoch());
        epoch = now.count() - static_cast<std::int64_t>(gst_clock_get_time(clock.get())) +
                static_cast<std::int64_t>(gst_element_get_base_time(pipeline.all()));
    }
    return GST_CLOCK_TIME_IS_VALID(runningTime) ? *epoch + static_cast<std::int64_t>(runningTime)
                                                : 0;
}

} // namespace gstreamer
