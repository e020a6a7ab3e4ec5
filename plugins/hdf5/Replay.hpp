// Reads a recording, or any dataset of numbers with one or two dimensions.
#ifndef BRENIX_PLUGINS_HDF5_REPLAY_HPP
#define BRENIX_PLUGINS_HDF5_REPLAY_HPP

#include "ElementTypes.hpp"
#include "Notes.hpp"

#include <cstdint>
#include <string>
#include <vector>

namespace hdf5
{

class Replay
{
public:
    /// Opens a dataset of a file. Throws what is wrong with them.
    Replay(const std::string& fileName, const std::string& datasetName);

    const bytes::ElementType& type() const { return *elementType; }
    std::uint64_t channels() const { return columns; }
    std::uint64_t counts() const { return rows; }
    const Notes& notes() const { return allNotes; }

    /// In the order of their indices.
    const std::vector<Gap>& gaps() const { return allGaps; }

    /// Reads counts, which must be there, into an array of the type.
    void read(std::uint64_t first, std::uint64_t count, void* elements);

private:
    void openDataset(const std::string& datasetName);
    void readGaps(const std::string& datasetName);

    std::string name; ///< of the file
    Object file;
    Object dataset;
    const bytes::ElementType* elementType = nullptr;
    std::uint64_t rows = 0;
    std::uint64_t columns = 1;
    Notes allNotes;
    std::vector<Gap> allGaps;
};

} // namespace hdf5

#endif
