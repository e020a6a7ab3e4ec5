#include "OpenFile.hpp"

#include <fcntl.h>
#include <sys/resource.h>
#include <unistd.h>

#include <algorithm>
#include <bit>
#include <cerrno>
#include <cstring>
#include <new>
#include <stdexcept>
#include <system_error>
#include <utility>

namespace hdf5
{

namespace
{

/// The checksum of a superblock: Bob Jenkins' lookup3 over its first 44 bytes.
std::uint32_t checksum(const unsigned char* bytes)
{
    constexpr std::size_t size = 44;
    std::array<std::uint32_t, size / 4> words{};
    std::memcpy(words.data(), bytes, size);
    std::uint32_t a = 0xDEADBEEF + size;
    std::uint32_t b = a;
    std::uint32_t c = a;
    const auto step = [](std::uint32_t& to, std::uint32_t& from, std::uint32_t& other, int bits) {
        to = (to - from) ^ std::rotl(from, bits);
        from += other;
    };
    std::size_t i = 0;
    for (; i + 3 < words.size(); i += 3) {
        a += words[i];
        b += words[i + 1];
        c += words[i + 2];
        step(a, c, b, 4);
        step(b, a, c, 6);
        step(c, b, a, 8);
        step(a, c, b, 16);
        step(b, a, c, 19);
        step(c, b, a, 4);
    }
    a += words[i];
    b += words[i + 1];
    const auto last = [](std::uint32_t& to, std::uint32_t from, int bits) {
        to = (to ^ from) - std::rotl(from, bits);
    };
    last(c, b, 14);
    last(a, c, 11);
    last(b, a, 25);
    last(c, b, 16);
    last(a, c, 4);
    last(b, a, 14);
    last(c, b, 24);
    return c;
}

constexpr std::size_t markAt = 11;   ///< in a superblock: that the file is being written
constexpr std::size_t lengthAt = 28; ///< of the file, 8 bytes
constexpr std::size_t checksumAt = 44;

constexpr std::uint64_t ahead =
    16U << 20U; ///< bytes; they take no room on the disk until they are used

} // namespace

/// What the library sees of a file.
struct OpenFile::Callbacks {
    H5FD_t common; ///< the library's
    std::shared_ptr<OpenFile> file;

    static OpenFile& of(H5FD_t* handle) { return *reinterpret_cast<Callbacks*>(handle)->file; }
    static const OpenFile& of(const H5FD_t* handle)
    {
        return *reinterpret_cast<const Callbacks*>(handle)->file;
    }

    static H5FD_t* open(const char* /*name*/, unsigned /*flags*/, hid_t access, haddr_t /*most*/)
    {
        const auto* const file =
            static_cast<std::shared_ptr<OpenFile>* const*>(H5Pget_driver_info(access));
        // cppcheck-suppress legacyUninitvar ; what is set here
        auto* const callbacks = new (std::nothrow) Callbacks{};
        if (callbacks == nullptr) {
            return nullptr;
        }
        callbacks->file = **file;
        return &callbacks->common;
    }
    static herr_t close(H5FD_t* handle)
    {
        of(handle).finish();
        delete reinterpret_cast<Callbacks*>(handle);
        return 0;
    }
    static herr_t query(const H5FD_t* /*handle*/, unsigned long* features)
    {
        *features = H5FD_FEAT_AGGREGATE_METADATA | H5FD_FEAT_AGGREGATE_SMALLDATA |
                    H5FD_FEAT_SUPPORTS_SWMR_IO | H5FD_FEAT_DEFAULT_VFD_COMPATIBLE;
        return 0;
    }
    static haddr_t getEnd(const H5FD_t* handle, H5FD_mem_t /*type*/) { return of(handle).end; }
    static herr_t setEnd(H5FD_t* handle, H5FD_mem_t /*type*/, haddr_t address)
    {
        of(handle).end = address;
        return 0;
    }
    static herr_t read(H5FD_t* handle, H5FD_mem_t /*type*/, hid_t /*transfer*/, haddr_t address,
                       size_t size, void* data)
    {
        return of(handle).read(address, data, size) ? 0 : -1;
    }
    static herr_t write(H5FD_t* handle, H5FD_mem_t type, hid_t /*transfer*/, haddr_t address,
                        size_t size, const void* data)
    {
        of(handle).write(type == H5FD_MEM_DRAW, address, data, size);
        return 0;
    }

