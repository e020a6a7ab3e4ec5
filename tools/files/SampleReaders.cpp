// Readers of files of samples.

#include "commands/Commands.hpp"
#include "files/Samples.hpp"
#include "plugins/SoundFormat.hpp"

#include <fcntl.h>
#include <poll.h>
#include <unistd.h>

#include <array>
#include <cstddef>
#include <cstdio>
#include <filesystem>
#include <iostream>
#include <system_error>

namespace brenix
{

namespace
{

/// Makes the file the standard input: an interruption ends that.
void openInput(const SampleFile& file)
{
    if (file.isPipe()) {
        return;
    }
    const int opened = ::open(file.name.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK);
    if (opened == -1) {
        failAsErrno(file.name);
    }
    pollfd waiting{opened, POLLIN, 0};
    while (::poll(&waiting, 1, 50) <= 0 && !isInterrupted()) { // nobody writes to a FIFO yet
    }
    ::fcntl(opened, F_SETFL, 0); // from here on a read waits
    ::dup2(opened, STDIN_FILENO);
    ::close(opened);
    if (isInterrupted()) {
        endInput();
    }
}

/// Puts a file in the place of a pipe, once it has all that comes.
void holdInput(const std::string& name)
{
    const OwnedFile file(std::tmpfile());
    if (!file) {
        failAsErrno("a temporary file");
    }
    std::array<char, 65536> block{};
    ssize_t size = 0;
    while ((size = ::read(STDIN_FILENO, block.data(), block.size())) > 0) {
        std::fwrite(block.data(), 1, static_cast<std::size_t>(size), file.get());
    }
    if (size < 0) {
        failAsErrno(name);
    }
    if (std::fflush(file.get()) != 0 || std::ferror(file.get()) != 0) {
        failAsErrno("a temporary file");
    }
    std::rewind(file.get());
    ::dup2(::fileno(file.get()), STDIN_FILENO);
}

/// At the end of the input: whether it was its end.
void requireRead(const std::string& name)
{
    if (std::cin.bad()) {
        fail(name, "cannot be read");
    }
}

class CsvReader : public SampleReader
{
public:
    CsvReader(const std::string& fileName, const ElementType& elementType)
        : SampleReader(fileName, elementType)
    {
        if (readLine()) {
            std::string wrong;
            const bool isRow = parseRow(*type, line, first, wrong, true);
            columns = first.size() / type->size;
            if (!isRow && !hasNumber(line)) {
                first.clear();
                if (readLine()) {
                    parseLine(first);
                }
            } else if (!isRow) {
                failAt(wrong);
            }
        }
    }

    void read(std::size_t rows, Bytes& elements) override
    {
        std::size_t count = 0;
        if (!first.empty() && rows > 0) {
            elements.insert(elements.end(), first.begin(), first.end());
            first.clear();
            count = 1;
        }
        for (; count < rows && readLine(); ++count) {
            parseLine(elements);
        }
    }

private:
    /// The next line that is not empty.
    bool readLine()
    {
        while (std::getline(std::cin, line) && !(std::cin.eof() && isInterrupted())) {
            if (++lineNumber == 1 && line.rfind("\xEF\xBB\xBF", 0) == 0) {
                line.erase(0, 3); // the mark of UTF-8, of some editors
            }
            if (line.find_first_not_of(" \t\r") != std::string::npos) {
                return true;
            }
        }
        requireRead(name);
        return false;
    }

    void parseLine(Bytes& elements)
    {
        const std::size_t size = elements.size();
        std::string wrong;
        const bool isRow = parseRow(*type, line, elements, wrong, true);
        const std::size_t cells = (elements.size() - size) / type->size;
        if (!isRow || cells != columns) {
            elements.resize(size);
        }
        if (!isRow) {
            failAt(wrong);
        }
        if (cells != columns) {
            fail(name,
                 place() + std::to_string(cells) + " values instead of " + std::to_string(columns));
        }
    }

