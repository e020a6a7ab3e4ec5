// Texts in messages are UTF-8; names of fields, options and streams are short as well.
#ifndef BRENIX_PLUGINS_MESSAGES_TEXTS_HPP
#define BRENIX_PLUGINS_MESSAGES_TEXTS_HPP

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string>
#include <string_view>

namespace messages
{

inline bool isUtf8(std::string_view text)
{
    for (std::size_t i = 0; i < text.size();) {
        std::uint64_t eight = 0; // most texts are ASCII
        if (text.size() - i >= sizeof eight) {
            std::memcpy(&eight, text.data() + i, sizeof eight);
            if ((eight & 0x8080808080808080) == 0) {
                i += sizeof eight;
                continue;
            }
        }
        const auto byte = [&](std::size_t at) {
            return at < text.size() ? static_cast<unsigned char>(text[at]) : 0U;
        };
        const unsigned int first = byte(i);
        if (first < 0x80) {
            ++i;
            continue;
        }
        const std::size_t length = first < 0xC2   ? 0
                                   : first < 0xE0 ? 2
                                   : first < 0xF0 ? 3
                                   : first < 0xF5 ? 4
                                                  : 0;
        if (length == 0) {
            return false;
        }
        // What would be longer than needed, a surrogate, or beyond the last character.
        const unsigned int least = first == 0xE0 ? 0xA0 : first == 0xF0 ? 0x90 : 0x80;
        const unsigned int most = first == 0xED ? 0x9F : first == 0xF4 ? 0x8F : 0xBF;
        for (std::size_t next = 1; next < length; ++next) {
            if (byte(i + next) < (next == 1 ? least : 0x80) ||
                byte(i + next) > (next == 1 ? most : 0xBF)) {
                return false;
            }
        }
        i += length;
    }
    return true;
}

constexpr std::size_t maxName = 255; ///< bytes

inline bool hasLengthOfName(std::string_view text)
{
    return !text.empty() && text.size() <= maxName && text.find('\0') == std::string_view::npos;
}

/// The bytes of a text that a caller wrote, who has a code unit for each byte, by sign extension; UTF-8 of
/// any other.
inline std::string toBytes(const std::u16string& text)
{
    const bool isBytes = std::all_of(text.begin(), text.end(),
                                     [](char16_t unit) { return unit < 0x80 || unit >= 0xFF80; });
    std::string bytes;
    const auto add = [&](std::uint32_t value) { bytes += static_cast<char>(value & 0xFF); };
    for (std::size_t i = 0; i < text.size(); ++i) {
        std::uint32_t code = text[i];
        if (isBytes || code < 0x80) {
            add(code);
            continue;
        }
        if (code >= 0xD800 && code < 0xDC00 && i + 1 < text.size() && text[i + 1] >= 0xDC00 &&
            text[i + 1] < 0xE000) {
            code = 0x10000 + ((code - 0xD800) << 10U) + (text[++i] - 0xDC00U);
        }
        if (code < 0x800) {
            add(0xC0 | code >> 6U);
        } else if (code < 0x10000) {
            add(0xE0 | code >> 12U);
            add(0x80 | (code >> 6U & 0x3F));
        } else {
            add(0xF0 | code >> 18U);
            add(0x80 | (code >> 12U & 0x3F));
            add(0x80 | (code >> 6U & 0x3F));
        }
        add(0x80 | (code & 0x3F));
    }
    return bytes;
}

} // namespace messages

#endif
