#include "Reading.hpp"

#include <chrono>
#include <memory>
#include <utility>

namespace zeromq
{

using namespace brenixcore::plugin;
using std::chrono::milliseconds;

void Reading::run(DeviceStreams& streams)
{
    receiver.begin();
    link.attend(true);
    while (!streams.isClosing() && (waiting || !receiver.isDone())) {
        constexpr int some = 256; // then the peers are looked after
        bool isIdle = false;
        deliver(streams);
        for (int i = 0; i < some && !waiting && !isIdle && !receiver.isDone(); ++i) {
            isIdle = !receive(streams);
            deliver(streams);
        }
        const bool isDone = !waiting && receiver.isDone();
        if (link.wait(wakeUp, isIdle ? ZMQ_POLLIN : 0,
                      milliseconds(!isDone && (isIdle || waiting) ? 10000 : 0), isIdle)) {
            link.attend(isIdle);
        }
    }
    finish(streams);
}

/// Takes a frame, if one is there. Of one that has a topic, which is the first of several, nothing is
/// said; every other frame is a message.
bool Reading::receive(DeviceStreams& streams)
{
    if (!frame.receive(link.getSocket())) {
        return false;
    }
    const bool isTopic = settings.pattern == Pattern::Subscribe && isFirst && frame.hasMore();
    isFirst = !frame.hasMore();
    if (!isTopic) {
        std::shared_ptr<unsigned char> owner;
        const std::size_t size = frame.size();
        if (size >= messages::largeArray) {
            const auto kept = std::make_shared<Frame>(std::move(frame));
            owner = {kept, kept->data()};
        }
        waiting = receiver.take(owner ? owner.get() : frame.data(), size, link.getEndpoint(),
                                streams, owner);
    }
    return true;
}

void Reading::deliver(DeviceStreams& streams)
{
    if (waiting && streams.tryPush(*waiting)) {
        waiting.reset();
    }
}

/// What libzmq has of packets that go to one reader alone is lost.
void Reading::finish(DeviceStreams& streams)
{
    link.tellRefusals();
    std::uint64_t lost = 0;
    const auto drop = [&] {
        lost += waiting ? waiting->counts : 0;
        waiting.reset();
    };
    if (settings.pattern == Pattern::Pull) {
        drop();
        for (int i = 0; i < settings.highWater && receive(streams); ++i) {
            drop();
        }
        if (lost > 0) {
            streams.tellLost(lost, "the channel closed before they were read");
        }
    }
    link.close(milliseconds(0));
}

} // namespace zeromq
