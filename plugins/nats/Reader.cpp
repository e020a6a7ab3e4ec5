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

std::string headerOf(natsMsg* message, const char* name)
{
    const char* value = nullptr;
    return natsMsgHeader_Get(message, name, &value) == NATS_OK && value != nullptr ? value : "";
}

enum Token { Sequence = 5, Time = 7 };

/// What the subject for acknowledging a message tells of it:
/// $JS.ACK.stream.place.deliveries.sequence.sequence of the place.time.... 0 for one of no stream.
std::uint64_t numberOf(const std::string& reply, Token wanted)
{
    std::size_t begin = 0;
    for (int token = 0; token < wanted && begin != std::string::npos; ++token) {
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
    const std::uint64_t number = numberOf(reply, Sequence);
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
    if (settings.start == Start::Time &&
        static_cast<std::int64_t>(numberOf(reply, Time)) < settings.startTime) {
        pass(number); // askedTime() was earlier
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

} // namespace natsio
