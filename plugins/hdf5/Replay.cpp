#include "Replay.hpp"

#include "Types.hpp"

#include <algorithm>
#include <array>
#include <cerrno>
#include <filesystem>
#include <fstream>
#include <stdexcept>
#include <system_error>

namespace hdf5
{

Replay::Replay(const std::string& fileName, const std::string& datasetName) : name(fileName)
{
    std::error_code unknown; // then opening tells it
    const auto status = std::filesystem::status(fileName, unknown);
    if (exists(status) && !is_regular_file(status)) { // to open a pipe waits for its writer
        throw std::runtime_error("Could not open " + name + ": it is no regular file");
    }
    if (!std::ifstream(fileName)) {
        throw std::runtime_error("Could not open " + name + ": " +
                                 std::generic_category().message(errno));
    }
    file = Object(H5Fopen(name.c_str(), H5F_ACC_RDONLY, H5P_DEFAULT), H5Fclose,
                  "Could not open " + name);
    openDataset(datasetName);
    allNotes.read(dataset);
    readGaps(datasetName);
}

void Replay::openDataset(const std::string& datasetName)
{
    const std::string what = "dataset " + datasetName + " of " + name;
    const Object access(H5Pcreate(H5P_DATASET_ACCESS), H5Pclose, "Could not open " + what);
    constexpr std::size_t cache = 32U
                                  << 20U; // bytes: a chunk that is larger is decoded for each read
    H5Pset_chunk_cache(access, H5D_CHUNK_CACHE_NSLOTS_DEFAULT, cache, 1);
    dataset =
        Object(H5Dopen2(file, datasetName.c_str(), access), H5Dclose, "Could not open " + what);
    const Object fileType(H5Dget_type(dataset), H5Tclose, "Could not read " + what);
    elementType = elementTypeFor(fileType);
    if (elementType == nullptr) {
        throw std::runtime_error("The elements of " + what + " are no numbers of an element type.");
    }
    const Object space(H5Dget_space(dataset), H5Sclose, "Could not read " + what);
    const int dimensions = H5Sget_simple_extent_ndims(space);
    if (dimensions != 1 && dimensions != 2) {
        throw std::runtime_error("The " + what + " has " + std::to_string(dimensions) +
                                 " dimensions; 1 or 2 can be read.");
    }
    std::array<hsize_t, 2> extents = {0, 1};
    H5Sget_simple_extent_dims(space, extents.data(), nullptr);
    rows = extents[0];
    columns = extents[1];
    if (columns == 0) {
        throw std::runtime_error("The " + what + " has no channels.");
    }
}

void Replay::readGaps(const std::string& datasetName)
{
    const std::string gapsName = gapsOf(datasetName);
    if (H5Lexists(file, gapsName.c_str(), H5P_DEFAULT) <= 0) {
        return;
    }
    const std::string what = "Could not read dataset " + gapsName + " of " + name;
    const Object gaps(H5Dopen2(file, gapsName.c_str(), H5P_DEFAULT), H5Dclose, what);
    const Object space(H5Dget_space(gaps), H5Sclose, what);
    const auto count = require(H5Sget_simple_extent_npoints(space), what);
    allGaps.resize(static_cast<std::size_t>(count));
    if (count > 0) {
        require(H5Dread(gaps, makeGapType(), H5S_ALL, H5S_ALL, H5P_DEFAULT, allGaps.data()), what);
    }
    std::stable_sort(allGaps.begin(), allGaps.end(),
                     [](const Gap& a, const Gap& b) { return a.index < b.index; });
}

void Replay::read(std::uint64_t first, std::uint64_t count, void* elements)
{
    const std::string what = "Could not read " + name + " at count " + std::to_string(first);
    const Object space(H5Dget_space(dataset), H5Sclose, what);
    const hsize_t offset[] = {first, 0};
    const hsize_t size[] = {count, columns};
    require(H5Sselect_hyperslab(space, H5S_SELECT_SET, offset, nullptr, size, nullptr), what);
    const Object memory = makeSpace({count * columns});
    require(H5Dread(dataset, nativeType(*elementType), memory, space, H5P_DEFAULT, elements), what);
}

} // namespace hdf5
