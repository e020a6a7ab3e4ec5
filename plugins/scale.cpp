// Filter `scale`: multiplies every number in arrays by a gain and adds an offset.

#include "brenixcore/plugin/Describe.hpp"
#include "brenixcore/plugin/Options.hpp"
#include "brenixcore/plugin/Plugin.hpp"
#include "brenixcore/plugin/Visit.hpp"

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <limits>
#include <type_traits>

namespace
{

using namespace brenixcore::plugin;
using brenixplugin::kit::coderconverter::TPointerProperty;
using brenixplugin::kit::device::TScalarProperty;
using brenixplugin::kit::device::TVectorProperty;

/// The nearest value of T; beyond its range the last one, and 0 for what is no number.
template <typename T>
T nearest(double value)
{
    if constexpr (std::is_floating_point_v<T>) {
        return static_cast<T>(value);
    } else {
        using Limits = std::numeric_limits<T>;
        if (std::isnan(value)) {
            return 0;
        }
        const double rounded = std::round(value);
        if (rounded <= static_cast<double>(Limits::min())) {
            return Limits::min();
        }
        // The limit of a 64-bit type rounds up to a power of two, which is already beyond it.
        return rounded >= static_cast<double>(Limits::max()) ? Limits::max()
                                                             : static_cast<T>(rounded);
    }
}

class Scale : public Filter
{
public:
    void tune(Options& options) override
    {
        const double newGain = options.number("Gain").value_or(gain);
        const double newOffset = options.number("Offset").value_or(offset);
        gain = newGain;
        offset = newOffset;
    }

    void apply(Packet& packet) override
    {
        for (const auto& field : *packet.fields) {
            visitNumbers(brenixplugin::asProperty(field.second), *this);
        }
    }

    template <typename T>
    void operator()(TPointerProperty<T>& array) const
    {
        scale(array.data, array.count);
    }

    template <typename T>
    void operator()(TVectorProperty<T>& vector) const
    {
        scale(vector.values.data(), vector.values.size());
    }

    template <typename T>
    void operator()(TScalarProperty<T>& /*describes the packet*/) const
    {
    }

private:
    template <typename T>
    void scale(T* values, std::uint64_t count) const
    {
        std::transform(values, values + count, values, [&](T value) {
            return nearest<T>(static_cast<double>(value) * gain + offset);
        });
    }

    double gain = 1;
    double offset = 0;
};

constexpr OptionInfo optionTable[] = {
    {"Gain", "number", "", "1", "what numbers are multiplied by"},
    {"Offset", "number", "", "0", "what is then added"},
    {},
};

} // namespace

BRENIXCORE_EXPORT_FILTER(Scale)
BRENIXCORE_DESCRIBE_OPTIONS(optionTable)
