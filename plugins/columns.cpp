// Converter `columns`: the interleaved numbers of the field "data", k for each count, become the
// fields Data1 to Datak with one number for each count. Everything else passes as it is.

#include "brenixcore/plugin/Describe.hpp"
#include "brenixcore/plugin/Make.hpp"
#include "brenixcore/plugin/Plugin.hpp"
#include "brenixcore/plugin/Visit.hpp"

#include <memory>
#include <stdexcept>
#include <string>

namespace
{

using namespace brenixcore::plugin;
using brenixplugin::kit::coderconverter::TPointerProperty;

struct Deinterleave {
    Packet& packet;

    template <typename T>
    void operator()(const TPointerProperty<T>& interleaved)
    {
        const std::uint64_t rows = packet.counts;
        const std::uint64_t columns = interleaved.count / rows;
        if (columns == 0 || interleaved.count % rows != 0) {
            throw std::invalid_argument("Field data of " + std::to_string(interleaved.count) +
                                        " elements does not divide into " + std::to_string(rows) +
                                        " counts.");
        }
        for (std::uint64_t column = 0; column < columns; ++column) {
            std::unique_ptr<T[]> values(new T[rows]);
            for (std::uint64_t row = 0; row < rows; ++row) {
                values[row] = interleaved.data[row * columns + column];
            }
            setField(packet,
                     makeArray("Data" + std::to_string(column + 1), std::move(values), rows));
        }
    }

    template <typename Other>
    void operator()(const Other& /*several*/)
    {
        refuse();
    }

    [[noreturn]] static void refuse()
    {
        throw std::invalid_argument("Field data is not an array of numbers.");
    }
};

class Columns : public Converter
{
public:
    void convertInput(Packet& packet) override
    {
        const auto data = takeField(packet, dataField);
        if (data && !visitNumbers(data.get(), Deinterleave{packet})) {
            Deinterleave::refuse();
        }
    }

    void convertOutput(Packet& /*packet*/) override {}
};

} // namespace

BRENIXCORE_EXPORT_CONVERTER(Columns)
BRENIXCORE_DESCRIBE_OPTIONS(brenixcore::plugin::noOptions)
