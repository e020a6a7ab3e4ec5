#include "Samples.hpp"

#include "Commands.hpp"

#include <unistd.h>

#include <array>
#include <cerrno>
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <limits>
#include <system_error>

namespace brenix
{

namespace
{

template <typename T, sf_count_t (*function)(SNDFILE*, T*, sf_count_t)>
sf_count_t readAs(SNDFILE* sound, void* elements, sf_count_t count)
{
    return function(sound, static_cast<T*>(elements), count);
}

/// Full scale is that of T for every file: libsndfile itself scales floating-point samples to
/// integers by the loudest of them, or not at all.
template <typename T>
sf_count_t readScaled(SNDFILE* sound, void* elements, sf_count_t count)
{
    constexpr double low = std::numeric_limits<T>::min();
    constexpr double high = std::numeric_limits<T>::max();
    std::vector<double> samples(static_cast<std::size_t>(count));
    auto* next = static_cast<T*>(elements);
    count = sf_read_double(sound, samples.data(), count);
    samples.resize(static_cast<std::size_t>(count));
    for (const double sample : samples) {
        const double level = std::isnan(sample) ? 0 : sample * -low;
        *next++ = static_cast<T>(std::lrint(std::clamp(level, low, high)));
    }
    return count;
}

constexpr std::array encodings = {
    WavEncoding{"double", SF_FORMAT_DOUBLE, "SF_FORMAT_DOUBLE", readAs<double, sf_read_double>},
    WavEncoding{"float", SF_FORMAT_FLOAT, "SF_FORMAT_FLOAT", readAs<float, sf_read_float>},
    WavEncoding{"int32", SF_FORMAT_PCM_32, "SF_FORMAT_PCM_32", readScaled<std::int32_t>},
    WavEncoding{"int16", SF_FORMAT_PCM_16, "SF_FORMAT_PCM_16", readScaled<std::int16_t>},
    WavEncoding{"uint8", SF_FORMAT_PCM_U8, "SF_FORMAT_PCM_U8", nullptr},
};

[[noreturn]] void fail(const std::string& file, const std::string& problem)
{
    throw Failure("", file + ": " + problem);
}

[[noreturn]] void failAsErrno(const std::string& file)
{
    fail(file, std::generic_category().message(errno));
}

template <auto function>
struct Close {
    void operator()(auto* file) const noexcept { function(file); }
};
using OwnedFile = std::unique_ptr<std::FILE, Close<std::fclose>>;
using OwnedSound = std::unique_ptr<SNDFILE, Close<sf_close>>;

std::size_t rowSize(const std::vector<Field>& fields)
{
    std::size_t size = 0;
    for (const Field& field : fields) {
        size += field.perCount * field.type->size;
    }
    return size;
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

void requireOneType(const std::vector<Field>& fields, const char* format)
{
    for (const Field& field : fields) {
        if (field.type != fields[0].type) {
            throw Failure("", "the fields are of different types, which " + std::string(format) +
                                  " cannot hold: choose one with --field");
        }
    }
}

/// CSV and raw elements.
class PlainWriter : public SampleWriter
{
public:
    PlainWriter(const SampleFile& sampleFile, const std::vector<Field>& fields)
        : name(sampleFile.outputName()), csv(sampleFile.format == "csv")
    {
        if (!csv) {
            requireOneType(fields, "raw");
        }
        file.reset(sampleFile.isPipe() ? ::fdopen(::dup(STDOUT_FILENO), "wb")
                                       : std::fopen(name.c_str(), "wb"));
        if (!file) {
            failAsErrno(name);
        }
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

class WavWriter : public SampleWriter
{
public:
    WavWriter(const SampleFile& sampleFile, const std::vector<Field>& fields)
        : name(sampleFile.outputName())
    {
        requireOneType(fields, "WAV");
        const double rate = sampleFile.rate;
        if (rate < 1 || rate > std::numeric_limits<int>::max() || rate != std::floor(rate)) {
            throw Failure(
                "", "a WAV file needs a whole number as sample rate, below 2^31, but " +
                        (rate == 0 ? "the device tells none" : "it is " + std::to_string(rate)) +
                        ": give --rate");
        }
        SF_INFO info{};
        info.format = SF_FORMAT_WAV | wavEncoding(*fields[0].type).format;
        info.channels = static_cast<int>(rowSize(fields) / fields[0].type->size);
        info.samplerate = static_cast<int>(rate);
        // The length stands at the front: a pipe gets the file when it is complete.
        if (sampleFile.isPipe()) {
            whole.reset(std::tmpfile());
            if (!whole) {
                failAsErrno("a temporary file");
            }
        }
        sound.reset(whole ? sf_open_fd(::fileno(whole.get()), SFM_WRITE, &info, SF_FALSE)
                          : sf_open(name.c_str(), SFM_WRITE, &info));
        if (!sound) {
            fail(name, sf_strerror(nullptr));
        }
        sf_command(sound.get(), SFC_SET_ADD_PEAK_CHUNK, nullptr, SF_FALSE); // raw writes have none
        // Whenever the command is killed, the file is one.
        sf_command(sound.get(), SFC_SET_UPDATE_HEADER_AUTO, nullptr, SF_TRUE);
    }

    void write(const std::vector<Field>& fields, std::size_t counts) override
    {
        const Bytes rows = interleave(fields, counts);
        size += static_cast<double>(rows.size());
        if (size > std::numeric_limits<std::uint32_t>::max() - 4096.0) {
            fail(name, "a WAV file ends at 4 GiB");
        }
        if (sf_write_raw(sound.get(), rows.data(), static_cast<sf_count_t>(rows.size())) !=
            static_cast<sf_count_t>(rows.size())) {
            fail(name, sf_strerror(sound.get()));
        }
    }

    void finish() override
    {
        if (const int error = sf_close(sound.release()); error != SF_ERR_NO_ERROR) {
            fail(name, sf_error_number(error));
        }
        if (whole) {
            std::rewind(whole.get());
            std::array<char, 65536> block{};
            while (const std::size_t part =
                       std::fread(block.data(), 1, block.size(), whole.get())) {
                std::cout.write(block.data(), static_cast<std::streamsize>(part));
            }
            if (std::ferror(whole.get()) != 0 || !std::cout.flush()) {
                fail(name, "cannot be written");
            }
        }
    }

private:
    std::string name;
    OwnedFile whole;
    OwnedSound sound;
    double size = 0; ///< bytes of the samples
};

/// The standard input as it is, or else the file, opened in `owned`.
std::istream& openInput(const SampleFile& file, std::ifstream& owned)
{
    if (file.isPipe()) {
        return std::cin;
    }
    owned.open(file.name, std::ios::binary);
    if (!owned) {
        failAsErrno(file.name);
    }
    return owned;
}

/// At the end of the input: whether it was its end.
void requireRead(const std::string& name, const std::istream& stream)
{
    if (stream.bad()) {
        fail(name, "cannot be read");
    }
}

class CsvReader : public SampleReader
{
public:
    CsvReader(const SampleFile& file, const ElementType& elementType)
        : SampleReader(file, elementType), stream(openInput(file, owned))
    {
        if (readLine()) {
            if (line.rfind("\xEF\xBB\xBF", 0) == 0) { // the mark of UTF-8, of some editors
                line.erase(0, 3);
            }
            std::string wrong;
            const bool isRow = parseRow(type, line, first, wrong);
            columns = first.size() / type.size;
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
        while (std::getline(stream, line) && !(stream.eof() && isInterrupted())) {
            ++lineNumber;
            if (line.find_first_not_of(" \t\r") != std::string::npos) {
                return true;
            }
        }
        requireRead(name, stream);
        return false;
    }

    void parseLine(Bytes& elements)
    {
        const std::size_t size = elements.size();
        std::string wrong;
        const bool isRow = parseRow(type, line, elements, wrong);
        const std::size_t cells = (elements.size() - size) / type.size;
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
        fail(name, place() + "not a number of type " + type.name + ": " + cell);
    }

    std::string place() const { return "line " + std::to_string(lineNumber) + ": "; }

    std::ifstream owned;
    std::istream& stream;
    std::string line;
    std::size_t lineNumber = 0;
    Bytes first; ///< the row that told the number of columns
};

class RawReader : public SampleReader
{
public:
    RawReader(const SampleFile& file, const ElementType& elementType)
        : SampleReader(file, elementType), stream(openInput(file, owned))
    {
        std::error_code notAFile;
        const auto size = std::filesystem::file_size(file.name, notAFile);
        const auto elements = notAFile ? 0 : size / type.size;
        total = static_cast<double>(elements);
    }

    void read(std::size_t rows, Bytes& elements) override
    {
        const std::size_t size = elements.size();
        elements.resize(size + rows * type.size);
        stream.read(reinterpret_cast<char*>(&elements[size]),
                    static_cast<std::streamsize>(rows * type.size));
        const auto length = static_cast<std::size_t>(stream.gcount());
        const std::size_t torn = length % type.size;
        elements.resize(size + length - torn);
        requireRead(name, stream);
        if (torn != 0 && !isInterrupted()) {
            fail(name, "the last element has " + std::to_string(torn) + " of " +
                           std::to_string(type.size) + " bytes");
        }
    }

private:
    std::ifstream owned;
    std::istream& stream;
};

class WavReader : public SampleReader
{
public:
    WavReader(const SampleFile& file, const ElementType& elementType)
        : SampleReader(file, elementType)
    {
        if (wavEncoding(type).read == nullptr) {
            throw Failure("",
                          std::string("WAV samples can be double, float, int32 or int16, not ") +
                              type.name);
        }
        SF_INFO info{};
        sound.reset(file.isPipe() ? sf_open_fd(STDIN_FILENO, SFM_READ, &info, SF_FALSE)
                                  : sf_open(name.c_str(), SFM_READ, &info));
        if (!sound) {
            fail(name, sf_strerror(nullptr));
        }
        columns = static_cast<std::size_t>(info.channels);
        rate = info.samplerate;
        total = file.isPipe() ? 0 : static_cast<double>(info.frames);
    }

    void read(std::size_t rows, Bytes& elements) override
    {
        const std::size_t size = elements.size();
        elements.resize(size + rows * columns * type.size);
        const auto count = static_cast<std::size_t>(wavEncoding(type).read(
            sound.get(), &elements[size], static_cast<sf_count_t>(rows * columns))); // 0 at the end
        elements.resize(size + count * type.size);
        if (const int error = sf_error(sound.get()); error != SF_ERR_NO_ERROR) {
            fail(name, sf_error_number(error));
        }
    }

private:
    OwnedSound sound;
};

} // namespace

const WavEncoding& wavEncoding(const ElementType& type)
{
    for (const WavEncoding& encoding : encodings) {
        if (encoding.type == type.name) {
            return encoding;
        }
    }
    throw Failure("", std::string("a WAV file cannot hold samples of type ") + type.name);
}

void settleFormat(SampleFile& file)
{
    if (file.format.empty()) {
        const std::string ending = std::filesystem::path(file.name).extension().string();
        file.format = ending == ".wav"                       ? "wav"
                      : ending == ".raw" || ending == ".bin" ? "raw"
                                                             : "csv";
    }
}

std::vector<std::string> columnNames(const std::vector<Field>& fields)
{
    std::vector<std::string> names;
    for (const Field& field : fields) {
        const std::string name = field.name.empty() ? "first" : field.name;
        for (std::size_t i = 1; i <= field.perCount; ++i) {
            names.push_back(field.perCount == 1 ? name : name + std::to_string(i));
        }
    }
    return names;
}

std::string csvHeader(const std::vector<Field>& fields)
{
    std::string header;
    for (const std::string& name : columnNames(fields)) {
        header += (header.empty() ? "" : ",") + name;
    }
    return header;
}

std::unique_ptr<SampleWriter> openWriter(const SampleFile& file, const std::vector<Field>& fields)
{
    if (file.format == "wav") {
        return std::make_unique<WavWriter>(file, fields);
    }
    return std::make_unique<PlainWriter>(file, fields);
}

std::unique_ptr<SampleReader> openReader(const SampleFile& file, const ElementType& type)
{
    if (type.isText) {
        throw Failure("", "samples are numbers, not char");
    }
    if (file.format == "wav") {
        return std::make_unique<WavReader>(file, type);
    }
    if (file.format == "raw") {
        return std::make_unique<RawReader>(file, type);
    }
    return std::make_unique<CsvReader>(file, type);
}

} // namespace brenix
