#ifndef BRENIXCODER_UTIL_NUMBERS_HPP
#define BRENIXCODER_UTIL_NUMBERS_HPP

#include <cstdint>

namespace brenixcoder
{

/// A count from generated code: below zero is 0; NaN and 2^64 or more are 2^64 - 1; the rest is cut
/// toward zero.
constexpr uint64_t toUint64Saturated(double value) noexcept
{
    if (!(value < 18446744073709551616.0)) { // 2^64; false for NaN as well
        return UINT64_MAX;
    }
    return value > 0 ? static_cast<uint64_t>(value) : 0;
}

} // namespace brenixcoder

#endif
