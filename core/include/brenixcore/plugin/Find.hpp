/// @file
/// How a device tells what is there that it could be opened on: cards, ports, radios. A plug-in that can look
/// exports a function, beside the macro that exports the class:
///
///     void findPorts(std::vector<Found>& found) { ... }
///     BRENIXCORE_EXPORT_DEVICE(Serial)
///     BRENIXCORE_EXPORT_FIND(findPorts)
#ifndef BRENIXCORE_PLUGIN_FIND_HPP
#define BRENIXCORE_PLUGIN_FIND_HPP

#include "brenixcore/plugin/Plugin.hpp"

#include <string>
#include <utility>
#include <vector>

namespace brenixcore::plugin
{

/// Something that a device can be opened on. All texts are UTF-8.
struct Found {
    std::string what; ///< in a line, for people

    /// The options that open it: names and values, as a command line takes them. The device's other options
    /// have their defaults.
    std::vector<std::pair<std::string, std::string>> options;

    /// Why it may not be opened and what would help, in a line; empty when nothing speaks against it.
    std::string problem;
};

} // namespace brenixcore::plugin

/// Exports a function that appends what is there to a std::vector<Found>. It runs when someone asks, with no
/// device of the plug-in made for it. It opens nothing that others could miss meanwhile, prints nothing, and ends
/// within a few seconds. It may throw a std::exception when it cannot look: its text becomes a message, and what
/// it has appended until then counts.
#define BRENIXCORE_EXPORT_FIND(function)                                                           \
    extern "C" BRENIXCORE_PLUGIN_SHARED void brenixcorePluginFind(                                 \
        std::vector<brenixcore::plugin::Found>& found)                                             \
    {                                                                                              \
        function(found);                                                                           \
    }

#endif
