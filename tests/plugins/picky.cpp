// A converter and a filter, by build, that refuse packets with the number 13 and spoil those with the
// numbers after it. The converter makes of a first number 20 how many packets of output it has seen. The
// filter also multiplies, by a factor that can be tuned, where 0 leaves no counts, and repeats the numbers.

#include "brenixcore/plugin/Describe.hpp"
#include "brenixcore/plugin/Make.hpp"
#include "brenixcore/plugin/Options.hpp"
#include "brenixcore/plugin/Plugin.hpp"

#include <algorithm>
#include <memory>
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
    void convertOutput(Packet& packet) override
    {
        double& first = *dataOf(packet).data;
        ++seen;
        first = first == 20 ? seen : first;
        spoil(packet, first);
    }

private:
    double seen = 0;
};

class PickyFilter : public Filter
{
public:
    void tune(Options& options) override
    {
        factor = options.number("Factor").value_or(factor);
        times = static_cast<std::uint64_t>(options.wholeNumber("Times", 1, 9).value_or(1));
    }

    void apply(Packet& packet) override
    {
        auto& data = dataOf(packet);
        const double first = *data.data;
        std::for_each(data.data, data.data + data.count, [&](double& value) { value *= factor; });
        packet.counts *= factor != 0;
        if (times > 1) {
            std::unique_ptr<double[]> repeated(new double[data.count * times]);
            for (std::uint64_t i = 0; i < times; ++i) {
                std::copy_n(data.data, data.count, repeated.get() + i * data.count);
            }
            packet.counts *= times;
            setField(packet, makeArray(dataField, std::move(repeated), packet.counts));
        }
        spoil(packet, first);
    }

private:
    double factor = 1;
    std::uint64_t times = 1;
};

} // namespace

#ifdef FILTER
BRENIXCORE_EXPORT_FILTER(PickyFilter)
#else
constexpr FieldInfo fields[] = {
    {dataField, "", "", "the numbers"}, {"Stamp", "double", "s", "one for each packet"}, {}};
BRENIXCORE_EXPORT_CONVERTER(PickyConverter)
BRENIXCORE_DESCRIBE_FIELDS(fields, noFields)
#endif
