// What the devices have in common that receive messages: what each writer sent, and what is missing of it.
#ifndef BRENIX_PLUGINS_MESSAGES_RECEIVER_HPP
#define BRENIX_PLUGINS_MESSAGES_RECEIVER_HPP

#include "Message.hpp"

#include "brenixcore/plugin/Describe.hpp"
#include "brenixcore/plugin/Options.hpp"
#include "brenixcore/plugin/Plugin.hpp"

#include <chrono>
#include <optional>
#include <unordered_map>

namespace messages
{

constexpr brenixcore::plugin::OptionInfo receiverOptions[] = {
    {"MaxMessage", "whole number", "bytes", "67108864",
     "reading: of the largest message and of the largest array in it"},
    {"Writers", "whole number", "", "1",
     "reading: the device is done when so many writers have ended, and all that it has heard of; "
     "0: it goes on"},
};

constexpr brenixcore::plugin::PropertyInfo receiverProperties[] = {
    {"Writer", "char", "", "the name of the writer that was heard of last"},
    {"Unit", "char", "", "of its numbers"},
    {"Rate", "double", "counts/s", "of its counts; 0: not known"},
    {"BadMessages", "uint64", "", "since open: messages that were skipped, since they are none"},
};

/// What is known of the writers on one address.
class Receiver
{
public:
    /// Reads the options above.
    Receiver(brenixcore::plugin::Options& options, brenixplugin::PropertyMap& properties,
             brenixcore::plugin::DeviceHost& deviceHost);

    /// Forgets all writers.
    void begin();

    /// What arrived: the packet to push, if it brings one, with what is missing before it. `origin` is
    /// where it comes from, for messages. Tells of what is no message. Throws when memory runs out, and
    /// has then done nothing.
    std::optional<brenixcore::plugin::Packet> take(const unsigned char* bytes, std::size_t size,
                                                   const std::string& origin,
                                                   brenixcore::plugin::DeviceStreams& streams);

    /// Whether the writers have ended for whom the device is there.
    bool isDone() const;

    std::size_t getMaxMessage() const { return maxMessage; }

    /// Gaps in what a writer sends are what other readers got, not losses.
    bool shares = false;
};

} // namespace messages

#endif
