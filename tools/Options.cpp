#include "Options.hpp"

#include "brenixcore/plugin/Inspect.hpp"

#include <algorithm>
#include <array>
#include <sstream>
#include <stdexcept>

namespace brenix
{

namespace
{

using brenixcore::plugin::DescribedValue;

/// Those that a plug-in describes, and the core's own.
std::vector<DescribedValue> describedOptions(const std::string& plugin)
{
    std::vector<DescribedValue> described;
    if (!plugin.empty()) {
        described = brenixcore::plugin::inspectPlugin(plugin).options;
    }
    described.push_back({"Timeout", "number", "", "", ""});
    described.push_back({"Overflow", "text", "", "", ""});
    described.push_back({"Stamps", "logical", "", "", ""});
    return described;
}

/// A double that is written as a quantity.
const ElementType& quantityType()
{
    static const ElementType type = [] {
        ElementType quantity = elementType("double");
        quantity.parse = [](std::string_view text, unsigned char* element) {
            double value = 0;
            const bool ok = parseQuantity(text, value);
            std::copy_n(reinterpret_cast<const unsigned char*>(&value), sizeof value, element);
            return ok;
        };
        return quantity;
    }();
    return type;
}

Option parseOption(const std::string& text, const std::vector<DescribedValue>& described)
{
    const std::size_t equals = text.find('=');
    if (equals == std::string::npos || equals == 0) {
        throw std::invalid_argument("an option is Name=value or Name:type=value, not " + text);
    }
    Option option;
    option.name = text.substr(0, equals);
    const std::string values = text.substr(equals + 1);
    std::string wrong;
    const auto parse = [&](const ElementType& type) {
        option.type = &elementType(type.name);
        option.elements.clear();
        if (type.isText) {
            option.elements.assign(values.begin(), values.end());
        }
        return type.isText || parseRow(type, values, option.elements, wrong);
    };
    std::string wanted;
    bool ok = false;
    if (const std::size_t colon = option.name.find(':'); colon != std::string::npos) {
        const ElementType& type = elementType(std::string_view(option.name).substr(colon + 1));
        option.name.resize(colon);
        ok = parse(type);
        wanted = std::string("value of type ") + type.name;
    } else {
        const auto row =
            std::find_if(described.begin(), described.end(),
                         [&](const DescribedValue& known) { return known.name == option.name; });
        const std::string kind = row == described.end() ? "" : row->type;
        const bool isNumber = kind == "number" || kind == "whole number";
        if (kind == "logical") {
            ok = parse(elementType(kind));
        } else {
            ok = (kind != "text" && parse(isNumber ? quantityType() : elementType("double"))) ||
                 (!isNumber && parse(elementType("char")));
        }
        wanted = kind;
    }
    if (!ok) {
        throw std::invalid_argument("option " + option.name + ": not a " + wanted + ": " +
                                    (wrong.empty() ? "nothing" : wrong));
    }
    option.count = static_cast<int>(option.elements.size() / option.type->size);
    return option;
}

} // namespace

bool parseQuantity(std::string_view text, double& value)
{
    struct Prefix {
        std::string_view name;
        std::string_view exponent; ///< in the notation of numbers: 4.7m is 4.7e-3 and no product
        double factor;
    };
    constexpr double kibi = 1024;
    static constexpr std::array prefixes = {
        Prefix{"", "", 1},
        Prefix{"n", "e-9", 1},
        Prefix{"u", "e-6", 1},
        Prefix{"m", "e-3", 1},
        Prefix{"k", "e3", 1},
        Prefix{"M", "e6", 1},
        Prefix{"G", "e9", 1},
        Prefix{"T", "e12", 1},
        Prefix{"Ki", "", kibi},
        Prefix{"Mi", "", kibi * kibi},
        Prefix{"Gi", "", kibi * kibi * kibi},
    };
    return std::any_of(prefixes.begin(), prefixes.end(), [&](const Prefix& prefix) {
        const std::size_t length = text.size() - std::min(prefix.name.size(), text.size());
        std::string number(text.substr(0, length));
        number += prefix.exponent;
        if (text.substr(length) != prefix.name ||
            !elementType("double").parse(number, reinterpret_cast<unsigned char*>(&value))) {
            return false;
        }
        value *= prefix.factor;
        return true;
    });
}

std::vector<Option> parseOptions(const std::vector<std::string>& texts, const std::string& plugin)
{
    if (texts.size() > maxOptions) {
        throw std::invalid_argument("at most " + std::to_string(maxOptions) +
                                    " options are possible");
    }
    std::vector<Option> options;
    if (!texts.empty()) {
        const auto described = describedOptions(plugin);
        for (const std::string& text : texts) {
            options.push_back(parseOption(text, described));
        }
    }
    return options;
}

FilterSettings parseFilter(const std::string& text)
{
    FilterSettings filter;
    std::istringstream words(text);
    words >> filter.name;
    std::vector<std::string> options;
    for (std::string word; words >> word;) {
        options.push_back(word);
    }
    filter.options = parseOptions(options, filter.name);
    return filter;
}

} // namespace brenix
