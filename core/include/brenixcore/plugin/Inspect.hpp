/// @file
/// Looks at a plug-in as the core would load it: why it does not load, and what it says of itself.
/// For programs that list plug-ins; libbrenixcore is linked for it.
#ifndef BRENIXCORE_PLUGIN_INSPECT_HPP
#define BRENIXCORE_PLUGIN_INSPECT_HPP

#include "brenixcore/plugin/Find.hpp"
#include "brenixcore/plugin/Plugin.hpp"

#include <string>
#include <vector>

namespace brenixcore::plugin
{

/// A row of a plug-in's description: OptionInfo, or PropertyInfo or FieldInfo, which have no default.
struct DescribedValue {
    std::string name;         ///< of the option, property or field
    std::string type;         ///< as in OptionInfo, PropertyInfo and FieldInfo
    std::string unit;         ///< empty when it has none
    std::string defaultValue; ///< of an option
    std::string meaning;      ///< in a few words
};

/// A row of a plug-in's commands.
struct DescribedCommand {
    std::string name;                    ///< with which it is executed
    std::vector<DescribedValue> options; ///< that it takes
    std::string meaning;                 ///< in a few words
};

/// What is known of a plug-in.
struct PluginReport {
    std::string path; ///< where the core looks for it

    /// Empty when the plug-in loads and its object can be made. Otherwise "notFound" (or not
    /// readable), "wrongFileType", "missingDependency", "notLoadable", "notAPlugin", "abiVersion",
    /// "noFactory", "otherKind" or "factoryFailed"; then `message` says what exactly.
    std::string problem;
    std::string message; ///< why, when there is a problem

    std::string kind; ///< "Device", "Converter" or "Filter"; empty when it has no factory
    bool describesOptions = false;            ///< or else what its options are is not known
    std::vector<DescribedValue> options;      ///< in the order of the plug-in's table
    std::vector<DescribedValue> properties;   ///< the same
    std::vector<DescribedValue> inputFields;  ///< the same; empty when it describes none
    std::vector<DescribedValue> outputFields; ///< the same
    std::vector<DescribedCommand> commands;   ///< the same
};

/// Loads the plug-in of a path or a bare name, makes its object and releases both. With a kind, "Device",
/// "Converter" or "Filter", a plug-in of another one has a problem, too. Throws only when memory runs out.
BRENIXCORE_PLUGIN_SHARED PluginReport inspectPlugin(const std::string& name,
                                                    const std::string& kind = "");

/// What a plug-in finds.
struct FindReport {
    bool looks = false;       ///< whether the plug-in can look at all
    std::vector<Found> found; ///< in the order in which the plug-in tells
    std::string message;      ///< why it could not look, or not to the end; empty when it could
};

/// Loads the plug-in of a path or a bare name, has it look and releases it. Takes as long as the plug-in does.
/// Throws only when memory runs out.
BRENIXCORE_PLUGIN_SHARED FindReport findDevices(const std::string& name);

/// The folder of the bare names, with a slash at its end.
BRENIXCORE_PLUGIN_SHARED std::string pluginFolder();

} // namespace brenixcore::plugin

#endif
