// The numeric types that elements have, and the option that names one.
#ifndef BRENIX_PLUGINS_ELEMENT_TYPES_HPP
#define BRENIX_PLUGINS_ELEMENT_TYPES_HPP

#include "brenixcore/plugin/Make.hpp"
#include "brenixcore/plugin/Options.hpp"
#include "brenixcore/plugin/Packet.hpp"

#include <algorithm>
#include <array>
#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>

namespace bytes
{

using namespace brenixcore::plugin;
using brenixplugin::OwnedProperty;
using brenixplugin::PropertyMap;
using brenixplugin::interfaces::IPropertyInfo;
using brenixplugin::kit::coderconverter::TPointerProperty;
using brenixplugin::kit::device::TScalarProperty;

struct ElementType {
    std::string_view name;
    std::size_t size; ///< in bytes
    /// An array of so many elements, which are not set.
    OwnedProperty (*make)(std::size_t count);
    /// The elements of an array of this type; nothing for any other property.
    std::optional<std::span<unsigned char>> (*find)(IPropertyInfo* property);
    /// Leaves the first elements of an array of this type.
    void (*shorten)(IPropertyInfo* property, std::size_t count);
};

template <typename T>
constexpr ElementType elementType(std::string_view name)
{
    return {name, sizeof(T),
            [](std::size_t count) {
                return makeArray(dataField, std::unique_ptr<T[]>(new T[count]), count);
            },
            [](IPropertyInfo* property) {
                auto* const array = dynamic_cast<TPointerProperty<T>*>(property);
                return array == nullptr
                           ? std::nullopt
                           : std::optional(std::span(reinterpret_cast<unsigned char*>(array->data),
                                                     array->count * sizeof(T)));
            },
            [](IPropertyInfo* property, std::size_t count) {
                static_cast<TPointerProperty<T>*>(property)->count = count;
            }};
}

constexpr std::array elementTypes = {
    elementType<double>("double"),       elementType<float>("float"),
    elementType<signed char>("int8"),    elementType<short>("int16"),
    elementType<int>("int32"),           elementType<long>("int64"),
    elementType<unsigned char>("uint8"), elementType<unsigned short>("uint16"),
    elementType<unsigned int>("uint32"), elementType<unsigned long>("uint64"),
};

/// What a property holds that is not what it should be.
inline std::string describe(IPropertyInfo* property)
{
    for (const ElementType& type : elementTypes) {
        if (type.find(property)) {
            return std::string(type.name);
        }
    }
    if (dynamic_cast<TPointerProperty<bool>*>(property) != nullptr) {
        return "logical";
    }
    if (dynamic_cast<TScalarProperty<std::u16string>*>(property) != nullptr) {
        return "char";
    }
    return property == nullptr ? "missing" : "not an array of numbers";
}

/// One of the texts that an option may have; its index.
template <std::size_t N>
std::size_t readChoice(Options& options, const std::string& name,
                       const std::array<std::string_view, N>& choices)
{
    const std::string given = options.text(name).value_or(std::string(choices[0]));
    const auto* const found = std::find(choices.begin(), choices.end(), given);
    if (found == choices.end()) {
        std::string list(choices[0]);
        for (std::size_t i = 1; i < N; ++i) {
            list += (i + 1 < N ? ", " : " or ") + std::string(choices[i]);
        }
        Options::fail(name, "must be " + list + ", not " + given);
    }
    return static_cast<std::size_t>(found - choices.begin());
}

/// The type of a name; null where there is none.
constexpr const ElementType* findType(std::string_view name)
{
    const auto* const found =
        std::find_if(elementTypes.begin(), elementTypes.end(),
                     [&](const ElementType& candidate) { return candidate.name == name; });
    return found == elementTypes.end() ? nullptr : found;
}

/// The element type of an option that names one, or else of the default.
inline const ElementType& readElementType(Options& options, const std::string& defaultName)
{
    const std::string name = options.text("ElementType").value_or(defaultName);
    const auto* const found = findType(name);
    if (found == nullptr) {
        Options::fail("ElementType", "is not a numeric type: " + name);
    }
    return *found;
}

} // namespace bytes

#endif
