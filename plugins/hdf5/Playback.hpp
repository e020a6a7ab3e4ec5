// Delivers a recording.
#ifndef BRENIX_PLUGINS_HDF5_PLAYBACK_HPP
#define BRENIX_PLUGINS_HDF5_PLAYBACK_HPP

#include "Replay.hpp"

#include "brenixcore/plugin/Plugin.hpp"

#include <chrono>
#include <cstdint>
#include <functional>

namespace hdf5
{

using Wait = std::function<void(std::chrono::steady_clock::time_point due)>;

/// Which counts.
struct Part {
    std::uint64_t first = 0;     ///< from which on
    std::uint64_t blockSize = 0; ///< at most, of a packet
};

/// Ends with the recording, or when the channel closes. Gaps are told as losses. Waits for the time of a packet's
/// end where it is given how.
void play(Replay& replay, const Notes& notes, Part part, const Wait& wait,
          brenixcore::plugin::DeviceStreams& streams);

} // namespace hdf5

#endif
