// The public header in C++17, where its functions are noexcept, and the property header, which
// links nothing: this file becomes a library without undefined symbols of its own.
#include "brenixcoder/coder.h"
#include "brenixplugin/Property.hpp"

static_assert(noexcept(coderChannelInit(nullptr, 0)));

namespace device = brenixplugin::kit::device;

brenixplugin::interfaces::IPropertyInfo* makeProperty();

__attribute__((visibility("default"))) brenixplugin::interfaces::IPropertyInfo* makeProperty()
{
    return new device::TVectorProperty<bool>("bits", 3);
}
