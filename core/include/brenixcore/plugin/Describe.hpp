/// @file
/// How a plug-in tells what its options, properties, fields and commands are, for those who use it. A
/// description is optional and read only when someone asks; it stands beside the macro that exports the
/// class:
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
    const char* type;         ///< what it must be: "text", "number", "whole number", "logical"
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

/// One field of the packets of a stream. Tables end as those of options do.
struct FieldInfo {
    const char* name; ///< "#" in it stands for 1, 2, 3 and so on, as far as there are fields

    /// The type name with which it is read or written; "(Name)" is the type that the option Name says,
    /// and an empty text the one that the data has before.
    const char* type;
    const char* unit;    ///< empty when it has none
    const char* meaning; ///< in a few words
};

/// One command of a device. Tables end as those of options do.
struct CommandInfo {
    const char* name;          ///< with which it is executed
    const OptionInfo* options; ///< those that it takes, a table as of options
    const char* meaning;       ///< in a few words
};

/// The table of a plug-in or a command that has no options.
constexpr OptionInfo noOptions[] = {{}};

/// The table of a stream that a device does not have, or that a converter leaves as it is.
constexpr FieldInfo noFields[] = {{}};

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

/// Exports two tables of fields, which must have static storage: what a device delivers and what it takes, or
/// what a converter makes of input and what it takes to convert for output.
#define BRENIXCORE_DESCRIBE_FIELDS(inputTable, outputTable)                                        \
    extern "C" BRENIXCORE_PLUGIN_SHARED const brenixcore::plugin::FieldInfo*                       \
    brenixcorePluginInputFields()                                                                  \
    {                                                                                              \
        return inputTable;                                                                         \
    }                                                                                              \
    extern "C" BRENIXCORE_PLUGIN_SHARED const brenixcore::plugin::FieldInfo*                       \
    brenixcorePluginOutputFields()                                                                 \
    {                                                                                              \
        return outputTable;                                                                        \
    }

/// Exports a table of commands, which must have static storage.
#define BRENIXCORE_DESCRIBE_COMMANDS(table)                                                        \
    extern "C" BRENIXCORE_PLUGIN_SHARED const brenixcore::plugin::CommandInfo*                     \
    brenixcorePluginCommands()                                                                     \
    {                                                                                              \
        return table;                                                                              \
    }

#endif
