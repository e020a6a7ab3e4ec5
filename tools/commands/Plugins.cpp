// The commands plugins, check and find.

#include "Described.hpp"
#include "Screen.hpp"
#include "commands/Commands.hpp"

#include <algorithm>
#include <cctype>
#include <filesystem>
#include <iostream>

namespace brenix
{

namespace
{

std::vector<std::string> installedPlugins()
{
    std::vector<std::string> names;
    std::error_code noFolder;
    for (const auto& entry :
         std::filesystem::directory_iterator(brenixcore::plugin::pluginFolder(), noFolder)) {
        if (entry.path().extension() == ".so") {
            names.push_back(entry.path().stem());
        }
    }
    std::sort(names.begin(), names.end());
    return names;
}

std::string kindOf(const PluginReport& report)
{
    std::string kind = report.kind.empty() ? "unknown" : report.kind;
    kind[0] = static_cast<char>(std::tolower(static_cast<unsigned char>(kind[0])));
    return kind;
}

Json toJson(const std::string& name, const PluginReport& report)
{
    Json entry = {{"name", name},
                  {"path", report.path},
                  {"kind", kindOf(report)},
                  {"loads", report.problem.empty()}};
    if (!report.problem.empty()) {
        entry["problem"] = report.problem;
        entry["message"] = report.message;
    }
    return entry;
}

/// What opens it, as it can stand behind "brenix read".
std::string arguments(const std::string& device, const brenixcore::plugin::Found& found)
{
    std::string text = shellWord(device);
    for (const auto& [name, value] : found.options) {
        text += " -o " + shellWord(name + '=' + value);
    }
    return text;
}

Json toJson(const std::string& device, const brenixcore::plugin::Found& found)
{
    Json options = Json::object();
    for (const auto& [name, value] : found.options) {
        options[name] = value;
    }
    return {{"what", found.what},
            {"options", options},
            {"arguments", arguments(device, found)},
            {"problem", found.problem}};
}

std::string printed(const std::string& device, const brenixcore::plugin::FindReport& report)
{
    std::string text;
    for (const auto& found : report.found) {
        text += arguments(device, found) + "\n  " + found.what + '\n' +
                (found.problem.empty() ? "" : "  may not be opened: " + found.problem + '\n');
    }
    if (!report.message.empty()) {
        text += device + ": cannot look: " + report.message + '\n';
    } else if (!report.looks) {
        text += device + ": does not look for anything\n";
    } else if (report.found.empty()) {
        text += device + ": nothing found\n";
    }
    return printable(text);
}

} // namespace

ExitCode listPlugins(const Settings& settings)
{
    Json list = Json::array();
    ExitCode result = Success;
    for (const std::string& name :
         settings.plugins.empty() ? installedPlugins() : settings.plugins) {
        const PluginReport report = brenixcore::plugin::inspectPlugin(name);
        if (!report.problem.empty()) {
            result = Failed;
        }
        if (settings.namesOnly) {
            if (report.problem.empty()) {
                std::cout << name << '\n';
            } else {
                brenix::report(settings,
                               {"", name + ": " + report.problem + ": " + report.message});
            }
            continue;
        }
        if (settings.json) {
            Json entry = toJson(name, report);
            entry["options"] =
                report.describesOptions ? toJson(report.options, true) : Json(nullptr);
            entry["properties"] = toJson(report.properties);
            entry["inputFields"] = toJson(report.inputFields);
            entry["outputFields"] = toJson(report.outputFields);
            entry["commands"] = toJson(report.commands);
            list.push_back(entry);
            continue;
        }
        std::cout << name << ": " << kindOf(report) << '\n';
        if (!report.problem.empty()) {
            std::cout << "  does not load: " << report.message << '\n';
        } else if (!report.describesOptions) {
            std::cout << "  does not describe its options\n";
        }
        std::cout << printed("", "", report.options)
                  << printed("  ", "properties", report.properties) << printedFields("  ", report);
    }
    if (settings.json) {
        printJson(std::cout, {{"folder", brenixcore::plugin::pluginFolder()}, {"plugins", list}},
                  2);
    }
    return result;
}

ExitCode checkPlugins(const Settings& settings)
{
    Json list = Json::array();
    ExitCode result = Success;
    for (const std::string& name : settings.plugins) {
        const PluginReport report = brenixcore::plugin::inspectPlugin(name);
        if (!report.problem.empty()) {
            result = Failed;
        }
        if (settings.json) {
            list.push_back(toJson(name, report));
        } else if (report.problem.empty()) {
            std::cout << name << ": a " << kindOf(report) << " that loads, " << report.path << '\n';
        } else {
            std::cout << name << ": " << report.problem << ": " << report.message << '\n';
        }
    }
    if (settings.json) {
        printJson(std::cout, list, 2);
    }
    return result;
}

ExitCode findDevices(const Settings& settings)
{
    const bool isNamed = !settings.plugins.empty();
    Json list = Json::array();
    ExitCode result = Success;
    for (const std::string& name : isNamed ? settings.plugins : installedPlugins()) {
        const PluginReport plugin =
            brenixcore::plugin::inspectPlugin(name, isNamed ? "Device" : "");
        brenixcore::plugin::FindReport report;
        if (plugin.problem.empty()) {
            report = brenixcore::plugin::findDevices(name);
        } else {
            report.message = plugin.message;
        }
        if (!report.message.empty()) {
            result = Failed;
        }
        if (!isNamed && !report.looks && report.message.empty()) {
            continue;
        }
        if (settings.json) {
            Json entry = {{"device", name}, {"looks", report.looks}, {"found", Json::array()}};
            for (const auto& found : report.found) {
                entry["found"].push_back(toJson(name, found));
            }
            if (!report.message.empty()) {
                entry["message"] = report.message;
            }
            list.push_back(entry);
        } else {
            std::cout << printed(name, report) << std::flush; // some look for a while
        }
    }
    if (settings.json) {
        printJson(std::cout, list, 2);
    }
    return result;
}

} // namespace brenix
