// What a reader tells and asks of a stream: what was read, what waits, and whether its place is there.

#include "Reader.hpp"

#include <algorithm>
#include <utility>

namespace natsio
{

namespace
{

constexpr const char* ack = "+ACK";
constexpr const char* inProgress = "+WPI";
constexpr const char* notYet = "-NAK";

constexpr auto touchPause = ackWait / 5;

} // namespace

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
