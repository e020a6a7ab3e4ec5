// Where the bytes of a message go.
#ifndef BRENIX_PLUGINS_MESSAGES_OUTPUT_HPP
#define BRENIX_PLUGINS_MESSAGES_OUTPUT_HPP

#include "Message.hpp"
#include "Texts.hpp"

#include <cbor.h>

#include <algorithm>
#include <array>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string>
#include <string_view>

namespace messages
{

/// Takes the bytes in their order: writes them, or counts them where there is no place yet.
class Output
{
public:
    explicit Output(unsigned char* place) : bytes(place) {}

    std::size_t getSize() const { return size; }

    /// Where the first large array begins; 0: there is none.
    std::size_t getLarge() const { return large; }

    /// The elements of an array.
    void array(const void* data, std::size_t length)
    {
        put(cbor_encode_bytestring_start, length);
        if (large == 0 && length >= largeArray) {
            large = size;
        }
        copy(data, length);
    }

    /// One of libcbor's functions. It writes what its result says, and no byte more.
    template <typename Encode, typename Value>
    void put(Encode encode, Value value)
    {
        std::array<unsigned char, longestHead> unseen;
        size += encode(value, bytes != nullptr ? bytes + size : unseen.data(), longestHead);
    }

    void copy(const void* data, std::size_t length)
    {
        if (bytes != nullptr && length > 0) {
            std::memcpy(bytes + size, data, length);
        }
        size += length;
    }

    /// Logical values, of one byte each.
    template <typename Flag>
    void flags(Flag begin, std::size_t count)
    {
        unsigned char none = 0;
        cbor_encode_bool(false, &none, 1);
        if (bytes != nullptr) {
            std::transform(
                begin, begin + static_cast<std::ptrdiff_t>(count), bytes + size,
                [none](bool flag) { return static_cast<unsigned char>(none | (flag ? 1 : 0)); });
        }
        size += count;
    }

    void number(std::uint64_t value) { put(cbor_encode_uint, value); }

    /// One that is known to be UTF-8.
    void name(std::string_view text)
    {
        put(cbor_encode_string_start, text.size());
        copy(text.data(), text.size());
    }

    /// What is not UTF-8 stays as it is, as bytes.
    void text(const std::string& value)
    {
        put(isUtf8(value) ? cbor_encode_string_start : cbor_encode_bytestring_start, value.size());
        copy(value.data(), value.size());
    }
    void text(const std::u16string& value) { text(toBytes(value)); }

private:
    static constexpr std::size_t longestHead = 9;

    unsigned char* const bytes;
    std::size_t size = 0;
    std::size_t large = 0;
};

} // namespace messages

#endif
