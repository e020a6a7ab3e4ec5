#include "Capture.hpp"

#include "brenixcore/plugin/Make.hpp"

#include <algorithm>
#include <chrono>
#include <cstring>
#include <utility>

namespace alsa
{

using namespace brenixcore::plugin;

namespace
{

constexpr const char* notTaken = "nobody took them in time";
constexpr const char* overwritten = "the card's buffer was full";
constexpr const char* notDelivered = "the card had stopped, by its clock";

/// What is to be added to a time of the card's clock to have that since 1970.
std::int64_t sinceEpoch()
{
    const auto now = std::chrono::system_clock::now().time_since_epoch();
    return std::chrono::duration_cast<std::chrono::nanoseconds>(now).count() - steadyTime();
}

} // namespace

Capture::Capture(std::shared_ptr<Card> ownCard, const Settings& what, DeviceHost& deviceHost,
                 DeviceStreams& itsStreams, Event& wakeUp)
    : shared(std::move(ownCard)), card(*shared),
      blockSize(static_cast<snd_pcm_sframes_t>(what.blockSize)),
      mostKept(card.bufferSize() - std::max(card.bufferSize() / 4, blockSize)),
      channels(what.channels), type(*bytes::findType(what.format.name)), host(deviceHost),
      streams(itsStreams), event(wakeUp)
{
}

void Capture::fail()
{
    if (waiting) {
        streams.push(std::move(*waiting)); // there is time now
    }
    if (filled >
        0) { // copied: a call that was left behind may still write to what follows in the block
        const auto samples = static_cast<std::size_t>(filled * channels);
        auto part = type.make(samples);
        std::memcpy(type.find(part.get())->data(), type.find(block.get())->data(),
                    samples * type.size);
        Packet packet;
        packet.counts = static_cast<std::uint64_t>(filled);
        packet.time = blockTime;
        setField(packet, std::move(part));
        streams.push(std::move(packet));
    }
}

void Capture::work()
{
    card.start();
    while (!streams.isClosing()) {
        const Moment now = card.look();
        if (now.hasStopped()) {
            restart();
        } else if (card.hasClock() && now.avail > card.bufferSize()) {
            passOverLost(now);
        } else {
            compareClock(now);
            await(take(now));
        }
    }
}

/// What the card would have delivered until it runs again is lost.
void Capture::restart()
{
    card.prepare();
    card.start();
    const Moment now = card.look();
    if (now.hasStopped()) {
        constexpr int soon = 10; // milliseconds
        card.wait(event.handle(), false, soon);
        return;
    }
    if (known) {
        const std::int64_t due = known->frames + card.framesIn(now.time - known->time);
        lose(due - now.avail - taken, overwritten);
    }
    known = Position{now.time, taken + now.avail};
    before.reset();
}

/// The card goes on over what was not read: that is passed over, and a little more, as it does not wait now.
void Capture::passOverLost(const Moment& now)
{
    const auto lost = card.skip(now.avail - card.bufferSize() + card.periodSize());
    if (lost == 0) {
        restart();
    } else {
        lose(lost, overwritten);
    }
}

/// A sound server that loses frames while the program is stopped for long does not tell: then fewer have come than
/// time has passed, once what it has kept is read.
void Capture::compareClock(const Moment& now)
{
    if (!card.hasClock() || (!known && now.avail == 0)) {
        return; // what comes first may come late
    }
    const std::int64_t here = taken + now.avail;
    if (known && !before && now.time - known->time > card.timeOf(card.bufferSize())) {
        before = known;
    }
    known = Position{now.time, here};
    if (before && now.avail <= card.bufferSize() / 2) {
        const std::int64_t time = now.time - before->time;
        const std::int64_t missing = card.framesIn(time) - (here - before->frames);
        const std::int64_t clocksDiffer = card.framesIn(time / 1000) + card.rate() / 20;
        before.reset();
        if (missing > clocksDiffer) {
            known->frames += missing;
            lose(missing, notDelivered);
        }
    }
}

/// Reads the blocks that are there; less where the card says that it is ready all the same, or it would say so
/// again at once. Returns how many frames are left.
snd_pcm_sframes_t Capture::take(const Moment& now)
{
    const std::int64_t offset = sinceEpoch();
    snd_pcm_sframes_t available = now.avail;
    snd_pcm_sframes_t delay = now.delay;
    const snd_pcm_sframes_t usual = card.isToBeEmptied() ? 1 : blockSize;
    snd_pcm_sframes_t least = isReady ? 1 : usual;
    while (available >= std::min(least, blockSize - filled) && makeRoom(available)) {
        if (filled == 0) {
            block = type.make(static_cast<std::size_t>(blockSize * channels));
            blockTime = card.hasClock() ? now.time + offset - card.timeOf(delay) : 0;
        }
        auto* const space = static_cast<unsigned char*>(type.find(block.get())->data()) +
                            static_cast<std::size_t>(filled * channels) * type.size;
        const auto frames = card.read(space, std::min(available, blockSize - filled));
        if (frames == 0) {
            return 0;
        }
        const std::int64_t passed = card.framesIn(steadyTime() - now.time);
        if (card.overwrites() && available + passed > card.bufferSize()) {
            lose(frames, overwritten); // perhaps while they were read
        } else {
            taken += frames;
            filled += frames;
            if (filled == blockSize) {
                endBlock();
            }
        }
        available -= frames;
        delay -= frames;
        least = usual;
    }
    return available;
}

void Capture::endBlock()
{
    if (filled > 0) {
        type.shorten(block.get(), static_cast<std::size_t>(filled * channels));
        waiting.emplace();
        waiting->counts = static_cast<std::uint64_t>(std::exchange(filled, 0));
        waiting->time = blockTime;
        setField(*waiting, std::move(block));
    }
}

/// Whether a block may be read: the one that waits for room is lost when the card can keep no more.
bool Capture::makeRoom(snd_pcm_sframes_t available)
{
    if (!deliver() && card.hasClock() && available >= mostKept) {
        dropWaiting();
    }
    return !waiting;
}

/// Whether no packet waits any longer.
bool Capture::deliver()
{
    if (waiting && streams.tryPush(*waiting)) {
        waiting.reset();
        losing = false;
    }
    return !waiting;
}

void Capture::dropWaiting()
{
    const std::uint64_t counts = waiting->counts;
    waiting.reset();
    tellLost(counts, notTaken);
}

/// Frames that were not read are lost.
void Capture::lose(std::int64_t frames, const char* reason)
{
    if (frames > 0) {
        endBlock();
        if (!deliver()) { // it was before them, and could only be delivered behind them
            dropWaiting();
        }
        taken += frames;
        tellLost(static_cast<std::uint64_t>(frames), reason);
    }
}

void Capture::tellLost(std::uint64_t frames, const char* reason)
{
    if (!std::exchange(losing, true)) {
        host.updateProperty(makeScalar("Overruns", ++overruns));
    }
    streams.tellLost(frames, reason);
}

/// Waits for the card, or for room in the stream and for the time at which the card can keep no more.
void Capture::await(snd_pcm_sframes_t available)
{
    const bool awaitsRoom = !deliver();
    int milliseconds = -1;
    if (awaitsRoom && card.hasClock()) {
        const auto time = card.timeOf(std::max<std::int64_t>(mostKept - available, 0));
        milliseconds = static_cast<int>(time / 1000000) + 1;
    }
    isReady = card.wait(event.handle(), !awaitsRoom, milliseconds);
}

} // namespace alsa
