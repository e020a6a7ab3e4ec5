#include "Described.hpp"

#include <algorithm>

namespace brenix
{

using nlohmann::ordered_json;

namespace
{

/// The option of which a field has its type; empty when it has it of nobody.
std::string optionOfType(const std::string& type)
{
    const bool isOption = type.size() > 2 && type.front() == '(' && type.back() == ')';
    return isOption ? type.substr(1, type.size() - 2) : "";
}

} // namespace

PluginReport describe(const ChannelSettings& settings)
{
    PluginReport report = brenixcore::plugin::inspectPlugin(settings.device);
    const PluginReport converter = brenixcore::plugin::inspectPlugin(settings.converter);
    const std::vector<Option> given = parseOptions(settings.options, settings.device);
    const auto settle = [&](std::vector<DescribedValue>& fields,
                            const std::vector<DescribedValue>& converted) {
        const std::string before = fields.size() == 1 ? fields[0].type : "";
        fields = converted.empty() ? fields : converted;
        for (DescribedValue& field : fields) {
            field.type = field.type.empty() ? before : field.type;
            const std::string name = optionOfType(field.type);
            for (const DescribedValue& option : report.options) {
                field.type = option.name == name ? option.defaultValue : field.type;
            }
            for (const Option& option : given) {
                field.type =
                    option.name == name ? printElements(*option.type, option.elements) : field.type;
            }
        }
    };
    settle(report.inputFields, converter.inputFields);
    settle(report.outputFields, converter.outputFields);
    return report;
}

ordered_json toJson(const std::vector<DescribedValue>& values, bool hasDefaults)
{
    ordered_json list = ordered_json::array();
    for (const DescribedValue& value : values) {
        ordered_json entry = {{"name", value.name}, {"type", value.type}, {"unit", value.unit}};
        if (hasDefaults) {
            entry["default"] = value.defaultValue;
        }
        entry["meaning"] = value.meaning;
        list.push_back(entry);
    }
    return list;
}

ordered_json toJson(const std::vector<DescribedCommand>& commands)
{
    ordered_json list = ordered_json::array();
    for (const DescribedCommand& command : commands) {
        list.push_back({{"name", command.name},
                        {"options", toJson(command.options, true)},
                        {"meaning", command.meaning}});
    }
    return list;
}

std::string printed(const std::string& indent, const std::string& title,
                    const std::vector<DescribedValue>& values)
{
    std::size_t width = 0;
    for (const DescribedValue& value : values) {
        width = std::max(width, value.name.size());
    }
    std::string text = values.empty() || title.empty() ? "" : indent + title + ":\n";
    for (const DescribedValue& value : values) {
        const std::string option = optionOfType(value.type);
        text += indent + "  " + value.name + std::string(width + 2 - value.name.size(), ' ') +
                (value.type.empty() ? "type of the data"
                 : option.empty()   ? value.type
                                    : "as " + option + " says") +
                (value.unit.empty() ? "" : " in " + value.unit);
        if (!value.defaultValue.empty()) {
            text += value.defaultValue == "(required)" ? ", required"
                                                       : ", default " + value.defaultValue;
        }
        text += (value.meaning.empty() ? "" : ": " + value.meaning) + '\n';
    }
    return text;
}

std::string printedFields(const std::string& indent, const PluginReport& report)
{
    std::string text = printed(indent, "input fields", report.inputFields) +
                       printed(indent, "output fields", report.outputFields);
    for (const DescribedCommand& command : report.commands) {
        text += indent + "command " + command.name +
                (command.meaning.empty() ? "" : ": " + command.meaning) + '\n' +
                printed(indent, "", command.options);
    }
    return text;
}

} // namespace brenix
