// What the devices have in common that receive messages: what each writer sent, and what is missing of it.
#ifndef BRENIX_PLUGINS_MESSAGES_RECEIVER_HPP
#define BRENIX_PLUGINS_MESSAGES_RECEIVER_HPP

#include "Message.hpp"

#include "brenixcore/plugin/Describe.hpp"
#include "brenixcore/plugin/Options.hpp"
#include "brenixcore/plugin/Plugin.hpp"

#include <memory>
#include <optional>
#include <unordered_map>

namespace messages
{

constexpr brenixcore::plugin::OptionInfo receiverOptions[] = {
    {"MaxMessage", "whole number", "bytes", "67108864",
     "reading: of the largest array that is taken, and of the largest message"},
    {"Writers", "whole number", "", "1",
     "reading: the device is done when so many writers have ended, and all that it has heard of; "
     "0: "
     "it goes on"},
};

constexpr brenixcore::plugin::PropertyInfo receiverProperties[] = {
    {"Writer", "char", "", "the name of the writer that said hello last"},
    {"Unit", "char", "", "of its numbers; empty: not known"},
    {"Rate", "double", "counts/s", "of its counts; 0: not known"},
    {"BadMessages", "uint64", "", "since open: what arrived and was skipped"},
};

/// What is known of the writers at one address.
class Receiver
{
public:
    /// Reads the options above and delivers the properties.
    Receiver(brenixcore::plugin::Options& options, brenixplugin::PropertyMap& properties,
             brenixcore::plugin::DeviceHost& deviceHost);

    /// Forgets the writers.
    void begin();

    /// Reads what arrived from `origin`, by its name. Returns the packet that it brings, if any, to be pushed before
    /// the next call; what is missing before it is told to the stream. What is no message is skipped, with an
    /// error. When it throws, for want of memory, nothing has changed. `owner` as for messages::read().
    std::optional<brenixcore::plugin::Packet> take(const unsigned char* bytes, std::size_t size,
                                                   const std::string& origin,
                                                   brenixcore::plugin::DeviceStreams& streams,
                                                   std::shared_ptr<unsigned char> owner = nullptr);

    /// Whether the writers have ended for which the device is there.
    bool isDone() const;

    std::size_t getMaxMessage() const { return maxMessage; }

    /// Other readers take packets of the same writers: what is missing is theirs.
    bool shares = false;

private:
    struct Writer {
        std::uint64_t seq = 0;   ///< of the next packet
        std::uint64_t first = 0; ///< number of the next count
        double period = 0;       ///< nanoseconds of a count; 0: not known
        bool hasEnded = false;
    };

    void skip(const std::string& origin, const char* problem);
    Writer& find(const std::string& stream, std::uint64_t seq, std::uint64_t first);
    void take(const Hello& hello);
    std::optional<brenixcore::plugin::Packet> take(Data&& data,
                                                   brenixcore::plugin::DeviceStreams& streams);
    void take(const End& end, brenixcore::plugin::DeviceStreams& streams);

    brenixcore::plugin::DeviceHost& host;
    std::size_t maxMessage = 0;
    std::uint64_t writersWanted = 1;
    std::unordered_map<std::string, Writer> writers; ///< by their streams
    std::uint64_t ended = 0;                         ///< since open, also those that are forgotten
    std::uint64_t open = 0;                          ///< have not ended
    std::uint64_t bad = 0;                           ///< messages
};

} // namespace messages

#endif
