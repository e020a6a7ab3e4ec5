// When the counts of a recording were.
#ifndef BRENIX_PLUGINS_HDF5_TIMELINE_HPP
#define BRENIX_PLUGINS_HDF5_TIMELINE_HPP

#include "Notes.hpp"

#include <algorithm>
#include <chrono>
#include <cmath>
#include <cstdint>

namespace hdf5
{

/// From its start, its rate, and the gaps that were passed so far.
class Timeline
{
public:
    explicit Timeline(const Notes& notes) : rate(notes.rate), base{0, notes.start, 0} {}

    /// Goes on behind a gap. One that tells no time takes as long as the counts that are missing.
    void pass(const Gap& gap)
    {
        const std::int64_t missing = duration(gap.lost);
        const std::int64_t before = time(gap.index);
        const std::int64_t after = gap.time != 0 ? gap.time : before == 0 ? 0 : before + missing;
        const bool isKnown = before != 0 && after != 0;
        const std::int64_t jump = isKnown ? std::max<std::int64_t>(after - before, 0) : missing;
        base = {gap.index, after, elapsed(gap.index).count() + jump};
    }

    /// Of a count, in nanoseconds since 1970 (UTC); 0 when it is not known.
    std::int64_t time(std::uint64_t index) const
    {
        const bool isKnown = base.time != 0 && (rate > 0 || index == base.index);
        return isKnown ? base.time + duration(index - base.index) : 0;
    }

    /// How long after the start of the recording a count was.
    std::chrono::nanoseconds elapsed(std::uint64_t index) const
    {
        return std::chrono::nanoseconds(base.elapsed + duration(index - base.index));
    }

private:
    /// In nanoseconds.
    std::int64_t duration(std::uint64_t counts) const
    {
        constexpr double longest = 1e18; // some 30 years
        return rate > 0 ? std::llround(std::min(static_cast<double>(counts) / rate * 1e9, longest))
                        : 0;
    }

    struct Base {
        std::uint64_t index;
        std::int64_t time;
        std::int64_t elapsed;
    };
    double rate;
    Base base; ///< the last gap, or the start
};

} // namespace hdf5

#endif
