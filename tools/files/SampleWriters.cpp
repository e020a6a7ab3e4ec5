// Writers of files of samples.

#include "commands/Commands.hpp"
#include "files/Samples.hpp"
#include "plugins/SoundFile.hpp"

#include <fcntl.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <chrono>
#include <cmath>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <optional>
#include <string_view>
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
        if (descriptor != -1) {              // or else errno tells why
            ::fcntl(descriptor, F_SETFL, 0); // from here on a write waits
        }
    }
    OwnedFile output(descriptor == -1 ? nullptr : ::fdopen(descriptor, "wb"));
    if (!output) {
        errno = descriptor == -1 ? errno : EBADF; // it is closed, or for input
        failAsErrno(file.outputName());
    }
    std::setvbuf(output.get(), nullptr, _IONBF, 0); // what is written is large
    return output;
}

/// The elements of all fields, row by row.
Bytes interleave(const std::vector<Field>& fields, std::size_t counts)
{
    if (fields.size() == 1) {
        return fields[0].elements;
    }
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
            Bytes several;
            const Bytes& rows =
                fields.size() == 1 ? fields[0].elements : several = interleave(fields, counts);
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
            whole.reset(std::tmpfile());
            if (!whole) {
                failAsErrno("a temporary file");
            }
            output.reset(::fdopen(::dup(::fileno(whole.get())), "wb"));
        }
        disk = output.get();
        sound.emplace(output.release(), info);
        if (sound->get() == nullptr) {
            fail(name, sound->error());
        }
        sf_command(sound->get(), SFC_SET_CLIPPING, nullptr, SF_TRUE); // the scale of PCM is 2^n
        // It has the time in it.
        sf_command(sound->get(), SFC_SET_ADD_PEAK_CHUNK, nullptr, SF_FALSE);
        if (startsWithHeader(format)) {
            // A file of no frames is one, too.
            sf_command(sound->get(), SFC_UPDATE_HEADER_NOW, nullptr, 0);
        }
        if (format.encoding.value == 0 && format.container.value != SF_FORMAT_FLAC) {
            // Whenever the command is killed, the file is one.
            sf_command(sound->get(), SFC_SET_UPDATE_HEADER_AUTO, nullptr, SF_TRUE);
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
        if (static_cast<double>(::ftello(disk)) >
            mostBytes(format, static_cast<double>(rows.size()))) {
            fail(name, "a file of format " + std::string(format.name) + " ends at 4 GiB");
        }
        const auto items = static_cast<sf_count_t>(rows.size() / type.size);
        const sf_count_t written = soundOf.write(sound->get(), rows.data(), items);
        if (const std::string error = sound->error(); written != items || !error.empty()) {
            fail(name, error.empty() ? "cannot be written" : error);
        }
    }

    void finish() override
    {
        if (const std::string error = sound->close(); !error.empty()) {
            fail(name, error);
        }
        if (pipe) {
            copyToPipe();
        }
        if (clipped > 0) {
            fail(name, std::to_string(clipped) + " samples beyond full scale were cut off");
        }
    }

private:
    void copyToPipe()
    {
        std::rewind(whole.get());
        std::array<char, 65536> block{};
        while (const std::size_t part = std::fread(block.data(), 1, block.size(), whole.get())) {
            if (std::fwrite(block.data(), 1, part, pipe.get()) != part) {
                failAsErrno(name);
            }
        }
        if (std::ferror(whole.get()) != 0) {
            fail(name, "the temporary file cannot be read");
        }
        if (std::fclose(pipe.release()) != 0) {
            failAsErrno(name);
        }
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
    long clipped = 0;          ///< samples
    OwnedFile pipe;            ///< nothing when the sound file can be written in place
    OwnedFile whole;           ///< what then goes to the pipe
    std::FILE* disk = nullptr; ///< under the sound file
    std::optional<SoundFile> sound;
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
