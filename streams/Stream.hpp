#ifndef BRENIXCODER_STREAMS_STREAM_HPP
#define BRENIXCODER_STREAMS_STREAM_HPP

#include "brenixcore/Stream.hpp"
#include "util/Handle.hpp"

#include <cstdarg>
#include <cstdint>
#include <limits>
#include <string>

namespace brenixcoder
{

class Channel;

enum class StreamDirection : int32_t { Input = 0, Output = 1 };

[[noreturn]] void throwNotSupported(StreamDirection direction);

/// The object behind a stream handle. It exists also when the channel has no stream of its
/// direction; then every operation that needs one throws InputStreamNotSupported or
/// OutputStreamNotSupported.
class Stream : public Marked
{
public:
    static constexpr Mark ownMark = Mark::Stream;

    Stream(const Stream&) = delete;
    Stream& operator=(const Stream&) = delete;
    virtual ~Stream() = default;

    Channel& getChannel() const noexcept { return *channel; }
    bool isSupported() const noexcept { return coreStream != nullptr; }

    /// Of which class the stream is, an InputStream or an OutputStream.
    StreamDirection getDirection() const noexcept { return direction; }

    /// Leaves the stream without its core stream, as if the channel had none.
    void detach() noexcept { coreStream = nullptr; }

    bool isDeviceDone() const;
    double getCountDimension() const;

    bool isOpen() const
    {
        checkSupported();
        return coreStream->isOpen();
    }
    double getDataAvailable() const
    {
        checkSupported();
        return static_cast<double>(coreStream->getDataAvailable());
    }
    /// Positive infinity for an unlimited stream.
    double getSpaceAvailable() const
    {
        checkSupported();
        return coreStream->isUnlimited() ? std::numeric_limits<double>::infinity()
                                         : static_cast<double>(coreStream->getSpaceAvailable());
    }
    void flush();

    /// The options are `optionCount` groups as buildOptionMap() reads them.
    void addFilter(const std::string& filterName, uint64_t optionCount, va_list* options);
    void tuneFilters(uint64_t optionCount, va_list* options);

protected:
    Stream(brenixcore::Stream* stream, StreamDirection streamDirection, Channel& owner) noexcept
        : Marked(ownMark), coreStream(stream), direction(streamDirection), channel(&owner)
    {
    }

    /// Throws unless there is a core stream; the first step of everything that uses it.
    void checkSupported() const
    {
        if (coreStream == nullptr) {
            throwNotSupported(direction);
        }
    }

    /// The core stream as that of one direction, after checkSupported().
    brenixcore::InputStream& coreInput() const;
    brenixcore::OutputStream& coreOutput() const;

private:
    brenixcore::Stream* coreStream;
    StreamDirection direction;
    Channel* channel;
};

} // namespace brenixcoder

#endif
