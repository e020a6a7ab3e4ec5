// A filter that limits the numbers in arrays.

#include <brenixcore/plugin/Describe.hpp>
#include <brenixcore/plugin/Options.hpp>
#include <brenixcore/plugin/Plugin.hpp>
#include <brenixcore/plugin/Visit.hpp>

#include <algorithm>
#include <cstdint>
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

    // Called for each class that a field can have: an array in one of two forms is clipped...
    template <typename T>
    void operator()(brenixplugin::kit::coderconverter::TPointerProperty<T>& array) const
    {
        clip(array.data, array.count);
    }
    template <typename T>
    void operator()(brenixplugin::kit::device::TVectorProperty<T>& vector) const
    {
        clip(vector.values.data(), vector.values.size());
    }

    // ... and one number stays.
    template <typename T>
    void operator()(brenixplugin::kit::device::TScalarProperty<T>& /*scalar*/) const
    {
    }

private:
    template <typename T>
    void clip(T* elements, std::uint64_t count) const
    {
        constexpr auto lowest = static_cast<double>(std::numeric_limits<T>::lowest());
        for (T* element = elements; element != elements + count; ++element) {
            if (static_cast<double>(*element) > highest) {
                *element = static_cast<T>(std::max(highest, lowest));
            }
        }
    }

    double highest = std::numeric_limits<double>::infinity();
};

constexpr OptionInfo optionTable[] = {
    {"Highest", "number", "", "infinity", "the highest number that passes, also while data flows"},
    {},
};

} // namespace

BRENIXCORE_EXPORT_FILTER(Clip)
BRENIXCORE_DESCRIBE_OPTIONS(optionTable)
