#ifndef BRENIXCODER_STREAMS_OUTPUTSTREAM_HPP
#define BRENIXCODER_STREAMS_OUTPUTSTREAM_HPP

#include "streams/Stream.hpp"

#include <cstdarg>
#include <cstdint>
#include <string>

namespace brenixcoder
{

/// The output stream of a channel.
class OutputStream : public Stream
{
public:
    static constexpr StreamDirection ownDirection = StreamDirection::Output;

    OutputStream(brenixcore::OutputStream* stream, Channel& owner) noexcept
        : Stream(stream, ownDirection, owner)
    {
    }

    /// Writes `numBuffers` buffers of one type, each given by an int (element count) and a
    /// const void* (elements) of `buffers`, which are copied. Returns the counts written.
    double writeTypedData(uint64_t numBuffers, const std::string& typeName, va_list* buffers);
};

} // namespace brenixcoder

#endif
