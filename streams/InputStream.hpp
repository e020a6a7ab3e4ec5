#ifndef BRENIXCODER_STREAMS_INPUTSTREAM_HPP
#define BRENIXCODER_STREAMS_INPUTSTREAM_HPP

#include "streams/DataList.hpp"
#include "streams/Stream.hpp"

#include <cstdint>
#include <string>

namespace brenixcoder
{

/// The input stream of a channel, with the store of data buffers that the last read delivered.
/// Buffers are numbered from 1 and keep their numbers when others are freed.
class InputStream : public Stream
{
public:
    static constexpr StreamDirection ownDirection = StreamDirection::Input;

    InputStream(brenixcore::InputStream* stream, Channel& owner) noexcept
        : Stream(stream, ownDirection, owner)
    {
    }

    /// Reports the counts of waiting buffers, at most *numBuffers of them, and their sum.
    void peek(double* totalCounts, double* bufferCounts, double* numBuffers, double maxCounts);

    /// Takes counts from the core into the store. When it throws, the store is as it was.
    void readBuffers(double countsToRead, double expectedBuffers);

    /// Copies a field of a stored buffer, found by its name, by name and index, or, with an empty
    /// name, as the first.
    void readBufferData(int32_t bufferIndex, int32_t fieldIndex, const std::string& fieldName,
                        const std::string& typeName, int32_t capacity, void* destination) const;

    /// Releases a stored buffer.
    void freeBuffer(int32_t bufferIndex);

    /// Releases all that is stored.
    void freeBuffers() noexcept { DataList().buffers.swap(dataBuffers.buffers); }

private:
    /// The store's position for a buffer; throws when no buffer is there.
    std::size_t positionOf(int32_t bufferIndex) const;

    DataList dataBuffers; ///< null where a buffer was freed
};

} // namespace brenixcoder

#endif
