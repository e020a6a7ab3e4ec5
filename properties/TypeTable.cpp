// The type names, and what creation and copy-out do with each.

#include "properties/CopyProperty.hpp"
#include "properties/CreateProperty.hpp"
#include "properties/PropertyCopiers.hpp"
#include "properties/PropertyMakers.hpp"
#include "util/Arguments.hpp"

#include <algorithm>
#include <array>
#include <string_view>

namespace brenixcoder
{

namespace
{

struct Type {
    std::string_view name;
    IPropertyInfo* (*create)(bool forDevice, const std::string& name, int count, const void* data);
    void (*copy)(const void* property, const std::string& name, const std::string& typeName,
                 int capacity, void* destination);
};

template <typename T>
constexpr Type typed(std::string_view typeName)
{
    return {typeName,
            [](bool forDevice, const std::string& name, int count, const void* data) {
                return createTypedProperty(forDevice, name, count, static_cast<const T*>(data));
            },
            [](const void* property, const std::string& name, const std::string& type, int capacity,
               void* destination) {
                copyTypedValue(property, name, type, capacity, static_cast<T*>(destination));
            }};
}

constexpr Type text(std::string_view typeName)
{
    return {typeName,
            [](bool forDevice, const std::string& name, int count, const void* data) {
                return createCharProperty(forDevice, name, count, static_cast<const char*>(data));
            },
            [](const void* property, const std::string& name, const std::string& type, int capacity,
               void* destination) {
                copyTextValue(property, name, type, capacity, static_cast<char*>(destination));
            }};
}

constexpr std::array types = {
    typed<double>("double"),
    typed<bool>("logical"),
    text("char"),
    typed<unsigned char>("uint8"),
    typed<signed char>("int8"),
    typed<unsigned long>("uint64"),
    typed<long>("int64"),
    typed<unsigned int>("uint32"),
    typed<int>("int32"),
    typed<unsigned short>("uint16"),
    typed<short>("int16"),
    typed<float>("float"),
};

/// Null for an unknown type name.
const Type* findType(std::string_view typeName) noexcept
{
    const auto* const found = std::find_if(types.begin(), types.end(),
                                           [&](const Type& type) { return type.name == typeName; });
    return found == types.end() ? nullptr : found;
}

} // namespace

IPropertyInfo* createProperty(bool forDevice, const std::string& name, const std::string& typeName,
                              int count, const void* data)
{
    const Type* const type = findType(typeName);
    return type == nullptr ? nullptr : type->create(forDevice, name, count, data);
}

bool copyPropertyValue(const void* property, const std::string& name, const std::string& typeName,
                       int capacity, void* destination)
{
    const Type* const type = findType(typeName);
    if (type == nullptr) {
        return false;
    }
    type->copy(property, name, typeName, capacity, destination);
    return true;
}

void copyCustomPropertyValue(const brenixplugin::PropertyMap& properties, const std::string& name,
                             const std::string& typeName, int capacity, va_list* arguments)
{
    void* const destination = va_arg(*arguments, void*);
    requireArgument(destination, "destination");
    const auto found = properties.find(name);
    if (found == properties.end()) {
        throw std::runtime_error("Custom property: " + name + " not found.");
    }
    if (!copyPropertyValue(found->second, name, typeName, capacity, destination)) {
        throw std::runtime_error("Custom property: " + name +
                                 " is not a supported type: " + typeName);
    }
}

} // namespace brenixcoder
