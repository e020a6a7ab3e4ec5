// A filter that limits the numbers in arrays.

#include <brenixcore/plugin/Describe.hpp>
#include <brenixcore/plugin/Options.hpp>
#include <brenixcore/plugin/Plugin.hpp>
#include <brenixcore/plugin/Visit.hpp>

#include <limits>

namespace
{

using namespace brenixcore::plugin;

class Clip : public Filter
{
public:
    void tune(Options& options) override
    {
        const double value = options.number("Highest").value_or(highest);
        highest = value;
    }

    void apply(Packet& packet) override
    {
        for (const auto& field : *packet.fields) {
            visitNumbers(brenixplugin::asProperty(field.second), *this);
        }
    }

    // Called for each class that a field can have: arrays are clipped...
    template <typename T>
    void operator()(brenixplugin::kit::coderconverter::TPointerProperty<T>& array) const
    {
        for (T* element = array.data; element != array.data + array.count; ++element) {
            if (static_cast<double>(*element) > highest) {
                *element = static_cast<T>(highest);
            }
        }
    }

    // ... and everything else stays.
    template <typename Other>
    void operator()(Other& /*other*/) const
    {
    }

private:
    double highest = std::numeric_limits<double>::infinity();
};

constexpr OptionInfo optionTable[] = {
    {"Highest", "number", "", "infinity", "the highest number that passes, also while data flows"},
    {},
};

} // namespace

BRENIXCORE_EXPORT_FILTER(Clip)
BRENIXCORE_DESCRIBE_OPTIONS(optionTable)
