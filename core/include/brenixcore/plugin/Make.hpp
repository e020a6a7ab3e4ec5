/// @file
/// Makes property objects.
#ifndef BRENIXCORE_PLUGIN_MAKE_HPP
#define BRENIXCORE_PLUGIN_MAKE_HPP

#include "brenixplugin/Property.hpp"

#include <cstdint>
#include <memory>
#include <string>
#include <utility>

namespace brenixcore::plugin
{

/// One value.
template <typename T>
brenixplugin::OwnedProperty makeScalar(const std::string& name, T value)
{
    return brenixplugin::OwnedProperty(
        new brenixplugin::kit::device::TScalarProperty<T>(name, std::move(value)));
}

/// An array of `count` elements.
template <typename T>
brenixplugin::OwnedProperty makeArray(const std::string& name, std::unique_ptr<T[]> elements,
                                      std::uint64_t count)
{
    brenixplugin::OwnedProperty array(
        new brenixplugin::kit::coderconverter::TPointerProperty<T>(name, elements.get(), count));
    elements.release();
    return array;
}

/// Adds one value to the properties that a device delivers.
template <typename T>
void publish(brenixplugin::PropertyMap& properties, const std::string& name, T value)
{
    storeProperty(properties, name, makeScalar(name, std::move(value)));
}

} // namespace brenixcore::plugin

#endif
