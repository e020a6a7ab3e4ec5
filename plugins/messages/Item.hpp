// Reads CBOR item by item, and trusts none of it.
#ifndef BRENIX_PLUGINS_MESSAGES_ITEM_HPP
#define BRENIX_PLUGINS_MESSAGES_ITEM_HPP

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

namespace messages
{

/// An item, or the beginning of one that has others in it.
struct Item {
    enum class Kind { Unsigned, Negative, Bytes, Text, Array, Map, Tag, Bool, Float, Other };

    Kind kind = Kind::Other;
    std::uint64_t value = 0; ///< a number (n of -1 - n), a tag, true or false, a number of entries
    double number = 0;       ///< of Float
    std::string_view bytes;  ///< of Bytes and Text, in their place
};

/// Walks over the bytes of a message. Its operations throw Malformed.
class Items
{
public:
    Items(const unsigned char* first, std::size_t length) : bytes(first), size(length) {}

    std::size_t getSize() const { return size; }
    std::size_t getPosition() const { return position; }

    /// Where something begins that was read in its place.
    std::size_t positionOf(std::string_view part) const
    {
        return static_cast<std::size_t>(part.data() - reinterpret_cast<const char*>(bytes));
    }

    /// Goes to what the name says, for errors; it must stay, as what is in the message does.
    void go(std::size_t place, std::string_view name, std::string_view before = "")
    {
        position = lastPosition = place;
        where = name;
        prefix = before;
    }

    Item next();

    /// One of this kind.
    Item next(Item::Kind kind, const char* expected);

    /// A text.
    std::string_view text();

    /// A text that names something.
    std::string_view name();

    /// The beginning of a map with at most so many entries, and how many it has.
    std::uint64_t map(std::uint64_t most);

    /// The logical values that come next, at most so many, of one byte each.
    std::string_view flags(std::uint64_t most);
    static constexpr auto valueOf = [](char flag) -> unsigned char { return flag & 1; };

    /// One item with all that is in it.
    void skip();

    /// Tells of the item that was read last.
    [[noreturn]] void fail(const std::string& problem) const;

private:
    const unsigned char* const bytes;
    const std::size_t size;
    std::size_t position = 0;
    std::size_t lastPosition = 0;
    std::string_view where = "the message";
    std::string_view prefix; ///< of `where`
};

} // namespace messages

#endif
