// Samples in files and pipes: CSV, raw elements and WAV.
#ifndef BRENIX_TOOLS_SAMPLES_HPP
#define BRENIX_TOOLS_SAMPLES_HPP

#include "Channel.hpp"
#include "Values.hpp"

#include <sndfile.h>

#include <cstddef>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

namespace brenix
{

/// Where samples go to or come from.
struct SampleFile {
    std::string name = "-"; ///< "-" is the standard output or input
    std::string format;     ///< "csv", "raw" or "wav"; empty: as the name's ending has it, or "csv"
    double rate = 0;        ///< counts a second; 0 when it is not known

    bool isPipe() const { return name == "-"; }

    // What errors call it.
    std::string inputName() const { return isPipe() ? "standard input" : name; }
    std::string outputName() const { return isPipe() ? "standard output" : name; }
};

/// Sets the format from the name's ending.
void settleFormat(SampleFile& file);

/// Takes the fields of one buffer after another. Errors are Failures.
class SampleWriter
{
public:
    virtual ~SampleWriter() = default;
    virtual void write(const std::vector<Field>& fields, std::size_t counts) = 0;
    virtual void finish() = 0;
};

/// Opens the file for fields like these.
std::unique_ptr<SampleWriter> openWriter(const SampleFile& file, const std::vector<Field>& fields);

/// Gives the elements of one row after another. Errors are Failures.
class SampleReader
{
public:
    SampleReader(const SampleFile& file, const ElementType& elementType)
        : name(file.inputName()), type(elementType)
    {
    }
    virtual ~SampleReader() = default;

    /// Appends up to that many rows, none at the end. A Failure comes after the rows before it, which
    /// are then there. A row that an interruption has cut is none.
    virtual void read(std::size_t rows, Bytes& elements) = 0;
    std::size_t getColumns() const { return columns; }
    double getRate() const { return rate; }       ///< 0 when the file does not tell
    double getTotalRows() const { return total; } ///< 0 when it is not known

protected:
    std::string name;
    const ElementType& type;
    std::size_t columns = 1;
    double rate = 0;
    double total = 0;
};

std::unique_ptr<SampleReader> openReader(const SampleFile& file, const ElementType& type);

/// The names of the columns of CSV, and the line of them.
std::vector<std::string> columnNames(const std::vector<Field>& fields);
std::string csvHeader(const std::vector<Field>& fields);

/// How a WAV file holds elements as they are in memory, in libsndfile's terms.
struct WavEncoding {
    std::string_view type;
    int format;
    const char* formatName;                                               ///< in C
    sf_count_t (*read)(SNDFILE* sound, void* elements, sf_count_t count); ///< null if there is none
};

/// Throws a Failure for a type that WAV does not have.
const WavEncoding& wavEncoding(const ElementType& type);

} // namespace brenix

#endif
