#ifndef BRENIXCODER_PROPERTIES_COPYPROPERTY_HPP
#define BRENIXCODER_PROPERTIES_COPYPROPERTY_HPP

#include "brenixplugin/Property.hpp"

#include <cstdarg>
#include <string>

namespace brenixcoder
{

/// Copies a property's elements to `destination`, which takes `capacity` elements of the named type
/// (for "char": bytes, the final NUL included). The property must hold exactly that type. `name` is
/// for messages.
/// @return false for an unknown type name; then nothing was done
/// @throws std::runtime_error when the type does not match or the elements do not fit; then nothing
///         was written
bool copyPropertyValue(const void* property, const std::string& name, const std::string& typeName,
                       int capacity, void* destination);

/// Copies the property of that name in the map to the destination that is next in `arguments`.
/// @throws std::runtime_error as above, and for an unknown name, an unknown type name or a null
///         destination
void copyCustomPropertyValue(const brenixplugin::PropertyMap& properties, const std::string& name,
                             const std::string& typeName, int capacity, va_list* arguments);

} // namespace brenixcoder

#endif
