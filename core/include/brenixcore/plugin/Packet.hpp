/// @file
/// What devices, filters and converters pass on to each other.
#ifndef BRENIXCORE_PLUGIN_PACKET_HPP
#define BRENIXCORE_PLUGIN_PACKET_HPP

#include "brenixplugin/Property.hpp"

#include <cstdint>
#include <string>
#include <utility>

namespace brenixcore::plugin
{

/// Property objects by field name, and the number of counts (samples, frames, elements) that they
/// hold. It owns its fields and is moved, never copied. Where a packet has to be divided, a field
/// with a whole number of elements for each count is divided with it, and any other field is
/// repeated in each part.
struct Packet {
    brenixplugin::OwnedDataBuffer fields{new brenixplugin::PropertyMap}; ///< never null
    std::uint64_t counts = 0;                                            ///< of each field
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
