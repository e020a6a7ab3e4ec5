// How the elements of each kind of type become a property object. Used by the type table alone.
#ifndef BRENIXCODER_PROPERTIES_PROPERTYMAKERS_HPP
#define BRENIXCODER_PROPERTIES_PROPERTYMAKERS_HPP

#include "brenixplugin/Property.hpp"

#include <algorithm>
#include <cstddef>
#include <cstring>
#include <memory>
#include <stdexcept>
#include <string>
#include <type_traits>

namespace brenixcoder
{

inline void requireData(const std::string& name, const void* data)
{
    if (data == nullptr) {
        throw std::runtime_error("No data for " + name + ".");
    }
}

/// For the eleven numeric and logical types.
template <typename T>
brenixplugin::interfaces::IPropertyInfo*
createTypedProperty(bool forDevice, const std::string& name, int count, const T* data)
{
    using namespace brenixplugin::kit;
    if (count < 1) {
        throw std::runtime_error("Unsupported length for data " + name +
                                 ". Length must be 1 or greater.");
    }
    requireData(name, data);
    const auto length = static_cast<std::size_t>(count);
    if (!forDevice) {
        std::unique_ptr<T[]> copy(new T[length]);
        std::memcpy(copy.get(), data, length * sizeof(T));
        auto* const property = new coderconverter::TPointerProperty<T>(name, copy.get(), length);
        copy.release();
        return property;
    }
    // A byte other than 0 and 1 is true, but no bool, and must not be read as one.
    using Element = std::conditional_t<std::is_same_v<T, bool>, unsigned char, T>;
    const auto* const elements = reinterpret_cast<const Element*>(data);
    if (length == 1) {
        return new device::TScalarProperty<T>(name, static_cast<T>(*elements));
    }
    auto* const property = new device::TVectorProperty<T>(name, length);
    std::copy_n(elements, length, property->values.begin());
    return property;
}

/// For "char", in both modes.
inline brenixplugin::interfaces::IPropertyInfo*
createCharProperty(bool /*forDevice*/, const std::string& name, int count, const char* data)
{
    std::u16string text;
    if (count > 0) {
        requireData(name, data);
        const std::size_t length = strnlen(data, static_cast<std::size_t>(count));
        // One code unit a byte, by sign extension.
        const auto* const bytes = reinterpret_cast<const signed char*>(data);
        text.assign(bytes, bytes + length);
    }
    return new brenixplugin::kit::device::TScalarProperty<std::u16string>(name, std::move(text));
}

} // namespace brenixcoder

#endif
