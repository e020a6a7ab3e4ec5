// The sources that GStreamer's device providers see.
#ifndef BRENIX_PLUGINS_GSTREAMER_FIND_HPP
#define BRENIX_PLUGINS_GSTREAMER_FIND_HPP

#include "brenixcore/plugin/Find.hpp"

#include <vector>

namespace gstreamer
{

/// Audio and video sources, each with the Pipeline that opens it.
void findSources(std::vector<brenixcore::plugin::Found>& found);

} // namespace gstreamer

#endif
