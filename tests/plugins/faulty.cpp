// Plug-ins that cannot be loaded or created, one for each FAULT.

#include "brenixcore/plugin/Plugin.hpp"

#include <stdexcept>

#define EXPORT extern "C" BRENIXCORE_PLUGIN_SHARED

struct OwnException : std::runtime_error {
    using std::runtime_error::runtime_error;
};

#if FAULT == 7 // throws from a static object
struct Static {
    Static() { throw OwnException("thrown by a static object"); }
} staticObject;
#endif

EXPORT std::uint32_t brenixcorePluginAbiVersion()
{
    if (FAULT == 1) {
        throw OwnException("thrown while loading");
    }
    return FAULT == 2 ? 999 : brenixcore::plugin::abiVersion;
}

#if FAULT != 3 // exports no factory
EXPORT brenixcore::plugin::Device* brenixcoreCreateDevice()
{
    if (FAULT == 4) {
        throw OwnException("thrown by the factory");
    }
    if (FAULT == 5) {
        throw 5;
    }
    return nullptr;
}
#endif
