#include "Item.hpp"

#include "Message.hpp"
#include "Texts.hpp"

#include <cbor.h>

#include <algorithm>
#include <cstring>

namespace messages
{

namespace
{

using Kind = Item::Kind;

Item& itemOf(void* context)
{
    return *static_cast<Item*>(context);
}

template <Kind kind, typename Value>
void setValue(void* context, Value value)
{
    itemOf(context).kind = kind;
    itemOf(context).value = value;
}

template <Kind kind>
void setBytes(void* context, cbor_data data, std::size_t length)
{
    itemOf(context).kind = kind;
    itemOf(context).bytes = {reinterpret_cast<const char*>(data), length};
}

template <typename Value>
void setFloat(void* context, Value value)
{
    itemOf(context).kind = Kind::Float;
    itemOf(context).number = value;
}

/// What is not set here stays of the kind Other: items of no given length among them.
cbor_callbacks callbacksOfItems()
{
    cbor_callbacks callbacks = cbor_empty_callbacks;
    callbacks.uint8 = setValue<Kind::Unsigned>;
    callbacks.uint16 = setValue<Kind::Unsigned>;
    callbacks.uint32 = setValue<Kind::Unsigned>;
    callbacks.uint64 = setValue<Kind::Unsigned>;
    callbacks.negint8 = setValue<Kind::Negative>;
    callbacks.negint16 = setValue<Kind::Negative>;
    callbacks.negint32 = setValue<Kind::Negative>;
    callbacks.negint64 = setValue<Kind::Negative>;
    callbacks.byte_string = setBytes<Kind::Bytes>;
    callbacks.string = setBytes<Kind::Text>;
    callbacks.array_start = setValue<Kind::Array>;
    callbacks.map_start = setValue<Kind::Map>;
    callbacks.tag = setValue<Kind::Tag>;
    callbacks.boolean = setValue<Kind::Bool>;
    callbacks.float2 = setFloat;
    callbacks.float4 = setFloat;
    callbacks.float8 = setFloat;
    return callbacks;
}

} // namespace

Item Items::next()
{
    static const cbor_callbacks callbacks = callbacksOfItems();
    lastPosition = position;
    Item item;
    const cbor_decoder_result result =
        cbor_stream_decode(bytes + position, size - position, &callbacks, &item);
    if (result.status == CBOR_DECODER_NEDATA) {
        const std::size_t there = size - position;
        const bool isBeyond = result.required <= there; // of 64 bits
        fail("claims " + (isBeyond ? "2^64 or more" : std::to_string(result.required)) +
             " bytes, of which " + std::to_string(there) + " are there");
    }
    if (result.status != CBOR_DECODER_FINISHED) {
        fail("is not CBOR");
    }
    position += result.read;
    const std::size_t rest = size - position;
    if ((item.kind == Kind::Array || item.kind == Kind::Map) &&
        item.value > (item.kind == Kind::Map ? rest / 2 : rest)) {
        fail("claims " + std::to_string(item.value) + " entries, for which " +
             std::to_string(rest) + " bytes are too few");
    }
    return item;
}

Item Items::next(Kind kind, const char* expected)
{
    const Item item = next();
    if (item.kind != kind) {
        fail(std::string("must be ") + expected);
    }
    return item;
}

std::string_view Items::text()
{
    const std::string_view text = next(Kind::Text, "a text").bytes;
    if (!isUtf8(text)) {
        fail("is not UTF-8");
    }
    return text;
}

std::string_view Items::name()
{
    const std::string_view name = text();
    if (!hasLengthOfName(name)) {
        fail("must have 1 to " + std::to_string(maxName) + " bytes, none of them 0");
    }
    return name;
}

std::uint64_t Items::map(std::uint64_t most)
{
    const std::uint64_t count = next(Kind::Map, "a map").value;
    if (count > most) {
        fail("has " + std::to_string(count) + " entries, more than " + std::to_string(most));
    }
    return count;
}

std::string_view Items::flags(std::uint64_t most)
{
    const unsigned char* const begin = bytes + position;
    const unsigned char* const end = begin + std::min<std::uint64_t>(most, size - position);
    constexpr std::uint64_t eightTrue = 0xF5F5F5F5F5F5F5F5;
    constexpr std::uint64_t lowest = 0x0101010101010101; // bits, which alone tell false from true
    const unsigned char* at = begin;
    for (std::uint64_t eight = 0; static_cast<std::size_t>(end - at) >= sizeof eight;
         at += sizeof eight) {
        std::memcpy(&eight, at, sizeof eight);
        if ((eight | lowest) != eightTrue) {
            break;
        }
    }
    while (at < end && (*at | 1U) == 0xF5) {
        ++at;
    }
    position += static_cast<std::size_t>(at - begin);
    return {reinterpret_cast<const char*>(begin), static_cast<std::size_t>(at - begin)};
}

void Items::skip()
{
    for (std::size_t left = 1; left > 0; --left) {
        const Item item = next();
        if (item.kind == Kind::Array) {
            left += item.value - flags(item.value).size();
        } else if (item.kind == Kind::Map) {
            left += 2 * item.value;
        } else if (item.kind == Kind::Tag) {
            ++left;
        } else if (item.kind == Kind::Other) {
            fail("must be of a given length, and no simple value but true or false");
        }
        if (left - 1 > size - position) {
            fail("ends before its entries");
        }
    }
}

void Items::fail(const std::string& problem) const
{
    throw Malformed(std::string(prefix) + std::string(where) + ", byte " +
                    std::to_string(lastPosition) + ": " + problem);
}

} // namespace messages
