// Writers of files of samples.

#include "Commands.hpp"
#include "Samples.hpp"

#include <fcntl.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <chrono>
#include <cmath>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <string_view>
#include <system_error>
#include <thread>
#include <utility>

namespace brenix
{

namespace
{

/// Nothing when an interruption ends the waiting for somebody who reads a FIFO.
OwnedFile openOutput(const SampleFile& file)
{
    int descriptor = -1;
    if (file.isPipe()) {
        descriptor = ::dup(STDOUT_FILENO);
    } else {
        const auto open = [&] {
            constexpr int flags = O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC | O_NONBLOCK;
            descriptor = ::open(file.name.c_str(), flags, 0666);
            return descriptor != -1;
        };
        while (!open() && errno == ENXIO && std::filesystem::is_fifo(file.name)) {
            if (isInterrupted()) {
                return nullptr;
            }
            std::this_thread::sleep_for(std::chrono::milliseconds(10));
        }
        ::fcntl(descriptor, F_SETFL, 0); // from here on a write waits
    }
    OwnedFile output(descriptor == -1 ? nullptr : ::fdopen(descriptor, "wb"));
    if (!output) {
        errno = descriptor == -1 ? errno : EBADF; // it is closed, or for input
        failAsErrno(file.outputName());
    }
    return output;
}

/// The elements of all fields, row by row.
Bytes interleave(const std::vector<Field>& fields, std::size_t counts)
{
    Bytes rows(rowSize(fields) * counts);
    unsigned char* next = rows.data();
    for (std::size_t row = 0; row < counts; ++row) {
        for (const Field& field : fields) {
            const std::size_t size = field.perCount * field.type->size;
            std::memcpy(next, &field.elements[row * size], size);
            next += size;
        }
    }
    return rows;
}

void requireOneType(const std::vector<Field>& fields, const std::string& format)
{
    for (const Field& field : fields) {
        if (field.type != fields[0].type) {
            throw Failure("", "the fields are of different types, which " + format +
                                  " cannot hold: choose one with --field");
        }
    }
}

/// CSV and raw elements.
class PlainWriter : public SampleWriter
{
public:
    PlainWriter(const SampleFile& sampleFile, const std::vector<Field>& fields, OwnedFile output)
        : name(sampleFile.outputName()), csv(sampleFile.format == "csv"), file(std::move(output))
    {
        if (csv) {
            const std::string header = csvHeader(fields) + '\n';
            put(header.data(), header.size());
        }
    }

    void write(const std::vector<Field>& fields, std::size_t counts) override
    {
        if (!csv) {
            const Bytes rows = interleave(fields, counts);
            put(rows.data(), rows.size());
            return;
        }
        text.clear();
        for (std::size_t row = 0; row < counts; ++row) {
            const char* separator = "";
            for (const Field& field : fields) {
                for (std::size_t i = 0; i < field.perCount; ++i) {
                    text += separator;
                    field.type->print(
                        &field.elements[(row * field.perCount + i) * field.type->size], text);
                    separator = ",";
                }
            }
            text += '\n';
        }
        put(text.data(), text.size());
    }

    void finish() override
    {
        if (std::fclose(file.release()) != 0) {
            failAsErrno(name);
        }
    }

private:
    void put(const void* data, std::size_t size)
    {
        if (std::fwrite(data, 1, size, file.get()) != size ||
            std::fflush(file.get()) != 0) { // a reader of a pipe wants them now
            failAsErrno(name);
        }
    }

    std::string name;
    bool csv;
    OwnedFile file;
    std::string text;
};

/// The file under a sound file. libsndfile does not tell of a write that fails while it closes a file: the
/// first error is kept here.
struct SoundDisk {
    OwnedFile file;
    int error = 0;

