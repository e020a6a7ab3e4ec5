#ifndef BRENIXCODER_PROPERTIES_CREATEPROPERTY_HPP
#define BRENIXCODER_PROPERTIES_CREATEPROPERTY_HPP

#include "brenixplugin/Property.hpp"

#include <string>

namespace brenixcoder
{

using brenixplugin::interfaces::IPropertyInfo;

/// Makes the property object of a value: `count` elements of the named type at `data`, which are
/// copied. For a device, one element becomes a scalar and more become a vector; otherwise it is a
/// TPointerProperty. "char" is always one UTF-16 text. The caller owns the result.
/// @return null for an unknown type name; then neither count nor data is looked at
/// @throws std::runtime_error for a count below 1 or a null pointer; for "char", `count` is the
///         most characters to take, and 0 or less is an empty text
IPropertyInfo* createProperty(bool forDevice, const std::string& name, const std::string& typeName,
                              int count, const void* data);

} // namespace brenixcoder

#endif
