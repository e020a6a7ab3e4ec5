// Copies and parts of packets.
#ifndef BRENIXCORE_SRC_PACKETS_HPP
#define BRENIXCORE_SRC_PACKETS_HPP

#include "brenixcore/plugin/Packet.hpp"

#include <cstdint>

namespace brenixcore
{

/// A packet of `length` counts with the elements of `packet` from count `first` on.
plugin::Packet slice(const plugin::Packet& packet, std::uint64_t first, std::uint64_t length);

/// The counts of fields that were written: the elements of the first, one for a single value or a text.
/// Throws as requireWhole() does.
std::uint64_t countsOf(const brenixplugin::PropertyMap& fields);

/// A packet with copies of all fields that were written.
plugin::Packet copyFields(const brenixplugin::PropertyMap& fields);

/// Throws when these could not copy a packet that a plug-in made or changed: it has no fields, one is
/// of a class that they do not know, or an array lacks its elements.
void requireWhole(const plugin::Packet& packet);

} // namespace brenixcore

#endif
