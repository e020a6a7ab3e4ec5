// The public header in C++17, where its functions are noexcept, and the property header, which
// links nothing: this file becomes a library without undefined symbols of its own.
#include "brenixcoder/coder.h"
#include "brenixplugin/Property.hpp"

#include <type_traits>

static_assert(noexcept(coderChannelInit(nullptr, 0)));

// Every data buffer is one, though no function of the library names it.
static_assert(std::is_same_v<brenixplugin::PropertyMap, std::map<std::string, void*>>);

namespace device = brenixplugin::kit::device;

brenixplugin::interfaces::IPropertyInfo* makeProperty();

__attribute__((visibility("default"))) brenixplugin::interfaces::IPropertyInfo* makeProperty()
{
    return new device::TVectorProperty<bool>("bits", 3);
}
