// What plug-ins say of themselves, as the commands use and print it.
#ifndef BRENIX_TOOLS_DESCRIBED_HPP
#define BRENIX_TOOLS_DESCRIBED_HPP

#include "Channel.hpp"
#include "brenixcore/plugin/Inspect.hpp"

#include <nlohmann/json.hpp>

#include <string>
#include <vector>

namespace brenix
{

using brenixcore::plugin::DescribedCommand;
using brenixcore::plugin::DescribedValue;
using brenixcore::plugin::PluginReport;

/// What is known of a channel's device. Its fields are those on the caller's side of the converter, of the
/// types that the device's options say.
PluginReport describe(const ChannelSettings& settings);

nlohmann::ordered_json toJson(const std::vector<DescribedValue>& values, bool hasDefaults = false);
nlohmann::ordered_json toJson(const std::vector<DescribedCommand>& commands);

/// A line for each value, behind a title if there are any.
std::string printed(const std::string& indent, const std::string& title,
                    const std::vector<DescribedValue>& values);

/// The fields and commands, in the same way.
std::string printedFields(const std::string& indent, const PluginReport& report);

} // namespace brenix

#endif
