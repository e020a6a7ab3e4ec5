// One opening of a device that reads.
#ifndef BRENIX_PLUGINS_NATS_READER_HPP
#define BRENIX_PLUGINS_NATS_READER_HPP

#include "JetStream.hpp"
#include "Order.hpp"

#include "messages/Receiver.hpp"

#include <deque>
#include <memory>
#include <optional>
#include <string>
#include <unordered_map>

namespace natsio
{

class Reader
{
public:
    /// Connects and subscribes.
    Reader(const Settings& deviceSettings, messages::Receiver& deviceReceiver,
           std::shared_ptr<Mailbox> box, brenixcore::plugin::DeviceHost& deviceHost);

    std::string server() { return connection.server(); }

    void run(brenixcore::plugin::DeviceStreams& deviceStreams);

private:
    /// A message that was delivered and not acknowledged.
    struct Open {
        std::string reply; ///< where to acknowledge it
        Moment touched;    ///< since when the server waits
    };
    struct Pushed {
        std::uint64_t end = 0;   ///< count of the input stream before which it is
        std::uint64_t place = 0; ///< in the stream
    };

    // What the library tells:
    void handle(Event& event);
    void handleMessage(MessagePointer message);
    void handleState(const natsMsg* answer);

    // What goes into the input stream:
    void deliver();
    void take(MessagePointer message, std::uint64_t number);
    void pass(std::uint64_t number);

    // What a stream is told:
    bool acknowledge();
    void touch();
    std::chrono::milliseconds askPause() const;
    void askForPlace();
    void handBack();
    Moment nextTime() const;
    bool isDone() const { return receiver.isDone() && !waiting; }

    const Settings& settings;
    messages::Receiver& receiver;
    std::shared_ptr<Mailbox> mailbox;
    brenixcore::plugin::DeviceHost& host;
    brenixcore::plugin::DeviceStreams* streams = nullptr;
    Connection connection;
    std::optional<KeptStream> stream;
    std::optional<Place> place;

    bool connected = true;
    std::string failure;                               ///< after which nothing more can arrive
    std::deque<MessagePointer> arrived;                ///< without a stream
    std::optional<brenixcore::plugin::Packet> waiting; ///< for room in the input stream
    std::uint64_t waitingPlace = 0;                    ///< of it, in the stream

    // With a stream:
    Order order;
    std::unordered_map<std::uint64_t, Open> open; ///< by their places
    std::uint64_t last = 0;                       ///< of all places that have come
    std::deque<Pushed> pushed;       ///< of the open ones, those that are in the input stream
    std::string lastReply;           ///< to which one was acknowledged
    bool confirmed = true;           ///< the acknowledgement of that
    Moment touchTime, askTime;       ///< of the last time
    std::uint64_t openWhenAsked = 0; ///< 0: not asked
    std::uint64_t lastWhenAsked = 0;
    int goneAnswers = 0; ///< one after the other, that there is no such place
    bool inputEnded = false;
};

} // namespace natsio

#endif
