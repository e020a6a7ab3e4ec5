#ifndef BRENIXCORE_SRC_PACKETRING_HPP
#define BRENIXCORE_SRC_PACKETRING_HPP

#include "Packets.hpp"

#include <algorithm>
#include <bit>
#include <cmath>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <utility>
#include <vector>

namespace brenixcore
{

/// A waiting packet of which the first `taken` counts are gone.
struct QueuedPacket {
    explicit QueuedPacket(plugin::Packet&& whole) noexcept : packet(std::move(whole)) {}

    plugin::Packet packet;
    std::uint64_t taken = 0;
    std::uint64_t index = 0;   ///< of the packet's first count, from open on
    double period = 0;         ///< nanoseconds of a count; 0: not known
    std::uint32_t opening = 0; ///< from which it is
    bool converted = false;

    std::uint64_t counts() const { return packet.counts - taken; }

    /// The next `length` counts, copied.
    QueuedPacket part(std::uint64_t length) const
    {
        QueuedPacket result(slice(packet, taken, length));
        if (packet.time != 0) {
            result.packet.time = packet.time + std::llround(period * static_cast<double>(taken));
        }
        result.index = index + taken;
        result.opening = opening;
        result.period = period;
        result.converted = converted;
        return result;
    }
};

/// Packets in a row, in one piece of memory, which is quick to walk. Only reserve() can fail.
class PacketRing
{
public:
    bool empty() const { return length == 0; }
    std::size_t size() const { return length; }
    QueuedPacket& operator[](std::size_t i) { return *slot(i); }
    const QueuedPacket& operator[](std::size_t i) const
    {
        return *slots[(first + i) & (slots.size() - 1)];
    }

    /// Makes room for so many more packets. Gives memory back of which little is needed.
    void reserve(std::size_t more)
    {
        const std::size_t needed = std::bit_ceil(std::max<std::size_t>(length + more, 16));
        if (needed > slots.size() || (slots.size() > 4096 && needed < slots.size() / 8)) {
            std::vector<Slot> other(needed);
            for (std::size_t i = 0; i < length; ++i) {
                other[i] = std::move(slot(i));
            }
            slots.swap(other);
            first = 0;
        }
    }

    void pushBack(QueuedPacket&& packet) noexcept { slot(length++).emplace(std::move(packet)); }

    void pushFront(QueuedPacket&& packet) noexcept
    {
        --first;
        ++length;
        slot(0).emplace(std::move(packet));
    }

    QueuedPacket popFront() noexcept
    {
        QueuedPacket packet = std::move(*slot(0));
        slot(0).reset();
        ++first;
        --length;
        return packet;
    }

    void erase(std::size_t i) noexcept
    {
        for (; i > 0; --i) {
            slot(i) = std::move(slot(i - 1));
        }
        popFront();
    }

private:
    using Slot = std::optional<QueuedPacket>;

    Slot& slot(std::size_t i) { return slots[(first + i) & (slots.size() - 1)]; }

    std::vector<Slot> slots; ///< a power of two of them, or none
    std::size_t first = 0;   ///< wraps
    std::size_t length = 0;
};

} // namespace brenixcore

#endif
