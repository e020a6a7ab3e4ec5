#ifndef BRENIXCORE_SRC_LOSSES_HPP
#define BRENIXCORE_SRC_LOSSES_HPP

#include <array>
#include <cstdint>
#include <cstdio>
#include <vector>

namespace brenixcore
{

/// The reason where a device gives none.
constexpr const char* lostByDevice = "the device lost them";

/// Counts that were lost in one place of a stream. Needs no memory, with which they would not be counted.
struct Gap {
    std::uint64_t counts = 0;
    std::array<char, 256> reason{}; ///< of the first of them, cut where it is longer
    std::uint64_t sum = 0;          ///< lost since open, with these

    void add(std::uint64_t more, const char* why) noexcept
    {
        if (counts == 0) {
            std::snprintf(reason.data(), reason.size(), "%s", why);
        }
        counts += more;
    }
};

/// What an input stream has lost since open, and what of it is still to be told. A gap is told when it can
/// no longer grow.
class Losses
{
public:
    std::uint64_t getSum() const { return sum; }
    bool hasNews() const { return news || !ended.empty(); }

    void clear() { *this = Losses(); }

    /// Behind all that waits, where the next packet ends the gap.
    void addAtEnd(std::uint64_t counts, const char* reason) { add(atEnd, counts, reason); }
    void endAtEnd() { end(atEnd); }

    /// Before all that waits, where the next read ends the gap.
    void addAtFront(std::uint64_t counts, const char* reason)
    {
        if (frontIsRead) {
            endAtFront();
        }
        add(atFront, counts, reason);
    }
    void endAtFront()
    {
        end(atFront);
        frontIsRead = false;
    }

    /// The caller goes beyond the gap at the front; the device's thread tells it.
    void passFront() { frontIsRead = atFront.counts > 0; }
    bool isFrontPassed() const { return frontIsRead; }

    /// Told otherwise.
    void addTold(std::uint64_t counts)
    {
        sum += counts;
        news = true;
    }

    /// The gaps that ended and are not told yet.
    const std::vector<Gap>& getEnded() const { return ended; }

    /// Whether the sum is to be told.
    void setNews(bool isNew) { news = isNew; }

    /// The first of them is told.
    void forgetGap() { ended.erase(ended.begin()); }

private:
    void add(Gap& gap, std::uint64_t counts, const char* reason)
    {
        gap.add(counts, reason);
        addTold(counts);
    }

    void end(Gap& gap)
    {
        if (gap.counts > 0) {
            gap.sum = sum;
            ended.push_back(gap); // or it goes on
            gap = {};
        }
    }

    std::uint64_t sum = 0;
    Gap atEnd;
    Gap atFront;
    bool frontIsRead = false;
    std::vector<Gap> ended;
    bool news = false;
};

} // namespace brenixcore

#endif
