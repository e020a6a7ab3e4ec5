#ifndef BRENIXCODER_PROPERTIES_OPTIONMAP_HPP
#define BRENIXCODER_PROPERTIES_OPTIONMAP_HPP

#include "brenixplugin/Property.hpp"

#include <cstdarg>
#include <cstdint>

namespace brenixcoder
{

/// Reads `optionCount` options from the list, each a name (const char*), a type name (const char*),
/// an element count (int) and the elements (const void*), into the empty map `options`. The objects
/// in it are the caller's until it hands the map to an operation of the core, and from then on the
/// core's. When it throws, the map is still empty and nothing leaks.
void buildOptionMap(brenixplugin::PropertyMap& options, uint64_t optionCount, va_list* arguments);

} // namespace brenixcoder

#endif
