// A converter and a filter, by build, that refuse packets with the number `refused`. The filter
// also multiplies, by a factor that can be tuned; a factor of 0 leaves no counts.

#include "brenixcore/plugin/Options.hpp"
#include "brenixcore/plugin/Plugin.hpp"

#include <algorithm>
#include <stdexcept>

namespace
{

using namespace brenixcore::plugin;

constexpr double refused = 13;

brenixplugin::kit::coderconverter::TPointerProperty<double>& dataOf(Packet& packet)
{
    auto& data = dynamic_cast<brenixplugin::kit::coderconverter::TPointerProperty<double>&>(
        *brenixplugin::asProperty(packet.fields->at(dataField)));
    if (std::find(data.data, data.data + data.count, refused) != data.data + data.count) {
        throw std::runtime_error("13 is refused");
    }
    return data;
}

class PickyConverter : public Converter
{
public:
    void convertInput(Packet& packet) override { dataOf(packet); }
    void convertOutput(Packet& packet) override { dataOf(packet); }
};

class PickyFilter : public Filter
{
public:
    void tune(const brenixplugin::PropertyMap& optionMap) override
    {
        Options options(optionMap);
        factor = options.number("Factor").value_or(factor);
        options.requireAllKnown();
    }

    void apply(Packet& packet) override
    {
        auto& data = dataOf(packet);
        std::for_each(data.data, data.data + data.count, [&](double& value) { value *= factor; });
        packet.counts *= factor != 0;
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
