#ifndef BRENIXCODER_CHANNEL_ERRORTEXT_HPP
#define BRENIXCODER_CHANNEL_ERRORTEXT_HPP

#include <array>
#include <cstddef>
#include <exception>
#include <string_view>

namespace brenixcoder
{

/// Size of the caller's identifier and message buffers, the final NUL included.
constexpr std::size_t errorBufferSize = 1024;

/// An identifier or message, kept in place and cut to what a caller's buffer takes. Storing one
/// needs no memory, so that no error can be lost for want of it.
class ErrorText
{
public:
    ErrorText& operator=(std::string_view text) noexcept
    {
        length = text.copy(characters.data(), characters.size());
        return *this;
    }

    /// The same for a text of a plug-in, which may be null: then there is none.
    ErrorText& operator=(const char* text) noexcept
    {
        return *this = std::string_view(text == nullptr ? "" : text);
    }

    void clear() noexcept { length = 0; }
    bool empty() const noexcept { return length == 0; }
    std::string_view view() const noexcept { return {characters.data(), length}; }

private:
    std::size_t length = 0;
    std::array<char, errorBufferSize - 1> characters; ///< of which `length` are set
};

/// Copies a text into a caller's buffer of `size` bytes: at most size - 1 bytes and a NUL. A NUL in
/// the text ends it; the rest of its bytes are then NUL as well. Bytes after them are left alone.
void copyToBuffer(std::string_view text, char* destination, std::size_t size) noexcept;

/// Turns an exception into an identifier and a message; null stands for what is no std::exception.
void translateException(const std::exception* exception, ErrorText& id,
                        ErrorText& message) noexcept;

} // namespace brenixcoder

#endif
