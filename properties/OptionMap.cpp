#include "properties/OptionMap.hpp"

#include "properties/CreateProperty.hpp"

#include <stdexcept>
#include <string>
#include <utility>

namespace brenixcoder
{

void buildOptionMap(brenixplugin::PropertyMap& options, uint64_t optionCount, va_list* arguments)
{
    brenixplugin::OwnedPropertyMap built;
    for (uint64_t i = 0; i < optionCount; ++i) {
        const std::string name = va_arg(*arguments, const char*);
        const std::string typeName = va_arg(*arguments, const char*);
        const int count = va_arg(*arguments, int);
        const void* const data = va_arg(*arguments, const void*);
        brenixplugin::OwnedProperty property(createProperty(true, name, typeName, count, data));
        if (!property) {
            throw std::runtime_error("Unsupported type: " + typeName + " for option " + name + ".");
        }
        brenixplugin::storeProperty(built.map, name, std::move(property));
    }
    options.swap(built.map);
}

} // namespace brenixcoder
