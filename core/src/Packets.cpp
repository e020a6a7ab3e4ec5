#include "Packets.hpp"

#include "brenixcore/plugin/Make.hpp"
#include "brenixcore/plugin/Visit.hpp"

#include <algorithm>
#include <memory>
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
    std::uint64_t elements = 0; ///< in the whole property

    template <typename T>
    void operator()(const TScalarProperty<T>& scalar)
    {
        elements = 1;
        result = plugin::makeScalar(scalar.name, scalar.value);
    }

    template <typename T>
    void operator()(const TPointerProperty<T>& array)
    {
        elements = array.count;
        const Range range(first, length, counts, array.count);
        std::unique_ptr<T[]> copy(new T[range.size]);
        std::copy_n(array.data + range.begin, range.size, copy.get());
        result = plugin::makeArray(array.name, std::move(copy), range.size);
    }

    template <typename T>
    void operator()(const TVectorProperty<T>& vector)
    {
        elements = vector.values.size();
        const Range range(first, length, counts, elements);
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

/// Throws when an array has lost its elements.
struct RequireElements {
    template <typename T>
    void operator()(const TPointerProperty<T>& array) const
    {
        if (array.data == nullptr && array.count > 0) {
            throw std::invalid_argument("Field " + array.name + " has no elements.");
        }
    }
    template <typename Other>
    void operator()(const Other& /*holds its values*/) const
    {
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

plugin::Packet copyFields(const PropertyMap& fields)
{
    plugin::Packet copy;
    for (const auto& [name, property] : fields) {
        Slicer slicer{0, 1, 1, nullptr};
        visitField(name, property, slicer);
        storeProperty(*copy.fields, name, std::move(slicer.result));
        if (copy.counts == 0) {
            copy.counts = slicer.elements;
        }
    }
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
    for (const auto& [name, property] : *packet.fields) {
        visitField(name, property, RequireElements());
    }
    packet.fields.setChecked(true);
}

} // namespace brenixcore
