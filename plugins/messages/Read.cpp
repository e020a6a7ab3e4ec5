// From the bytes of a message to what it says.

#include "Arrays.hpp"
#include "Item.hpp"
#include "Message.hpp"
#include "Texts.hpp"

#include "brenixcore/plugin/Make.hpp"

#include <algorithm>
#include <array>
#include <bit>
#include <cmath>
#include <cstring>
#include <limits>
#include <memory>
#include <string_view>
#include <utility>
#include <vector>

namespace messages
{

namespace
{

using namespace brenixcore::plugin;
using brenixplugin::OwnedProperty;
using brenixplugin::PropertyMap;
using Kind = Item::Kind;

std::string textOf(Items& items)
{
    const std::string_view text = items.next(Kind::Text, "a text").bytes;
    if (!isUtf8(text)) {
        items.fail("is not UTF-8");
    }
    return std::string(text);
}

/// A field on its way from the message.
struct Field {
    std::string name;
    OwnedProperty property;
    std::uint64_t elements;
};

template <typename T>
T reversed(T value)
{
    auto bytes = std::bit_cast<std::array<unsigned char, sizeof(T)>>(value);
    std::reverse(bytes.begin(), bytes.end());
    return std::bit_cast<T>(bytes);
}

/// Reads fields, each with its name before it.
class FieldReader
{
public:
    FieldReader(Items& messageItems, std::size_t mostOfArray, bool ofConstants)
        : items(messageItems), maxArray(mostOfArray), areConstants(ofConstants)
    {
    }

    Field read()
    {
        Field field{textOf(items), nullptr, 1};
        items.go(items.getPosition(), "field " + field.name);
        const Item item = items.next();
        if (item.kind == Kind::Tag) {
            readNumbers(field, item.value);
        } else if (item.kind == Kind::Array) {
            readEach(field, item.value);
        } else if (item.kind == Kind::Bytes || (item.kind == Kind::Text && isUtf8(item.bytes))) {
            field.property = makeScalar(field.name, std::string(item.bytes));
        } else {
            items.fail(
                item.kind == Kind::Text
                    ? "is not UTF-8"
                    : "must be a typed array, an array of logical values or of texts, or a text");
        }
        return field;
    }

private:
    void requireSize(std::uint64_t elements, std::size_t each) const
    {
        if (elements > maxArray / each) {
            items.fail("has " + std::to_string(elements) + " elements; of this type at most " +
                       std::to_string(maxArray / each) + " are taken (MaxMessage)");
        }
    }

