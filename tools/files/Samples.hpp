// Samples in files and pipes: CSV, raw elements and sound files.
#ifndef BRENIX_TOOLS_SAMPLES_HPP
#define BRENIX_TOOLS_SAMPLES_HPP

#include "Channel.hpp"
#include "Values.hpp"
#include "files/Sound.hpp"

#include <cstddef>
#include <cstdio>
#include <memory>
#include <string>
#include <vector>

namespace brenix
{

/// Where samples go to or come from.
struct SampleFile {
    std::string name = "-"; ///< "-" is the standard output or input
    std::string format;     ///< one of formatNames(); empty: as the name's ending has it, or "csv"
    double rate = 0;        ///< counts a second; 0 when it is not known

    bool isPipe() const { return name == "-"; }

    // What errors call it.
    std::string inputName() const { return isPipe() ? "standard input" : name; }
    std::string outputName() const { return isPipe() ? "standard output" : name; }
};

/// "csv", "raw" and those of sound files.
std::vector<std::string> formatNames();

/// Sets the format from the name's ending. Throws std::invalid_argument for one that names none.
void settleFormat(SampleFile& file);

[[noreturn]] void fail(const std::string& file, const std::string& problem);
[[noreturn]] void failAsErrno(const std::string& file);

template <auto function>
struct Close {
    void operator()(auto* file) const noexcept { function(file); }
};
using OwnedFile = std::unique_ptr<std::FILE, Close<std::fclose>>;
using OwnedSound = std::unique_ptr<SNDFILE, Close<sf_close>>;

/// Takes the fields of one buffer after another. Errors are Failures.
class SampleWriter
{
public:
    virtual ~SampleWriter() = default;
    virtual void write(const std::vector<Field>& fields, std::size_t counts) = 0;
    virtual void finish() = 0;
};

/// Opens the file for fields like these. Nothing when an interruption ends the waiting for somebody who
/// reads a FIFO.
std::unique_ptr<SampleWriter> openWriter(const SampleFile& file, const std::vector<Field>& fields);

/// Gives the elements of one row after another. Errors are Failures.
class SampleReader
{
public:
    SampleReader(std::string fileName, const ElementType& elementType)
        : name(std::move(fileName)), type(&elementType)
    {
    }
    virtual ~SampleReader() = default;

    /// Appends up to that many rows, none at the end. A Failure comes after the rows before it, which
    /// are then there. A row that an interruption has cut is none.
    virtual void read(std::size_t rows, Bytes& elements) = 0;
    const ElementType& getType() const { return *type; }
    std::size_t getColumns() const { return columns; }
    double getRate() const { return rate; }       ///< 0 when the file does not tell
    double getTotalRows() const { return total; } ///< 0 when it is not known

protected:
    std::string name;
    const ElementType* type;
    std::size_t columns = 1;
    double rate = 0;
    double total = 0;
};

/// Makes the file the standard input, which an interruption ends. Without a type it is the file's own:
/// what holds the samples of a sound file, or else double.
std::unique_ptr<SampleReader> openReader(const SampleFile& file, const ElementType* type);

/// The names of the columns of CSV, and the line of them.
std::vector<std::string> columnNames(const std::vector<Field>& fields);
std::string csvHeader(const std::vector<Field>& fields);

/// Bytes of a row, which is an element of each column.
std::size_t rowSize(const std::vector<Field>& fields);

/// A sound file for fields like these, and its format in C.
SF_INFO soundInfo(const SampleFile& file, const std::vector<Field>& fields, std::string& format);

/// Where a file of a format must end that cannot have 4 GiB, after one more write of that many bytes.
double mostBytes(const SoundFormat& format, double written);

} // namespace brenix

#endif
