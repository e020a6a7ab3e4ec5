// Option lists in, as plug-ins read them, and properties of every class out.

#include "Input.hpp"
#include "brenixcore/plugin/Make.hpp"
#include "brenixcore/plugin/Options.hpp"
#include "properties/CopyProperty.hpp"
#include "properties/CreateProperty.hpp"
#include "properties/OptionMap.hpp"

#include <cstdarg>
#include <cstring>
#include <iterator>
#include <vector>

using namespace brenixplugin;
using brenixcore::plugin::Options;

namespace
{

const std::pair<std::string, std::size_t> types[] = {
    {"char", 1},  {"double", 8}, {"float", 4},  {"int8", 1},   {"int16", 2},  {"int32", 4},
    {"int64", 8}, {"uint8", 1},  {"uint16", 2}, {"uint32", 4}, {"uint64", 8}, {"logical", 1}};

struct Option {
    explicit Option(Input& input) : name(input.text().c_str())
    {
        const unsigned int choice = input.byte();
        type = choice < 128 ? types[choice % std::size(types)].first : input.text().c_str();
        for (const auto& [known, bytes] : types) {
            size = type == known ? bytes : size;
        }
        const std::string given = input.text();
        data.assign(given.begin(), given.end()); // no byte more: the sanitizer sees the end
        count = static_cast<int>(data.size() / size);
        if (const unsigned int odd = input.byte(); odd > 200) {
            count = static_cast<int>(200 - odd);
        } else if (type == "char" && odd > 100) {
            data.push_back('\0'); // ends the text before its count does
            count += static_cast<int>(odd);
        }
    }
    std::string name, type;
    std::size_t size = 1;
    std::vector<char> data;
    int count;
};

void build(PropertyMap& map, std::uint64_t count, ...)
{
    va_list list;
    va_start(list, count);
    try {
        brenixcoder::buildOptionMap(map, count, &list);
    } catch (const std::runtime_error&) {
        REQUIRE(map.empty());
    }
    va_end(list);
}

/// What a copy of the property writes to so many elements, or "none".
std::string copyOut(const OwnedProperty& property, const std::string& type, std::size_t size,
                    int capacity)
{
    std::vector<char> destination(static_cast<std::size_t>(std::max(capacity, 0)) * size, 'u');
    try {
        const bool known =
            brenixcoder::copyPropertyValue(property.get(), "p", type, capacity, destination.data());
        return known ? std::string(destination.begin(), destination.end()) : "none";
    } catch (const std::runtime_error&) {
        REQUIRE(std::count(destination.begin(), destination.end(), 'u') ==
                std::ptrdiff_t(destination.size()));
        return "none";
    }
}

/// The text's bytes, up to its NUL, come back in an option and, with seven bits, at the caller.
void checkOption(const Option& option, const PropertyMap& map)
{
    Options options(map);
    if (option.type == "char") {
        std::string text(option.data.begin(), option.data.end());
        text =
            option.count < 1 ? "" : text.substr(0, static_cast<std::size_t>(option.count)).c_str();
        REQUIRE(options.text(option.name) == text);
    } else {
        try {
            REQUIRE(options.number(option.name).has_value() && option.count == 1);
        } catch (const std::invalid_argument&) { // several, a logical or not a number
        }
    }
}

void checkCreated(const Option& option, bool forDevice, Input& input)
{
    OwnedProperty property;
    try {
        property.reset(brenixcoder::createProperty(forDevice, "p", option.type, option.count,
                                                   option.data.data()));
    } catch (const std::runtime_error&) {
        REQUIRE(option.count < 1 || option.data.data() == nullptr);
    }
    const auto& [other, otherSize] = types[input.byte() % std::size(types)];
    if (property && option.type != "char") {
        const std::string bytes(option.data.data(), std::size_t(option.count) * option.size);
        if (option.type != "logical" || !forDevice) {
            REQUIRE(copyOut(property, option.type, option.size, option.count) == bytes);
        }
        REQUIRE(copyOut(property, option.type, option.size, option.count - 1) == "none");
        REQUIRE(other == option.type || copyOut(property, other, otherSize, 1000) == "none");
    }
}

/// Texts of both kinds of characters, joined with commas, where they fit.
template <typename Text>
void checkTexts(Input& input)
{
    auto vector = std::make_unique<kit::device::TVectorProperty<Text>>("p", input.byte() % 4);
    std::unique_ptr<Text[]> array(new Text[vector->values.size()]);
    std::string joined;
    for (std::size_t i = 0; i < vector->values.size(); ++i) {
        for (const char unit : input.text()) {
            vector->values[i] += static_cast<typename Text::value_type>(unit);
            joined += static_cast<char>(sizeof vector->values[i][0] == 1 ? unit : unit & 0x7F);
        }
        array[i] = vector->values[i];
        joined += i + 1 < vector->values.size() ? "," : "";
    }
    joined += '\0';
    const int size = static_cast<int>(joined.size());
    const std::size_t count = vector->values.size();
    const OwnedProperty properties[] = {
        OwnedProperty(vector.release()),
        brenixcore::plugin::makeArray("p", std::move(array), count)};
    for (const OwnedProperty& property : properties) {
        REQUIRE(copyOut(property, "char", 1, size) == joined);
        REQUIRE(copyOut(property, "char", 1, size - 1) == "none");
    }
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    Input input(data, size);
    checkTexts<std::string>(input);
    checkTexts<std::u16string>(input);
    const Option a(input);
    const Option b(input);
    OwnedPropertyMap options;
    build(options.map, 2, a.name.c_str(), a.type.c_str(), a.count, a.data.data(), b.name.c_str(),
          b.type.c_str(), b.count, b.data.data());
    if (!options.map.empty()) {
        checkOption(b, options.map);
    }
    checkCreated(a, true, input);
    checkCreated(b, false, input);
    return 0;
}
