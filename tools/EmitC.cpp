#include "EmitC.hpp"

#include "CheckText.hpp"

#include <array>
#include <cctype>
#include <cmath>
#include <cstdio>
#include <fstream>
#include <limits>
#include <vector>

namespace brenix
{

namespace
{

constexpr std::string_view start = R"(/*
 * Made by: @COMMAND@
 *
 *     cc -std=c99 program.c @LIBRARIES@ -o program
 *
@USAGE@ */
#define _POSIX_C_SOURCE 200809L

#include <brenixcoder/coder.h>

#include <math.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <time.h>
@INCLUDE@
@CHECK@
static int setUp(void* channel)
{
@SETUP_DATA@    return check(channel, "coderChannelInit",
            coderChannelInit(channel, @INIT@))@CALLS@;
}
)";

constexpr std::string_view furtherCall = R"( &&
           check(channel, "@CALL@",
            @CALL@(@ARGUMENTS@)))";

constexpr std::string_view printFunction = R"(
/* With as few digits as tell the value. */
static void printNumber(FILE* file, double value, int isFloat)
{
    char text[32];
    int digits = isFloat ? 6 : 15;
    const int most = isFloat ? 9 : 17;
    do {
        (void)snprintf(text, sizeof(text), "%.*g", digits, value);
    } while (digits++ < most && (isFloat ? (double)(float)strtod(text, NULL) : strtod(text, NULL)) != value);
    fputs(text, file);
}
)";

/// A text inside of a comment: nothing in it ends that, or looks as if it began another.
std::string commentOf(std::string_view text)
{
    std::string comment;
    for (const char character : text) {
        if (std::iscntrl(static_cast<unsigned char>(character)) != 0) { // it might join two lines
            comment += ' ';
        } else {
            const char last = comment.empty() ? ' ' : comment.back();
            comment +=
                (last == '*' && character == '/') || (last == '/' && character == '*') ? " " : "";
            comment += character;
        }
    }
    return comment;
}

/// The elements of an array.
std::string initialiser(const ElementType& type, const Bytes& elements)
{
    std::string list;
    for (std::size_t i = 0; i < elements.size(); i += type.size) {
        std::string element;
        type.print(&elements[i], element);
        if (isFloating(type)) {
            element = constant(type.toDouble(&elements[i]));
        } else if (element == std::to_string(std::numeric_limits<long>::min())) {
            element = "INT64_MIN";
        }
        list += (i == 0 ? "" : ", ") + element + (type.name == std::string("uint64") ? "U" : "");
    }
    return list;
}

/// Number and list of the options of a call. Their data go to `declarations`.
std::string optionList(const std::vector<Option>& options, const std::string& prefix,
                       std::string& declarations)
{
    std::string list = std::to_string(options.size());
    int number = 0; // names may be the same, or once they are identifiers
    for (const Option& option : options) {
        std::string data;
        ++number;
        if (option.type->isText) {
            data = quote(std::string_view(reinterpret_cast<const char*>(option.elements.data()),
                                          option.elements.size()));
        } else {
            data = prefix + std::to_string(number) + "_" + option.name;
            for (char& character : data) {
                character =
                    std::isalnum(static_cast<unsigned char>(character)) != 0 ? character : '_';
            }
            declarations += "    static const " + std::string(option.type->cName) + " " + data +
                            "[] = {" + initialiser(*option.type, option.elements) + "};\n";
        }
        list += ",\n                CODER_OPTION(" + quote(option.name) + ", " +
                quote(option.type->name) + ", " + std::to_string(option.count) + ", " + data + ")";
    }
    return list;
}

} // namespace

std::string fill(std::string_view text, const Values& values)
{
    std::string filled;
    for (;;) {
        const std::size_t begin = text.find('@');
        filled += text.substr(0, begin);
        if (begin == std::string_view::npos) {
            return filled;
        }
        const std::size_t end = text.find('@', begin + 1);
        const auto value = values.find(std::string(text.substr(begin + 1, end - begin - 1)));
        filled += value == values.end() ? "" : value->second;
        text.remove_prefix(end + 1);
    }
}

std::string quote(std::string_view text)
{
    std::string literal = "\"";
    for (const char character : text) {
        const auto byte = static_cast<unsigned char>(character);
        if (std::isprint(byte) != 0 && character != '"' && character != '\\' && character != '?') {
            literal += character;
        } else {
            std::array<char, 8> octal{};
            std::snprintf(octal.data(), octal.size(), "\\%03o", static_cast<unsigned>(byte));
            literal += octal.data();
        }
    }
    return literal + '"';
}

std::string constant(double value)
{
    if (std::isnan(value)) {
        return "NAN";
    }
    if (std::isinf(value)) {
        return value > 0 ? "INFINITY" : "-INFINITY";
    }
    std::string text;
    elementType("double").print(reinterpret_cast<const unsigned char*>(&value), text);
    return text.find_first_of(".e") == std::string::npos ? text + ".0" : text;
}

bool isFloating(const ElementType& type)
{
    return type.cFormat[1] == '.';
}

std::string printElement(const ElementType& type, const std::string& file,
                         const std::string& element)
{
    if (isFloating(type)) {
        return "printNumber(" + file + ", " + element + ", " +
               (type.name == std::string("float") ? "1" : "0") + ");\n";
    }
    return "fprintf(" + file + ", " + quote(type.cFormat) + ", " + element + ");\n";
}

Values commonValues(const Settings& settings, bool opens, bool output)
{
    const ChannelSettings& channel = settings.channel;
    Values values;
    values["COMMAND"] = commentOf(settings.commandLine);
    values["LIBRARIES"] = "-lbrenixcoder";
    values["CHECK"] = checkText;
    values["INIT"] =
        optionList(parseOptions(channel.options, channel.device), "init", values["SETUP_DATA"]);
    const auto add = [&](const char* call, const std::string& arguments) {
        values["CALLS"] += fill(furtherCall, {{"CALL", call}, {"ARGUMENTS", arguments}});
    };
    for (std::size_t i = 0; i < channel.filters.size(); ++i) {
        const FilterSettings filter = parseFilter(channel.filters[i]);
        add("coderStreamAddFilter",
            (output ? "coderChannelGetOutputStream(channel), "
                    : "coderChannelGetInputStream(channel), ") +
                quote(filter.name) + ", " +
                optionList(filter.options, "filter" + std::to_string(i + 1) + "_",
                           values["SETUP_DATA"]));
    }
    if (opens) {
        add("coderChannelOpen", "channel, " + optionList(parseOptions(channel.openOptions, ""),
                                                         "open", values["SETUP_DATA"]));
    }
    values["DEVICE"] = quote(channel.device);
    values["CONVERTER"] = quote(channel.converter);
    values["INLIMIT"] = constant(channel.inputLimit);
    values["OUTLIMIT"] = constant(channel.outputLimit);
    values["NAME"] = quote(settings.file.name);
    return values;
}

void save(const Settings& settings, std::string_view program, Values values)
{
    if ((values["WRITE"] + values["PROPERTIES"]).find("printNumber") != std::string::npos) {
        values["PRINT"] = printFunction;
    }
    std::ofstream file(settings.emitC);
    if (!(file << fill(start, values) << fill(program, values)).flush()) {
        failAsErrno(settings.emitC);
    }
}

} // namespace brenix