    static std::FILE* fileOf(void* user) { return static_cast<SoundDisk*>(user)->file.get(); }
    static sf_count_t tell(void* user) { return ::ftello(fileOf(user)); }
    static sf_count_t seek(sf_count_t offset, int whence, void* user)
    {
        return ::fseeko(fileOf(user), offset, whence) == 0 ? tell(user) : -1;
    }
    static sf_count_t length(void* user)
    {
        const sf_count_t position = tell(user);
        const sf_count_t end = seek(0, SEEK_END, user);
        seek(position, SEEK_SET, user);
        return end;
    }
    static sf_count_t read(void* /*data*/, sf_count_t /*size*/, void* /*user*/) { return 0; }
    static sf_count_t write(const void* data, sf_count_t size, void* user)
    {
        auto& disk = *static_cast<SoundDisk*>(user);
        const auto written = static_cast<sf_count_t>(
            std::fwrite(data, 1, static_cast<std::size_t>(size), disk.file.get()));
        disk.error = written == size || disk.error != 0 ? disk.error : errno;
        return written;
    }
};

class SoundWriter : public SampleWriter
{
public:
    SoundWriter(const SampleFile& sampleFile, const ElementType& elementType, SF_INFO info,
                OwnedFile output)
        : name(sampleFile.outputName()), format(*findSoundFormat(sampleFile.format)),
          type(elementType), soundOf(soundType(type)), clips(hasFullScale(info))
    {
        // The length stands at the front: a pipe gets the file when it is complete.
        if (sampleFile.isPipe() || ::lseek(::fileno(output.get()), 0, SEEK_CUR) == -1) {
            pipe = std::move(output);
            output.reset(std::tmpfile());
            if (!output) {
                failAsErrno("a temporary file");
            }
        }
        disk.file = std::move(output);
        std::setvbuf(disk.file.get(), nullptr, _IONBF, 0);
        SF_VIRTUAL_IO calls = {SoundDisk::length, SoundDisk::seek, SoundDisk::read,
                               SoundDisk::write, SoundDisk::tell};
        sound.reset(sf_open_virtual(&calls, SFM_WRITE, &info, &disk));
        if (!sound) {
            fail(name, sf_strerror(nullptr));
        }
        sf_command(sound.get(), SFC_SET_CLIPPING, nullptr, SF_TRUE); // the scale of PCM is 2^n
        sf_command(sound.get(), SFC_SET_ADD_PEAK_CHUNK, nullptr, SF_FALSE); // it has the time in it
        if (startsWithHeader(format)) { // then a file of no frames is one, too
            sf_command(sound.get(), SFC_UPDATE_HEADER_NOW, nullptr, 0);
        }
        if (format.encoding.value == 0 && format.container.value != SF_FORMAT_FLAC) {
            // Whenever the command is killed, the file is one.
            sf_command(sound.get(), SFC_SET_UPDATE_HEADER_AUTO, nullptr, SF_TRUE);
        }
    }

    void write(const std::vector<Field>& fields, std::size_t counts) override
    {
        Bytes rows = interleave(fields, counts);
        if (clips && type.name == std::string_view("double")) {
            clip<double>(rows);
        } else if (clips && type.name == std::string_view("float")) {
            clip<float>(rows);
        }
        if (static_cast<double>(SoundDisk::tell(&disk)) >
            mostBytes(format, static_cast<double>(rows.size()))) {
            fail(name, "a file of format " + std::string(format.name) + " ends at 4 GiB");
        }
        const auto items = static_cast<sf_count_t>(rows.size() / type.size);
        if (soundOf.write(sound.get(), rows.data(), items) != items || disk.error != 0) {
            failAsTold(sf_error(sound.get()));
        }
    }

    void finish() override
    {
        const int error = sf_close(sound.release());
        if (error != SF_ERR_NO_ERROR || disk.error != 0) {
            failAsTold(error);
        }
        if (pipe) {
            std::rewind(disk.file.get());
            std::array<char, 65536> block{};
            while (const std::size_t part =
                       std::fread(block.data(), 1, block.size(), disk.file.get())) {
                if (std::fwrite(block.data(), 1, part, pipe.get()) != part) {
                    failAsErrno(name);
                }
            }
            if (std::ferror(disk.file.get()) != 0) {
                fail(name, "the temporary file cannot be read");
            }
            disk.file = std::move(pipe);
        }
        if (std::fclose(disk.file.release()) != 0) {
            failAsErrno(name);
        }
        if (clipped > 0) {
            fail(name, std::to_string(clipped) + " samples beyond full scale were cut off");
        }
    }

private:
    [[noreturn]] void failAsTold(int error)
    {
        fail(name, disk.error != 0 ? std::generic_category().message(disk.error)
                                   : sf_error_number(error));
    }

    template <typename T>
    void clip(Bytes& rows)
    {
        auto* const samples = reinterpret_cast<T*>(rows.data());
        for (std::size_t i = 0; i < rows.size() / sizeof(T); ++i) {
            if (!(std::fabs(samples[i]) <= 1)) {
                samples[i] = std::isnan(samples[i]) ? 0 : std::copysign(T(1), samples[i]);
                ++clipped;
            }
        }
    }

    std::string name;
    const SoundFormat& format;
    const ElementType& type;
    const SoundType& soundOf;
    bool clips;
    long clipped = 0; ///< samples
    OwnedFile pipe;   ///< nothing when the sound file can be written in place
    SoundDisk disk;
    OwnedSound sound;
};

} // namespace

std::unique_ptr<SampleWriter> openWriter(const SampleFile& file, const std::vector<Field>& fields)
{
    SF_INFO info{};
    const bool isSound = findSoundFormat(file.format) != nullptr;
    if (file.format != "csv") {
        requireOneType(fields, file.format);
    }
    if (isSound) {
        std::string format;
        info = soundInfo(file, fields, format);
    }
    OwnedFile output = openOutput(file);
    if (!output) {
        return nullptr;
    }
    if (isSound) {
        return std::make_unique<SoundWriter>(file, *fields[0].type, info, std::move(output));
    }
    return std::make_unique<PlainWriter>(file, fields, std::move(output));
}

} // namespace brenix
