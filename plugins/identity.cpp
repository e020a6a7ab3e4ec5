// Converter `identity`: data passes as it is.

#include "brenixcore/plugin/Describe.hpp"
#include "brenixcore/plugin/Plugin.hpp"

namespace
{

class Identity : public brenixcore::plugin::Converter
{
public:
    void convertInput(brenixcore::plugin::Packet& /*packet*/) override {}
    void convertOutput(brenixcore::plugin::Packet& /*packet*/) override {}
};

} // namespace

BRENIXCORE_EXPORT_CONVERTER(Identity)
BRENIXCORE_DESCRIBE_OPTIONS(brenixcore::plugin::noOptions)
