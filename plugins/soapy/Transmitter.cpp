#include "Transmitter.hpp"

#include "brenixcore/plugin/Make.hpp"

#include <SoapySDR/Constants.h>
#include <SoapySDR/Errors.h>

#include <algorithm>
#include <cmath>
#include <exception>
#include <limits>
#include <utility>

namespace soapy
{

using namespace brenixcore::plugin;

Transmitter::Transmitter(Radio& ownRadio, DeviceHost& deviceHost, DeviceStreams& itsStreams,
                         Wait waitUntil)
    : radio(ownRadio), type(radio.elementType()), pairSize(2 * type.size), host(deviceHost),
      streams(itsStreams), wait(std::move(waitUntil)), told(deviceHost)
{
}

void Transmitter::run()
{
    try {
        transmit();
    } catch (const std::exception& error) {
        throw std::runtime_error(error.what() + notSent() + told.besides());
    }
}

void Transmitter::transmit()
{
    lastTaken = Clock::now();
    bool closing = false;
    while (!closing || !rest.empty()) {
        closing = streams.isClosing(); // before the last look at the output
        while ((!rest.empty() || fetch()) && write()) {
        }
        if (!rest.empty()) {
            noteStuck();
        } else if (!closing) {
            wait(Clock::now() + callTime);
            lastTaken = Clock::now();
        }
        followStatus();
    }
    finish();
}

/// Takes the next packet. Returns whether there is one.
bool Transmitter::fetch()
{
    while (auto packet = streams.tryPull()) {
        auto next = takeField(*packet, dataField);
        const auto found = type.find(next.get());
        if (!found) {
            wrongType += packet->counts;
            told.raise(bytes::Told::wrongType, "brenix:Device:wrongType",
                       "Data to transmit must be " + std::string(type.name) + ", but is " +
                           bytes::describe(next.get()) + ". " + std::to_string(wrongType) +
                           " elements of another type were not sent by radio " + radio.name() +
                           ".");
            continue;
        }
        data = std::move(next);
        rest = *found;
        if (!torn.empty()) {
            joined = std::exchange(torn, {});
            joined.insert(joined.end(), rest.begin(), rest.end());
            rest = joined;
        }
        return true;
    }
    return false;
}

/// Gives the radio what it takes of the rest. Returns whether it took all.
bool Transmitter::write()
{
    constexpr std::size_t most = std::numeric_limits<int>::max() / 2;
    const std::size_t pairs = std::min(rest.size() / pairSize, most);
    if (pairs == 0) {
        torn.assign(rest.begin(), rest.end());
        rest = {};
        return true;
    }
    const int sent = radio.write(rest.data(), pairs, 0);
    if (sent > 0) {
        noteSent(sent);
        if (isDry) {
            tellDry({});
        }
    } else if (sent == SOAPY_SDR_UNDERFLOW) {
        noteDry(0, 0);
    } else if (sent != SOAPY_SDR_TIMEOUT && sent != 0) {
        throw radio.failure(sent);
    }
    followStatus();
    return rest.empty();
}

void Transmitter::noteSent(int pairs)
{
    rest = rest.subspan(static_cast<std::size_t>(pairs) * pairSize);
    hasSent = true;
    isStuck = false;
    lastTaken = Clock::now();
    if (lastTaken > end) {
        begin = lastTaken;
        isTold = false;
    }
    const std::chrono::duration<double> length(pairs / radio.rate());
    end = std::max(end, lastTaken) + std::chrono::duration_cast<Clock::duration>(length);
}

/// The radio has taken nothing. That holds a writer back, but not close.
void Transmitter::noteStuck()
{
    if (Clock::now() - lastTaken < patience) {
        return;
    }
    const std::string message = "Radio " + radio.name() + " takes no more.";
    if (streams.isClosing()) {
        throw std::runtime_error(message);
    }
    if (!std::exchange(isStuck, true)) {
        host.raise("error", "brenix:Device:timeout", (message + told.besides()).c_str());
    }
}

void Transmitter::followStatus()
{
    constexpr int most = 100; // whatever the driver says
    for (int i = 0; hasStatus && i < most; ++i) {
        int flags = 0;
        long long time = 0;
        const int status = radio.status(flags, time);
        if (status == SOAPY_SDR_TIMEOUT) {
            return;
        }
        if (status == SOAPY_SDR_UNDERFLOW) {
            noteDry(flags, time);
        } else if (status == SOAPY_SDR_NOT_SUPPORTED) {
            hasStatus = false;
        } else if (status == SOAPY_SDR_STREAM_ERROR) {
            throw radio.failure(status);
        } else if (status < 0) {
            told.raise(bytes::Told::damage, "brenix:Device:dataLost",
                       "Radio " + radio.name() + " may not have sent all that it took: " +
                           SoapySDR_errToStr(status) + ".");
        } else if ((flags & SOAPY_SDR_END_BURST) != 0) {
            hasEnded = true;
        }
    }
}

/// A status comes late: the radio may have got more since, and sends that.
void Transmitter::noteDry(int flags, long long time)
{
    if (!hasSent || isDry) {
        return;
    }
    const auto now = Clock::now();
    const auto clocksDiffer = callTime + (now - begin) / 10000;
    const bool sends = now + clocksDiffer < end;
    if (sends && isTold) {
        return; // some say it again and again
    }
    isDry = true;
    drySince = (flags & SOAPY_SDR_HAS_TIME) != 0 ? std::optional(time) : std::nullopt;
    if (sends) {
        tellDry(now - begin);
    }
}

/// The radio has run dry in the midst of what is sent, and got more so long ago.
void Transmitter::tellDry(std::chrono::nanoseconds ago)
{
    isDry = false;
    isTold = true;
    const auto clock = drySince ? radio.clock() : std::nullopt;
    const std::int64_t length = clock ? *clock - ago.count() - *drySince : -1;
    if (length >= 0) {
        const auto nanoseconds = static_cast<double>(length);
        silence += static_cast<std::uint64_t>(std::llround(nanoseconds * radio.rate() / 1e9));
    } else {
        ++untimed;
    }
    host.updateProperty(makeScalar("Underflows", ++underflows));
    std::string message = "Radio " + radio.name() + " ran dry " + std::to_string(underflows) +
                          " times since open, for " + std::to_string(silence) + " counts";
    if (untimed > 0) {
        message += "; it did not tell how long " + std::to_string(untimed) + " of them were";
    }
    told.raise(bytes::Told::silence, "brenix:Device:dataLost", message + ".");
}

/// Waits until all is sent.
void Transmitter::finish()
{
    constexpr std::chrono::milliseconds underway{100}; // on the way to the radio
    const auto isSending = [&] { return hasSent && Clock::now() < (isDry ? end : end + underway); };
    if (isSending()) {
        const int result = radio.write(rest.data(), 0, SOAPY_SDR_END_BURST);
        if (result == SOAPY_SDR_STREAM_ERROR) {
            throw radio.failure(result);
        }
    }
    while (!hasEnded && isSending()) {
        wait(std::min(end + underway, Clock::now() + callTime));
        followStatus();
    }
    if (!torn.empty()) {
        throw std::runtime_error("The last I for radio " + radio.name() + " has no Q.");
    }
}

/// A sentence on what is left after a failure, if anything is.
std::string Transmitter::notSent()
{
    const std::uint64_t elements = (rest.size() + torn.size()) / type.size + discardOutput(streams);
    const double inRadio = std::chrono::duration<double>(end - Clock::now()).count() * radio.rate();
    std::string text;
    if (elements > 0) {
        text += ' ' + std::to_string(elements) + " elements were not sent.";
    }
    if (hasSent && inRadio >= 1) {
        text += " Of those that it took, " + std::to_string(2 * std::llround(inRadio)) +
                " may not have been sent.";
    }
    return text;
}

} // namespace soapy
