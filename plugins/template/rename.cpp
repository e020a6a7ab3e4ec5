// A converter that gives the caller the field "data" under the name "Values", in place of one that has it
// already. A converter may do anything with the fields of a packet, such as decode them; output here passes as
// it is.

#include <brenixcore/plugin/Describe.hpp>
#include <brenixcore/plugin/Plugin.hpp>

#include <utility>

namespace
{

using namespace brenixcore::plugin;

class Rename : public Converter
{
public:
    void convertInput(Packet& packet) override
    {
        if (auto field = takeField(packet, dataField)) {
            brenixplugin::storeProperty(*packet.fields, "Values", std::move(field));
        }
    }

    void convertOutput(Packet& /*packet*/) override {}
};

constexpr FieldInfo inputFields[] = {
    {"Values", "", "", "what was in data"},
    {},
};

} // namespace

BRENIXCORE_EXPORT_CONVERTER(Rename)
BRENIXCORE_DESCRIBE_OPTIONS(brenixcore::plugin::noOptions)
BRENIXCORE_DESCRIBE_FIELDS(inputFields, brenixcore::plugin::noFields)
