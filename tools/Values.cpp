#include "Values.hpp"

#include <algorithm>
#include <array>
#include <charconv>
#include <cmath>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <stdexcept>
#include <system_error>
#include <type_traits>

namespace brenix
{

namespace
{

template <typename T>
T load(const unsigned char* element)
{
    T value{};
    std::memcpy(&value, element, sizeof value);
    return value;
}

/// Decimal, with a sign or without. What is too small for a floating-point type is the nearest that it has.
template <typename T>
bool parseNumber(std::string_view text, T& value)
{
    const bool isNegative = text.substr(0, 1) == "-";
    if (text.substr(0, 1) == "+" || (isNegative && std::is_unsigned_v<T>)) {
        text.remove_prefix(1);
        if (text.substr(0, 1) == "-") {
            return false;
        }
    }
    const auto* const end = text.data() + text.size();
    const auto result = std::from_chars(text.data(), end, value);
    if constexpr (std::is_floating_point_v<T>) {
        if (result.ec == std::errc::result_out_of_range && result.ptr == end) {
            const std::string number(text);
            value = std::is_same_v<T, float> ? std::strtof(number.c_str(), nullptr)
                                             : static_cast<T>(std::strtod(number.c_str(), nullptr));
            return std::isfinite(value);
        }
    }
    return result.ec == std::errc() && result.ptr == end &&
           !(isNegative && std::is_unsigned_v<T> && value != 0);
}

template <typename T>
constexpr ElementType number(const char* name, const char* cName, const char* cFormat)
{
    return {name,
            cName,
            cFormat,
            sizeof(T),
            false,
            std::is_floating_point_v<T>,
            [](const unsigned char* element, std::string& text) {
                std::array<char, 32> digits{};
                const auto end = std::to_chars(digits.begin(), digits.end(), load<T>(element));
                text.append(digits.data(), end.ptr);
            },
            [](std::string_view text, unsigned char* element) {
                T value{};
                const bool isNumber = parseNumber(text, value);
                std::memcpy(element, &value, sizeof value);
                return isNumber;
            },
            [](const unsigned char* element) { return static_cast<double>(load<T>(element)); }};
}

constexpr ElementType logical()
{
    ElementType type = number<std::uint8_t>("logical", "uint8_t", "%hhu");
    type.parse = [](std::string_view text, unsigned char* element) {
        if (text == "true" || text == "false") {
            *element = text == "true" ? 1 : 0;
            return true;
        }
        return parseNumber(text, *element) && *element <= 1;
    };
    return type;
}

constexpr ElementType text()
{
    ElementType type = number<std::uint8_t>("char", "char", "%s");
    type.isText = true;
    return type;
}

std::string_view trimmed(std::string_view text)
{
    const std::size_t first = text.find_first_not_of(" \t\r");
    return first == std::string_view::npos
               ? std::string_view()
               : text.substr(first, text.find_last_not_of(" \t\r") - first + 1);
}

/// The parts of a text between commas, without the spaces around them. As a row of CSV they may stand in
/// quotes, with commas between them.
template <typename Take>
void splitCommas(std::string_view list, bool isCsv, Take take)
{
    bool isQuoted = false;
    std::size_t begin = 0;
    for (std::size_t i = 0; i <= list.size(); ++i) {
        if (i == list.size() || (list[i] == ',' && !isQuoted)) {
            std::string_view part = trimmed(list.substr(begin, i - begin));
            if (isCsv && part.size() > 1 && part.front() == '"' && part.back() == '"') {
                part = trimmed(part.substr(1, part.size() - 2));
            }
            take(part);
            begin = i + 1;
        } else if (isCsv && list[i] == '"') {
            isQuoted = !isQuoted;
        }
    }
}

} // namespace

const std::vector<ElementType>& elementTypes()
{
    static const std::vector<ElementType> types = {
        number<double>("double", "double", ""),
        number<float>("float", "float", ""),
        number<std::int8_t>("int8", "int8_t", "%hhd"),
        number<std::int16_t>("int16", "int16_t", "%hd"),
        number<std::int32_t>("int32", "int32_t", "%d"),
        number<std::int64_t>("int64", "int64_t", "%ld"),
        number<std::uint8_t>("uint8", "uint8_t", "%hhu"),
        number<std::uint16_t>("uint16", "uint16_t", "%hu"),
        number<std::uint32_t>("uint32", "uint32_t", "%u"),
        number<std::uint64_t>("uint64", "uint64_t", "%lu"),
        logical(),
        text(),
    };
    return types;
}

const ElementType& elementType(std::string_view name)
{
    std::string names;
    for (const ElementType& type : elementTypes()) {
        if (name == type.name) {
            return type;
        }
        names += (names.empty() ? "" : ", ") + std::string(type.name);
    }
    throw std::invalid_argument("no such type: " + std::string(name) + "; there are " + names);
}

bool parseRow(const ElementType& type, std::string_view list, Bytes& elements, std::string& wrong,
              bool isCsv)
{
    bool ok = true;
    splitCommas(list, isCsv, [&](std::string_view part) {
        elements.resize(elements.size() + type.size);
        if (ok && !type.parse(part, &elements[elements.size() - type.size])) {
            ok = false;
            wrong = part;
        }
    });
    return ok;
}

bool hasNumber(std::string_view list)
{
    const ElementType& type = elementType("double");
    bool found = false;
    splitCommas(list, true, [&](std::string_view part) {
        double value = 0;
        part.remove_prefix(
            std::min(part.find_first_not_of('"'), part.size())); // one without an end
        found = found || part.find_first_of("+-.0123456789") == 0 ||
                type.parse(part, reinterpret_cast<unsigned char*>(&value));
    });
    return found;
}

std::string printElements(const ElementType& type, const Bytes& elements)
{
    std::string text;
    if (type.isText) {
        text.assign(elements.begin(), std::find(elements.begin(), elements.end(), 0));
        return text;
    }
    for (std::size_t i = 0; i < elements.size(); i += type.size) {
        text += i == 0 ? "" : ",";
        type.print(&elements[i], text);
    }
    return text;
}

std::string quoted(const std::string& text, const char* escaped)
{
    std::string result = "'";
    for (const char character : text) {
        result += character == '\'' ? escaped : std::string(1, character);
    }
    return result + "'";
}

std::string shellWord(const std::string& text)
{
    const bool plain =
        !text.empty() && text.find_first_not_of("abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQ"
                                                "RSTUVWXYZ0123456789-_./:=,+") == std::string::npos;
    return plain ? text : quoted(text, "'\\''");
}

} // namespace brenix
