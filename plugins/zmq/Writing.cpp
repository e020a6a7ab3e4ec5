#include "Writing.hpp"

#include <algorithm>
#include <cstdlib>
#include <memory>
#include <new>
#include <tuple>
#include <utility>

namespace zeromq
{

using namespace brenixcore::plugin;
using std::chrono::milliseconds;

namespace
{

/// Stands before the bytes of a message.
struct alignas(std::max_align_t) Head {
    Outstanding* outstanding;
    std::uint64_t counts;
};

/// libzmq calls it, on a thread of its own, when it has no more use for a message.
void release(void* /*bytes*/, void* hint)
{
    auto* const head = static_cast<Head*>(hint);
    Outstanding& outstanding = *head->outstanding;
    outstanding.counts -= head->counts;
    if (--outstanding.messages == 0 && outstanding.isAwaited) {
        outstanding.wakeUp.signal();
    }
    std::free(head); // NOLINT(cppcoreguidelines-no-malloc)
}

} // namespace

Writing::Writing(Link& deviceLink, const Settings& linkSettings,
                 const WritingSettings& writingSettings, messages::Sender& deviceSender,
                 WakeUp& deviceWakeUp, DeviceHost& deviceHost, Outstanding& deviceOutstanding)
    : link(deviceLink), settings(linkSettings), limits(writingSettings), sender(deviceSender),
      wakeUp(deviceWakeUp), host(deviceHost), outstanding(deviceOutstanding)
{
}

/// libzmq tells that a peer has gone, and a little later gives up what is on the way to it: until then it
/// would take more for it.
bool Writing::isSettled() const
{
    return settings.pattern == Pattern::Publish || (link.getPeers() > 0 && Clock::now() >= settled);
}

std::uint64_t Writing::getReaders() const
{
    return settings.pattern == Pattern::Publish ? subscriptions : link.getPeers();
}

void Writing::run(DeviceStreams& streams)
{
    sender.begin();
    look();
    for (;;) {
        const bool closing = streams.isClosing(); // before the last look at the output
        if (closing && !deadline) {
            deadline = Clock::now() + limits.closeTimeout;
        }
        hasBegun = hasBegun || getReaders() >= limits.readers;
        State state = State::Blocked;
        if (hasBegun && isSettled()) {
            state = sendSome(streams);
        } else if (closing && !waiting && !pull(streams)) {
            state = State::Idle;
        }
        if (closing && (state == State::Idle || Clock::now() >= *deadline)) {
            break;
        }
        wait(state, milliseconds(state == State::Busy ? 0 : 10000));
    }
    finish(streams);
}

/// Comes back after some packets, to look after the peers.
Writing::State Writing::sendSome(DeviceStreams& streams)
{
    constexpr int some = 256;
    for (int i = 0; i < some; ++i) {
        const bool isIdle = !waiting && !pull(streams);
        if (!sendHellos() && !isIdle) {
            return State::Blocked;
        }
        if (isIdle) {
            return State::Idle;
        }
        if (!send(outgoing)) {
            return State::Blocked;
        }
        sent += *waiting;
        waiting.reset();
    }
    return State::Busy;
}

/// Makes a message of the next packet, if there is one. A hello goes before it.
bool Writing::pull(DeviceStreams& streams)
{
    if (hellos > 0) {
        greeting = sender.hello();
    }
    while (auto packet = streams.tryPull()) {
        messages::Data data;
        data.packet = std::move(*packet);
        const std::uint64_t counts = data.packet.counts;
        try {
            sender.number(data, 0, counts);
            make(outgoing, data, counts);
            sender.sent(data);
            waiting = counts;
            return true;
        } catch (const messages::Malformed& problem) {
            sender.lose(counts);
            unfit += counts;
            why = problem.what();
            tell();
        }
    }
    return false;
}

/// The message is written where libzmq sends it from.
template <typename Kind>
void Writing::make(Frame& frame, const Kind& message, std::uint64_t counts)
{
    const std::size_t size = messages::sizeOf(message);
    // NOLINTBEGIN(cppcoreguidelines-no-malloc): libzmq's thread frees it
    const auto free = [](void* place) { std::free(place); };
    std::unique_ptr<void, decltype(free)> memory(std::malloc(sizeof(Head) + size));
    // NOLINTEND(cppcoreguidelines-no-malloc)
    if (!memory) {
        throw std::bad_alloc();
    }
    auto* const head = new (memory.get()) Head{&outstanding, counts};
    auto* const bytes = reinterpret_cast<unsigned char*>(head + 1);
    messages::write(message, bytes);
    std::ignore = memory.release(); // from here on release() frees it
    outstanding.counts += counts;
    ++outstanding.messages; // behind the bytes, for the thread that frees them
    zmq_msg_close(frame.get());
    if (zmq_msg_init_data(frame.get(), bytes, size, release, head) != 0) {
        release(bytes, head);
        zmq_msg_init(frame.get());
        throw std::bad_alloc();
    }
}

template void Writing::make(Frame& frame, const messages::End& message, std::uint64_t counts);

/// Whether libzmq has taken it.
bool Writing::send(Frame& frame)
{
    void* const socket = link.getSocket();
    hear();
    if (settings.pattern == Pattern::Publish &&
        zmq_send(socket, settings.topic.data(), settings.topic.size(), ZMQ_DONTWAIT | ZMQ_SNDMORE) <
            0) {
        return false;
    }
    return zmq_msg_send(frame.get(), socket, ZMQ_DONTWAIT) >= 0;
}

bool Writing::sendHellos()
{
    for (; greeting && hellos > 0; --hellos) {
        Frame frame;
        make(frame, *greeting, 0);
        if (!send(frame)) {
            return false;
        }
    }
    greeting.reset();
    return true;
}

/// What is on its way to a peer that has gone is dropped when the socket hears of that, and not before: until
/// then, all that libzmq has released was sent.
void Writing::hear()
{
    hasHeard = hasHeard || outstanding.counts > waiting.value_or(0);
}

void Writing::wait(State state, milliseconds time)
{
    const bool publishes = settings.pattern == Pattern::Publish;
    if (hasHeard && !publishes && look()) { // whether somebody had gone by then
        return;
    }
    if (deadline) {
        time = std::clamp(std::chrono::ceil<milliseconds>(*deadline - Clock::now()),
                          milliseconds(0), time);
    }
    const bool isFull = state == State::Blocked && hasBegun && isSettled();
    if (Clock::now() < settled) {
        time = std::min(time, milliseconds(20));
    }
    const bool isHeard = publishes || isFull || !isSettled();
    if (isHeard) {
        hear();
    }
    outstanding.isAwaited = deadline.has_value();
    link.wait(wakeUp,
              publishes ? ZMQ_POLLIN
              : isFull  ? ZMQ_POLLOUT
              : isHeard ? ZMQ_POLLERR
                        : 0,
              time, true);
    outstanding.isAwaited = false;
    look();
}

/// Looks after the peers. Returns whether some have come or gone.
bool Writing::look()
{
    const bool wasHeard = std::exchange(hasHeard, false);
    const std::uint64_t before = sent - outstanding.counts + waiting.value_or(0);
    const bool isUnderWay = sent > before;
    const std::uint64_t arrivals = link.getArrivals();
    const std::uint64_t departures = link.getDepartures();
    link.attend(true);
    if (settings.pattern == Pattern::Publish) {
        takeSubscriptions();
        return false;
    }
    const bool haveCome = link.getArrivals() != arrivals;
    const bool haveGone = link.getDepartures() != departures;
    if (haveCome) {
        hellos = link.getPeers(); // they go round
        hasHeard = isUnderWay;    // of them, and of who went since
    }
    if (!wasHeard || !haveGone) {
        handedOver = std::max(handedOver, before); // what was told is not told again
    }
    if (haveGone) {
        settled = Clock::now() + milliseconds(100);
        if (const std::uint64_t lost = sent - std::exchange(handedOver, sent); lost > 0) {
            doubtful += lost;
            tell();
        }
    }
    return haveCome || haveGone;
}

/// Those of the topic, which for a reader is the beginning of one.
void Writing::takeSubscriptions()
{
    Frame frame;
    while (frame.receive(link.getSocket())) {
        if (frame.size() == 0 || settings.topic.rfind(frame.text().substr(1), 0) != 0) {
            continue;
        }
        if (frame.data()[0] == 1) {
            ++subscriptions;
            hellos = 1;
        } else if (subscriptions > 0) {
            --subscriptions;
        }
    }
}

} // namespace zeromq
