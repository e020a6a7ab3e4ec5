/// @file
/// The two streams of a channel. They belong to the channel; all operations are called on the
/// thread that uses the channel. Unless said otherwise an operation may throw any std::exception.
#ifndef BRENIXCORE_STREAM_HPP
#define BRENIXCORE_STREAM_HPP

#include "brenixcore/Exceptions.hpp"

#include <map>
#include <memory>
#include <string>
#include <vector>

namespace brenixcore
{

class Channel;

/// What both directions have in common. Slots of the virtual table: two destructors, isInput,
/// addFilter, tuneFilters, flush.
class BRENIXCORE_API Stream
{
public:
    Stream(const Stream&) = delete;
    Stream& operator=(const Stream&) = delete;
    virtual ~Stream();

    virtual bool isInput() const; ///< whether it is an InputStream

    /// Adds a filter behind those already there. Takes over the objects in `options`, also when it
    /// throws.
    /// @throws CouldNotLoadFilter, CouldNotCreateFilter, CannotAddFilterWhileOpen
    virtual void addFilter(const std::string& filterName,
                           const std::map<std::string, void*>& options);

    /// Passes the options to every filter in turn, also while data flows. Takes over the objects in
    /// `options`, also when it throws.
    virtual void tuneFilters(const std::map<std::string, void*>& options);

    /// Discards what is buffered.
    virtual void flush();

    bool isOpen() const; ///< while the channel is open

    /// Whether the stream has no limit; then getSpaceAvailable() has no meaning.
    bool isUnlimited() const;

    /// Counts in the stream.
    unsigned long getDataAvailable() const;

    /// Counts that the stream has room for.
    unsigned long getSpaceAvailable() const;

protected:
    struct Impl;
    explicit Stream(std::unique_ptr<Impl> state); ///< made by the channel
    friend class Channel;
    std::unique_ptr<Impl> impl; ///< what a core keeps
};

/// From the device to the caller.
class BRENIXCORE_API InputStream : public Stream
{
public:
    /// Made by the channel.
    explicit InputStream(std::unique_ptr<Impl> state);
    ~InputStream() override;

    bool isInput() const override;

    /// Whether the device will push no more.
    bool isDeviceDone() const;

    /// The dimension of the data along which the device counts.
    unsigned long getCountDimension() const;

    /// Lists the buffers that read() of `limit` counts (or of all there are, if fewer) would
    /// deliver: the counts of each, oldest first, and their sum.
    void peekCounts(unsigned long limit, unsigned long& total, std::vector<unsigned long>& counts);

    /// Takes the `count` oldest counts, waiting for them while they may still come. `buffers`
    /// receives pointers to std::map<std::string, void*> made with new, of property objects by
    /// field name, which are the caller's; `countRead` the counts delivered. When it throws,
    /// nothing is handed over.
    /// @throws SynchronousInputNotPossible, CouldNotConvertInputData
    void read(unsigned long count, std::vector<void*>& buffers, unsigned long& countRead);
};

/// From the caller to the device.
class BRENIXCORE_API OutputStream : public Stream
{
public:
    /// Made by the channel.
    explicit OutputStream(std::unique_ptr<Impl> state);
    ~OutputStream() override;

    bool isInput() const override;

    /// Whether the device will take no more.
    bool isDeviceDone() const;

    /// The dimension of the data along which the device counts.
    unsigned long getCountDimension() const;

    /// Takes all buffers or none, waiting for room while it may still come. The elements point to
    /// std::map<std::string, void*>; they are read during the call and stay the caller's.
    /// @return counts written
    /// @throws SynchronousOutputNotPossible, CouldNotConvertOutputData
    unsigned long write(const std::vector<void*>& dataList);
};

} // namespace brenixcore

#endif
