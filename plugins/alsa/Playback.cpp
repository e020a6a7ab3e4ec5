#include "Playback.hpp"

#include "brenixcore/plugin/Make.hpp"

#include <algorithm>
#include <exception>
#include <limits>
#include <stdexcept>
#include <utility>

namespace alsa
{

using namespace brenixcore::plugin;

Playback::Playback(std::shared_ptr<Card> ownCard, const Settings& what, DeviceHost& deviceHost,
                   DeviceStreams& itsStreams, Event& wakeUp)
    : shared(std::move(ownCard)), card(*shared), name(what.name), channels(what.channels),
      type(*bytes::findType(what.format.name)), frameSize(channels * type.size), host(deviceHost),
      streams(itsStreams), event(wakeUp), told(deviceHost)
{
}

void Playback::work()
{
    try {
        play();
    } catch (const std::exception&) {
        if (running) {
            try {
                left = card.left();
            } catch (const std::exception&) { // it is gone
            }
        }
        throw;
    }
}

void Playback::play()
{
    bool closing = false;
    while (!closing || rest.size() > 0) {
        closing = streams.isClosing(); // before the last look at the output
        while ((rest.size() > 0 || fetch()) && write()) {
        }
        if (!closing || rest.size() > 0) {
            await(closing);
        }
    }
    finish();
}

/// Takes the next packet. Returns whether there is one.
bool Playback::fetch()
{
    while (auto packet = streams.tryPull()) {
        auto next = takeField(*packet, dataField);
        const auto found = type.find(next.get());
        if (!found) {
            wrongType += packet->counts;
            const std::string typeName(type.name);
            told.raise(bytes::Told::wrongType, "brenix:Device:wrongType",
                       "Data to play must be " + typeName + ", but is " +
                           bytes::describe(next.get()) + ". " + std::to_string(wrongType) +
                           " elements of another type were not played on card " + name + ".");
        } else if (torn.empty()) {
            data = std::move(next);
            rest = asio::buffer(found->data(), found->size());
            return true;
        } else {
            const unsigned char* const first = found->data();
            joined = std::exchange(torn, {});
            joined.insert(joined.end(), first, first + found->size());
            rest = asio::buffer(joined);
            return true;
        }
    }
    return false;
}

/// Gives the card what it takes of the rest. Returns whether it took all.
bool Playback::write()
{
    const auto frames = static_cast<snd_pcm_sframes_t>(rest.size() / frameSize);
    if (frames == 0) {
        const auto* const first = static_cast<const unsigned char*>(rest.data());
        torn.assign(first, first + rest.size());
        rest = {};
        return true;
    }
    if (!std::exchange(
            isReady,
            true)) { // not before: PulseAudio drops as much as the time until it is written
        card.prepare();
    }
    const auto taken = card.write(rest.data(), frames);
    rest += static_cast<std::size_t>(taken) * frameSize;
    if (taken > 0) {
        lastWrite = steadyTime();
        written += running ? 0 : taken;
        if (running && ranDry) {
            tellSilence();
            end = lastWrite + card.timeOf(taken);
        }
    }
    const bool wasRunning = running;
    followCard();
    if (wasRunning && !running) {
        return true; // it takes some now
    }
    if (!running && (taken < frames || written >= card.bufferSize())) {
        start();
    }
    return taken == frames;
}

/// Notes when all will be played, or that it has run dry.
void Playback::followCard()
{
    const Moment now = card.look();
    if (now.hasStopped()) {
        end = std::min(end, now.time);
        running = false;
        isReady = false;
        ranDry = true;
        written = 0;
    } else if (running && card.hasRunDry(now)) {
        end = std::min(end, now.time);
        ranDry = true;
    } else if (running) {
        end = now.time + card.timeOf(now.delay);
    }
}

void Playback::start()
{
    card.start();
    running = true;
    if (ranDry) {
        tellSilence();
    }
    const Moment now = card.look();
    end = now.time + card.timeOf(now.delay);
}

/// From when it had run dry until now.
void Playback::tellSilence()
{
    const std::int64_t frames = std::max<std::int64_t>(card.framesIn(steadyTime() - end), 0);
    ranDry = false;
    silence += frames;
    host.updateProperty(makeScalar("Underruns", ++underruns));
    told.raise(bytes::Told::silence, "brenix:Device:dataLost",
               "Card " + name + " ran dry: " + std::to_string(frames) + " frames of silence; " +
                   std::to_string(silence) + " since open.");
}

/// Waits for output, or for the card to take what there is.
void Playback::await(bool closing)
{
    const bool isFull = rest.size() > 0;
    const std::int64_t now = steadyTime();
    constexpr std::int64_t millisecond = 1000000;
    std::int64_t latest = std::numeric_limits<std::int64_t>::max();
    if (closing) {
        latest =
            lastWrite + card.timeOf(card.periodSize()) + std::chrono::nanoseconds(patience).count();
    } else if (!isFull && !running && written > 0) {
        latest = lastWrite + card.timeOf(card.bufferSize()) / 2;
    } else if (!isFull && running && !ranDry &&
               card.hasClock()) { // it will run dry; some cards say when only as they do
        latest = std::clamp(end, now + 10 * millisecond, now + card.timeOf(card.periodSize()));
    }
    if (latest == std::numeric_limits<std::int64_t>::max()) {
        card.wait(event.handle(), isFull, -1);
    } else if (latest > now) {
        card.wait(event.handle(), isFull, static_cast<int>((latest - now) / millisecond) + 1);
    } else if (closing) {
        throw std::runtime_error("Card " + name + " takes no more.");
    } else {
        start();
    }
    if (running && !isFull) {
        followCard();
    }
}

/// Plays all that the card has got.
void Playback::finish()
{
    if (!running && written > 0) {
        start();
    }
    if (running) {
        written = card.drain(event.handle());
        running = false;
        if (written > 0) {
            throw std::runtime_error("Card " + name + " does not play on.");
        }
    }
    if (!torn.empty()) {
        throw std::runtime_error("The last frame for card " + name + " has " +
                                 std::to_string(torn.size() / type.size) + " of " +
                                 std::to_string(channels) + " samples and was not played.");
    }
}

std::string Playback::notPlayed()
{
    const std::int64_t byClock = std::max<std::int64_t>(card.framesIn(end - steadyTime()), 0);
    const std::int64_t inCard = running ? left.value_or(byClock) : written;
    const std::uint64_t frames = static_cast<std::uint64_t>(inCard) + rest.size() / frameSize +
                                 discardOutput(streams) / channels;
    return (frames == 0 ? "" : ' ' + std::to_string(frames) + " frames were not played.") +
           told.besides();
}

} // namespace alsa
