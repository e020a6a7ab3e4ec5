// The command info.

#include "Described.hpp"
#include "Screen.hpp"
#include "brenixcoder/coder.h"
#include "commands/Commands.hpp"

#include <cstdint>
#include <iostream>
#include <optional>
#include <sstream>
#include <tuple>

namespace brenix
{

namespace
{

/// The properties that the device describes, and those that are asked for.
std::vector<PropertyValue> findProperties(Channel& channel, const PluginReport& report,
                                          const Settings& settings)
{
    std::vector<PropertyValue> values;
    for (const auto& row : report.properties) {
        const ElementType& type = elementType(row.type);
        if (const auto elements = channel.property(row.name, type)) {
            values.push_back({row.name, row.unit, &type, *elements});
        }
    }
    for (const std::string& text : settings.properties) {
        const std::size_t colon = text.find(':');
        if (colon == std::string::npos) {
            throw std::invalid_argument("a property is Name:type, not " + text);
        }
        const ElementType& type = elementType(std::string_view(text).substr(colon + 1));
        const std::string name = text.substr(0, colon);
        const auto elements = channel.property(name, type);
        if (!elements) {
            channel.check(0); // says what is wrong
        }
        values.push_back({name, "", &type, *elements});
    }
    return values;
}

Json toJson(const ElementType& type, const Bytes& elements)
{
    if (type.isText) {
        return printElements(type, elements);
    }
    // What JSON has no number for, such as infinity, is null.
    Json list = Json::array();
    for (std::size_t i = 0; i < elements.size(); i += type.size) {
        std::string element;
        type.print(&elements[i], element);
        const Json number = Json::parse(element, nullptr, false);
        list.push_back(number.is_discarded() ? Json(nullptr) : number);
    }
    return list.size() == 1 ? list[0] : list;
}

/// The dimension along which a stream counts; nothing when the device has no such stream.
std::optional<double> countDimension(Channel& channel, void* stream)
{
    double dimension = 0;
    if (!channel.isSupported(stream)) {
        return std::nullopt;
    }
    channel.check(coderStreamGetCountDimension(stream, &dimension));
    return dimension;
}

} // namespace

ExitCode showInfo(const Settings& settings)
{
    Channel channel(settings.channel, Use::Look);
    if (settings.open) {
        channel.open(settings.channel);
    }
    PluginReport report = describe(settings.channel);
    const auto properties = findProperties(channel, report, settings);
    Json streams;
    Json list = Json::array();
    std::ostringstream text;
    for (const auto& [name, stream, fields] :
         {std::tuple("input", channel.inputStream(), &report.inputFields),
          std::tuple("output", channel.outputStream(), &report.outputFields)}) {
        text << name << ": ";
        if (const auto dimension = countDimension(channel, stream)) {
            streams[name] = {{"countDimension", static_cast<std::int64_t>(*dimension)},
                             {"fields", toJson(*fields)}};
            text << "counts along dimension " << *dimension << '\n';
        } else {
            streams[name] = nullptr;
            text << "none\n";
            fields->clear();
        }
    }
    channel.finish();
    for (const auto& [name, unit, type, elements] : properties) {
        list.push_back({{"name", name},
                        {"type", type->name},
                        {"unit", unit},
                        {"value", toJson(*type, elements)}});
        text << name << ": " << printable(printElements(*type, elements))
             << (unit.empty() ? "" : " ") << unit << '\n';
    }
    const std::string fields = printedFields("", report);
    if (!settings.emitC.empty()) {
        emitInfo(settings, properties, fields);
    }
    if (settings.emitC == "-") {
        return Success; // the program is there instead
    }
    if (settings.json) {
        printJson(
            std::cout,
            {{"streams", streams}, {"properties", list}, {"commands", toJson(report.commands)}}, 2);
    } else {
        std::cout << text.str() << fields;
    }
    return Success;
}

} // namespace brenix
