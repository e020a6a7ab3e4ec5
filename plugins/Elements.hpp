// What the devices share that move bytes: elements of numeric types and their bytes, both ways.
#ifndef BRENIX_PLUGINS_ELEMENTS_HPP
#define BRENIX_PLUGINS_ELEMENTS_HPP

#include "brenixcore/plugin/Describe.hpp"
#include "brenixcore/plugin/Make.hpp"
#include "brenixcore/plugin/Options.hpp"
#include "brenixcore/plugin/Plugin.hpp"

#include <asio/buffer.hpp>

#include <algorithm>
#include <array>
#include <bit>
#include <chrono>
#include <cstdint>
#include <cstring>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>

namespace bytes
{

using namespace brenixcore::plugin;
using brenixplugin::OwnedProperty;
using brenixplugin::PropertyMap;
using brenixplugin::interfaces::IPropertyInfo;
using brenixplugin::kit::coderconverter::TPointerProperty;
using brenixplugin::kit::device::TScalarProperty;

struct ElementType {
    std::string_view name;
    std::size_t size; ///< in bytes
    /// An array of so many elements, which are not set.
    OwnedProperty (*make)(std::size_t count);
    /// The elements of an array of this type; nothing for any other property.
    std::optional<asio::mutable_buffer> (*find)(IPropertyInfo* property);
    /// Leaves the first elements of an array of this type.
    void (*shorten)(IPropertyInfo* property, std::size_t count);
};

template <typename T>
constexpr ElementType elementType(std::string_view name)
{
    return {name, sizeof(T),
            [](std::size_t count) {
                return makeArray(dataField, std::unique_ptr<T[]>(new T[count]), count);
            },
            [](IPropertyInfo* property) {
                auto* const array = dynamic_cast<TPointerProperty<T>*>(property);
                return array == nullptr ? std::nullopt
                                        : std::optional(asio::mutable_buffer(
                                              array->data, array->count * sizeof(T)));
            },
            [](IPropertyInfo* property, std::size_t count) {
                static_cast<TPointerProperty<T>*>(property)->count = count;
            }};
}

constexpr std::array elementTypes = {
    elementType<double>("double"),       elementType<float>("float"),
    elementType<signed char>("int8"),    elementType<short>("int16"),
    elementType<int>("int32"),           elementType<long>("int64"),
    elementType<unsigned char>("uint8"), elementType<unsigned short>("uint16"),
    elementType<unsigned int>("uint32"), elementType<unsigned long>("uint64"),
};

constexpr OptionInfo elementTypeOption = {"ElementType", "text", "", "uint8",
                                          "double, float, int8 to int64 or uint8 to uint64"};
constexpr OptionInfo byteOrderOption = {"ByteOrder", "text", "", "little",
                                        "little or big: of the elements on their way"};

/// What arrives and what is written.
constexpr FieldInfo elementFields[] = {{dataField, "(ElementType)", "", "a count is an element"},
                                       {}};

/// What a property holds that is not what it should be.
inline std::string describe(IPropertyInfo* property)
{
    for (const ElementType& type : elementTypes) {
        if (type.find(property)) {
            return std::string(type.name);
        }
    }
    if (dynamic_cast<TPointerProperty<bool>*>(property) != nullptr) {
        return "logical";
    }
    if (dynamic_cast<TScalarProperty<std::u16string>*>(property) != nullptr) {
        return "char";
    }
    return property == nullptr ? "missing" : "not an array of numbers";
}

inline void reverseEach(unsigned char* data, std::size_t length, std::size_t size)
{
    for (unsigned char* element = data; element < data + length; element += size) {
        std::reverse(element, element + size);
    }
}

/// One of the texts that an option may have; its index.
template <std::size_t N>
std::size_t readChoice(Options& options, const std::string& name,
                       const std::array<std::string_view, N>& choices)
{
    const std::string given = options.text(name).value_or(std::string(choices[0]));
    const auto* const found = std::find(choices.begin(), choices.end(), given);
    if (found == choices.end()) {
        std::string list(choices[0]);
        for (std::size_t i = 1; i < N; ++i) {
            list += (i + 1 < N ? ", " : " or ") + std::string(choices[i]);
        }
        Options::fail(name, "must be " + list + ", not " + given);
    }
    return static_cast<std::size_t>(found - choices.begin());
}

/// What the bytes are on their way.
struct Format {
    const ElementType* type = nullptr;
    bool reverses = false; ///< the bytes of each element

    /// Turns the elements into bytes, in place. Nothing for a property that is no array of the type.
    std::optional<asio::const_buffer> toBytes(IPropertyInfo* property) const
    {
        const auto found = type->find(property);
        if (found && reverses) {
            reverseEach(static_cast<unsigned char*>(found->data()), found->size(), type->size);
        }
        return found;
    }
};

/// Reads its two options.
inline Format readFormat(Options& options)
{
    const std::string name = options.text("ElementType").value_or("uint8");
    const auto* const found =
        std::find_if(elementTypes.begin(), elementTypes.end(),
                     [&](const ElementType& candidate) { return candidate.name == name; });
    if (found == elementTypes.end()) {
        Options::fail("ElementType", "is not a numeric type: " + name);
    }
    const bool isBig = readChoice<2>(options, "ByteOrder", {"little", "big"}) == 1;
    return {found, isBig != (std::endian::native == std::endian::big)};
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
        buffer = *format.type->find(array.get());
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
