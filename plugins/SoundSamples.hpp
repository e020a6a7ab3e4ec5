// From the numbers of a field to the samples of a sound file.
#ifndef BRENIX_PLUGINS_SOUND_SAMPLES_HPP
#define BRENIX_PLUGINS_SOUND_SAMPLES_HPP

#include "brenixplugin/Property.hpp"

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <limits>
#include <type_traits>
#include <vector>

namespace brenix
{

/// Appends the numbers of a property as samples, the full scale of which is from -1 to 1.
struct AppendSamples {
    std::vector<double>& samples;
    bool clips;         ///< what is beyond full scale
    bool known = false; ///< whether the numbers are of a type that samples can have

    template <typename T>
    void operator()(const brenixplugin::kit::coderconverter::TPointerProperty<T>& array)
    {
        append(array.data, array.count);
    }
    template <typename T>
    void operator()(const brenixplugin::kit::device::TVectorProperty<T>& vector)
    {
        append(vector.values.data(), vector.values.size());
    }
    template <typename T>
    void operator()(const brenixplugin::kit::device::TScalarProperty<T>& scalar)
    {
        append(&scalar.value, 1);
    }

private:
    template <typename T>
    void append(const T* values, std::uint64_t count)
    {
        if constexpr (std::is_floating_point_v<T> ||
                      (std::is_signed_v<T> && sizeof(T) <= sizeof(int))) {
            known = true;
            samples.reserve(samples.size() + count);
            for (std::uint64_t i = 0; i < count; ++i) {
                double sample = values[i];
                if constexpr (std::is_integral_v<T>) {
                    sample /= -static_cast<double>(std::numeric_limits<T>::min());
                }
                samples.push_back(clips ? clipped(sample) : sample);
            }
        }
    }

    /// 0 for what is no number: libsndfile sees to this for PCM only, and looks up other encodings in
    /// tables without a check.
    static double clipped(double sample)
    {
        return std::isnan(sample) ? 0 : std::clamp(sample, -1.0, 1.0);
    }
};

} // namespace brenix

#endif
