// From what fields are in CBOR to property objects.

#include "Fields.hpp"

#include "Arrays.hpp"
#include "Message.hpp"
#include "Texts.hpp"

#include "brenixcore/plugin/Make.hpp"

#include <algorithm>
#include <array>
#include <bit>
#include <cstring>
#include <utility>

namespace messages
{

using brenixcore::plugin::makeArray;
using brenixcore::plugin::makeScalar;
using Kind = Item::Kind;

namespace
{

template <typename T>
T reversed(T value)
{
    auto bytes = std::bit_cast<std::array<unsigned char, sizeof(T)>>(value);
    std::reverse(bytes.begin(), bytes.end());
    return std::bit_cast<T>(bytes);
}

bool isText(const Item& item)
{
    return item.kind == Kind::Text || item.kind == Kind::Bytes;
}

/// An array in memory that it shares.
template <typename T>
class ArrayInPlace : public brenixplugin::kit::coderconverter::TPointerProperty<T>
{
    using Base = brenixplugin::kit::coderconverter::TPointerProperty<T>;

public:
    ArrayInPlace(std::string propertyName, T* elements, std::uint64_t elementCount,
                 std::shared_ptr<unsigned char> memory)
        : Base(std::move(propertyName), elements, elementCount), place(elements),
          owner(std::move(memory))
    {
    }
    ~ArrayInPlace() override
    {
        if (this->data == place) {
            this->data = nullptr; // it is the owner's
        }
    }

private:
    const T* const place;
    const std::shared_ptr<unsigned char> owner;
};

} // namespace

template <typename T>
void FieldReader::take(Field& field, std::unique_ptr<T[]> elements) const
{
    field.property = areConstants && field.elements == 1
                         ? makeScalar(field.name, std::move(elements[0]))
                         : makeArray(field.name, std::move(elements), field.elements);
}

/// Null for what is to be copied: also what is less than half of the message, which it would keep.
template <typename T>
T* FieldReader::placeOf(std::string_view bytes) const
{
    if (owner == nullptr || bytes.size() < largeArray || bytes.size() < items.getSize() / 2) {
        return nullptr;
    }
    unsigned char* const place = owner.get() + items.positionOf(bytes);
    const bool isAligned = reinterpret_cast<std::uintptr_t>(place) % alignof(T) == 0;
    return isAligned ? reinterpret_cast<T*>(place) : nullptr;
}

template <typename T>
void FieldReader::takeArray(Field& field, std::string_view bytes, bool isOfOtherOrder)
{
    const bool isReversed = isOfOtherOrder && sizeof(T) > 1;
    if (bytes.size() % sizeof(T) != 0) {
        items.fail("has " + std::to_string(bytes.size()) +
                   " bytes, which is no whole number of elements of " + std::to_string(sizeof(T)));
    }
    field.elements = bytes.size() / sizeof(T);
    if (T* const place = isReversed ? nullptr : placeOf<T>(bytes)) {
        field.property.reset(new ArrayInPlace<T>(field.name, place, field.elements, owner));
        return;
    }
    std::unique_ptr<T[]> elements(new T[field.elements]);
    if (!bytes.empty()) {
        std::memcpy(elements.get(), bytes.data(), bytes.size());
    }
    if (isReversed) {
        std::transform(elements.get(), elements.get() + field.elements, elements.get(),
                       reversed<T>);
    }
    take(field, std::move(elements));
}

Field FieldReader::read(bool ofConstants)
{
    areConstants = ofConstants;
    const std::string_view name = items.name();
    Field field{std::string(name), nullptr, 1};
    items.go(items.getPosition(), name, "field ");
    const Item item = items.next();
    if (item.kind == Kind::Tag) {
        readNumbers(field, item.value);
    } else if (item.kind == Kind::Array) {
        readEach(field, item.value);
    } else if (isText(item)) {
        field.property = makeScalar(field.name, textOf(item));
    } else {
        items.fail("must be a typed array, an array of logical values or of texts, or a text");
    }
    return field;
}

/// Of a text, or of one that is not UTF-8 and was therefore sent as bytes.
std::string FieldReader::textOf(const Item& item) const
{
    if (!isText(item)) {
        items.fail("must be a text, as the elements before it");
    }
    if (item.kind == Kind::Text && !isUtf8(item.bytes)) {
        items.fail("is not UTF-8");
    }
    return std::string(item.bytes);
}

void FieldReader::takeSize(std::uint64_t elements, std::size_t each)
{
    if (elements > left / each) {
        items.fail("has " + std::to_string(elements) + " elements; of this type at most " +
                   std::to_string(left / each) + " are taken (MaxMessage)");
    }
    left -= elements * each;
}

void FieldReader::readNumbers(Field& field, std::uint64_t tag)
{
    const std::string_view bytes = items.next(Kind::Bytes, "the bytes of a typed array").bytes;
    takeSize(bytes.size(), 1);
    const bool isLittle = (tag & 4U) != 0;
    const bool isOfOtherOrder = isLittle != (std::endian::native == std::endian::little);
    const auto take = [&](auto element) {
        takeArray<decltype(element)>(field, bytes, isOfOtherOrder);
    };
    switch (tag) {
    case 64:
    case 68: // clamped, when it was made
        return take(static_cast<unsigned char>(0));
    case 65:
    case 69:
        return take(static_cast<unsigned short>(0));
    case 66:
    case 70:
        return take(0U);
    case 67:
    case 71:
        return take(0UL);
    case 72:
        return take(static_cast<signed char>(0));
    case 73:
    case 77:
        return take(static_cast<short>(0));
    case 74:
    case 78:
        return take(0);
    case 75:
    case 79:
        return take(0L);
    case 81:
    case 85:
        return take(0.0F);
    case 82:
    case 86:
        return take(0.0);
    default:
        items.fail("has tag " + std::to_string(tag) +
                   ", which is that of none of the arrays of 8 to 64 bits");
    }
}

/// Logical values, or texts.
void FieldReader::readEach(Field& field, std::uint64_t count)
{
    field.elements = count;
    const std::string_view flags = items.flags(count);
    if (flags.size() == count) {
        takeSize(count, 1);
        std::unique_ptr<bool[]> values(new bool[count]);
        std::transform(flags.begin(), flags.end(), reinterpret_cast<unsigned char*>(values.get()),
                       Items::valueOf);
        return take(field, std::move(values));
    }
    if (!flags.empty()) {
        items.next();
        items.fail("must be true or false, as the elements before it");
    }
    Item item = items.next();
    if (!isText(item)) {
        items.fail("must be true or false, or a text");
    }
    takeSize(count, sizeof(std::string));
    auto texts = std::make_unique<std::string[]>(count);
    for (std::uint64_t i = 0; i < count; ++i) {
        texts[i] = textOf(i == 0 ? item : items.next());
    }
    take(field, std::move(texts));
}

} // namespace messages
