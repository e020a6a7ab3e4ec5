// The commands plugins and check.

#include "Commands.hpp"
#include "Described.hpp"

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

} // namespace brenix
