// The device zmq as a reader.
#ifndef BRENIX_PLUGINS_ZMQ_READING_HPP
#define BRENIX_PLUGINS_ZMQ_READING_HPP

#include "Link.hpp"

#include "messages/Receiver.hpp"

#include <cstdint>
#include <optional>

namespace zeromq
{

/// One run of a reader.
class Reading
{
public:
    Reading(Link& deviceLink, const Settings& linkSettings, messages::Receiver& deviceReceiver,
            WakeUp& deviceWakeUp)
        : link(deviceLink), settings(linkSettings), receiver(deviceReceiver), wakeUp(deviceWakeUp)
    {
    }

    /// Delivers what arrives until the channel closes or the writers have ended.
    void run(brenixcore::plugin::DeviceStreams& streams);

private:
    bool receive(brenixcore::plugin::DeviceStreams& streams);
    void deliver(brenixcore::plugin::DeviceStreams& streams);
    void finish(brenixcore::plugin::DeviceStreams& streams);

    Link& link;
    const Settings& settings;
    messages::Receiver& receiver;
    WakeUp& wakeUp;
    Frame frame;
    bool isFirst = true;                               ///< frame of a message
    std::optional<brenixcore::plugin::Packet> waiting; ///< for room
};

} // namespace zeromq

#endif
