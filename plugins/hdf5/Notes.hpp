// What stands beside the counts of a recording.
#ifndef BRENIX_PLUGINS_HDF5_NOTES_HPP
#define BRENIX_PLUGINS_HDF5_NOTES_HPP

#include "Calls.hpp"

#include <cstdint>
#include <map>
#include <string>
#include <string_view>
#include <vector>

namespace hdf5
{

/// Counts that are missing in front of one that is there.
struct Gap {
    std::uint64_t index; ///< of that one, in the dataset
    std::int64_t time;   ///< when that was, in nanoseconds since 1970 (UTC); 0: not known
    std::uint64_t lost;  ///< how many; 0: not known
};

/// As it is in a file.
Object makeGapType();

/// The dataset of the gaps in another dataset.
inline std::string gapsOf(const std::string& dataset)
{
    return dataset + "_gaps";
}

/// The attributes of a dataset.
struct Notes {
    double rate = 0; ///< counts a second; 0: not known
    std::string unit;
    std::int64_t start = 0; ///< the time of the first count; 0: not known
    std::vector<std::string> names;
    std::string origin;
    std::map<std::string, std::string> others;

    /// Puts them at a dataset.
    void write(hid_t dataset) const;

    /// Those that a dataset has. One of these names that is something else is passed over.
    void read(hid_t dataset);

    static void writeStart(hid_t dataset, std::int64_t start);
};

/// The parts of a list: "a,b". A backslash in front of a character makes it part of a name.
std::vector<std::string> parseNames(std::string_view list);
/// The same of texts with names: "name=value,name=value". Throws std::invalid_argument with what is wrong.
std::map<std::string, std::string> parseAttributes(std::string_view list);

/// The lists that are parsed as these.
std::string formatNames(const std::vector<std::string>& names);
std::string formatAttributes(const std::map<std::string, std::string>& attributes);

} // namespace hdf5

#endif
