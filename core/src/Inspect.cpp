#include "brenixcore/plugin/Inspect.hpp"

#include "Plugin.hpp"
#include "brenixcore/plugin/Describe.hpp"

#include <algorithm>
#include <array>
#include <cerrno>
#include <fstream>
#include <optional>
#include <stdexcept>
#include <string_view>
#include <system_error>

namespace brenixcore::plugin
{

namespace
{

void requireReadable(const std::string& path)
{
    if (!std::ifstream(path)) {
        throw std::runtime_error(path + ": " + std::generic_category().message(errno));
    }
}

void requireElf(const std::string& path)
{
    std::array<char, 4> start{};
    std::ifstream(path, std::ios::binary).read(start.data(), start.size());
    if (std::string_view(start.data(), start.size()) != "\177ELF") {
        throw std::runtime_error(path + ": it is not a shared library (an ELF file)");
    }
}

/// Makes an object and releases it.
template <typename Interface>
void tryFactory(const PluginLibrary& library, const char* factory)
{
    createPlugin<Interface>(library, factory);
}

struct Kind {
    const char* name;
    const char* factory;
    void (*tryFactory)(const PluginLibrary& library, const char* factory);
};

constexpr std::array kinds = {
    Kind{"Device", "brenixcoreCreateDevice", tryFactory<Device>},
    Kind{"Converter", "brenixcoreCreateConverter", tryFactory<Converter>},
    Kind{"Filter", "brenixcoreCreateFilter", tryFactory<Filter>},
};

void describe(const PluginLibrary& library, PluginReport& report)
{
    if (library.has("brenixcorePluginOptions")) {
        report.describesOptions = true;
        const auto* row = library.function<const OptionInfo*()>("brenixcorePluginOptions")();
        for (; row->name != nullptr; ++row) {
            report.options.push_back(
                {row->name, row->type, row->unit, row->defaultValue, row->meaning});
        }
    }
    if (library.has("brenixcorePluginProperties")) {
        const auto* row = library.function<const PropertyInfo*()>("brenixcorePluginProperties")();
        for (; row->name != nullptr; ++row) {
            report.properties.push_back({row->name, row->type, row->unit, "", row->meaning});
        }
    }
}

} // namespace

PluginReport inspectPlugin(const std::string& name)
{
    PluginReport report;
    std::optional<PluginLibrary> library; // outlives what the plug-in throws
    try {
        report.problem = "notFound";
        report.path = pluginPath(name);
        report.problem = "wrongFileType";
        requireNoOtherFile(report.path);
        report.problem = "notFound";
        requireReadable(report.path);
        report.problem = "wrongFileType";
        requireElf(report.path);
        report.problem = "notLoadable";
        library.emplace(report.path);
        report.problem = "notAPlugin";
        library->function<void()>("brenixcorePluginAbiVersion");
        report.problem = "abiVersion";
        library->requireAbiVersion();
        report.problem = "noFactory";
        const auto* const kind =
            std::find_if(kinds.begin(), kinds.end(),
                         [&](const Kind& candidate) { return library->has(candidate.factory); });
        if (kind == kinds.end()) {
            throw std::runtime_error("it exports none of brenixcoreCreateDevice, "
                                     "brenixcoreCreateConverter and brenixcoreCreateFilter");
        }
        report.kind = kind->name;
        describe(*library, report);
        report.problem = "factoryFailed";
        kind->tryFactory(*library, kind->factory);
        report.problem.clear();
    } catch (...) {
        report.message = currentExceptionText();
        // The loader begins with the file at fault.
        if (report.problem == "notLoadable" && report.message.rfind(report.path + ':', 0) != 0 &&
            report.message.find(": cannot open shared object file") != std::string::npos) {
            report.problem = "missingDependency";
            report.message = "it needs a library that does not load: " + report.message;
        }
    }
    return report;
}

} // namespace brenixcore::plugin
