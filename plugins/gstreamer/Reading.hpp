// What a pipeline delivers, on its way into the input stream.
#ifndef BRENIX_PLUGINS_GSTREAMER_READING_HPP
#define BRENIX_PLUGINS_GSTREAMER_READING_HPP

#include "Pipeline.hpp"

#include "brenixcore/plugin/Plugin.hpp"

#include <cstdint>
#include <functional>
#include <optional>

namespace gstreamer
{

/// One run.
class Reading
{
public:
    /// `tellFormat` is called with each format that comes, and its caps.
    using TellFormat = std::function<void(const Format&, GstCaps*)>;
    Reading(Pipeline& own, brenixcore::plugin::DeviceHost& deviceHost,
            brenixcore::plugin::DeviceStreams& itsStreams, TellFormat tellFormat);

    void run();

private:
    bool deliver(GstSample* sample);
    brenixcore::plugin::Packet convert(GstBuffer* buffer);
    void follow(GstBuffer* buffer, const GstSegment* segment, brenixcore::plugin::Packet& packet);
    std::int64_t dateOf(GstClockTime runningTime);

    Pipeline& pipeline;
    brenixcore::plugin::DeviceHost& host;
    brenixcore::plugin::DeviceStreams& streams;
    const TellFormat tell;

    Format format;
    Owned<GstCaps> caps;
    std::optional<std::int64_t> epoch;           ///< when the pipeline's clock was 0, since 1970
    GstClockTime nextTime = GST_CLOCK_TIME_NONE; ///< that the next buffer should have
    std::uint64_t nextOffset = GST_BUFFER_OFFSET_NONE;
};

} // namespace gstreamer

#endif
