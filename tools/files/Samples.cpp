#include "files/Samples.hpp"

#include <algorithm>
#include <cctype>
#include <cerrno>
#include <cmath>
#include <cstdint>
#include <filesystem>
#include <limits>
#include <stdexcept>
#include <system_error>

namespace brenix
{

void fail(const std::string& file, const std::string& problem)
{
    throw Failure("", file + ": " + problem);
}

void failAsErrno(const std::string& file)
{
    fail(file, std::generic_category().message(errno));
}

std::vector<std::string> formatNames()
{
    std::vector<std::string> names = {"csv", "raw"};
    for (const SoundFormat& format : soundFormats()) {
        names.emplace_back(format.name);
    }
    return names;
}

void settleFormat(SampleFile& file)
{
    if (!file.format.empty()) {
        return;
    }
    std::string ending = std::filesystem::path(file.name).extension().string();
    std::transform(ending.begin(), ending.end(), ending.begin(),
                   [](unsigned char letter) { return static_cast<char>(std::tolower(letter)); });
    if (ending.empty() || ending == ".csv" || ending == ".txt") {
        file.format = "csv";
    } else if (ending == ".raw" || ending == ".bin") {
        file.format = "raw";
    } else if (findSoundFormat(ending.substr(1)) != nullptr) {
        file.format = ending.substr(1);
    } else {
        throw std::invalid_argument(file.name + ": the ending " + ending +
                                    " names no format: give --format");
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

std::size_t rowSize(const std::vector<Field>& fields)
{
    std::size_t size = 0;
    for (const Field& field : fields) {
        size += field.perCount * field.type->size;
    }
    return size;
}

SF_INFO soundInfo(const SampleFile& file, const std::vector<Field>& fields, std::string& format)
{
    if (file.rate < 1 || file.rate > std::numeric_limits<int>::max() ||
        file.rate != std::floor(file.rate)) {
        throw Failure("", "a sound file needs a whole number as sample rate, below 2^31, but " +
                              (file.rate == 0 ? "the device tells none"
                                              : "it is " + std::to_string(file.rate)) +
                              ": give --rate");
    }
    SF_INFO info{};
    info.channels = static_cast<int>(rowSize(fields) / fields[0].type->size);
    info.samplerate = static_cast<int>(file.rate);
    format = chooseFormat(*findSoundFormat(file.format), *fields[0].type, info);
    return info;
}

double mostBytes(const SoundFormat& format, double written)
{
    // An element has at most twice its size in the file.
    return format.isLarge ? std::numeric_limits<double>::infinity()
                          : std::numeric_limits<std::uint32_t>::max() - 4096.0 - 2 * written;
}

} // namespace brenix