    void readNumbers(Field& field, std::uint64_t tag)
    {
        const std::string_view bytes = items.next(Kind::Bytes, "the bytes of a typed array").bytes;
        requireSize(bytes.size(), 1);
        const bool isLittle = (tag & 4U) != 0;
        const bool isReversed = isLittle != (std::endian::native == std::endian::little);
        const auto take = [&](auto element) {
            takeArray<decltype(element)>(field, bytes, isReversed);
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

    template <typename T>
    void takeArray(Field& field, std::string_view bytes, bool isReversed)
    {
        if (bytes.size() % sizeof(T) != 0) {
            items.fail("has " + std::to_string(bytes.size()) +
                       " bytes, which is no whole number of elements of " +
                       std::to_string(sizeof(T)));
        }
        field.elements = bytes.size() / sizeof(T);
        std::unique_ptr<T[]> elements(new T[field.elements]);
        if (!bytes.empty()) {
            std::memcpy(elements.get(), bytes.data(), bytes.size());
        }
        if (isReversed && sizeof(T) > 1) {
            std::transform(elements.get(), elements.get() + field.elements, elements.get(),
                           reversed<T>);
        }
        take(field, std::move(elements));
    }

    /// Logical values, or texts.
    void readEach(Field& field, std::uint64_t count)
    {
        field.elements = count;
        const std::size_t begin = items.getPosition();
        if (count > 0 && items.next().kind == Kind::Text) {
            requireSize(count, sizeof(std::string));
            items.go(begin, "field " + field.name);
            auto texts = std::make_unique<std::string[]>(count);
            std::generate_n(texts.get(), count, [&] { return textOf(items); });
            return take(field, std::move(texts));
        }
        requireSize(count, 1);
        items.go(begin, "field " + field.name);
        std::unique_ptr<bool[]> flags(new bool[count]);
        std::generate_n(flags.get(), count, [&] {
            return items.next(Kind::Bool, "true or false, as the elements before it").value != 0;
        });
        take(field, std::move(flags));
    }

    template <typename T>
    void take(Field& field, std::unique_ptr<T[]> elements) const
    {
        field.property = areConstants && field.elements == 1
                             ? makeScalar(field.name, std::move(elements[0]))
                             : makeArray(field.name, std::move(elements), field.elements);
    }

    Items& items;
    const std::size_t maxArray;
    const bool areConstants; ///< a single one is a scalar then
};

/// The entries of a map by their names, to be read in any order.
class Entries
{
public:
    /// The map is the item that comes next.
    explicit Entries(Items& messageItems) : items(messageItems)
    {
        const std::uint64_t count = items.next(Kind::Map, "a map").value;
        if (count > most) {
            items.fail("has " + std::to_string(count) + " entries, more than " +
                       std::to_string(most));
        }
        for (std::uint64_t left = count; left > 0; --left) {
            const std::string_view name =
                items.next(Kind::Text, "a text, the name of an entry").bytes;
            const std::size_t place = items.getPosition();
            if (find(name)) {
                items.fail("is there twice");
            }
            items.go(place, name);
            places.emplace_back(name, place);
            items.skip();
        }
    }

    /// Goes to an entry. Returns whether it is there.
    bool find(std::string_view name)
    {
        const auto found = std::find_if(places.begin(), places.end(),
                                        [&](const auto& place) { return place.first == name; });
        if (found != places.end()) {
            items.go(found->second, name);
        }
        return found != places.end();
    }

    void require(std::string_view name)
    {
        if (!find(name)) {
            throw Malformed("the message has no " + std::string(name));
        }
    }

    std::uint64_t number(std::string_view name)
    {
        require(name);
        return items.next(Kind::Unsigned, "a whole number of 0 or more").value;
    }

    std::int64_t time(std::string_view name)
    {
        require(name);
        const Item item = items.next();
        const bool isNegative = item.kind == Kind::Negative;
        if ((!isNegative && item.kind != Kind::Unsigned) ||
            item.value > static_cast<std::uint64_t>(std::numeric_limits<std::int64_t>::max())) {
            items.fail("must be a whole number of nanoseconds, in 64 bits");
        }
        const auto magnitude = static_cast<std::int64_t>(item.value);
        return isNegative ? -1 - magnitude : magnitude;
    }

    /// Empty when there is none.
    std::string text(std::string_view name) { return find(name) ? textOf(items) : ""; }

private:
    static constexpr std::uint64_t most = 32;

    Items& items;
    std::vector<std::pair<std::string_view, std::size_t>> places;
};

class Reader
{
public:
    Reader(const unsigned char* bytes, std::size_t size, std::size_t mostOfArray)
        : items(bytes, size), entries(items), maxArray(mostOfArray)
    {
        if (items.getPosition() < size) {
            throw Malformed(std::to_string(size - items.getPosition()) +
                            " bytes follow the message");
        }
        if (const std::uint64_t given = entries.number("v"); given != 1) {
            items.fail("is version " + std::to_string(given) + ", known is 1");
        }
    }

    Message read()
    {
        entries.require("stream");
        std::string stream = textOf(items);
        if (stream.empty() || stream.size() > maxName) {
            items.fail("must have 1 to " + std::to_string(maxName) + " bytes");
        }
        if (entries.find("hello")) {
            return readHello(std::move(stream));
        }
        if (entries.find("end")) {
            return End{std::move(stream), entries.number("seq"), entries.number("end")};
        }
        return readData(std::move(stream));
    }

private:
    static constexpr std::size_t maxName = 255;

    Message readHello(std::string stream)
    {
        Hello hello{
            std::move(stream), entries.number("seq"), entries.number("first"), {}, {}, 0, {}};
        entries.require("hello");
        Entries writer(items);
        hello.name = writer.text("name");
        hello.unit = writer.text("unit");
        if (writer.find("rate")) {
            const Item rate = items.next();
            hello.rate = rate.kind == Kind::Float      ? rate.number
                         : rate.kind == Kind::Unsigned ? static_cast<double>(rate.value)
                                                       : -1;
            if (!(hello.rate >= 0) || std::isinf(hello.rate)) {
                items.fail("must be a number of 0 or more");
            }
        }
        if (writer.find("options")) {
            for (std::uint64_t left = items.next(Kind::Map, "a map").value; left > 0; --left) {
                std::string name = textOf(items);
                hello.options[std::move(name)] = textOf(items);
            }
        }
        return hello;
    }

    Message readData(std::string stream)
    {
        Data data;
        data.stream = std::move(stream);
        data.seq = entries.number("seq");
        data.packet.time = entries.time("time");
        data.packet.lost = entries.number("lost");
        data.first = entries.number("first");
        if (data.packet.lost > data.first) {
            items.fail("is less than lost");
        }
        data.counts = data.packet.counts = entries.number("counts");
        if (data.counts == 0 ||
            data.counts > std::numeric_limits<std::uint64_t>::max() - data.first) {
            items.fail("must be 1 or more, and fit in 64 bits with first");
        }
        entries.require("fields");
        readFields(data.packet, false);
        if (entries.find("constants")) {
            readFields(data.packet, true);
        }
        return data;
    }

    void readFields(Packet& packet, bool areConstants)
    {
        FieldReader reader(items, maxArray, areConstants);
        for (std::uint64_t left = items.next(Kind::Map, "a map").value; left > 0; --left) {
            Field field = reader.read();
            const bool fits = field.elements > 0 && field.elements % packet.counts == 0;
            if (!areConstants && !fits) {
                items.fail("has " + std::to_string(field.elements) + " elements for " +
                           std::to_string(packet.counts) + " counts");
            }
            if (packet.fields->contains(field.name)) {
                items.fail("is there twice");
            }
            setField(packet, std::move(field.property));
        }
    }

    Items items;
    Entries entries;
    const std::size_t maxArray;
};

} // namespace

Message read(const unsigned char* bytes, std::size_t size, std::size_t maxArray)
{
    return Reader(bytes, size, maxArray).read();
}

} // namespace messages
