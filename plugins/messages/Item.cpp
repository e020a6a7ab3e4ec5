#include "Item.hpp"

#include "Message.hpp"

#include <cbor.h>

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
    const cbor_callbacks callbacks = callbacksOfItems();
    lastPosition = position;
    Item item;
    const cbor_decoder_result result =
        cbor_stream_decode(bytes + position, size - position, &callbacks, &item);
    if (result.status == CBOR_DECODER_NEDATA) {
        fail("claims " + std::to_string(result.required) + " bytes, of which " +
             std::to_string(size - position) + " are there");
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

void Items::skip()
{
    for (std::size_t left = 1; left > 0; --left) {
        const Item item = next();
        if (item.kind == Kind::Array) {
            left += item.value;
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
    throw Malformed(where + ", byte " + std::to_string(lastPosition) + ": " + problem);
}

} // namespace messages
