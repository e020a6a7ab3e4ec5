/// @file
/// From a property object to its concrete class.
#ifndef BRENIXCORE_PLUGIN_VISIT_HPP
#define BRENIXCORE_PLUGIN_VISIT_HPP

#include "brenixplugin/Property.hpp"

#include <string>
#include <typeinfo>

namespace brenixcore::plugin
{

namespace detail
{

/// Of the very class, which is quick to tell, or of one derived from it.
enum class Match { Exact, Derived };

template <typename Property, typename Visitor>
bool visitAs(brenixplugin::interfaces::IPropertyInfo* property, Match match, Visitor& visitor)
{
    Property* concrete = nullptr;
    if (match == Match::Derived) {
        concrete = dynamic_cast<Property*>(property);
    } else if (typeid(*property) == typeid(Property)) {
        concrete = static_cast<Property*>(property);
    }
    if (concrete == nullptr) {
        return false;
    }
    visitor(*concrete);
    return true;
}

template <typename T, typename Visitor>
bool visitElement(brenixplugin::interfaces::IPropertyInfo* property, Match match, Visitor& visitor)
{
    using namespace brenixplugin::kit;
    return visitAs<coderconverter::TPointerProperty<T>>(property, match, visitor) ||
           visitAs<device::TScalarProperty<T>>(property, match, visitor) ||
           visitAs<device::TVectorProperty<T>>(property, match, visitor);
}

template <typename... T>
struct Elements {
    template <typename... Other>
    using And = Elements<T..., Other...>;

    template <typename Visitor>
    static bool visit(brenixplugin::interfaces::IPropertyInfo* property, Visitor& visitor)
    {
        return property != nullptr && ((visitElement<T>(property, Match::Exact, visitor) || ...) ||
                                       (visitElement<T>(property, Match::Derived, visitor) || ...));
    }
};

using Numbers = Elements<double, float, unsigned long, long, unsigned int, int, unsigned short,
                         short, unsigned char, signed char>;
using All = Numbers::And<bool, std::u16string, std::string>;

} // namespace detail

/// Calls the visitor with a numeric property as its concrete class: a TPointerProperty<T>,
/// TScalarProperty<T> or TVectorProperty<T>. Returns whether it is one; null is none.
template <typename Visitor>
bool visitNumbers(brenixplugin::interfaces::IPropertyInfo* property, Visitor&& visitor)
{
    return detail::Numbers::visit(property, visitor);
}

/// The same for every class: numbers, bool, std::u16string and std::string.
template <typename Visitor>
bool visitProperty(brenixplugin::interfaces::IPropertyInfo* property, Visitor&& visitor)
{
    return detail::All::visit(property, visitor);
}

} // namespace brenixcore::plugin

#endif