    [[noreturn]] void failAt(const std::string& cell) const
    {
        fail(name, place() + "not a number of type " + type->name + ": " + cell);
    }

    std::string place() const { return "line " + std::to_string(lineNumber) + ": "; }

    std::string line;
    std::size_t lineNumber = 0;
    Bytes first; ///< the row that told the number of columns
};

class RawReader : public SampleReader
{
public:
    RawReader(const SampleFile& file, const ElementType& elementType)
        : SampleReader(file.inputName(), elementType)
    {
        std::error_code notAFile;
        const auto size = std::filesystem::file_size(file.name, notAFile);
        const auto elements = notAFile ? 0 : size / type->size;
        total = static_cast<double>(elements);
    }

    void read(std::size_t rows, Bytes& elements) override
    {
        const std::size_t size = elements.size();
        elements.resize(size + rows * type->size);
        std::cin.read(reinterpret_cast<char*>(&elements[size]),
                      static_cast<std::streamsize>(rows * type->size));
        const auto length = static_cast<std::size_t>(std::cin.gcount());
        const std::size_t torn = length % type->size;
        elements.resize(size + length - torn);
        requireRead(name);
        if (torn != 0 && !isInterrupted()) {
            fail(name, "the last element has " + std::to_string(torn) + " of " +
                           std::to_string(type->size) + " bytes");
        }
    }
};

class SoundReader : public SampleReader
{
public:
    SoundReader(const SampleFile& file, const ElementType* given)
        : SampleReader(file.inputName(), elementType("double"))
    {
        sound.reset(sf_open_fd(STDIN_FILENO, SFM_READ, &info, SF_FALSE));
        if (!sound && isInterrupted()) {
            return;
        }
        if (!sound) {
            fail(name, sf_strerror(nullptr));
        }
        type = given != nullptr ? given : &typeOfSound(info);
        if (soundType(*type).read == nullptr) {
            fail(name, std::string("its samples can be double, float, int32 or int16, not ") +
                           type->name);
        }
        columns = static_cast<std::size_t>(info.channels);
        rate = info.samplerate;
        total = info.seekable != 0 ? static_cast<double>(info.frames) : 0;
    }

    void read(std::size_t rows, Bytes& elements) override
    {
        const std::size_t size = elements.size();
        elements.resize(size + rows * columns * type->size);
        auto count = static_cast<std::size_t>(soundType(*type).read(
            sound.get(), &elements[size], static_cast<sf_count_t>(rows * columns))); // 0 at the end
        count /= columns; // of an incomplete frame there may be some samples
        elements.resize(size + count * columns * type->size);
        frames += static_cast<sf_count_t>(count);
        if (const int error = sf_error(sound.get()); error != SF_ERR_NO_ERROR) {
            fail(name, sf_error_number(error));
        }
        if (count < rows && !isInterrupted()) {
            if (const std::string missing = missingAtEnd(sound.get(), info, frames);
                !missing.empty()) {
                fail(name, missing);
            }
        }
    }

private:
    SF_INFO info{};
    OwnedSound sound;
    sf_count_t frames = 0; ///< that were read
};

} // namespace

std::unique_ptr<SampleReader> openReader(const SampleFile& file, const ElementType* type)
{
    if (type != nullptr && type->isText) {
        throw Failure("", "samples are numbers, not char");
    }
    openInput(file);
    if (const SoundFormat* const format = findSoundFormat(file.format)) {
        if (!format->isStream && ::lseek(STDIN_FILENO, 0, SEEK_CUR) == -1) {
            holdInput(file.inputName());
        }
        return std::make_unique<SoundReader>(file, type);
    }
    const ElementType& elements = type != nullptr ? *type : elementType("double");
    if (file.format == "raw") {
        return std::make_unique<RawReader>(file, elements);
    }
    return std::make_unique<CsvReader>(file.inputName(), elements);
}

} // namespace brenix
