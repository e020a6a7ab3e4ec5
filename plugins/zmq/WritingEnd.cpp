// The end of a run: what is queued is handed over, and what was not is told.

#include "Writing.hpp"

#include <algorithm>
#include <string>
#include <utility>

namespace zeromq
{

using namespace brenixcore::plugin;
using std::chrono::milliseconds;

/// Whether the systems of all peers have taken everything before the time is over.
bool Writing::waitUntilHandedOver()
{
    const auto isOver = [this] { return outstanding.messages == 0 && link.getQueued() == 0; };
    while (!isOver() && Clock::now() < *deadline) {
        wait(State::Idle, milliseconds(2));
    }
    return isOver();
}

/// To each peer, if nothing is before it: then they have their turns. One that is behind gets none; one that
/// gets two takes the second for nothing.
void Writing::sendEnd()
{
    wait(State::Idle, milliseconds(0));
    hear();
    link.hear(); // who has room again
    const std::uint64_t times = settings.pattern == Pattern::Publish ? 1 : link.getPeers();
    for (std::uint64_t i = 0; i < times; ++i) {
        Frame frame;
        make(frame, sender.end(), 0);
        send(frame);
    }
}

void Writing::finish(DeviceStreams& streams)
{
    undelivered = discardOutput(streams);
    sender.lose(undelivered);
    sendEnd(); // one who is behind does not keep it from the others
    if (waitUntilHandedOver()) {
        sendEnd();
        waitUntilHandedOver();
    }
    undelivered += outstanding.counts;
    link.tellRefusals();
    unconfirmed = undelivered == 0 ? link.getQueued() : 0;
    const auto now = Clock::now();
    link.close(std::chrono::ceil<milliseconds>(std::max(*deadline, now) - now));
    tell();
}

/// Raises an error if more is lost than was told.
void Writing::tell()
{
    std::string text;
    const auto add = [&](std::uint64_t number, const std::string& sentence) {
        if (number > 0) {
            text.append(text.empty() ? "" : " ").append(std::to_string(number)).append(sentence);
        }
    };
    const std::string& endpoint = link.getEndpoint();
    add(unfit, " counts were not sent to " + endpoint + ": " + why + ".");
    add(doubtful, " counts were on their way when a reader at " + endpoint +
                      " went, and may be lost with it.");
    add(undelivered, " counts were not sent to " + endpoint + ": they were not taken in time.");
    add(unconfirmed, " bytes of the last packets had not arrived from " + endpoint + " in time.");
    if (text != std::exchange(told, text)) {
        const bool isLoss = doubtful + undelivered + unconfirmed > 0;
        host.raise("error", isLoss ? "brenix:Device:dataLost" : "brenix:Device:wrongType",
                   text.c_str());
    }
}

} // namespace zeromq
