#include "Playback.hpp"

#include "Timeline.hpp"

#include <algorithm>
#include <optional>
#include <utility>

namespace hdf5
{

void play(Replay& replay, const Notes& notes, Part part, const Wait& wait,
          brenixcore::plugin::DeviceStreams& streams)
{
    Timeline times(notes);
    std::uint64_t lost = 0;
    auto next = replay.gaps().begin();
    const auto end = replay.gaps().end();
    const auto pass = [&] {
        times.pass(*next);
        lost += next->lost;
        return (next++)->lost;
    };
    while (next != end && next->index < part.first) {
        pass();
    }
    const auto began = std::chrono::steady_clock::now();
    std::optional<std::chrono::nanoseconds> before; // of the first packet
    for (std::uint64_t index = part.first;;) {
        while (next != end && (next->index <= index || index == replay.counts())) {
            if (const std::uint64_t counts = pass(); counts > 0) {
                streams.tellLost(counts, "the recording has a gap");
            }
        }
        if (index == replay.counts()) {
            return;
        }
        std::uint64_t behind = std::min(replay.counts(), index + part.blockSize);
        if (next != end) {
            behind = std::min(behind, next->index);
        }
        brenixcore::plugin::Packet packet;
        packet.counts = behind - index;
        packet.time = times.time(index);
        packet.index = index + lost;
        auto elements = replay.type().make(packet.counts * replay.channels());
        replay.read(index, packet.counts, replay.type().find(elements.get())->data());
        setField(packet, std::move(elements));
        if (wait) {
            before = before.value_or(times.elapsed(index));
            wait(began + times.elapsed(behind) - *before);
        }
        if (!streams.push(std::move(packet))) {
            return;
        }
        index = behind;
    }
}

} // namespace hdf5
