#include "Link.hpp"

#include "Endpoint.hpp"
#include "Keys.hpp"

#include "brenixcore/plugin/Make.hpp"

#include <poll.h>
#include <sys/ioctl.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstring>
#include <optional>
#include <string_view>
#include <system_error>
#include <utility>
#include <vector>

namespace zeromq
{

namespace
{

using std::chrono::milliseconds;

int typeOf(Pattern pattern)
{
    constexpr std::array types = {ZMQ_PUSH, ZMQ_PULL, ZMQ_XPUB, ZMQ_SUB};
    return types.at(static_cast<std::size_t>(pattern));
}

} // namespace

Link::Link(Settings linkSettings, brenixcore::plugin::DeviceHost& deviceHost)
    : settings(std::move(linkSettings)), host(deviceHost), context(zmq_ctx_new()),
      endpoint(settings.endpoint), refusals(deviceHost, settings.binds)
{
    if (!context) {
        fail("Could not start libzmq");
    }
    socket = makeSocket(context.get(), typeOf(settings.pattern));
    setOptions();
    if (!settings.secretKeyFile.empty()) {
        setKeys();
    }
    const char* const events = "inproc://events";
    zmq_socket_monitor(socket.get(), events, ZMQ_EVENT_ALL);
    monitor = makeSocket(context.get(), ZMQ_PAIR);
    set(monitor.get(), ZMQ_RCVHWM, 0);
    if (zmq_connect(monitor.get(), events) != 0) {
        fail("Could not watch a socket");
    }
    if (!settings.binds) {
        connect();
        return;
    }
    if (isTaken(endpoint)) {
        throw std::runtime_error("Could not bind " + endpoint + ": Address already in use");
    }
    if (zmq_bind(socket.get(), endpoint.c_str()) != 0) {
        failToBind(zmq_errno());
    }
    std::array<char, 1024> bound{};
    std::size_t size = bound.size();
    if (zmq_getsockopt(socket.get(), ZMQ_LAST_ENDPOINT, bound.data(), &size) == 0) {
        endpoint = bound.data();
    }
}

/// The event tells the error where zmq_bind() has another one by then.
void Link::failToBind(int error)
{
    const auto look = [&](std::uint16_t event, std::uint32_t value) {
        if (event == ZMQ_EVENT_BIND_FAILED && error == EAGAIN) {
            error = static_cast<int>(value);
        }
    };
    takeEvents(look);
    throw std::runtime_error("Could not bind " + endpoint + ": " + zmq_strerror(error));
}

template <typename Take>
void Link::takeEvents(const Take& handler)
{
    Frame event;
    Frame address;
    while (event.receive(monitor.get()) && address.receive(monitor.get())) {
        std::uint16_t number = 0;
        std::uint32_t value = 0;
        std::memcpy(&number, event.data(), sizeof number);
        std::memcpy(&value, event.data() + sizeof number, sizeof value);
        handler(number, value);
    }
}

void Link::setOptions()
{
    void* const to = socket.get();
    set(to, ZMQ_SNDHWM, settings.highWater);
    set(to, ZMQ_RCVHWM, settings.highWater);
    set(to, ZMQ_IPV6, settings.endpoint.find('[') != std::string::npos ? 1 : 0);
    if (settings.pattern == Pattern::Push) {
        set(to, ZMQ_IMMEDIATE, 1); // nothing for a peer that is not there yet
    }
    // A machine that has gone does not close its connections. ZMTP's own heartbeats would take a reader that
    // does not read for one that has gone.
    set(to, ZMQ_TCP_KEEPALIVE, 1);
    set(to, ZMQ_TCP_KEEPALIVE_IDLE, 10);
    set(to, ZMQ_TCP_KEEPALIVE_INTVL, 5);
    set(to, ZMQ_TCP_KEEPALIVE_CNT, 4);
    const auto most = static_cast<std::int64_t>(settings.maxMessage);
    zmq_setsockopt(to, ZMQ_MAXMSGSIZE, &most, sizeof most);
    if (settings.pattern == Pattern::Subscribe) {
        set(to, ZMQ_SUBSCRIBE, settings.topic);
    } else if (settings.pattern == Pattern::Publish) {
        set(to, ZMQ_XPUB_VERBOSER, 1); // it tells of each that comes and goes
    }
}

void Link::setKeys()
{
    const KeyPair own = readSecretKey(settings.secretKeyFile);
    publicKey = own.publicKey;
    set(socket.get(), ZMQ_CURVE_PUBLICKEY, own.publicKey);
    set(socket.get(), ZMQ_CURVE_SECRETKEY, own.secretKey);
    if (!settings.binds) {
        set(socket.get(), ZMQ_CURVE_SERVERKEY, readPublicKey(settings.serverKeyFile));
        return;
    }
    admission.emplace(context.get(), settings.allowedKeysFile);
    set(socket.get(), ZMQ_CURVE_SERVER, 1);
    set(socket.get(), ZMQ_ZAP_DOMAIN, std::string("brenix"));
}

void Link::connect()
{
    if (zmq_connect(socket.get(), endpoint.c_str()) != 0) {
        fail("Could not connect to " + endpoint);
    }
}

bool Link::wait(WakeUp& wakeUp, int events, milliseconds time, bool isEmpty)
{
    std::optional<Clock::time_point> next;
    if (!refusals.isEmpty()) {
        next = refusals.getNextTelling();
    }
    if (nextConnect && isEmpty) {
        next = std::min(next.value_or(*nextConnect), *nextConnect);
    }
    if (next) {
        time = std::clamp(std::chrono::ceil<milliseconds>(*next - Clock::now()), milliseconds(0),
                          time);
    }
    // Not zmq_poll(), which asks the system four times more often.
    std::array<pollfd, 4> places = {pollfd{wakeUp.getHandle(), POLLIN, 0},
                                    pollfd{handleOf(monitor.get()), POLLIN, 0}};
    std::size_t count = 2;
    if (admission) {
        places.at(count++) = {handleOf(admission->getSocket()), POLLIN, 0};
    }
    const std::size_t called = count;
    if (events != 0) {
        if ((hear() & events) != 0) { // what has been heard does not end a wait
            time = milliseconds(0);
        }
        places.at(count++) = {handleOf(socket.get()), POLLIN, 0};
    }
    ::poll(places.data(), count, static_cast<int>(time.count()));
    if (places[0].revents != 0) {
        wakeUp.clear();
    }
    return std::any_of(places.begin() + 1, places.begin() + static_cast<std::ptrdiff_t>(called),
                       [](const pollfd& place) { return place.revents != 0; }) ||
           (next && Clock::now() >= *next);
}

int Link::hear()
{
    int ready = 0;
    std::size_t size = sizeof ready;
    zmq_getsockopt(socket.get(), ZMQ_EVENTS, &ready, &size);
    return ready;
}

void Link::attend(bool isEmpty)
{
    if (admission) {
        admission->answer(refusals);
    }
    const std::uint64_t before = arrivals;
    const std::uint64_t peers = getPeers();
    takeEvents([this](std::uint16_t event, std::uint32_t value) { take(event, value); });
    if (getPeers() != peers) {
        host.updateProperty(
            brenixcore::plugin::makeScalar("Peers", static_cast<unsigned int>(getPeers())));
    }
    if (arrivals != before) { // the socket is to know of them, too
        hear();
    }
    const auto now = Clock::now();
    if (nextConnect && now >= *nextConnect && isEmpty) {
        connectAgain();
    }
    if (now >= refusals.getNextTelling()) {
        tellRefusals();
    }
}

/// libzmq gives a connection up when what comes over it is none of its messages, or too large a one.
void Link::connectAgain()
{
    nextConnect.reset();
    if (std::exchange(wasPeer, false)) {
        const std::string what = "The connection to " + endpoint +
                                 " has ended: what came over it is no message, or larger than "
                                 "MaxMessage.";
        host.raise("error", "brenix:Device:badMessage", what.c_str());
    }
    zmq_disconnect(socket.get(), endpoint.c_str()); // or it takes itself for connected
    connect();
}

void Link::take(std::uint16_t event, std::uint32_t value)
{
    const bool hasKey = !settings.secretKeyFile.empty();
    switch (event) {
    case ZMQ_EVENT_ACCEPTED:
    case ZMQ_EVENT_CONNECTED:
        connections[static_cast<int>(value)] = false;
        handshaking.push_back(static_cast<int>(value));
        break;
    case ZMQ_EVENT_HANDSHAKE_SUCCEEDED:
        ++arrivals;
        if (!handshaking.empty()) { // it is not told of which; one that takes long is a stranger
            connections[handshaking.back()] = true;
            handshaking.pop_back();
        }
        vain = 0;
        patience = shortest;
        break;
    case ZMQ_EVENT_HANDSHAKE_FAILED_AUTH:
        hasFailed = true;
        if (!settings.binds) {
            refusals.add("it does not allow the key of " + settings.secretKeyFile);
        }
        break;
    case ZMQ_EVENT_HANDSHAKE_FAILED_PROTOCOL:
        hasFailed = true;
        if (value == ZMQ_PROTOCOL_ERROR_ZMTP_MECHANISM_MISMATCH) {
            refusals.add(hasKey ? "the other side has no key" : "the other side has a key");
        } else if (value == ZMQ_PROTOCOL_ERROR_ZMTP_CRYPTOGRAPHIC) {
            refusals.add(settings.binds
                             ? "it expected another key than that of " + settings.secretKeyFile
                             : "it has another key than that of " + settings.serverKeyFile);
        } else {
            refusals.add("it does not keep to the protocol");
        }
        break;
    case ZMQ_EVENT_HANDSHAKE_FAILED_NO_DETAIL:
        hasFailed = isStranger = true;
        // One that has just gone away looks the same.
        if (!settings.binds && ++vain > 2) {
            refusals.add(hasKey ? "it has another key than that of " + settings.serverKeyFile +
                                      ", has no key, no Pattern that fits, or is no ZeroMQ socket"
                                : "it has a key, no Pattern that fits, or is no ZeroMQ socket");
        }
        break;
    case ZMQ_EVENT_DISCONNECTED:
        if (std::exchange(isStranger, false) && connections[static_cast<int>(value)] &&
            !handshaking.empty()) { // another was let in
            connections[handshaking.back()] = true;
            handshaking.pop_back();
            connections[static_cast<int>(value)] = false;
        }
        if (connections[static_cast<int>(value)]) {
            ++departures;
            wasPeer = true;
        } else if (!std::exchange(hasFailed, false)) {
            refusals.add("the other side has no Pattern that fits");
        }
        connections.erase(static_cast<int>(value));
        std::erase(handshaking, static_cast<int>(value));
        if (!settings.binds) { // unless libzmq says that it tries again
            nextConnect = Clock::now() + patience;
            patience = std::min<Clock::duration>(2 * patience, std::chrono::seconds(16));
        }
        break;
    case ZMQ_EVENT_CONNECT_RETRIED:
        wasPeer = false;
        nextConnect.reset();
        break;
    default:
        break;
    }
}

std::uint64_t Link::getQueued() const
{
    std::uint64_t all = 0;
    for (const auto& [connection, wasLetIn] : connections) {
        int queued = 0;
        ::ioctl(connection, TIOCOUTQ, &queued); // also the one of sockets
        all += static_cast<std::uint64_t>(std::max(queued, 0));
    }
    return all;
}

void Link::close(milliseconds linger)
{
    set(socket.get(), ZMQ_LINGER, static_cast<int>(linger.count()));
    monitor.reset();
    socket.reset();
    admission.reset(); // without it, everybody would be let in
    context.reset();
}

} // namespace zeromq
