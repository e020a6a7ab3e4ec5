#include "emit/EmitC.hpp"

#include "Templates.hpp"

#include <algorithm>
#include <cctype>
#include <cmath>
#include <cstddef>
#include <fstream>
#include <iostream>
#include <sstream>
#include <vector>

namespace brenix
{

namespace
{

void setType(Data& data, const ElementType& type)
{
    data["type"] = quote(type.name);
    data["typeName"] = type.name;
    data["cType"] = type.cName;
    data["format"] = quote(type.cFormat);
    data["isText"] = type.isText;
    data["isFloating"] = type.isFloating;
    data["isFloat"] = type.name == std::string_view("float");
    data["isUint64"] = type.name == std::string_view("uint64");
    data["isLogical"] = type.name == std::string_view("logical");
}

/// A call of setUp() with options, whose elements become arrays of the function.
Data callWith(const std::vector<Option>& options, const char* call, const std::string& target,
              const std::string& prefix, list& arrays)
{
    list given;
    for (const Option& option : options) {
        Data data = object{{"name", quote(option.name)},
                           {"type", quote(option.type->name)},
                           {"count", std::to_string(option.count)}};
        if (option.type->isText) {
            data["data"] = quote(
                {reinterpret_cast<const char*>(option.elements.data()), option.elements.size()});
        } else { // names may be the same, or once they are identifiers
            std::string name = prefix + std::to_string(given.size() + 1) + "_" + option.name;
            std::replace_if(
                name.begin(), name.end(),
                [](unsigned char character) { return std::isalnum(character) == 0; }, '_');
            data["data"] = name;
            arrays.emplace_back(object{{"cType", option.type->cName},
                                       {"data", name},
                                       {"values", initialiser(*option.type, option.elements)}});
        }
        given.push_back(data);
    }
    return object{{"call", call},
                  {"target", target},
                  {"size", std::to_string(given.size())},
                  {"options", given},
                  {"isFurther", prefix != "init"}};
}

/// What all programs have.
Data programData(const Settings& settings, bool opens, bool output)
{
    const ChannelSettings& channel = settings.channel;
    list arrays;
    list calls = {callWith(parseOptions(channel.options, channel.device), "coderChannelInit",
                           "channel", "init", arrays)};
    const std::string stream =
        output ? "coderChannelGetOutputStream(channel), " : "coderChannelGetInputStream(channel), ";
    for (const std::string& text : channel.filters) {
        const FilterSettings filter = parseFilter(text);
        calls.push_back(callWith(filter.options, "coderStreamAddFilter",
                                 stream + quote(filter.name),
                                 "filter" + std::to_string(calls.size()) + "_", arrays));
    }
    if (opens) {
        calls.push_back(callWith(parseOptions(channel.openOptions, ""), "coderChannelOpen",
                                 "channel", "open", arrays));
    }
    return object{{"command", commentOf(settings.commandLine)},
                  {"arrays", arrays},
                  {"calls", calls},
                  {"device", quote(channel.device)},
                  {"converter", quote(channel.converter)},
                  {"inputLimit", constant(channel.inputLimit)},
                  {"outputLimit", constant(channel.outputLimit)}};
}

/// The same for one with a file, which ends when it has moved so much.
Data transferData(const Settings& settings, bool isRead, double mostCounts, double mostSeconds)
{
    Data data = programData(settings, true, !isRead);
    const std::string& format = settings.file.format;
    const bool isSound = findSoundFormat(format) != nullptr;
    data["isRead"] = isRead;
    data["isWrite"] = !isRead;
    data["sound"] = isSound;
    data["csv"] = format == "csv";
    data["raw"] = format == "raw";
    data["formatName"] = format;
    data["file"] = isSound ? "SNDFILE" : "FILE";
    data["fileName"] = quote(settings.file.name);
    data["close"] = !isSound ? "fclose" : isRead ? "closeSound" : "sf_close";
    data["counts"] = constant(mostCounts);
    if (std::isfinite(mostSeconds)) {
        data["seconds"] = constant(mostSeconds);
    }
    return data;
}

/// A sound file that is written, in buffers of so many counts at most.
void setSound(Data& data, const Settings& settings, const std::vector<Field>& fields,
              std::size_t most)
{
    std::string soundFormat;
    const SF_INFO info = soundInfo(settings.file, fields, soundFormat);
    const SoundFormat& format = *findSoundFormat(settings.file.format);
    const ElementType& type = *fields[0].type;
    data["soundFormat"] = soundFormat;
    data["rate"] = std::to_string(info.samplerate);
    data["itemType"] = soundType(type).item;
    data["cType"] = type.cName;
    data["clips"] = type.isFloating && hasFullScale(info);
    data["isPlain"] = type.size > 1 && !(type.isFloating && hasFullScale(info));
    data["startsWithHeader"] = startsWithHeader(format);
    if (!format.isLarge) {
        data["limit"] = constant(mostBytes(format, static_cast<double>(most * rowSize(fields))));
    }
    data["isInt8"] = type.name == std::string_view("int8");
    data["isUint8"] = type.name == std::string_view("uint8");
}

/// Writes a program that is one of the templates.
void save(const Settings& settings, const char* program, Data data)
{
    for (const auto& [name, text] : templates) {
        data[name] = text;
    }
    data["newline"] = "\n";
    kainjow::mustache::mustache whole(data[program].string_value());
    whole.set_custom_escape([](const std::string& text) { return text; });
    const std::string text = whole.render(data) + '\n';
    if (settings.emitC == "-") {
        std::cout << text;
        return;
    }
    std::ofstream file(settings.emitC);
    if (!(file << text).flush()) {
        failAsErrno(settings.emitC);
    }
}

} // namespace

void emitInfo(const Settings& settings, const std::vector<PropertyValue>& properties,
              const std::string& fields)
{
    Data data = programData(settings, settings.open, false);
    list blocks;
    for (const PropertyValue& property : properties) {
        const std::size_t count = property.elements.size() / property.type->size;
        list elements;
        for (std::size_t i = 0; i < count; ++i) {
            elements.emplace_back(
                object{{"element", "value[" + std::to_string(i) + "]"}, {"isFurther", i > 0}});
        }
        Data block = object{{"name", quote(property.name)},
                            {"count", std::to_string(count)},
                            {"unit", quote((property.unit.empty() ? "" : " ") + property.unit)},
                            {"elements", elements}};
        setType(block, *property.type);
        blocks.push_back(block);
        if (property.type->isFloating) {
            data["printsFloats"] = true;
        }
    }
    list lines;
    std::istringstream rest(fields);
    for (std::string line; std::getline(rest, line);) {
        lines.emplace_back(quote(line));
    }
    data["properties"] = blocks;
    data["lines"] = lines;
    data["to"] = "stdout";
    save(settings, "info", data);
}

void emitRead(const Settings& settings, const std::vector<Field>& fields, double mostCounts,
              double mostSeconds, double mostListed)
{
    Data data = transferData(settings, true, mostCounts, mostSeconds);
    const std::size_t columns = columnNames(fields).size();
    const auto most = std::clamp<std::size_t>(
        (1 << 24) / columns, 1, static_cast<std::size_t>(std::min(mostListed, 65536.0)));
    list all;
    list repeated;
    for (const Field& field : fields) {
        const std::string array = "field" + std::to_string(all.size() + 1);
        const std::string perCount = std::to_string(field.perCount);
        const bool isVector = field.perCount != 1;
        Data one =
            object{{"name", quote(field.name)},
                   {"array", array},
                   {"perCount", perCount},
                   {"isVector", isVector},
                   {"isFurther", !all.empty()},
                   {"isTime", field.name == "Time"}, // 0 is no time
                   {"element", array + "[row" + (isVector ? " * " + perCount + " + i]" : "]")}};
        setType(one, *field.type);
        if (field.step > 0) {
            one["step"] = constant(field.step);
        }
        if (field.isRepeated) { // a buffer has one for all its counts
            repeated.push_back(one);
        }
        if (field.type->isFloating && settings.file.format == "csv") {
            data["printsFloats"] = true;
        }
        all.push_back(one);
    }
    if (findSoundFormat(settings.file.format) != nullptr) {
        setSound(data, settings, fields, most);
    }
    data["fields"] = all;
    data["repeated"] = repeated;
    data["columns"] = std::to_string(columns);
    data["columnNames"] = quote(csvHeader(fields));
    data["most"] = std::to_string(most);
    data["failOnLoss"] = settings.failOnLoss;
    data["to"] = "file";
    save(settings, "read", data);
}

void emitWrite(const Settings& settings, const SampleReader& reader, bool hasInput,
               double mostCounts, double mostSeconds)
{
    Data data = transferData(settings, false, mostCounts, mostSeconds);
    const ElementType& type = reader.getType();
    const long high = (1L << (8 * type.size - 1)) - 1; // of the integers that sound files have
    setType(data, type);
    data["low"] = std::to_string(-high - 1);
    data["high"] = std::to_string(high);
    data["rows"] = std::to_string(settings.block);
    data["columns"] = std::to_string(reader.getColumns());
    data["hasInput"] = hasInput;
    save(settings, "write", data);
}

} // namespace brenix
