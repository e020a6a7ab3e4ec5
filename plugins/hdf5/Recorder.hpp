// Writes a recording.
#ifndef BRENIX_PLUGINS_HDF5_RECORDER_HPP
#define BRENIX_PLUGINS_HDF5_RECORDER_HPP

#include "ElementTypes.hpp"
#include "Notes.hpp"
#include "OpenFile.hpp"

#include <cstdint>
#include <memory>
#include <span>
#include <string>
#include <vector>

namespace hdf5
{

/// What a recording is to be.
struct RecordingFormat {
    std::string dataset;
    const bytes::ElementType* type = nullptr;
    std::uint64_t channels = 1;
    unsigned compression = 0; ///< 0 to 9
};

/// A file with a dataset of counts by channels, which grows, and one of gaps. It collects elements until they
/// fill a chunk of the dataset. All that it does throws when the file cannot be written, with the reason.
class Recorder
{
public:
    /// Makes the file, without counts.
    Recorder(std::string fileName, RecordingFormat recordingFormat, Notes recordingNotes);

    /// Takes elements. The first ones are those of the time that the notes tell, or else of now.
    void append(std::span<const unsigned char> elements);

    /// Notes counts that are lost before those that come next.
    void addGap(const Gap& gap);

    /// Puts what has waited since the last call into the file, and makes sure that it can be read there.
    void flush();

    /// Puts everything into the file and closes it. Elements that do not fill a count are left.
    void finish();

    /// Elements that do not fill a count.
    std::uint64_t partial() const { return held % rowSize / format.type->size; }

    /// Counts in the file.
    std::uint64_t counts() const { return first + stored; }

    /// After something has failed: closes the file as far as it can be written. Returns the counts that can be
    /// read from it.
    std::uint64_t giveUp();

private:
    template <typename Call>
    void attempt(const Call& call);
    void createDatasets();
    void begin();
    void storeChunk(const unsigned char* rows, std::uint64_t count, bool isFinal);
    void sync();
    void close();

    const std::string fileName;
    const RecordingFormat format;
    Notes notes;
    const std::size_t rowSize;     ///< bytes of a count
    const std::uint64_t chunkRows; ///< counts of a chunk
    std::vector<unsigned char> chunk;

    std::shared_ptr<OpenFile> openFile;
    Object file;
    Object dataset;
    Object gaps;
    std::uint64_t gapCount = 0;

    bool hasBegun = false;
    bool isDirty = false;     ///< whether there is more to be made sure of
    std::uint64_t first = 0;  ///< count at which the chunk begins that is being filled
    std::size_t held = 0;     ///< bytes of it
    std::uint64_t stored = 0; ///< counts of it in the file
    bool isPlain = false;     ///< whether it is there without compression
    bool hasWaited = false;   ///< whether there were more counts at the last flush than in the file
};

} // namespace hdf5

#endif
