// One opening of a device that writes.
#ifndef BRENIX_PLUGINS_NATS_WRITER_HPP
#define BRENIX_PLUGINS_NATS_WRITER_HPP

#include "JetStream.hpp"
#include "Order.hpp"

#include "messages/Sender.hpp"

#include <deque>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <unordered_map>
#include <vector>

namespace natsio
{

class Writer
{
public:
    /// Connects.
    Writer(const Settings& deviceSettings, messages::Sender& deviceSender,
           std::shared_ptr<Mailbox> box, brenixcore::plugin::DeviceHost& deviceHost);

    std::string server() { return connection.server(); }

    /// Sends what is written, and at close waits until it has arrived. Tells what has not.
    void run(brenixcore::plugin::DeviceStreams& deviceStreams);

private:
    /// What a stream has not confirmed.
    struct Unstored {
        Label::Turn turn;
        std::uint64_t counts = 0;
        std::size_t size = 0;
    };
    struct Again {
        MessagePointer message;
        Moment at;
    };

    static constexpr const char* noConnection = "there is no connection with a server";

    void openStream();

    // What the library tells:
    void handle(Event& event);
    void handleStored(Event& event);
    void handleState(const natsMsg* answer);

    // What is to be sent:
    bool mayEnd();
    bool hasRoom();
    bool sendAll();
    void sendPart();
    std::uint64_t fitting(std::uint64_t begin, std::uint64_t most);
    void sayHello();
    template <typename Message>
    bool publish(const Message& message, Label::Turn turn, std::uint64_t counts);
    bool keep(Label::Turn turn, std::uint64_t counts, std::size_t size);
    natsStatus hand(MessagePointer& message);
    void sendAgain();
    void confirm(std::int64_t milliseconds);
    bool isAllConfirmed() const;
    void dropUnconfirmed();
    void askForStream();
    Moment nextTime() const;

    // The end:
    void finish();
    void tell(const char* identifier, const std::string& what = {});

    const Settings& settings;
    messages::Sender& sender;
    std::shared_ptr<Mailbox> mailbox;
    brenixcore::plugin::DeviceHost& host;
    brenixcore::plugin::DeviceStreams* streams = nullptr;
    Connection connection;
    std::optional<KeptStream> stream;
    std::string sink; ///< for messages

    std::vector<unsigned char> bytes; ///< of a message
    messages::Data current;           ///< the packet that is sent, while `rest` is not 0
    std::uint64_t rest = 0;           ///< counts of it that are to be sent
    bool connected = true;
    std::string failure; ///< after which nothing more can be sent

    // Without a stream, since the server has confirmed all before:
    std::uint64_t unconfirmed = 0; ///< counts
    std::size_t unconfirmedBytes = 0;
    std::uint64_t reconnects = 0;
    Moment lastSent;

    // With a stream:
    std::unordered_map<const natsMsg*, Unstored> unstored;
    std::multiset<std::uint64_t> unstoredSeqs;
    std::size_t unstoredBytes = 0;
    std::deque<Again> again; ///< of them, those that are to be sent again
    std::string whyNot;      ///< they were not stored
    int goneAnswers = 0;     ///< one after the other, that there is no stream
    Moment askTime;

    bool begun = false;         ///< hello has arrived
    std::uint64_t helloSeq = 0; ///< when it was said last
    Moment helloTime;
    std::optional<Moment> deadline; ///< of the close
    bool ended = false;             ///< the end was said

    std::uint64_t unsent = 0, tooLarge = 0, unknown = 0, uncertain = 0; ///< counts
    std::string told;
};

} // namespace natsio

#endif
