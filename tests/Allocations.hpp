// The allocation functions of a test program, for all of its modules: they fail when a test says so,
// and count.
#ifndef BRENIXCODER_TESTS_ALLOCATIONS_HPP
#define BRENIXCODER_TESTS_ALLOCATIONS_HPP

#include <gtest/gtest.h>

#include <atomic>

namespace allocations
{

inline std::atomic<long> live = 0; ///< blocks that are not freed yet

/// Which allocation from now on fails, 1 is the next and 0 is none: those of threads that let
/// allocations fail, and those of all other threads.
inline std::atomic<long> failingHere = 0, failingElsewhere = 0;
inline std::atomic<long> failed = 0;
inline std::atomic<bool> lasting = false;  ///< whether all after that one fail as well
inline thread_local bool isHere = false;   ///< whether failingHere counts for this thread
inline thread_local bool isExempt = false; ///< whether nothing fails on this thread

/// Lets allocation `number` fail, and with `lasts` all later ones.
class Failing
{
public:
    explicit Failing(long number, bool lasts = true, bool elsewhere = false)
    {
        isHere = true;
        failed = 0;
        lasting = lasts;
        (elsewhere ? failingElsewhere : failingHere) = number;
    }
    Failing(const Failing&) = delete;
    Failing& operator=(const Failing&) = delete;
    ~Failing() { end(); }

    /// From now on none fails; whether one did.
    static bool end()
    {
        failingHere = failingElsewhere = 0;
        return failed > 0;
    }
};

/// Exempts a scripted core and the tests themselves.
struct Allowed {
    Allowed() { isExempt = true; }
    Allowed(const Allowed&) = delete;
    Allowed& operator=(const Allowed&) = delete;
    ~Allowed() { isExempt = wasExempt; }
    const bool wasExempt = isExempt;
};

inline long points = 0; ///< allocations failed by sweeps

/// Lets each allocation fail in turn, alone and with all after it: `point(number, lasts)` has to do
/// so and returns whether one did.
template <typename Point>
void sweep(const Point& point)
{
    for (const bool lasts : {false, true}) {
        for (long number = 1; point(number, lasts); ++number, ++points) {
            ASSERT_LT(number, 1000);
            ASSERT_FALSE(testing::Test::HasFailure()) << "allocation " << number << ", " << lasts;
        }
    }
}

/// Says so at the end of a test.
struct PrintPoints {
    ~PrintPoints()
    {
        EXPECT_GT(points, 0);
        std::printf("%ld allocations failed\n", std::exchange(points, 0));
    }
};

} // namespace allocations

#endif
