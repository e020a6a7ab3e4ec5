#include "Writer.hpp"

#include "brenixcore/plugin/Make.hpp"

#include <algorithm>
#include <stdexcept>
#include <utility>

namespace natsio
{

using namespace brenixcore::plugin;

namespace
{

constexpr std::size_t headerRoom = 512;            // bytes that headers take, at most
constexpr std::size_t mostUnconfirmed = 4U << 20U; // bytes, without a stream
constexpr std::size_t mostUnstored = 64U << 20U;   // bytes, with one
constexpr std::chrono::milliseconds
    idleTime(20); // after which the server is asked whether it has all

} // namespace

Writer::Writer(const Settings& deviceSettings, messages::Sender& deviceSender,
               std::shared_ptr<Mailbox> box, DeviceHost& deviceHost)
    : settings(deviceSettings), sender(deviceSender), mailbox(std::move(box)), host(deviceHost),
      connection(settings, mailbox)
{
    if (settings.keeps) {
        openStream();
    }
    sink = stream ? "stream " + stream->name : settings.subject;
}

/// Returns whether it was handed over.
template <typename Message>
bool Writer::publish(const Message& message, Label::Turn turn, std::uint64_t counts)
{
    const std::size_t size = messages::sizeOf(message);
    bytes.resize(std::max(bytes.size(), size));
    messages::write(message, bytes.data());
    if (stream) {
        return keep(turn, counts, size);
    }
    const natsStatus status = natsConnection_Publish(connection.get(), settings.subject.c_str(),
                                                     bytes.data(), static_cast<int>(size));
    if (status != NATS_OK) {
        // A write that took too long leaves the connection as it is, but drops what was to be sent.
        connected = natsConnection_Status(connection.get()) == NATS_CONN_STATUS_CONNECTED;
        whyNot = noConnection;
        dropUnconfirmed();
        return false;
    }
    unconfirmed += counts;
    unconfirmedBytes += size;
    lastSent = Clock::now();
    return true;
}

void Writer::run(DeviceStreams& deviceStreams)
{
    streams = &deviceStreams;
    sender.begin();
    sayHello();
    while (failure.empty()) {
        mayEnd(); // before the last look at the output
        sendAgain();
        const bool isEmpty = sendAll();
        if (isEmpty && deadline) {
            if (!stream) {
                confirm(50);
            }
            if (isAllConfirmed()) {
                if (ended) {
                    break;
                }
                ended = publish(sender.end(), {sender.end().seq, Rank::End}, 0);
                continue;
            }
        } else if (isEmpty && unconfirmedBytes > 0 && Clock::now() - lastSent >= idleTime) {
            confirm(50);
        }
        if (deadline && Clock::now() >= *deadline) {
            break;
        }
        for (Event& event : mailbox->take(nextTime())) {
            handle(event);
        }
    }
    finish();
}

// --- What the library tells ---

void Writer::handle(Event& event)
{
    switch (event.kind) {
    case Event::Kind::Stored:
    case Event::Kind::NotStored:
        handleStored(event);
        break;
    case Event::Kind::Answer:
        handleState(event.message.get());
        break;
    case Event::Kind::Disconnected:
        connected = false;
        whyNot = noConnection;
        host.raise(
            "warning", "brenix:Device:disconnected",
            ("The connection with " + connection.server() + " has ended: " + event.text).c_str());
        dropUnconfirmed();
        break;
    case Event::Kind::Reconnected:
        connected = true;
        whyNot.clear();
        dropUnconfirmed();
        host.updateProperty(makeScalar("Server", connection.server()));
        for (Again& message : again) {
            message.at = Clock::now();
        }
        break;
    case Event::Kind::Closed:
    case Event::Kind::Error:
        failure = event.text;
        break;
    case Event::Kind::Message:
        break;
    }
}

// --- What is to be sent ---

/// Looks whether the channel is closing; from then on, time is limited. Whether it is over.
bool Writer::mayEnd()
{
    if (!deadline && streams->isClosing()) {
        deadline = Clock::now() + settings.closeTimeout;
    }
    return deadline && Clock::now() >= *deadline;
}

bool Writer::hasRoom()
{
    if (!connected || mayEnd()) {
        return false;
    }
    if (stream) {
        return begun && unstored.size() < settings.window && unstoredBytes < mostUnstored;
    }
    if (unconfirmedBytes >= mostUnconfirmed) {
        confirm(200);
    }
    return unconfirmedBytes < mostUnconfirmed;
}

/// As far as there is room. Whether nothing is left.
bool Writer::sendAll()
{
    while (hasRoom()) {
        sayHello();
        if (rest == 0) {
            auto packet = streams->tryPull();
            if (!packet) {
                return true;
            }
            rest = packet->counts;
            current.packet = *std::move(packet);
            current.begin = 0;
        }
        sendPart();
    }
    return false;
}

/// Sends, or drops, a part of the current packet; leaves it where there is no connection.
void Writer::sendPart()
{
    const std::uint64_t begin = current.packet.counts - rest;
    try {
        const std::uint64_t counts = fitting(begin, rest);
        if (counts == 0) {
            ++tooLarge;
            sender.lose(1);
            --rest;
            if (rest == 0) {
                tell("brenix:Device:tooLarge");
            }
            return;
        }
        if (publish(current, {current.seq, Rank::Data}, counts)) {
            sender.sent(current);
            rest -= counts;
        }
    } catch (const messages::Malformed& problem) {
        unknown += rest;
        sender.lose(std::exchange(rest, 0));
        tell("brenix:Device:wrongType", problem.what());
    }
}

/// How many counts a message has room for; the current packet is numbered for them.
std::uint64_t Writer::fitting(std::uint64_t begin, std::uint64_t most)
{
    auto limit = static_cast<std::size_t>(
        std::max<std::int64_t>(natsConnection_GetMaxPayload(connection.get()), 0));
    if (stream) {
        limit = stream->maxMessage > 0
                    ? std::min(limit, static_cast<std::size_t>(stream->maxMessage))
                    : limit;
        limit -= std::min(limit, headerRoom);
    }
    const auto fits = [&](std::uint64_t counts) {
        sender.number(current, begin, counts);
        return messages::sizeOf(current) <= limit;
    };
    if (fits(most)) {
        return most;
    }
    std::uint64_t least = 0; // fits
    while (most - least > 1) {
        const std::uint64_t middle = least + (most - least) / 2;
        (fits(middle) ? least : most) = middle;
    }
    return least > 0 && fits(least) ? least : 0;
}

/// At the beginning, and again where readers may have come since.
void Writer::sayHello()
{
    const messages::Hello& hello = sender.hello();
    const auto now = Clock::now();
    const bool isFirst = helloTime == Moment();
    const bool isNew = hello.seq != helloSeq;
    const std::chrono::seconds pause(!stream ? 2 : unstored.empty() ? 5 : 10);
    const bool isDue = isFirst || (now - helloTime >= pause && (isNew || !stream));
    if (isDue && !ended && publish(hello, {hello.seq, Rank::Hello}, 0)) {
        helloTime = now;
        helloSeq = hello.seq;
        begun = begun || !stream;
    }
}

/// Waits until the server has taken what was sent.
void Writer::confirm(std::int64_t milliseconds)
{
    const natsStatus status = connection.flush(milliseconds);
    if (connection.reconnects() != reconnects) {
        dropUnconfirmed();
    } else if (status == NATS_OK) {
        unconfirmed = unconfirmedBytes = 0;
    } else if (connected) {
        whyNot = reasonOf(status);
    }
}

bool Writer::isAllConfirmed() const
{
    return stream ? unstored.empty() : connected && unconfirmedBytes == 0;
}

/// The connection in which it was sent is no more.
void Writer::dropUnconfirmed()
{
    reconnects = connection.reconnects();
    uncertain += std::exchange(unconfirmed, 0);
    unconfirmedBytes = 0;
    if (!stream) {
        tell("brenix:Device:dataLost");
    }
}

/// When there is something to do if nothing happens.
Moment Writer::nextTime() const
{
    const auto now = Clock::now();
    Moment time = now + std::chrono::seconds(2);
    if (!stream && unconfirmed > 0 && connected) {
        time = std::max(now, lastSent + idleTime);
    }
    if (!again.empty() && connected) {
        time = std::min(time, again.front().at);
    }
    return deadline ? std::min(time, std::max(*deadline, now)) : time;
}

// --- The end ---

void Writer::finish()
{
    for (const auto& [message, entry] : unstored) {
        unsent += entry.counts;
    }
    unsent += unconfirmed + rest + discardOutput(*streams);
    unconfirmed = rest = 0;
    if (!ended && failure.empty() && connected) { // then readers know how much is missing
        publish(sender.end(), {sender.end().seq, Rank::End}, 0);
    }
    if (!failure.empty()) {
        const std::string why = std::exchange(failure, {});
        whyNot.clear();
        tell("brenix:Device:failed", "Writing to " + sink + " failed: " + why + ".");
        return;
    }
    tell("brenix:Device:dataLost");
}

/// Raises an error if more is lost than was told, or to say something more. Each tells all, since it takes the
/// place of one that nobody has read yet.
void Writer::tell(const char* identifier, const std::string& what)
{
    std::string all;
    const auto add = [&](std::uint64_t counts, const std::string& sentence) {
        if (counts > 0) {
            all.append(all.empty() ? "" : " ").append(std::to_string(counts));
            all.append(sentence).append(".");
        }
    };
    const std::string why = whyNot.empty() ? whyNot : std::string(": ") + whyNot;
    add(unsent, stream ? " counts were not acknowledged by " + sink + why
                       : " counts were not taken by a server for " + sink + why);
    add(uncertain, " counts may not have arrived at " + sink + ", since the connection ended");
    add(tooLarge, " counts are each too large for a message to " + sink);
    add(unknown, " counts were not sent to " + sink);
    if (!what.empty() || all != told) {
        told = all;
        const std::string text = what + (what.empty() || all.empty() ? "" : " ") + all;
        host.raise("error", identifier, text.c_str());
    }
}

} // namespace natsio
