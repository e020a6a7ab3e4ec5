// The device zmq as a writer.
#ifndef BRENIX_PLUGINS_ZMQ_WRITING_HPP
#define BRENIX_PLUGINS_ZMQ_WRITING_HPP

#include "Link.hpp"

#include "messages/Sender.hpp"

#include <atomic>
#include <chrono>
#include <cstdint>
#include <optional>
#include <string>

namespace zeromq
{

/// What libzmq has been given and has not handed to the system yet.
struct Outstanding {
    std::atomic<std::uint64_t> messages = 0;
    std::atomic<std::uint64_t> counts = 0;
    std::atomic<bool> isAwaited = false; ///< that there is nothing: then the device is woken
    WakeUp& wakeUp;
};

struct WritingSettings {
    std::uint64_t readers = 0; ///< that have to be there before anything is sent
    std::chrono::milliseconds closeTimeout = std::chrono::seconds(10);
};

/// One run of a writer.
class Writing
{
public:
    Writing(Link& deviceLink, const Settings& linkSettings, const WritingSettings& writingSettings,
            messages::Sender& deviceSender, WakeUp& deviceWakeUp,
            brenixcore::plugin::DeviceHost& deviceHost, Outstanding& deviceOutstanding);

    /// Sends until the channel closes, and ends the stream.
    void run(brenixcore::plugin::DeviceStreams& streams);

private:
    enum class State { Idle, Busy, Blocked };

    State sendSome(brenixcore::plugin::DeviceStreams& streams);
    bool pull(brenixcore::plugin::DeviceStreams& streams);
    template <typename Kind>
    void make(Frame& frame, const Kind& message, std::uint64_t counts);
    bool send(Frame& frame);
    bool sendHellos();
    void hear();
    void wait(State state, std::chrono::milliseconds time);
    bool look();
    void takeSubscriptions();
    bool waitUntilHandedOver();
    void sendEnd();
    void finish(brenixcore::plugin::DeviceStreams& streams);
    void tell();

    std::uint64_t getReaders() const;
    bool isSettled() const;

    Link& link;
    const Settings& settings;
    const WritingSettings& limits;
    messages::Sender& sender;
    WakeUp& wakeUp;
    brenixcore::plugin::DeviceHost& host;
    Outstanding& outstanding;

    bool hasBegun = false;
    Clock::time_point settled{}; ///< after a peer has gone
    std::uint64_t subscriptions = 0;
    std::uint64_t hellos = 1;                ///< to be sent
    std::optional<messages::Hello> greeting; ///< as it was before `outgoing`
    Frame outgoing;
    std::optional<std::uint64_t> waiting; ///< counts of `outgoing`, if it is not sent
    std::uint64_t sent = 0;               ///< counts that libzmq took
    std::uint64_t handedOver = 0;         ///< of them, when nothing had been dropped yet
    bool hasHeard = false;                ///< the socket may have dropped something of it since
    std::optional<Clock::time_point> deadline; ///< once the channel closes

    // Counts, all of one run: an error takes the place of one that nobody has read.
    std::uint64_t undelivered = 0;
    std::uint64_t doubtful = 0; ///< were on their way to one who has gone
    std::uint64_t unfit = 0;
    std::string why;               ///< of the last of them
    std::uint64_t unconfirmed = 0; ///< bytes
    std::string told;
};

} // namespace zeromq

#endif
