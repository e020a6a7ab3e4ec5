// Hands out the device, converter or filter, by build, that a test has made.

#include "brenixcore/plugin/Plugin.hpp"

#include <utility>

namespace
{

brenixcore::plugin::KIND* handed = nullptr;

} // namespace

extern "C" BRENIXCORE_PLUGIN_SHARED void brenixcoreCreateFrom(brenixcore::plugin::KIND* object)
{
    handed = object;
}

extern "C" BRENIXCORE_PLUGIN_SHARED std::uint32_t brenixcorePluginAbiVersion()
{
    return brenixcore::plugin::abiVersion;
}

extern "C" BRENIXCORE_PLUGIN_SHARED brenixcore::plugin::KIND* FACTORY()
{
    return std::exchange(handed, nullptr);
}
