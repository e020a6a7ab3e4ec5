#include "Receiver.hpp"

#include "brenixcore/plugin/Make.hpp"

#include <SoapySDR/Constants.h>
#include <SoapySDR/Errors.h>

#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <string>
#include <utility>

namespace soapy
{

using namespace brenixcore::plugin;
using std::chrono::steady_clock;

namespace
{

constexpr const char* overflowed = "the radio overflowed";
constexpr const char* wasSilent = "the radio was silent";

constexpr std::int64_t second = 1000000000; // nanoseconds

std::int64_t now()
{
    const auto time = std::chrono::system_clock::now().time_since_epoch();
    return std::chrono::duration_cast<std::chrono::nanoseconds>(time).count();
}

std::int64_t durationOf(std::uint64_t counts, double rate)
{
    return std::llround(static_cast<double>(counts) * 1e9 / rate);
}

} // namespace

Receiver::Receiver(Radio& ownRadio, std::size_t blockSize, DeviceHost& deviceHost,
                   DeviceStreams& itsStreams)
    : radio(ownRadio), size(blockSize > 0 ? blockSize : radio.pairsAtOnce()), host(deviceHost),
      streams(itsStreams), rate(radio.rate())
{
}

void Receiver::run()
{
    compareClocks();
    lastBlock = steady_clock::now();
    const bytes::ElementType& type = radio.elementType();
    bytes::OwnedProperty block;
    while (!streams.isClosing()) {
        if (block == nullptr) {
            block = type.make(2 * size);
        }
        int flags = 0;
        long long time = 0;
        const auto elements = *type.find(block.get());
        const int got = radio.read(elements.data(), size, flags, time);
        if (got > 0) {
            const auto counts = static_cast<std::size_t>(got);
            bytes::OwnedProperty data;
            if (counts < size / 2) { // or packets would hold memory that they do not use
                data = type.make(2 * counts);
                std::copy_n(elements.data(), 2 * counts * type.size, type.find(data.get())->data());
            } else {
                type.shorten(block.get(), 2 * counts);
                data = std::move(block);
            }
            take(std::move(data), counts, flags, time);
        } else if (got == SOAPY_SDR_TIMEOUT || got == 0) {
            noteSilence();
        } else if (got == SOAPY_SDR_OVERFLOW) {
            noteGap(overflowed);
        } else if (got == SOAPY_SDR_CORRUPTION) {
            noteGap("what came from the radio was damaged");
        } else {
            throw radio.failure(got);
        }
    }
}

void Receiver::take(bytes::OwnedProperty data, std::size_t counts, int flags, long long time)
{
    const bool hasTime = (flags & SOAPY_SDR_HAS_TIME) != 0;
    if (const double set = radio.rate(); set != rate) {
        rate = set;
        stamp.reset(); // nobody knows with which count that began
        settled = steady_clock::now() + std::chrono::nanoseconds(second);
    }
    if (gap == nullptr && hasTime && hasJumped(time)) {
        noteGap("the radio's time jumped");
    }
    if (gap != nullptr) {
        closeGap(hasTime, time);
    }
    if (hasTime) {
        stamp = Stamp{time, 0};
    }
    Packet packet;
    packet.counts = counts;
    packet.period = 1e9 / rate;
    packet.time = stamp ? sinceEpoch(stamp->time + passed(), counts) : 0;
    setField(packet, std::move(data));
    if (!streams.tryPush(packet) && !streams.isClosing()) {
        streams.tellLost(counts, "nobody took them in time");
    }
    if (stamp) {
        stamp->counts += counts;
    }
    if ((flags & SOAPY_SDR_END_ABRUPT) != 0) {
        noteGap(overflowed);
    }
    lastBlock = steady_clock::now();
    isSilent = false;
}

std::int64_t Receiver::passed() const
{
    return durationOf(stamp->counts, rate);
}

/// Whether counts are missing, of which the driver says nothing else. Some take the time from the system's clock.
bool Receiver::hasJumped(std::int64_t time) const
{
    constexpr std::int64_t inaccurate = second / 100;
    return stamp && steady_clock::now() >= settled &&
           time - stamp->time - passed() > std::max(inaccurate, durationOf(10, rate));
}

/// A radio's clock begins anywhere. One that is right already is better than the comparison.
void Receiver::compareClocks()
{
    const std::int64_t before = now();
    if (const auto clock = radio.clock()) {
        offset = before + (now() - before) / 2 - *clock;
        offset = std::abs(*offset) < second ? 0 : *offset;
    }
}

/// From a time of the radio's clock; that of the first of these counts, which have just come.
std::int64_t Receiver::sinceEpoch(std::int64_t time, std::size_t counts)
{
    if (!offset) {
        offset = now() - durationOf(counts, rate) - time;
        offset = std::abs(*offset) < second ? 0 : *offset;
    }
    return time + *offset;
}

void Receiver::noteGap(const char* reason)
{
    gap = reason;
    host.updateProperty(makeScalar("Overflows", ++overflows));
}

/// How long it was, by the time of the first count behind it.
void Receiver::closeGap(bool hasTime, std::int64_t time)
{
    const char* const reason = std::exchange(gap, nullptr);
    const std::int64_t missing = hasTime && stamp ? time - stamp->time - passed() : -second;
    const auto counts = std::llround(static_cast<double>(missing) * rate / 1e9);
    if (counts > 0) {
        streams.tellLost(static_cast<std::uint64_t>(counts), reason);
    } else if (counts < 0) {
        stamp.reset();
        if (reason == wasSilent) {
            return; // it may have lost nothing
        }
        const std::string message = "Radio " + radio.name() + " lost counts " +
                                    std::to_string(++unknown) +
                                    " times since open and did not tell how many: " + reason + ".";
        host.raise("error", "brenix:Device:dataLost", message.c_str());
    }
}

void Receiver::noteSilence()
{
    const auto usual = std::chrono::nanoseconds(durationOf(size, rate));
    if (!isSilent && steady_clock::now() - lastBlock > patience + usual) {
        isSilent = true;
        gap = gap != nullptr ? gap : wasSilent;
        const std::string message = "Radio " + radio.name() + " delivers nothing.";
        host.raise("error", "brenix:Device:timeout", message.c_str());
    }
}

} // namespace soapy
