// What the output stream brings, on its way into a pipeline.
#ifndef BRENIX_PLUGINS_GSTREAMER_WRITING_HPP
#define BRENIX_PLUGINS_GSTREAMER_WRITING_HPP

#include "Pipeline.hpp"

#include "brenixcore/plugin/Plugin.hpp"

#include <chrono>
#include <cstdint>
#include <span>
#include <string>
#include <vector>

namespace gstreamer
{

/// One run.
class Writing
{
public:
    Writing(Pipeline& own, const Format& itsFormat, std::chrono::duration<double> itsCloseTimeout,
            brenixcore::plugin::DeviceHost& deviceHost,
            brenixcore::plugin::DeviceStreams& itsStreams);

    void run();

private:
    void write();
    void take(brenixcore::plugin::Packet packet);
    void append(std::span<unsigned char> elements);
    void end();
    bool isLate();
    std::uint64_t left() const;

    Pipeline& pipeline;
    const Format format;
    const std::chrono::duration<double> closeTimeout;
    brenixcore::plugin::DeviceHost& host;
    brenixcore::plugin::DeviceStreams& streams;

    std::vector<unsigned char> rest; ///< of a frame that has not all of its samples
    std::uint64_t frames = 0;
    std::uint64_t dropped = 0; ///< elements that the pipeline refused
    std::uint64_t refused = 0; ///< counts of another type
    std::string besides;       ///< a sentence that tells of them
    std::uint64_t lastLeft = 0;
    std::chrono::steady_clock::time_point
        moved; ///< when the pipeline last took something while closing
    bool isClosing = false;
};

} // namespace gstreamer

#endif
