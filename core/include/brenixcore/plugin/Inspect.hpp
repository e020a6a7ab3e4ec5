/// @file
/// Looks at a plug-in as the core would load it: why it does not load, and what it says of itself.
/// For programs that list plug-ins; libbrenixcore is linked for it.
#ifndef BRENIXCORE_PLUGIN_INSPECT_HPP
#define BRENIXCORE_PLUGIN_INSPECT_HPP

#include <string>
#include <vector>

namespace brenixcore::plugin
{

/// A row of a plug-in's description: OptionInfo, or PropertyInfo, which has no default.
struct DescribedValue {
    std::string name;
    std::string type;
    std::string unit;
    std::string defaultValue;
    std::string meaning;
};

struct PluginReport {
    std::string path; ///< where the core looks for it

    /// Empty when the plug-in loads and its object can be made. Otherwise "notFound" (or not
    /// readable), "wrongFileType", "missingDependency", "notLoadable", "notAPlugin", "abiVersion",
    /// "noFactory" or "factoryFailed"; then `message` says what exactly.
    std::string problem;
    std::string message;

    std::string kind; ///< "Device", "Converter" or "Filter"; empty when it has no factory
    bool describesOptions = false; ///< or else what its options are is not known
    std::vector<DescribedValue> options;
    std::vector<DescribedValue> properties;
};

/// Loads the plug-in of a path or a bare name, makes its object and releases both. Throws only when
/// memory runs out.
__attribute__((visibility("default"))) PluginReport inspectPlugin(const std::string& name);

/// The folder of the bare names, with a slash at its end.
__attribute__((visibility("default"))) std::string pluginFolder();

} // namespace brenixcore::plugin

#endif
