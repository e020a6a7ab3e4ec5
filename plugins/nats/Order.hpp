// The order in which a writer made its messages: a stream keeps those that a writer had to send again behind later
// ones, and what got lost on its way to a reader comes again after them.
#ifndef BRENIX_PLUGINS_NATS_ORDER_HPP
#define BRENIX_PLUGINS_NATS_ORDER_HPP

#include "Mailbox.hpp"

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <deque>
#include <map>
#include <optional>
#include <string>
#include <utility>

namespace natsio
{

constexpr const char* idHeader = "Nats-Msg-Id"; ///< by which a server keeps once what is sent twice
constexpr const char* storedHeader =
    "Brenix-Stored"; ///< all packets before this number were, when it was sent

/// What is said before a packet, a packet, the end.
enum class Rank { Hello, Data, End };

/// What a writer says of a message beside it.
struct Label {
    /// Its place among those of its writer.
    struct Turn {
        std::uint64_t seq = 0;
        Rank rank = Rank::Hello;

        bool operator<(const Turn& other) const
        {
            return std::pair(seq, rank) < std::pair(other.seq, other.rank);
        }
    };

    std::string writer; ///< differs from all others
    Turn turn;
    std::uint64_t stored = 0; ///< of storedHeader

    std::string id() const;

    /// Nothing where it is no label.
    static std::optional<Label> read(const std::string& id, const std::string& stored);
};

/// What waits for its turn.
class Order
{
public:
    struct Item {
        MessagePointer message;
        std::uint64_t place = 0; ///< in the stream
        std::uint64_t sort = 0;  ///< the largest place of its writer so far
        bool follows = true;     ///< or else those before it were read at an earlier opening
    };

    /// Takes a message over. False: it was there before.
    bool take(const Label& label, Item& item, Moment now);

    /// The next one whose turn it is.
    std::optional<Item> next();

    /// Takes one over that says nothing of its place: it has its turn at once.
    void add(Item item) { ready.push_back(std::move(item)); }

    /// Whether there are writers of which it is not known where they begin.
    bool isBeginning() const { return beginners > 0; }

    /// All that was delivered and not acknowledged is here: writers may begin, unless one of them may still
    /// have an earlier message to store. What is missing of what they had stored was acknowledged.
    void settle(Moment now);

    /// Passes what did not come for so long, or where so many wait.
    void giveUp(Moment now, std::size_t most);

    /// It cannot come now: the time begins anew.
    void excuse(Moment now);

private:
    struct Writer {
        std::map<Label::Turn, Item> held;
        std::uint64_t next = 0;   ///< of the next packet
        std::uint64_t stored = 0; ///< of all messages of it
        std::uint64_t read = 0;   ///< of those before this one, what is not here was read earlier
        std::uint64_t place = 0;  ///< the largest that had its turn
        bool begun = false;
        Moment since; ///< it waits
    };

    void begin(Writer& writer, Moment now);
    void release(Writer& writer, Moment now);

    std::map<std::string, Writer> writers;
    std::size_t beginners = 0; ///< writers that have not begun
    std::deque<Item> ready;
};

} // namespace natsio

#endif
