// What the devices have in common that send messages: names and numbers.
#ifndef BRENIX_PLUGINS_MESSAGES_SENDER_HPP
#define BRENIX_PLUGINS_MESSAGES_SENDER_HPP

#include "Message.hpp"

#include "brenixcore/plugin/Describe.hpp"
#include "brenixcore/plugin/Options.hpp"

namespace messages
{

constexpr brenixcore::plugin::OptionInfo senderOptions[] = {
    {"Name", "text", "", "this machine's", "writing: what the writer is called"},
    {"Unit", "text", "", "none",
     "writing: of the numbers, such as V; readers have it as a property"},
    {"Rate", "number", "counts/s", "not known", "writing: readers have it as a property"},
};

/// Numbers the packets of one writer.
class Sender
{
public:
    /// Reads the options above.
    explicit Sender(brenixcore::plugin::Options& options);

    /// Adds an option of the device to what the hello says.
    void describe(const std::string& option, const std::string& value);

    /// Begins a stream: a new name, numbers from 0.
    void begin();

    /// The writer as it is now; to be sent at the beginning, and again for readers that come late.
    const Hello& hello() const { return description; }

    /// Makes the next message of `counts` counts of its packet, from `begin` on. All parts of a packet are
    /// made in one Data, one after the other.
    void number(Data& data, std::uint64_t begin, std::uint64_t counts) const;

    /// It was sent, or will be.
    void sent(const Data& data);

    /// Counts that will not be sent: the next message tells.
    void lose(std::uint64_t counts);

    End end() const { return {description.stream, description.seq, description.first + lost}; }

private:
    Hello description;
    std::uint64_t lost = 0; ///< behind the last message
};

} // namespace messages

#endif
