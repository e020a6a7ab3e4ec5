// The messages of the devices that reach other machines: docs/messages.md says what is in them.
#ifndef BRENIX_PLUGINS_MESSAGES_MESSAGE_HPP
#define BRENIX_PLUGINS_MESSAGES_MESSAGE_HPP

#include "brenixcore/plugin/Describe.hpp"
#include "brenixcore/plugin/Packet.hpp"

#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <stdexcept>
#include <string>
#include <variant>

namespace messages
{

/// Whether it can be the rate of a writer: 0, or at least a count in eleven days.
constexpr bool isRate(double rate)
{
    return rate == 0 || (rate >= 1e-6 && rate <= 1e15);
}

/// What a writer says of itself.
struct Hello {
    std::string stream;
    std::uint64_t seq = 0;                      ///< of the next packet
    std::uint64_t first = 0;                    ///< number of the next count, lost or not
    std::string name;                           ///< the writer's for itself
    std::string unit;                           ///< of the numbers; empty: not known
    double rate = 0;                            ///< counts a second; 0: not known
    std::map<std::string, std::string> options; ///< of the writer's device, as text
};

/// A packet, or a part of it.
struct Data {
    std::string stream;
    std::uint64_t seq = 0;
    std::uint64_t first = 0; ///< number of its first count

    /// Its fields, `time` and `lost` are those of the message. A message that was read has all `counts`.
    brenixcore::plugin::Packet packet;

    // Of the counts of `packet`, one or more, those of the message, when one is written:
    std::uint64_t begin = 0;
    std::uint64_t counts = 0;
};

/// The writer has closed.
struct End {
    std::string stream;
    std::uint64_t seq = 0;    ///< packets in all
    std::uint64_t counts = 0; ///< counts in all, lost ones included
};

using Message = std::variant<Hello, Data, End>;

/// What is read and written with the devices.
constexpr brenixcore::plugin::FieldInfo messageFields[] = {
    {brenixcore::plugin::dataField, "", "",
     "and what else was written, of its type; the text Source tells the writer"},
    {},
};

/// What no message holds, or what one should not hold. The text says what and where.
class Malformed : public std::runtime_error
{
public:
    using std::runtime_error::runtime_error;
};

/// The bytes that a message takes: a Hello, a Data or an End.
/// @throws Malformed for a field that no message can hold
template <typename Kind>
std::size_t sizeOf(const Kind& message);

/// Writes those bytes; arrays are copied once, from their field to their place.
template <typename Kind>
void write(const Kind& message, unsigned char* bytes);

/// Bytes from which an array of numbers is large. The first of a message lies at a multiple of 8 of it.
constexpr std::size_t largeArray = 32768;

/// Reads a message. Nothing in it is trusted: no memory is taken for what is not there, and its arrays
/// take at most `maxArrays` bytes. Arrays are copied once, from their place to their field. Where `owner` points to
/// the bytes, a large array that is half of the message or more, and as this machine holds it, stays in its place,
/// and the field keeps it: the bytes are then the field's, to be changed as well.
/// @throws Malformed
Message read(const unsigned char* bytes, std::size_t size, std::size_t maxArrays,
             std::shared_ptr<unsigned char> owner = nullptr);

} // namespace messages

#endif
