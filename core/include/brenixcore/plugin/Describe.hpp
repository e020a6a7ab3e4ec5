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
    const char* name;
    const char* type;         ///< what it must be: "text", "number", "whole number"
    const char* unit;         ///< empty when it has none
    const char* defaultValue; ///< "(required)" when it must be given
    const char* meaning;
};

/// One property of a device, all as above; `type` is the type name under which it is read.
struct PropertyInfo {
    const char* name;
    const char* type;
    const char* unit;
    const char* meaning;
};

/// The table of a plug-in that has no options.
constexpr OptionInfo noOptions[] = {{}};

} // namespace brenixcore::plugin

/// Exports a table, which must have static storage.
#define BRENIXCORE_DESCRIBE_OPTIONS(table)                                                         \
    extern "C" BRENIXCORE_PLUGIN_SHARED const brenixcore::plugin::OptionInfo*                      \
    brenixcorePluginOptions()                                                                      \
    {                                                                                              \
        return table;                                                                              \
    }
#define BRENIXCORE_DESCRIBE_PROPERTIES(table)                                                      \
    extern "C" BRENIXCORE_PLUGIN_SHARED const brenixcore::plugin::PropertyInfo*                    \
    brenixcorePluginProperties()                                                                   \
    {                                                                                              \
        return table;                                                                              \
    }

#endif
