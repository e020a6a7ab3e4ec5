// The file of a recording while it is written, so that it can be opened whenever its program is killed.
#ifndef BRENIX_PLUGINS_HDF5_OPEN_FILE_HPP
#define BRENIX_PLUGINS_HDF5_OPEN_FILE_HPP

#include "Calls.hpp"

#include <array>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>

namespace hdf5
{

/// Writes for the library, which, as a writer that others may read beside (SWMR), orders its writes so that
/// what is in the file is whole after each. But it marks the file as being written, and what is beyond the
/// length in its superblock cannot be read: then nobody would open the file of a program that was killed.
/// So the superblock goes to the file without the mark, and with a length that is ahead of the data.
///
/// The library does not learn of what the system refuses to write: after a flush that failed, it could neither
/// flush nor close the file. error() tells of it. Once something was refused that others need to find their way,
/// nothing is written any more, as if the program had been killed.
class OpenFile
{
public:
    /// Makes the file, or empties it; throws when that is not possible, or another recording writes it.
    explicit OpenFile(const std::string& fileName);
    OpenFile(const OpenFile&) = delete;
    OpenFile& operator=(const OpenFile&) = delete;
    ~OpenFile();

    /// The properties with which the library makes a file that is this one, which it then keeps until it has
    /// closed it. The pointer must outlive them.
    static Object access(std::shared_ptr<OpenFile>& openFile);

    /// Why the system refused something first; empty when it did not.
    std::string error() const;

private:
    struct Callbacks;

    void write(bool isData, std::uint64_t address, const void* data, std::size_t size);
    bool read(std::uint64_t address, void* data, std::size_t size) const;
    void finish();

    bool lengthen(std::uint64_t needed);
    bool putSuperblock();
    bool put(std::uint64_t address, const void* data, std::size_t size);
    void refuse(bool isData);

    int file;
    int firstError = 0;       ///< of the system
    bool isAbandoned = false; ///< whether nothing is written any more
    bool hasSuperblock = false;
    std::array<unsigned char, 48> superblock{}; ///< of version 3
    std::uint64_t end = 0;                      ///< of what the library uses
    std::uint64_t length = 0; ///< that the file has at least, and its superblock tells
};

} // namespace hdf5

#endif
