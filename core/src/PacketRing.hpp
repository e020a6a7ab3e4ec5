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
    std::uint32_t opening = 0; ///< from which it is
    bool converted = false;

    std::uint64_t counts() const { return packet.counts - taken; }

    /// The next `length` counts, copied.
    QueuedPacket part(std::uint64_t length) const
    {
        QueuedPacket result(slice(packet, taken, length));
        if (packet.time != 0) {
            result.packet.time =
                packet.time + std::llround(packet.period * static_cast<double>(taken));
        }
        result.index = index + taken;
        if (packet.index) {
            result.packet.index = *packet.index + taken;
        }
        result.opening = opening;
        result.packet.period = packet.period;
        result.converted = converted;
        return result;
    }
};

/// Packets in a row, in one piece of memory, which is quick to walk. Only reserve() can fail. Where one is
/// erased in the middle, a hole stays, so that the next ones in that place are erased in no time.
class PacketRing
{
public:
    bool empty() const { return length == 0; }
    std::size_t size() const { return length; }
    QueuedPacket& operator[](std::size_t i) { return *slot(i); }
    const QueuedPacket& operator[](std::size_t i) const { return *slots[place(i)]; }

    /// Makes room for so many more packets. Gives memory back of which little is needed.
    void reserve(std::size_t more)
    {
        if (hole > length / 2 && length + hole + more > slots.size()) { // rather than grow
            moveHole(0);
        }
        const std::size_t needed = std::bit_ceil(std::max<std::size_t>(length + hole + more, 16));
        if (needed > slots.size() || (slots.size() > 4096 && needed < slots.size() / 8)) {
            std::vector<Slot> other(needed);
            for (std::size_t i = 0; i < length; ++i) {
                other[i] = std::move(slot(i));
            }
            slots.swap(other);
            first = hole = 0;
        }
    }

    void pushBack(QueuedPacket&& packet) noexcept { slot(length++).emplace(std::move(packet)); }

    void pushFront(QueuedPacket&& packet) noexcept
    {
        --first;
        ++beforeHole;
        ++length;
        slot(0).emplace(std::move(packet));
    }

    QueuedPacket popFront() noexcept
    {
        QueuedPacket packet = std::move(*slot(0));
        slot(0).reset();
        ++first;
        --beforeHole;
        --length;
        closeAtFront();
        return packet;
    }

    void erase(std::size_t i) noexcept
    {
        moveHole(i);
        slot(i).reset();
        ++hole;
        --length;
        beforeHole = i;
        closeAtFront();
    }

private:
    using Slot = std::optional<QueuedPacket>;

    std::size_t place(std::size_t i) const
    {
        return (first + i + (i < beforeHole ? 0 : hole)) & (slots.size() - 1);
    }
    Slot& slot(std::size_t i) { return slots[place(i)]; }

    /// Moves the hole, if there is one, behind so many packets.
    void moveHole(std::size_t packets) noexcept
    {
        const std::size_t mask = slots.size() - 1;
        while (hole > 0 && beforeHole > packets) {
            const std::size_t from = first + --beforeHole;
            std::swap(slots[(from + hole) & mask], slots[from & mask]);
        }
        while (hole > 0 && beforeHole < packets) {
            const std::size_t to = first + beforeHole++;
            std::swap(slots[to & mask], slots[(to + hole) & mask]);
        }
        closeAtFront();
    }

    /// A hole before all packets is none.
    void closeAtFront() noexcept
    {
        if (beforeHole == 0) {
            first += std::exchange(hole, 0);
        }
    }

    std::vector<Slot> slots; ///< a power of two of them, or none
    std::size_t first = 0;   ///< wraps
    std::size_t length = 0;  ///< packets
    /// So many of them come before the hole; without a meaning where there is none.
    std::size_t beforeHole = 0;
    std::size_t hole = 0; ///< empty slots
};

} // namespace brenixcore

#endif
