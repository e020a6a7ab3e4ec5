/// @file
/// How a plug-in tells what its options and properties are, for those who use it. A description is
/// optional and read only when someone asks; it stands beside the macro that exports the class:
///
///     constexpr OptionInfo options[] = {{"Gain", "number", "", "1", "factor of every number"}, {}};
///     BRENIXCORE_EXPORT_FILTER(Scale)
///     BRENIXCORE_DESCRIBE_OPTIONS(options)
#ifndef BRENIXCORE_PLUGIN_DESCRIBE_HPP
#define BRENIXCORE_PLUGIN_DESCRIBE_HPP

#include "brenixcore/plugin/Plugin.hpp"

namespace brenixcore::plugin
{

/// One option. Tables end with a null name; no other text of theirs is null.
struct OptionInfo {
    const char* name;         ///< under which it is given
    const char* type;         ///< what it must be: "text", "number", "whole number"
    const char* unit;         ///< empty when it has none
    const char* defaultValue; ///< "(required)" when it must be given
    const char* meaning;      ///< in a few words
};

/// One property of a device. Tables end as those of options do.
struct PropertyInfo {
    const char* name;    ///< under which it is read
    const char* type;    ///< the type name with which it is read
    const char* unit;    ///< empty when it has none
    const char* meaning; ///< in a few words
};

/// The table of a plug-in that has no options.
constexpr OptionInfo noOptions[] = {{}};

} // namespace brenixcore::plugin

/// Exports a table of options, which must have static storage.
#define BRENIXCORE_DESCRIBE_OPTIONS(table)                                                         \
    extern "C" BRENIXCORE_PLUGIN_SHARED const brenixcore::plugin::OptionInfo*                      \
    brenixcorePluginOptions()                                                                      \
    {                                                                                              \
        return table;                                                                              \
    }

/// Exports a table of properties, which must have static storage.
#define BRENIXCORE_DESCRIBE_PROPERTIES(table)                                                      \
    extern "C" BRENIXCORE_PLUGIN_SHARED const brenixcore::plugin::PropertyInfo*                    \
    brenixcorePluginProperties()                                                                   \
    {                                                                                              \
        return table;                                                                              \
    }

#endif
