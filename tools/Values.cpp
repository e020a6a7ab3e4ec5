#include "Values.hpp"

#include <algorithm>
#include <array>
#include <charconv>
#include <cstdint>
#include <cstring>
#include <stdexcept>

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

template <typename T>
constexpr ElementType number(const char* name, const char* cName, const char* cFormat)
{
    return {name,
            cName,
            cFormat,
            sizeof(T),
            false,
            [](const unsigned char* element, std::string& text) {
                std::array<char, 32> digits{};
                const auto end = std::to_chars(digits.begin(), digits.end(), load<T>(element));
                text.append(digits.data(), end.ptr);
            },
            [](std::string_view text, unsigned char* element) {
                if (text.substr(0, 1) == "+") {
                    text.remove_prefix(1);
                }
                T value{};
                const auto* const end = text.data() + text.size();
                const auto result = std::from_chars(text.data(), end, value);
                std::memcpy(element, &value, sizeof value);
                return result.ec == std::errc() && result.ptr == end;
            },
            [](const unsigned char* element) { return static_cast<double>(load<T>(element)); }};
}

constexpr ElementType logical()
{
    ElementType type = number<std::uint8_t>("logical", "uint8_t", "%hhu");
    type.parse = [](std::string_view text, unsigned char* element) {
        *element = text == "1" || text == "true" ? 1 : 0;
        return *element == 1 || text == "0" || text == "false";
    };
    return type;
}

constexpr ElementType text()
{
    ElementType type = number<std::uint8_t>("char", "char", "%s");
    type.isText = true;
    return type;
}

/// The parts of a text between commas, without the spaces around them.
template <typename Take>
void splitCommas(std::string_view list, Take take)
{
    for (;;) {
        const std::size_t comma = list.find(',');
        std::string_view part = list.substr(0, comma);
        const std::size_t first = part.find_first_not_of(" \t\r");
        part = first == std::string_view::npos
                   ? std::string_view()
                   : part.substr(first, part.find_last_not_of(" \t\r") - first + 1);
        take(part);
        if (comma == std::string_view::npos) {
            return;
        }
        list.remove_prefix(comma + 1);
    }
}

} // namespace

const std::vector<ElementType>& elementTypes()
{
    static const std::vector<ElementType> types = {
        number<double>("double", "double", "%.17g"),
        number<float>("float", "float", "%.9g"),
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

bool parseRow(const ElementType& type, std::string_view list, Bytes& elements, std::string& wrong)
{
    bool ok = true;
    splitCommas(list, [&](std::string_view part) {
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
    splitCommas(list, [&](std::string_view part) {
        double value = 0;
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

} // namespace brenix
