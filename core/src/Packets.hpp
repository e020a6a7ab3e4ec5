// Copies and parts of packets.
#ifndef BRENIXCORE_SRC_PACKETS_HPP
#define BRENIXCORE_SRC_PACKETS_HPP

#include "brenixcore/plugin/Packet.hpp"

#include <cstdint>

namespace brenixcore
{

/// A packet of `length` counts with the elements of `packet` from count `first` on.
plugin::Packet slice(const plugin::Packet& packet, std::uint64_t first, std::uint64_t length);

/// A packet with copies of all fields. Its counts are the elements of the first field: one for a
/// single value or a text.
plugin::Packet copyFields(const brenixplugin::PropertyMap& fields);

/// Throws when a field is of a class that these do not know.
void requireCopyable(const brenixplugin::PropertyMap& fields);

} // namespace brenixcore

#endif
