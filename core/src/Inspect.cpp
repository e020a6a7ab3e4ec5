#include "brenixcore/plugin/Inspect.hpp"

#include "Plugin.hpp"
#include "brenixcore/plugin/Describe.hpp"

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
void tryFactory(const PluginLibrary& library)
{
    createPlugin<Interface>(library);
}

constexpr std::array tryFactories = {tryFactory<Device>, tryFactory<Converter>, tryFactory<Filter>};

DescribedValue described(const OptionInfo& row)
{
    return {row.name, row.type, row.unit, row.defaultValue, row.meaning};
}

template <typename Info>
DescribedValue described(const Info& row)
{
    return {row.name, row.type, row.unit, "", row.meaning};
}

/// The rows of a table, which ends with a null name.
template <typename Info>
std::vector<DescribedValue> rowsOf(const Info* row)
{
    std::vector<DescribedValue> rows;
    for (; row->name != nullptr; ++row) {
        rows.push_back(described(*row));
    }
    return rows;
}

/// The rows of the table that a function exports; none when it does not.
template <typename Info>
std::vector<DescribedValue> exportedRows(const PluginLibrary& library, const char* function)
{
    return library.has(function) ? rowsOf(library.function<const Info*()>(function)())
                                 : std::vector<DescribedValue>();
}

void describe(const PluginLibrary& library, PluginReport& report)
{
    report.describesOptions = library.has("brenixcorePluginOptions");
    report.options = exportedRows<OptionInfo>(library, "brenixcorePluginOptions");
    report.properties = exportedRows<PropertyInfo>(library, "brenixcorePluginProperties");
    report.inputFields = exportedRows<FieldInfo>(library, "brenixcorePluginInputFields");
    report.outputFields = exportedRows<FieldInfo>(library, "brenixcorePluginOutputFields");
    if (library.has("brenixcorePluginCommands")) {
        const auto* row = library.function<const CommandInfo*()>("brenixcorePluginCommands")();
        for (; row->name != nullptr; ++row) {
            report.commands.push_back({row->name, rowsOf(row->options), row->meaning});
        }
    }
}

} // namespace

PluginReport inspectPlugin(const std::string& name, const std::string& kind)
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
        const PluginKind& found = library->kind();
        report.kind = found.name;
        describe(*library, report);
        report.problem = "otherKind";
        library->requireKind(kind.empty() ? report.kind : kind);
        report.problem = "factoryFailed";
        tryFactories.at(static_cast<std::size_t>(&found - pluginKinds.data()))(*library);
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

FindReport findDevices(const std::string& name)
{
    FindReport report;
    std::optional<PluginLibrary> library; // outlives what the plug-in throws
    try {
        library.emplace(pluginPath(name));
        library->requireAbiVersion();
        report.looks = library->has("brenixcorePluginFind");
        if (report.looks) {
            library->function<void(std::vector<Found>&)>("brenixcorePluginFind")(report.found);
        }
    } catch (...) {
        report.message = currentExceptionText();
        if (report.message.empty()) {
            report.message = "the reason is not known";
        }
    }
    return report;
}

} // namespace brenixcore::plugin
