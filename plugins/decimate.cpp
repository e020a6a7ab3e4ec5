// Filter `decimate`: keeps every n-th count, across packets.

#include "brenixcore/plugin/Describe.hpp"
#include "brenixcore/plugin/Options.hpp"
#include "brenixcore/plugin/Plugin.hpp"
#include "brenixcore/plugin/Visit.hpp"

#include <algorithm>
#include <cstdint>

namespace
{

using namespace brenixcore::plugin;
using brenixplugin::kit::coderconverter::TPointerProperty;

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
        skip += kept * factor - packet.counts;
        packet.counts = kept;
    }

private:
    /// Moves the elements of the counts that stay to the front of an array.
    struct Keep {
        std::uint64_t counts;
        std::uint64_t first;
        std::uint64_t step;
        std::uint64_t kept;

        template <typename T>
        void operator()(TPointerProperty<T>& array) const
        {
            const std::uint64_t size = array.count / counts; // of a count
            if (size * counts != array.count) {
                return; // describes the packet
            }
            for (std::uint64_t i = 0; i < kept; ++i) {
                T* const from = array.data + (first + i * step) * size;
                T* const to = array.data + i * size;
                if (from != to) {
                    std::move(from, from + size, to);
                }
            }
            array.count = kept * size;
        }

        template <typename Other>
        void operator()(Other& /*describes the packet*/) const
        {
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
