/// @file
/// What devices, filters and converters pass on to each other.
#ifndef BRENIXCORE_PLUGIN_PACKET_HPP
#define BRENIXCORE_PLUGIN_PACKET_HPP

#include "brenixplugin/Property.hpp"

#include <cstdint>
#include <optional>
#include <string>
#include <utility>

namespace brenixcore::plugin
{

/// Property objects by field name, owned; used like a pointer to their map. It notes that it was used,
/// so that fields which pass through untouched are checked once. References to the map or to an object
/// are to be used no longer once the packet was pushed.
class Fields
{
public:
    /// A map without fields.
    Fields() : map(new brenixplugin::PropertyMap) {}
    /// Takes the map over with its objects.
    explicit Fields(brenixplugin::OwnedDataBuffer fields) noexcept : map(std::move(fields)) {}

    /// The map, which must be there.
    brenixplugin::PropertyMap& operator*() const
    {
        checked = false;
        return *map;
    }
    /// The same.
    brenixplugin::PropertyMap* operator->() const { return &**this; }

    /// Whether there is a map.
    explicit operator bool() const { return map != nullptr; }

    /// Hands the map and its objects over; none is left.
    brenixplugin::PropertyMap* release() { return map.release(); }

    /// For the core: whether nobody used the fields since it found them sound.
    bool isChecked() const { return checked; }
    /// For the core: whether it found them sound.
    void setChecked(bool sound) const { checked = sound; }

private:
    brenixplugin::OwnedDataBuffer map;
    mutable bool checked = false;
};

/// Fields, and the number of counts (samples, frames, elements) that they hold. A packet is moved, never
/// copied. Where it has to be divided, a field with a whole number of elements for each count is divided
/// with it, and any other field is repeated in each part.
struct Packet {
    Fields fields;            ///< never null
    std::uint64_t counts = 0; ///< of each field
    std::int64_t time = 0;    ///< of its first count, in nanoseconds since 1970 (UTC); 0: not known
    std::uint64_t lost = 0;   ///< counts that the device lost before it
    double period =
        0; ///< nanoseconds of a count; 0: what the rate of the stream says, if it has one

    /// The number of its first count, where its source numbers counts itself; then the caller's Index is
    /// this one, unless the stream has filters.
    std::optional<std::uint64_t> index = std::nullopt;
};

/// Adds a field, or replaces the one of its name.
inline void setField(Packet& packet, brenixplugin::OwnedProperty property)
{
    const std::string name = property->getName();
    brenixplugin::storeProperty(*packet.fields, name, std::move(property));
}

/// Takes a field out of the packet; null when there is none of that name.
inline brenixplugin::OwnedProperty takeField(Packet& packet, const std::string& name)
{
    const auto node = packet.fields->extract(name);
    return brenixplugin::OwnedProperty(node ? brenixplugin::asProperty(node.mapped()) : nullptr);
}

/// The field in which simple devices push their data and in which written data arrives.
constexpr const char* dataField = "data";

} // namespace brenixcore::plugin

#endif
