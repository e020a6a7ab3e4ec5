// Random sequences, one after the other.
//
// BRENIX_SEED is the seed of the first; the next has the next one, so that a sequence that failed can be run
// first. BRENIX_SOAK_SECONDS is how long to go on.
#ifndef BRENIXCODER_TESTS_SOAK_HPP
#define BRENIXCODER_TESTS_SOAK_HPP

#include <gtest/gtest.h>

#include <chrono>
#include <cstdint>
#include <cstdlib>
#include <iostream>
#include <random>
#include <string>

inline std::uint64_t environment(const char* name, std::uint64_t otherwise)
{
    const char* const text = std::getenv(name);
    return text == nullptr ? otherwise : std::stoull(text);
}

/// Runs sequences, each of which tells how many steps it had, until the time is over or one fails.
template <typename Sequence>
void soak(std::uint64_t seconds, const Sequence& sequence)
{
    using Clock = std::chrono::steady_clock;
    const auto end =
        Clock::now() + std::chrono::seconds(environment("BRENIX_SOAK_SECONDS", seconds));
    const std::uint64_t seed = environment("BRENIX_SEED", std::random_device()());
    std::cout << "BRENIX_SEED=" << seed << std::endl;
    std::uint64_t sequences = 0;
    std::uint64_t steps = 0;
    do {
        SCOPED_TRACE("BRENIX_SEED=" + std::to_string(seed + sequences));
        steps += sequence(seed + sequences);
        ++sequences;
    } while (!testing::Test::HasFailure() && Clock::now() < end);
    std::cout << sequences << " sequences, " << steps << " steps" << std::endl;
}

#endif
