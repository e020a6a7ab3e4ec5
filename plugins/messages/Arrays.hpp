// Arrays in messages: typed arrays as of RFC 8746.
#ifndef BRENIX_PLUGINS_MESSAGES_ARRAYS_HPP
#define BRENIX_PLUGINS_MESSAGES_ARRAYS_HPP

#include <bit>
#include <cstddef>
#include <cstdint>
#include <type_traits>

namespace messages
{

/// The tag of arrays of T as this machine holds them.
template <typename T>
constexpr std::uint64_t arrayTag()
{
    constexpr bool isFloat = std::is_floating_point_v<T>;
    constexpr bool isLittle =
        std::endian::native == std::endian::little &&
        (sizeof(T) > 1); // one byte has no order; 68 and 76 mean something else
    return 64U + (isFloat ? 16U : 0U) + (!isFloat && std::is_signed_v<T> ? 8U : 0U) +
           (isLittle ? 4U : 0U) + static_cast<unsigned>(std::countr_zero(sizeof(T))) -
           (isFloat ? 1U : 0U);
}

static_assert(arrayTag<unsigned char>() == 64 && arrayTag<signed char>() == 72);

} // namespace messages

#endif
