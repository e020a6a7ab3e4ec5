// How the elements of each kind of type leave a property object. Used by the type table alone.
#ifndef BRENIXCODER_PROPERTIES_PROPERTYCOPIERS_HPP
#define BRENIXCODER_PROPERTIES_PROPERTYCOPIERS_HPP

#include "brenixplugin/Property.hpp"

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <stdexcept>
#include <string>
#include <typeinfo>

namespace brenixcoder
{

/// Throws unless `count` elements fit; none fits a capacity below 1.
inline void requireCapacity(const std::string& name, uint64_t count, int capacity)
{
    if (count > static_cast<uint64_t>(std::max(capacity, 0))) {
        throw std::runtime_error("Property value: " + name + " is too large for allocated space.");
    }
}

/// Whether a pointer property can be read: it has its elements, or none.
template <typename T>
bool isReadable(const brenixplugin::kit::coderconverter::TPointerProperty<T>* property)
{
    return property != nullptr && (property->data != nullptr || property->count == 0);
}

/// A dynamic_cast that first looks whether the property is of the very class.
template <typename Property>
const Property* quickCast(const brenixplugin::interfaces::IPropertyInfo* info)
{
    return info != nullptr && typeid(*info) == typeid(Property)
               ? static_cast<const Property*>(info)
               : dynamic_cast<const Property*>(info);
}

/// For the eleven numeric and logical types.
template <typename T>
void copyTypedValue(const void* property, const std::string& name, const std::string& typeName,
                    int capacity, T* destination)
{
    using namespace brenixplugin::kit;
    const auto* const info = static_cast<const brenixplugin::interfaces::IPropertyInfo*>(property);

    // The class of data first, for a cast that fails is what takes longest here.
    if (const auto* array = quickCast<coderconverter::TPointerProperty<T>>(info);
        isReadable(array)) {
        requireCapacity(name, array->count, capacity);
        if (array->count > 0) {
            std::memcpy(destination, array->data, array->count * sizeof(T));
        }
    } else if (const auto* scalar = dynamic_cast<const device::TScalarProperty<T>*>(info)) {
        requireCapacity(name, 1, capacity);
        *destination = scalar->value;
    } else if (const auto* vector = dynamic_cast<const device::TVectorProperty<T>*>(info)) {
        requireCapacity(name, vector->values.size(), capacity);
        std::copy(vector->values.begin(), vector->values.end(), destination);
    } else {
        throw std::runtime_error("Property: " + name + " is not of the expected type: " + typeName);
    }
}

/// Writes `count` texts joined with commas, and a NUL.
template <typename Text>
void copyTexts(const Text* texts, std::size_t count, const std::string& name, int capacity,
               char* destination)
{
    uint64_t size = std::max<std::size_t>(count, 1); // commas and NUL
    for (std::size_t i = 0; i < count; ++i) {
        size += texts[i].size();
    }
    requireCapacity(name, size, capacity);

    for (std::size_t i = 0; i < count; ++i) {
        if (i > 0) {
            *destination++ = ',';
        }
        for (const auto unit : texts[i]) {
            // A UTF-16 code unit gives its low seven bits, a narrow character itself.
            *destination++ = static_cast<char>(sizeof unit == 1 ? unit : unit & 0x7F);
        }
    }
    *destination = '\0';
}

/// Copies a scalar, array or vector of Text; returns whether the property is one.
template <typename Text>
bool copyTextShapes(const brenixplugin::interfaces::IPropertyInfo* info, const std::string& name,
                    int capacity, char* destination)
{
    using namespace brenixplugin::kit;
    if (const auto* scalar = dynamic_cast<const device::TScalarProperty<Text>*>(info)) {
        copyTexts(&scalar->value, 1, name, capacity, destination);
    } else if (const auto* array =
                   dynamic_cast<const coderconverter::TPointerProperty<Text>*>(info);
               isReadable(array)) {
        copyTexts(array->data, array->count, name, capacity, destination);
    } else if (const auto* vector = dynamic_cast<const device::TVectorProperty<Text>*>(info)) {
        copyTexts(vector->values.data(), vector->values.size(), name, capacity, destination);
    } else {
        return false;
    }
    return true;
}

/// For "char".
inline void copyTextValue(const void* property, const std::string& name,
                          const std::string& /*typeName*/, int capacity, char* destination)
{
    const auto* const info = static_cast<const brenixplugin::interfaces::IPropertyInfo*>(property);
    if (!copyTextShapes<std::string>(info, name, capacity, destination) &&
        !copyTextShapes<std::u16string>(info, name, capacity, destination)) {
        throw std::runtime_error("Property: " + name +
                                 " is not of the expected type: "
                                 "string or ustring scalar or vector.");
    }
}

} // namespace brenixcoder

#endif
