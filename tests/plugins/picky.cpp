// A converter and a filter, by build, that refuse packets with the number 13 and spoil those with the
// numbers after it. The filter also multiplies, by a factor that can be tuned; a factor of 0 leaves no
// counts.

#include "brenixcore/plugin/Options.hpp"
#include "brenixcore/plugin/Plugin.hpp"

#include <algorithm>
#include <stdexcept>

namespace
{

using namespace brenixcore::plugin;

brenixplugin::kit::coderconverter::TPointerProperty<double>& dataOf(Packet& packet)
{
    auto& data = dynamic_cast<brenixplugin::kit::coderconverter::TPointerProperty<double>&>(
        *brenixplugin::asProperty(packet.fields->at(dataField)));
    if (std::find(data.data, data.data + data.count, 13) != data.data + data.count) {
        throw std::runtime_error("13 is refused");
    }
    return data;
}

/// Makes the mistake that the first number asks for.
void spoil(Packet& packet, double first)
{
    switch (static_cast<int>(first)) {
    case 14:
        throw 14;
    case 15:
        packet.counts = UINT64_MAX;
        break;
    case 16:
        Fields(std::move(packet.fields)); // leaves none
        break;
    case 17:
        packet.fields->emplace("null", nullptr);
        break;
    default:
        break;
    }
}

class PickyConverter : public Converter
{
public:
    void convertInput(Packet& packet) override { spoil(packet, *dataOf(packet).data); }
    void convertOutput(Packet& packet) override { spoil(packet, *dataOf(packet).data); }
};

class PickyFilter : public Filter
{
public:
    void tune(Options& options) override { factor = options.number("Factor").value_or(factor); }

    void apply(Packet& packet) override
    {
        auto& data = dataOf(packet);
        const double first = *data.data;
        std::for_each(data.data, data.data + data.count, [&](double& value) { value *= factor; });
        packet.counts *= factor != 0;
        spoil(packet, first);
    }

private:
    double factor = 1;
};

} // namespace

#ifdef FILTER
BRENIXCORE_EXPORT_FILTER(PickyFilter)
#else
BRENIXCORE_EXPORT_CONVERTER(PickyConverter)
#endif
