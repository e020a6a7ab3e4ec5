#include "Recorder.hpp"

#include "Replay.hpp"
#include "Types.hpp"

#include <algorithm>
#include <chrono>
#include <cstring>
#include <utility>

namespace hdf5
{

namespace
{

/// Counts of a chunk: about a quarter of a second, so that it is full before it has to be in the file.
std::uint64_t countsOfChunk(std::size_t rowSize, double rate)
{
    constexpr double least = 1024; // bytes
    constexpr double most = 1 << 20;
    constexpr double other = 1 << 16;
    const auto row = static_cast<double>(rowSize);
    const double size = rate > 0 ? std::clamp(rate / 4 * row, least, most) : other;
    return std::max<std::uint64_t>(static_cast<std::uint64_t>(size / row), 1);
}

} // namespace

/// Throws also what the library has not learned.
template <typename Call>
void Recorder::attempt(const Call& call)
{
    const auto fail = [this](const std::string& why) {
        throw std::runtime_error("Could not write " + fileName + ": " + why + ".");
    };
    try {
        call();
    } catch (const std::exception& failure) {
        fail(openFile->error().empty() ? failure.what() : openFile->error());
    }
    if (!openFile->error().empty()) {
        fail(openFile->error());
    }
}

Recorder::Recorder(std::string name, RecordingFormat recordingFormat, Notes recordingNotes)
    : fileName(std::move(name)), format(std::move(recordingFormat)),
      notes(std::move(recordingNotes)), rowSize(format.channels * format.type->size),
      chunkRows(countsOfChunk(rowSize, notes.rate)), chunk(chunkRows * rowSize),
      openFile(std::make_shared<OpenFile>(fileName))
{
    try {
        attempt([this] { createDatasets(); });
    } catch (...) {
        giveUp();
        throw;
    }
}

void Recorder::createDatasets()
{
    file =
        Object(H5Fcreate(fileName.c_str(), H5F_ACC_TRUNC, H5P_DEFAULT, OpenFile::access(openFile)),
               H5Fclose, "could not make the file");
    const Object links(H5Pcreate(H5P_LINK_CREATE), H5Pclose, "could not name a dataset");
    H5Pset_create_intermediate_group(links, 1);
    H5Pset_char_encoding(links, H5T_CSET_UTF8);
    const auto create = [&](const std::string& datasetName, hid_t type, const Object& space,
                            const std::vector<hsize_t>& chunks, unsigned compression) {
        const Object creation(H5Pcreate(H5P_DATASET_CREATE), H5Pclose, "could not make a dataset");
        H5Pset_chunk(creation, static_cast<int>(chunks.size()), chunks.data());
        H5Pset_fill_time(creation, H5D_FILL_TIME_NEVER);
        if (compression > 0) {
            require(H5Pset_deflate(creation, compression), "could not compress");
        }
        const Object access(H5Pcreate(H5P_DATASET_ACCESS), H5Pclose, "could not make a dataset");
        H5Pset_chunk_cache(access, H5D_CHUNK_CACHE_NSLOTS_DEFAULT, 0, H5D_CHUNK_CACHE_W0_DEFAULT);
        return Object(H5Dcreate2(file, datasetName.c_str(), type, space, links, creation, access),
                      H5Dclose, "dataset " + datasetName);
    };
    dataset =
        create(format.dataset, nativeType(*format.type), makeSpace({0, format.channels}, true),
               {chunkRows, format.channels}, format.compression);
    notes.write(dataset);
    constexpr hsize_t gapsOfChunk = 64;
    gaps = create(gapsOf(format.dataset), makeGapType(), makeSpace({0}, true), {gapsOfChunk}, 0);
    sync();
}

/// From here on, the file is whole after each write.
void Recorder::begin()
{
    if (hasBegun) {
        return;
    }
    if (notes.start == 0) {
        notes.start = std::chrono::duration_cast<std::chrono::nanoseconds>(
                          std::chrono::system_clock::now().time_since_epoch())
                          .count();
        Notes::writeStart(dataset, notes.start);
    }
    require(H5Fstart_swmr_write(file), "could not begin to write");
    hasBegun = true;
}

void Recorder::append(std::span<const unsigned char> elements)
{
    attempt([&] {
        begin();
        while (!elements.empty()) {
            if (held == 0 && elements.size() >= chunk.size()) {
                storeChunk(elements.data(), chunkRows, true);
                elements = elements.subspan(chunk.size());
                continue;
            }
            const std::size_t size = std::min(chunk.size() - held, elements.size());
            std::memcpy(&chunk[held], elements.data(), size);
            held += size;
            elements = elements.subspan(size);
            if (held == chunk.size()) {
                storeChunk(chunk.data(), chunkRows, true);
            }
        }
    });
}

/// A chunk that will have more counts is not compressed then or later: what it took in the file before
/// could not be used again.
void Recorder::storeChunk(const unsigned char* rows, std::uint64_t count, bool isFinal)
{
    const std::string what = "at count " + std::to_string(first);
    const hsize_t extents[] = {first + count, format.channels};
    const hsize_t offset[] = {first, 0};
    require(H5Dset_extent(dataset, extents), what);
    isPlain = isPlain || format.compression == 0 || !isFinal;
    if (isPlain) {
        if (rows == chunk.data()) {
            std::fill(chunk.begin() + static_cast<std::ptrdiff_t>(held), chunk.end(), 0);
        }
        const std::uint32_t skipped = format.compression == 0 ? 0 : 1;
        require(H5Dwrite_chunk(dataset, H5P_DEFAULT, skipped, offset, chunk.size(), rows), what);
    } else {
        const Object space(H5Dget_space(dataset), H5Sclose, what);
        const hsize_t size[] = {count, format.channels};
        require(H5Sselect_hyperslab(space, H5S_SELECT_SET, offset, nullptr, size, nullptr), what);
        require(H5Dwrite(dataset, nativeType(*format.type), makeSpace({count, format.channels}),
                         space, H5P_DEFAULT, rows),
                what);
    }
    if (!openFile->error().empty()) {
        throw std::runtime_error(openFile->error());
    }
    isDirty = true;
    stored = count;
    if (count == chunkRows) {
        first += count;
        held = 0;
        stored = 0;
        isPlain = false;
        hasWaited = false;
    }
}

void Recorder::addGap(const Gap& gap)
{
    attempt([&] {
        begin();
        const std::uint64_t whole = held / rowSize;
        if (whole > stored) {
            storeChunk(chunk.data(), whole, false);
        }
        const Object type = makeGapType();
        const hsize_t before = gapCount;
        const hsize_t one = 1;
        const hsize_t after = before + 1;
        const Gap placed{counts(), gap.time, gap.lost};
        constexpr const char* what = "gaps";
        require(H5Dset_extent(gaps, &after), what);
        const Object space(H5Dget_space(gaps), H5Sclose, what);
        require(H5Sselect_hyperslab(space, H5S_SELECT_SET, &before, nullptr, &one, nullptr), what);
        require(H5Dwrite(gaps, type, makeSpace({1}), space, H5P_DEFAULT, &placed), what);
        gapCount = after;
        isDirty = true;
    });
}

void Recorder::flush()
{
    attempt([this] {
        const std::uint64_t whole = held / rowSize;
        if (whole > stored && hasWaited) {
            storeChunk(chunk.data(), whole, false);
        }
        hasWaited = held / rowSize > stored;
        if (isDirty) {
            sync();
        }
    });
}

void Recorder::sync()
{
    require(H5Fflush(file, H5F_SCOPE_LOCAL), "could not flush");
    isDirty = false;
}

void Recorder::finish()
{
    attempt([this] {
        const std::uint64_t whole = held / rowSize;
        if (whole > stored) {
            storeChunk(chunk.data(), whole, true);
        }
        close();
    });
}

void Recorder::close()
{
    dataset.reset();
    gaps.reset();
    require(file.reset(), "could not close");
}

std::uint64_t Recorder::giveUp()
{
    const hsize_t extents[] = {counts(), format.channels};
    H5Dset_extent(dataset, extents);
    try {
        close();
        return Replay(fileName, format.dataset).counts();
    } catch (const std::exception&) {
        return 0;
    }
}

} // namespace hdf5
