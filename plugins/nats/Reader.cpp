#include "Reader.hpp"

#include "brenixcore/plugin/Make.hpp"

#include <algorithm>
#include <charconv>
#include <stdexcept>
#include <string_view>
#include <utility>

namespace natsio
{

using namespace brenixcore::plugin;

namespace
{

constexpr const char* ack = "+ACK";
constexpr const char* inProgress = "+WPI";
constexpr const char* notYet = "-NAK";

constexpr auto touchPause = ackWait / 5;

std::string headerOf(natsMsg* message, const char* name)
{
    const char* value = nullptr;
    return natsMsgHeader_Get(message, name, &value) == NATS_OK && value != nullptr ? value : "";
}

/// The place of a message in its stream, of which the subject for acknowledging it tells:
/// $JS.ACK.stream.place.deliveries.sequence.... 0 for one of no stream.
std::uint64_t placeOf(const std::string& reply)
{
    std::size_t begin = 0;
    for (int token = 0; token < 5 && begin != std::string::npos; ++token) {
        begin = reply.find('.', begin);
        begin += begin == std::string::npos ? 0 : 1;
    }
    std::uint64_t number = 0;
    if (begin != std::string::npos && reply.rfind("$JS.ACK.", 0) == 0) {
        std::from_chars(reply.data() + begin, reply.data() + reply.size(), number);
    }
    return number;
}

} // namespace

Reader::Reader(const Settings& deviceSettings, messages::Receiver& deviceReceiver,
               std::shared_ptr<Mailbox> box, DeviceHost& deviceHost)
    : settings(deviceSettings), receiver(deviceReceiver), mailbox(std::move(box)), host(deviceHost),
      connection(settings, mailbox)
{
    if (settings.keeps) {
        stream.emplace(connection, settings);
        place.emplace(*stream, settings, connection.until);
        connection.subscribe(place->subject);
        connection.watch("$JS.EVENT.ADVISORY.STREAM.DELETED." + stream->name);
        connection.watch("$JS.EVENT.ADVISORY.CONSUMER.DELETED." + stream->name + "." + place->name);
    } else {
        connection.subscribe(settings.subject);
        using std::chrono::milliseconds;
        const auto left = std::chrono::duration_cast<milliseconds>(connection.until - Clock::now());
        const natsStatus status =
            connection.flush(std::max(left, std::chrono::milliseconds(1)).count());
        if (status != NATS_OK) { // or else all arrives from here on
            throw std::runtime_error("Could not subscribe to " + settings.subject + ": " +
                                     reasonOf(status));
        }
    }
}

void Reader::run(DeviceStreams& deviceStreams)
{
    streams = &deviceStreams;
    receiver.begin();
    while (true) {
        const bool closing = streams->isClosing();
        if (!inputEnded) {
            deliver();
        }
        if (order.isBeginning()) {
            askForPlace(); // and what is open stays so until the answer comes
        } else {
            acknowledge();
        }
        touch();
        if (closing || !failure.empty() || (isDone() && open.empty())) {
            break;
        }
        if (isDone() && !std::exchange(inputEnded, true)) {
            streams->endInput(); // the caller has yet to read what is to be acknowledged
        }
        const bool takesMessages =
            stream || !waiting; // of a stream, there are no more than the window
        for (Event& event : mailbox->take(nextTime(), takesMessages)) {
            handle(event);
        }
    }
    if (stream) {
        handBack();
    }
    if (!failure.empty()) {
        throw std::runtime_error("Reading " + settings.subject + " failed: " + failure + ".");
    }
}

// --- What the library tells ---

void Reader::handle(Event& event)
{
    switch (event.kind) {
    case Event::Kind::Message:
        handleMessage(std::move(event.message));
        break;
    case Event::Kind::Answer:
        if (event.text == "state") {
            handleState(event.message.get());
        } else if (event.text == "acknowledged") {
            confirmed = true;
        } else { // something was deleted
            askTime = {};
        }
        break;
    case Event::Kind::Disconnected:
        connected = false;
        host.raise(
            "warning", "brenix:Device:disconnected",
            ("The connection with " + connection.server() + " has ended: " + event.text).c_str());
        break;
    case Event::Kind::Reconnected:
        connected = true;
        order.excuse(Clock::now());
        openWhenAsked = 0;
        askTime = {};
        host.updateProperty(makeScalar("Server", connection.server()));
        break;
    case Event::Kind::Closed:
    case Event::Kind::Error:
        failure = event.text;
        break;
    case Event::Kind::Stored:
    case Event::Kind::NotStored:
        break;
    }
}

void Reader::handleMessage(MessagePointer message)
{
    if (!stream) {
        arrived.push_back(std::move(message));
        return;
    }
    const char* const given = natsMsg_GetReply(message.get());
    const std::string reply = given == nullptr ? "" : given;
    const std::uint64_t number = placeOf(reply);
    if (number == 0) {
        return; // not of a stream
    }
    const auto now = Clock::now();
    last = std::max(last, number);
    const auto [entry, isNew] = open.try_emplace(number, Open{reply, now});
    if (!isNew) { // it waits here
        entry->second.touched = now;
        return;
    }
    const auto label =
        Label::read(headerOf(message.get(), idHeader), headerOf(message.get(), storedHeader));
    Order::Item item{std::move(message), number, number, true};
    if (!label) {
        order.add(std::move(item)); // of another maker: as it comes
    } else if (!order.take(*label, item, now)) {
        pass(number);
    }
}

void Reader::handleState(const natsMsg* answer)
{
    const State state(answer);
    goneAnswers = state.isGone ? goneAnswers + 1 : 0;
    if (goneAnswers >= 2) { // not of a server that has only just begun
        failure = (settings.durable.empty() ? "its place" : "Durable " + settings.durable) +
                  " in stream " + stream->name + " is not there any more";
    }
    const std::uint64_t asked = std::exchange(openWhenAsked, 0);
    // Nothing was acknowledged since: these are the very same, and all that was delivered has come.
    if (state.isKnown && asked > 0 && state.pending <= asked && state.delivered >= lastWhenAsked) {
        order.settle(Clock::now());
    }
}

// --- What goes into the input stream ---

void Reader::deliver()
{
    while (true) {
        if (waiting) {
            if (!streams->tryPush(*waiting)) {
                return;
            }
            waiting.reset();
            pass(waitingPlace);
        }
        if (!arrived.empty()) {
            MessagePointer message = std::move(arrived.front());
            arrived.pop_front();
            take(std::move(message), 0);
        } else if (auto item = order.next()) {
            receiver.shares = !item->follows;
            take(std::move(item->message), item->place);
        } else {
            return;
        }
    }
}

void Reader::take(MessagePointer message, std::uint64_t number)
{
    const auto* const bytes =
        reinterpret_cast<const unsigned char*>(natsMsg_GetData(message.get()));
    const auto size = static_cast<std::size_t>(natsMsg_GetDataLength(message.get()));
    waiting = receiver.take(bytes, size, natsMsg_GetSubject(message.get()), *streams);
    waitingPlace = number;
    if (!waiting) {
        pass(number);
    }
}

/// It may be acknowledged when all that is in the input stream by now was read.
void Reader::pass(std::uint64_t number)
{
    if (stream) {
        pushed.push_back({settings.durable.empty() ? 0 : streams->pushedCounts(), number});
    }
}

// --- What a stream is told ---

/// Returns whether nothing that was read is left, since there is a connection.
bool Reader::acknowledge()
{
    const std::uint64_t taken = pushed.empty() ? 0 : streams->takenCounts();
    while (!pushed.empty() && pushed.front().end <= taken) {
        const auto found = open.find(pushed.front().place);
        if (!connected || !connection.send(found->second.reply, ack)) {
            return false;
        }
        confirmed = false;
        lastReply = found->second.reply;
        open.erase(found);
        pushed.pop_front();
    }
    return true;
}

/// Tells that it still waits for the program, or for its turn, before the server thinks that it got lost.
void Reader::touch()
{
    const auto now = Clock::now();
    if (!stream || !connected || now < touchTime + touchPause) {
        return;
    }
    touchTime = now;
    for (auto& [number, entry] : open) {
        if (now - entry.touched >= ackWait / 4 && connection.send(entry.reply, inProgress)) {
            entry.touched = now;
        }
    }
    if (open.size() >= settings.window && !pushed.empty() && !order.isBeginning()) {
        order.excuse(now); // nothing comes before the program reads
    }
    order.giveUp(now, settings.window);
    askForPlace();
}

/// Between two questions.
std::chrono::milliseconds Reader::askPause() const
{
    if (!order.isBeginning()) {
        return std::chrono::milliseconds(goneAnswers > 0 ? 500 : 30000);
    }
    return std::chrono::milliseconds(openWhenAsked > 0 ? 200 : last != lastWhenAsked ? 5 : 100);
}

/// Whether the place is there, and what was delivered to it.
void Reader::askForPlace()
{
    const auto now = Clock::now();
    const bool isBeginning = order.isBeginning();
    if (!connected || now < askTime + askPause()) {
        return;
    }
    askTime = now;
    openWhenAsked = isBeginning ? open.size() : 0;
    lastWhenAsked = last;
    connection.ask("$JS.API.CONSUMER.INFO." + stream->name + "." + place->name, "", "state");
}

/// At the end: the server is to know what was read, and to deliver the rest to who comes next.
void Reader::handBack()
{
    const Moment until = Clock::now() + settings.closeTimeout;
    connection.unsubscribe(); // or it would come here again
    bool isBack = false;
    askTime = {};
    while (failure.empty()) {
        const bool isAcknowledged = acknowledge();
        if (connected && !isBack) {
            isBack = std::all_of(open.begin(), open.end(), [&](const auto& each) {
                return connection.send(each.second.reply, notYet);
            });
        }
        if (isAcknowledged && confirmed) {
            return;
        }
        if (Clock::now() >= until) {
            break;
        }
        if (connected && !confirmed && Clock::now() - askTime >= std::chrono::milliseconds(500)) {
            askTime = Clock::now();
            connection.ask(lastReply, ack, "acknowledged"); // once more, for an answer
        }
        for (Event& event :
             mailbox->take(std::min(until, Clock::now() + std::chrono::milliseconds(200)))) {
            if (event.kind != Event::Kind::Message) {
                handle(event);
            }
        }
    }
    host.raise("warning", "brenix:Device:notAcknowledged",
               ("What was read of stream " + stream->name +
                " last was not acknowledged in time: it may come again.")
                   .c_str());
}

Moment Reader::nextTime() const
{
    const auto now = Clock::now();
    if (!stream) {
        return now + std::chrono::hours(24);
    }
    const Moment touching = touchTime + touchPause;
    return order.isBeginning() ? std::min(touching, askTime + askPause()) : touching;
}

} // namespace natsio
