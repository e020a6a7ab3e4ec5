// What the device hdf5 says of itself.
#ifndef BRENIX_PLUGINS_HDF5_DESCRIPTION_HPP
#define BRENIX_PLUGINS_HDF5_DESCRIPTION_HPP

#include "brenixcore/plugin/Describe.hpp"

namespace hdf5
{

using brenixcore::plugin::CommandInfo;
using brenixcore::plugin::dataField;
using brenixcore::plugin::FieldInfo;
using brenixcore::plugin::OptionInfo;
using brenixcore::plugin::PropertyInfo;

constexpr OptionInfo optionTable[] = {
    {"FileName", "text", "", "(required)", ""},
    {"Mode", "text", "", "read", "read replays a recording; write makes one"},
    {"Dataset", "text", "", "data", "in the file; a path such as run1/force makes groups"},
    {"SampleRate", "number", "Hz", "0",
     "counts a second; 0: writing, not known; reading, what the file tells"},
    {"BlockSize", "whole number", "counts", "1024", "reading: of the largest packet"},
    {"First", "whole number", "counts", "0", "reading: row of the dataset to start at"},
    {"Pace", "text", "", "fast",
     "reading: fast as soon as there is room; realtime as it was recorded"},
    {"ElementType", "text", "", "double",
     "writing: double, float, int8 to int64 or uint8 to uint64"},
    {"Channels", "whole number", "", "1", "writing: elements of a count, up to 65536"},
    {"Compression", "whole number", "", "0", "writing: 0 for none, to 9 for the slowest"},
    {"Unit", "text", "", "none", "writing: of the elements"},
    {"Start", "whole number", "ns", "0",
     "writing: time of the first count, since 1970 (UTC); 0: when it is taken"},
    {"Names", "text", "", "none", "writing: of the channels, with commas between them"},
    {"Origin", "text", "", "none", "writing: the device that the counts are from, and its options"},
    {"Attributes", "text", "", "none", "writing: further ones, such as operator=Ann,site=lab 3"},
    {},
};

constexpr OptionInfo gapOptions[] = {
    {"Counts", "whole number", "counts", "(required)", "that are missing; 0: not known"},
    {"Time", "whole number", "ns", "now", "of the count behind the gap, since 1970 (UTC)"},
    {},
};

constexpr CommandInfo commandTable[] = {
    {"gap", gapOptions, "writing: counts are missing behind those that were written"},
    {},
};

constexpr FieldInfo inputFields[] = {
    {dataField, "", "", "an element of each channel for each count, of the type in the file"},
    {},
};

constexpr FieldInfo outputFields[] = {
    {dataField, "(ElementType)", "", "the same; a buffer need not end with a count"},
    {},
};

constexpr PropertyInfo propertyTable[] = {
    {"SampleRate", "double", "Hz", "0: not known"},
    {"Channels", "uint32", "", ""},
    {"ElementType", "char", "", ""},
    {"Frames", "int64", "counts", "reading: of the file at init; writing: in the file so far"},
    {"Gaps", "uint64", "", "the same of gaps"},
    {"Unit", "char", "", ""},
    {"Start", "int64", "ns", "time of the first count, since 1970 (UTC); 0: not known"},
    {"Names", "char", "", "of the channels"},
    {"Origin", "char", "", ""},
    {"Attributes", "char", "", "further ones that are texts"},
    {},
};

} // namespace hdf5

#endif
