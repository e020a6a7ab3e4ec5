#ifndef BRENIXCODER_STREAMS_OUTPUTSTREAM_HPP
#define BRENIXCODER_STREAMS_OUTPUTSTREAM_HPP

#include "brenixplugin/BufferTaker.hpp"
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
        : Stream(stream, ownDirection, owner),
          taker(dynamic_cast<brenixplugin::interfaces::IBufferTaker*>(stream))
    {
    }

    /// Writes `numBuffers` buffers of one type, each given by an int (element count) and a
    /// const void* (elements) of `buffers`, which are copied. Returns the counts written.
    double writeTypedData(uint64_t numBuffers, const std::string& typeName, va_list* buffers);

private:
    brenixplugin::interfaces::IBufferTaker* taker; ///< the core stream, if it takes buffers over
};

} // namespace brenixcoder

#endif
