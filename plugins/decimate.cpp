// Filter `decimate`: keeps every n-th count, across packets.

#include "brenixcore/plugin/Describe.hpp"
#include "brenixcore/plugin/Options.hpp"
#include "brenixcore/plugin/Plugin.hpp"
#include "brenixcore/plugin/Visit.hpp"

#include <algorithm>
#include <cmath>
#include <cstddef>
#include <cstdint>

namespace
{

using namespace brenixcore::plugin;
using brenixplugin::kit::coderconverter::TPointerProperty;
using brenixplugin::kit::device::TScalarProperty;
using brenixplugin::kit::device::TVectorProperty;

class Decimate : public Filter
{
public:
    void tune(Options& options) override
    {
        const auto newFactor = options.wholeNumber("Factor", 1, 1L << 53);
        if (newFactor) {
            factor = static_cast<std::uint64_t>(*newFactor);
            skip = 0;
        }
    }

    void apply(Packet& packet) override
    {
        const std::uint64_t kept =
            packet.counts > skip ? (packet.counts - skip - 1) / factor + 1 : 0;
        const Keep keep{packet.counts, skip, factor, kept};
        for (const auto& field : *packet.fields) {
            visitProperty(brenixplugin::asProperty(field.second), keep);
        }
        if (packet.time != 0) { // of what is now its first count
            packet.time += std::llround(packet.period * static_cast<double>(skip));
        }
        packet.period *= static_cast<double>(factor);
        skip += kept * factor - packet.counts;
        packet.counts = kept;
    }

private:
    /// Leaves of an array the elements of the counts that stay.
    struct Keep {
        std::uint64_t counts;
        std::uint64_t first;
        std::uint64_t step;
        std::uint64_t kept;

        template <typename T>
        void operator()(TPointerProperty<T>& array) const
        {
            array.count = moveForward(array.data, array.count);
        }

        template <typename T>
        void operator()(TVectorProperty<T>& vector) const
        {
            vector.values.resize(moveForward(vector.values.begin(), vector.values.size()));
        }

        template <typename T>
        void operator()(TScalarProperty<T>& /*describes the packet*/) const
        {
        }

        /// Moves the elements that stay to the front. Returns how many they are.
        template <typename Iterator>
        std::uint64_t moveForward(Iterator begin, std::uint64_t elements) const
        {
            const std::uint64_t size = elements / counts; // of a count
            if (size * counts != elements) {
                return elements; // they describe the packet
            }
            const auto at = [&](std::uint64_t count) {
                return begin + static_cast<std::ptrdiff_t>(count * size);
            };
            for (std::uint64_t i = 0; i < kept; ++i) {
                const std::uint64_t from = first + i * step;
                if (from != i) {
                    std::move(at(from), at(from + 1), at(i));
                }
            }
            return kept * size;
        }
    };

    std::uint64_t factor = 1;
    std::uint64_t skip = 0; ///< counts until the next one that stays
};

constexpr OptionInfo optionTable[] = {
    {"Factor", "whole number", "counts", "1", "one of so many stays"},
    {},
};

} // namespace

BRENIXCORE_EXPORT_FILTER(Decimate)
BRENIXCORE_DESCRIBE_OPTIONS(optionTable)
