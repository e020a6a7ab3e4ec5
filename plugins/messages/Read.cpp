// From the bytes of a message to what it says.

#include "Fields.hpp"
#include "Item.hpp"
#include "Message.hpp"

#include <algorithm>
#include <limits>
#include <memory>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace messages
{

namespace
{

using namespace brenixcore::plugin;
using Kind = Item::Kind;

constexpr std::uint64_t maxFields = 65536; // each takes memory of its own

/// The entries of a map by their names, to be read in any order.
class Entries
{
public:
    /// The map is the item that comes next.
    explicit Entries(Items& messageItems) : items(messageItems)
    {
        constexpr std::uint64_t most = 32;
        const std::uint64_t count = items.map(most);
        places.reserve(count);
        for (std::uint64_t left = count; left > 0; --left) {
            const std::string_view name = items.name();
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
    std::string text(std::string_view name)
    {
        return std::string(find(name) ? items.text() : std::string_view());
    }

private:
    Items& items;
    std::vector<std::pair<std::string_view, std::size_t>> places;
};

class Reader
{
public:
    Reader(const unsigned char* bytes, std::size_t size, std::size_t mostOfArrays,
           std::shared_ptr<unsigned char> owner)
        : items(bytes, size), entries(items), fields(items, mostOfArrays, std::move(owner))
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
        std::string stream(items.name());
        if (entries.find("hello")) {
            return readHello(std::move(stream));
        }
        if (entries.find("end")) {
            return End{std::move(stream), entries.number("seq"), entries.number("end")};
        }
        return readData(std::move(stream));
    }

private:
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
            if (!isRate(hello.rate)) {
                items.fail("must be 0, or a number from 1e-6 to 1e15");
            }
        }
        if (writer.find("options")) {
            for (std::uint64_t left = items.map(maxFields); left > 0; --left) {
                const std::string_view name = items.name();
                items.go(items.getPosition(), name, "option ");
                hello.options[std::string(name)] = items.text();
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
        for (std::uint64_t left = items.map(maxFields); left > 0; --left) {
            Field field = fields.read(areConstants);
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
    FieldReader fields;
};

} // namespace

Message read(const unsigned char* bytes, std::size_t size, std::size_t maxArrays,
             std::shared_ptr<unsigned char> owner)
{
    return Reader(bytes, size, maxArrays, std::move(owner)).read();
}

} // namespace messages
