// Converter `columns`: the interleaved numbers of the field "data", k for each count, become the
// fields Data1 to Datak with one number for each count. Everything else passes as it is.

#include "brenixcore/plugin/Describe.hpp"
#include "brenixcore/plugin/Make.hpp"
#include "brenixcore/plugin/Plugin.hpp"
#include "brenixcore/plugin/Visit.hpp"

#include <cstdint>
#include <memory>
#include <stdexcept>
#include <string>

namespace
{

using namespace brenixcore::plugin;
using brenixplugin::kit::coderconverter::TPointerProperty;
using brenixplugin::kit::device::TScalarProperty;
using brenixplugin::kit::device::TVectorProperty;

struct Deinterleave {
    Packet& packet;

    template <typename T>
    void operator()(const TPointerProperty<T>& array)
    {
        split(array.data, array.count);
    }

    template <typename T>
    void operator()(const TVectorProperty<T>& vector)
    {
        split(vector.values.data(), vector.values.size());
    }

    template <typename T>
    void operator()(const TScalarProperty<T>& /*one number*/)
    {
        refuse();
    }

    template <typename T>
    void split(const T* interleaved, std::uint64_t count)
    {
        const std::uint64_t rows = packet.counts;
        const std::uint64_t columns = count / rows;
        if (columns == 0 || count % rows != 0) {
            throw std::invalid_argument("Field data of " + std::to_string(count) +
                                        " elements does not divide into " + std::to_string(rows) +
                                        " counts.");
        }
        for (std::uint64_t column = 0; column < columns; ++column) {
            std::unique_ptr<T[]> values(new T[rows]);
            for (std::uint64_t row = 0; row < rows; ++row) {
                values[row] = interleaved[row * columns + column];
            }
            setField(packet,
                     makeArray("Data" + std::to_string(column + 1), std::move(values), rows));
        }
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

constexpr FieldInfo inputFields[] = {
    {"Data#", "", "", "one of the interleaved numbers of each count"},
    {},
};

} // namespace

BRENIXCORE_EXPORT_CONVERTER(Columns)
BRENIXCORE_DESCRIBE_OPTIONS(brenixcore::plugin::noOptions)
BRENIXCORE_DESCRIBE_FIELDS(inputFields, brenixcore::plugin::noFields)
