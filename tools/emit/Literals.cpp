// Values as C has them.

#include "emit/EmitC.hpp"

#include <array>
#include <cctype>
#include <cmath>
#include <cstddef>
#include <cstdio>
#include <limits>

namespace brenix
{

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

std::string initialiser(const ElementType& type, const Bytes& elements)
{
    std::string text;
    for (std::size_t i = 0; i < elements.size(); i += type.size) {
        std::string element;
        type.print(&elements[i], element);
        if (type.isFloating) {
            element = constant(type.toDouble(&elements[i]));
        } else if (element == std::to_string(std::numeric_limits<long>::min())) {
            element = "INT64_MIN";
        }
        text += (i == 0 ? "" : ", ") + element + (type.name == std::string("uint64") ? "U" : "");
    }
    return '{' + text + '}';
}

std::string commentOf(std::string_view text)
{
    // Nothing in it may end the comment, or look as if it began another.
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

} // namespace brenix
