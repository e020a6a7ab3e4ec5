#include "Packets.hpp"

#include "brenixcore/plugin/Make.hpp"
#include "brenixcore/plugin/Visit.hpp"

#include <algorithm>
#include <memory>
#include <optional>
#include <stdexcept>
#include <string>

namespace brenixcore
{

namespace
{

using namespace brenixplugin;
using brenixplugin::kit::coderconverter::TPointerProperty;
using brenixplugin::kit::device::TScalarProperty;
using brenixplugin::kit::device::TVectorProperty;

/// The elements of count `first` to `first + length` of a property that holds `counts` counts, or
/// all of them where they do not divide.
struct Range {
    Range(std::uint64_t first, std::uint64_t length, std::uint64_t counts, std::uint64_t elements)
        : size(elements)
    {
        if (elements % counts == 0) {
            begin = elements / counts * first;
            size = elements / counts * length;
        }
    }
    std::uint64_t begin = 0;
    std::uint64_t size;
};

struct Slicer {
    std::uint64_t first;
    std::uint64_t length;
    std::uint64_t counts;
    OwnedProperty result;

    template <typename T>
    void operator()(const TScalarProperty<T>& scalar)
    {
        result = plugin::makeScalar(scalar.name, scalar.value);
    }

    template <typename T>
    void operator()(const TPointerProperty<T>& array)
    {
        const Range range(first, length, counts, array.count);
        std::unique_ptr<T[]> copy(new T[range.size]);
        std::copy_n(array.data + range.begin, range.size, copy.get());
        result = plugin::makeArray(array.name, std::move(copy), range.size);
    }

    template <typename T>
    void operator()(const TVectorProperty<T>& vector)
    {
        const Range range(first, length, counts, vector.values.size());
        auto copy = std::make_unique<TVectorProperty<T>>(vector.name, range.size);
        std::copy_n(vector.values.begin() + static_cast<std::ptrdiff_t>(range.begin), range.size,
                    copy->values.begin());
        result.reset(copy.release());
    }
};

template <typename Visitor>
void visitField(const std::string& name, void* property, Visitor&& visitor)
{
    if (!plugin::visitProperty(asProperty(property), visitor)) {
        throw std::invalid_argument("Field " + name + " is of a class that cannot be copied.");
    }
}

/// Counts the elements of the first property. Throws when an array has lost its elements.
struct CountElements {
    std::optional<std::uint64_t> first;

    template <typename T>
    void operator()(const TPointerProperty<T>& array)
    {
        if (array.data == nullptr && array.count > 0) {
            throw std::invalid_argument("Field " + array.name + " has no elements.");
        }
        first = first.value_or(array.count);
    }
    template <typename T>
    void operator()(const TScalarProperty<T>& /*one*/)
    {
        first = first.value_or(1);
    }
    template <typename T>
    void operator()(const TVectorProperty<T>& vector)
    {
        first = first.value_or(vector.values.size());
    }
};

} // namespace

plugin::Packet slice(const plugin::Packet& packet, std::uint64_t first, std::uint64_t length)
{
    plugin::Packet part;
    part.counts = length;
    for (const auto& [name, property] : *packet.fields) {
        Slicer slicer{first, length, packet.counts, nullptr};
        visitField(name, property, slicer);
        storeProperty(*part.fields, name, std::move(slicer.result));
    }
    return part;
}

std::uint64_t countsOf(const PropertyMap& fields)
{
    CountElements counter;
    for (const auto& [name, property] : fields) {
        visitField(name, property, counter);
    }
    return counter.first.value_or(0);
}

plugin::Packet copyFields(const PropertyMap& fields)
{
    plugin::Packet copy;
    for (const auto& [name, property] : fields) {
        Slicer slicer{0, 1, 1, nullptr};
        visitField(name, property, slicer);
        storeProperty(*copy.fields, name, std::move(slicer.result));
    }
    copy.counts = countsOf(fields);
    return copy;
}

void requireWhole(const plugin::Packet& packet)
{
    if (packet.counts == 0) {
        return; // it goes nowhere
    }
    if (!packet.fields) {
        throw std::invalid_argument("A packet has no fields.");
    }
    if (packet.fields.isChecked()) {
        return;
    }
    countsOf(*packet.fields);
    packet.fields.setChecked(true);
}

} // namespace brenixcore
