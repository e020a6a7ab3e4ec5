// The socket of the device zmq, and an eye on who is at its other end.
#ifndef BRENIX_PLUGINS_ZMQ_LINK_HPP
#define BRENIX_PLUGINS_ZMQ_LINK_HPP

#include "Admission.hpp"
#include "Refusals.hpp"
#include "WakeUp.hpp"
#include "Zmq.hpp"

#include "brenixcore/plugin/Plugin.hpp"

#include <chrono>
#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <vector>

namespace zeromq
{

enum class Pattern { Push, Pull, Publish, Subscribe };

inline bool writes(Pattern pattern)
{
    return pattern == Pattern::Push || pattern == Pattern::Publish;
}

struct Settings {
    std::string endpoint;
    Pattern pattern = Pattern::Push;
    bool binds = true;
    std::string topic;
    int highWater = 1000;
    std::string secretKeyFile;                     ///< empty: no keys
    std::string serverKeyFile;                     ///< of a side that goes to the endpoint
    std::string allowedKeysFile;                   ///< of a side that binds
    std::size_t maxMessage = std::size_t{1} << 20; ///< bytes that a peer may send at once
};

/// Binds or connects, tells who was refused, connects again, and counts the peers.
class Link
{
public:
    /// Throws when it cannot bind, and when keys are not as they should be.
    Link(Settings linkSettings, brenixcore::plugin::DeviceHost& deviceHost);

    void* getSocket() const { return socket.get(); }
    const std::string& getEndpoint() const { return endpoint; }   ///< where it is bound
    const std::string& getPublicKey() const { return publicKey; } ///< empty: none

    /// Waits until the socket may be ready for one of the events, or hears of its peers, for something to attend
    /// to, or for somebody who wakes the device, and no longer than the time. Without events the socket is left
    /// alone: it hears nothing. What is to be attended to must have been before. Returns whether there is
    /// something. `isEmpty` as for attend().
    bool wait(WakeUp& wakeUp, int events, std::chrono::milliseconds time, bool isEmpty);

    /// Lets the socket hear of its peers: who has gone, and who has room again. Returns for what it is ready.
    int hear();

    /// Looks after the peers. A connection that has ended is made anew only when the socket is empty, as
    /// libzmq then drops what has arrived.
    void attend(bool isEmpty);

    // Peers that are let in:
    std::uint64_t getPeers() const { return arrivals > departures ? arrivals - departures : 0; }
    std::uint64_t getArrivals() const { return arrivals; }
    std::uint64_t getDepartures() const { return departures; }

    /// Bytes that the system has and the peers' systems have not confirmed.
    std::uint64_t getQueued() const;

    /// Raises an error for those that were refused and not told yet.
    void tellRefusals() { refusals.tell(endpoint); }

    /// Closes. The socket has so much time for what it still has to send.
    void close(std::chrono::milliseconds linger);

private:
    [[noreturn]] void failToBind(int error);
    template <typename Take>
    void takeEvents(const Take& handler);
    void setOptions();
    void setKeys();
    void take(std::uint16_t event, std::uint32_t value);
    void connect();
    void connectAgain();

    static constexpr Clock::duration shortest = std::chrono::milliseconds(250);

    const Settings settings;
    brenixcore::plugin::DeviceHost& host;
    OwnedContext context; // is to end last
    std::optional<Admission> admission;
    OwnedSocket socket;
    OwnedSocket monitor;
    std::string publicKey;
    std::string endpoint;

    std::uint64_t arrivals = 0;
    std::uint64_t departures = 0;
    std::map<int, bool> connections; ///< of the system, and whether they were let in
    std::vector<int> handshaking;    ///< those of which it is not known yet
    bool hasFailed = false;          ///< it was told why
    bool isStranger = false;         ///< whose connection ends next: libzmq says the two at once
    std::uint64_t vain = 0;          ///< attempts to connect, one after the other

    Refusals refusals;
    std::optional<Clock::time_point> nextConnect; ///< when libzmq does not by itself
    Clock::duration patience = shortest;
    bool wasPeer = false; ///< and its connection has ended
};

} // namespace zeromq

#endif
