#ifndef BRENIXCORE_SRC_CONVERTER_HPP
#define BRENIXCORE_SRC_CONVERTER_HPP

#include "Plugin.hpp"
#include "brenixcore/Converter.hpp"

namespace brenixcore
{

struct BRENIXCORE_INTERNAL Converter::Impl {
    LoadedPlugin<plugin::Converter> plugin;
};

} // namespace brenixcore

#endif
