// What the devices share that move bytes: elements and their bytes, both ways.
#ifndef BRENIX_PLUGINS_ELEMENTS_HPP
#define BRENIX_PLUGINS_ELEMENTS_HPP

#include "ElementTypes.hpp"
#include "brenixcore/plugin/Describe.hpp"
#include "brenixcore/plugin/Plugin.hpp"

#include <asio/buffer.hpp>

#include <algorithm>
#include <bit>
#include <chrono>
#include <cstdint>
#include <cstring>
#include <optional>
#include <string>
#include <utility>

namespace bytes
{

constexpr OptionInfo elementTypeOption = {"ElementType", "text", "", "uint8",
                                          "double, float, int8 to int64 or uint8 to uint64"};
constexpr OptionInfo byteOrderOption = {"ByteOrder", "text", "", "little",
                                        "little or big: of the elements on their way"};

/// What arrives and what is written.
constexpr FieldInfo elementFields[] = {{dataField, "(ElementType)", "", "a count is an element"},
                                       {}};

inline void reverseEach(unsigned char* data, std::size_t length, std::size_t size)
{
    for (unsigned char* element = data; element < data + length; element += size) {
        std::reverse(element, element + size);
    }
}

/// What the bytes are on their way.
struct Format {
    const ElementType* type = nullptr;
    bool reverses = false; ///< the bytes of each element

    /// Turns the elements into bytes, in place. Nothing for a property that is no array of the type.
    std::optional<asio::const_buffer> toBytes(IPropertyInfo* property) const
    {
        const auto found = type->find(property);
        if (!found) {
            return std::nullopt;
        }
        if (reverses) {
            reverseEach(found->data(), found->size(), type->size);
        }
        return asio::const_buffer(found->data(), found->size());
    }
};

/// Reads its two options.
inline Format readFormat(Options& options)
{
    const ElementType& type = readElementType(options, "uint8");
    const bool isBig = readChoice<2>(options, "ByteOrder", {"little", "big"}) == 1;
    return {&type, isBig != (std::endian::native == std::endian::big)};
}

/// Makes packets of whole elements from bytes that arrive in pieces. They arrive in the array that is
/// delivered, unless that would be mostly empty.
class Assembler
{
public:
    Assembler(Format elementFormat, std::size_t most)
        : format(elementFormat), size(format.type->size), capacity(most / size)
    {
        renew();
    }

    /// Where the next bytes go.
    asio::mutable_buffer space() const { return buffer + held; }

    /// The elements that are whole with so many more bytes, if any; the rest waits for its other bytes.
    std::optional<Packet> take(std::size_t length)
    {
        const std::size_t all = held + length;
        const std::size_t counts = all / size;
        if (counts == 0) {
            held = all;
            return std::nullopt;
        }
        auto* const bytes = static_cast<unsigned char*>(buffer.data());
        if (format.reverses) {
            reverseEach(bytes, counts * size, size);
        }
        OwnedProperty delivered;
        if (counts < capacity / 2) {
            delivered = format.type->make(counts);
            std::memcpy(format.type->find(delivered.get())->data(), bytes, counts * size);
        } else {
            delivered = std::move(array);
            renew();
        }
        held = all - counts * size;
        std::memmove(buffer.data(), bytes + counts * size, held);
        format.type->shorten(delivered.get(), counts);
        Packet packet;
        packet.counts = counts;
        packet.time = std::chrono::duration_cast<std::chrono::nanoseconds>(
                          std::chrono::system_clock::now().time_since_epoch())
                          .count();
        setField(packet, std::move(delivered));
        return packet;
    }

    /// Gives up the rest. Returns its bytes.
    std::size_t dropRest() { return std::exchange(held, 0); }

private:
    void renew()
    {
        array = format.type->make(capacity);
        const auto elements = *format.type->find(array.get());
        buffer = asio::mutable_buffer(elements.data(), elements.size());
    }

    const Format format;
    const std::size_t size; ///< of an element
    const std::size_t capacity;
    OwnedProperty array;
    asio::mutable_buffer buffer; ///< its elements
    std::size_t held = 0;        ///< bytes at its beginning, of an element without its end
};

} // namespace bytes

#endif