    static H5FD_class_t driver()
    {
        H5FD_class_t driver{};
#ifdef H5FD_CLASS_VERSION
        driver.version = H5FD_CLASS_VERSION;
        driver.value = static_cast<H5FD_class_value_t>(600); // of those that nobody registers
#endif
        driver.name = "brenix";
        driver.maxaddr = INT64_MAX;
        driver.fc_degree = H5F_CLOSE_WEAK;
        driver.fapl_size = sizeof(std::shared_ptr<OpenFile>*);
        driver.open = open;
        driver.close = close;
        driver.query = query;
        driver.get_eoa = getEnd;
        driver.set_eoa = setEnd;
        driver.get_eof = getEnd;
        driver.read = read;
        driver.write = write;
        constexpr H5FD_mem_t types[] = H5FD_FLMAP_DICHOTOMY; // metadata apart from the counts
        std::copy(std::begin(types), std::end(types), driver.fl_map);
        return driver;
    }
};

OpenFile::OpenFile(const std::string& fileName)
    : file(::open(fileName.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0666))
{
    const auto fail = [&] {
        const std::string why = std::generic_category().message(errno);
        ::close(file);
        throw std::runtime_error("Could not open " + fileName + ": " + why);
    };
    if (file < 0) {
        fail();
    }
    // One of the description, which keeps other recordings away, but no readers.
    struct flock lock {
    };
    lock.l_type = F_WRLCK;
    lock.l_whence = SEEK_SET;
    if (::fcntl(file, F_OFD_SETLK, &lock) != 0 && (errno == EAGAIN || errno == EACCES)) {
        ::close(file);
        throw std::runtime_error("Could not open " + fileName + ": another recording writes it");
    }
    if (::ftruncate(file, 0) != 0) {
        fail();
    }
}

OpenFile::~OpenFile()
{
    ::close(file);
}

Object OpenFile::access(std::shared_ptr<OpenFile>& openFile)
{
    constexpr const char* what = "Could not prepare a file";
    const H5FD_class_t driver = Callbacks::driver();
    const Object registered(H5FDregister(&driver), H5FDunregister, what);
    Object access(H5Pcreate(H5P_FILE_ACCESS), H5Pclose, what);
    const auto* const pointer = &openFile;
    require(H5Pset_driver(access, registered, &pointer), what);
    require(H5Pset_libver_bounds(access, H5F_LIBVER_V110, H5F_LIBVER_LATEST), what);
    return access;
}

std::string OpenFile::error() const
{
    return firstError == 0 ? "" : std::generic_category().message(firstError);
}

void OpenFile::refuse(bool isData)
{
    firstError = firstError == 0 ? errno : firstError;
    isAbandoned = isAbandoned || !isData;
}

void OpenFile::write(bool isData, std::uint64_t address, const void* data, std::size_t size)
{
    if (isAbandoned) {
        return;
    }
    const bool isSuperblock = address == 0 && size == superblock.size();
    if (isSuperblock) {
        std::memcpy(superblock.data(), data, size);
        hasSuperblock = true;
    }
    if (!lengthen(address + size) || !(isSuperblock ? putSuperblock() : put(address, data, size))) {
        refuse(isData);
    }
}

/// The file has its length before the superblock tells it.
bool OpenFile::lengthen(std::uint64_t needed)
{
    if (needed <= length) {
        return true;
    }
    rlimit most{};
    getrlimit(RLIMIT_FSIZE, &most);
    for (const std::uint64_t newLength :
         {needed + ahead, needed}) {     // it may not be allowed to be that long
        if (newLength > most.rlim_cur) { // the system would answer with a signal
            errno = EFBIG;
            continue;
        }
        if (::ftruncate(file, static_cast<off_t>(newLength)) == 0) {
            length = newLength;
            return !hasSuperblock || putSuperblock();
        }
    }
    return false;
}

bool OpenFile::putSuperblock()
{
    superblock[markAt] = 0;
    std::memcpy(&superblock[lengthAt], &length, sizeof length);
    const std::uint32_t sum = checksum(superblock.data());
    std::memcpy(&superblock[checksumAt], &sum, sizeof sum);
    return put(0, superblock.data(), superblock.size());
}

bool OpenFile::put(std::uint64_t address, const void* data, std::size_t size)
{
    const auto* bytes = static_cast<const unsigned char*>(data);
    while (size > 0) {
        const ssize_t written = ::pwrite(file, bytes, size, static_cast<off_t>(address));
        if (written < 0 && errno == EINTR) {
            continue;
        }
        if (written < 0) {
            return false;
        }
        bytes += written;
        address += static_cast<std::uint64_t>(written);
        size -= static_cast<std::size_t>(written);
    }
    return true;
}

/// Of a file that gets shorter, the superblock tells the length before.
void OpenFile::finish()
{
    if (isAbandoned) {
        return;
    }
    length = std::min(length, end);
    if ((hasSuperblock && !putSuperblock()) || ::ftruncate(file, static_cast<off_t>(length)) != 0) {
        refuse(false);
    }
}

bool OpenFile::read(std::uint64_t address, void* data, std::size_t size) const
{
    auto* bytes = static_cast<unsigned char*>(data);
    while (size > 0) {
        const ssize_t got = ::pread(file, bytes, size, static_cast<off_t>(address));
        if (got < 0 && errno == EINTR) {
            continue;
        }
        if (got <= 0) {
            return false;
        }
        bytes += got;
        address += static_cast<std::uint64_t>(got);
        size -= static_cast<std::size_t>(got);
    }
    return true;
}

} // namespace hdf5
