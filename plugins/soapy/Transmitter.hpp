// What is written to the output stream, on its way to a radio.
#ifndef BRENIX_PLUGINS_SOAPY_TRANSMITTER_HPP
#define BRENIX_PLUGINS_SOAPY_TRANSMITTER_HPP

#include "Radio.hpp"
#include "Told.hpp"

#include <chrono>
#include <cstdint>
#include <functional>
#include <optional>
#include <span>
#include <string>
#include <vector>

namespace soapy
{

/// One run.
class Transmitter
{
public:
    /// Waits until the device is woken, or until a time.
    using Wait = std::function<void(std::chrono::steady_clock::time_point)>;

    Transmitter(Radio& ownRadio, brenixcore::plugin::DeviceHost& deviceHost,
                brenixcore::plugin::DeviceStreams& itsStreams, Wait waitUntil);

    void run();

private:
    using Clock = std::chrono::steady_clock;

    void transmit();
    bool fetch();
    bool write();
    void noteSent(int pairs);
    void noteStuck();
    void noteDry(int flags, long long time);
    void tellDry(std::chrono::nanoseconds ago);
    void followStatus();
    void finish();
    std::string notSent();

    Radio& radio;
    const bytes::ElementType& type;
    const std::size_t pairSize; ///< bytes
    brenixcore::plugin::DeviceHost& host;
    brenixcore::plugin::DeviceStreams& streams;
    const Wait wait;

    bytes::OwnedProperty data;           ///< of a packet
    std::vector<unsigned char> torn;     ///< the I whose Q is in the next packet
    std::vector<unsigned char> joined;   ///< such an I, and the data of the next packet
    std::span<const unsigned char> rest; ///< of what is not sent yet

    bool hasStatus = true;
    bool hasSent = false;
    bool isStuck = false;        ///< and that was told
    Clock::time_point lastTaken; ///< when the radio took something, or had nothing to take
    Clock::time_point end;       ///< when the radio has sent all that it took, by its rate
    Clock::time_point begin;     ///< when it got something and had nothing, by its rate
    bool hasEnded = false;       ///< the radio says that it has sent all
    bool isDry = false;          ///< it had nothing to send, which is told if there is more
    bool isTold = false;         ///< that it had run dry before that
    std::optional<std::int64_t> drySince; ///< by the radio's clock
    std::uint64_t underflows = 0;
    std::uint64_t silence = 0;   ///< counts
    std::uint64_t untimed = 0;   ///< underflows of which nobody knows how long they were
    std::uint64_t wrongType = 0; ///< elements
    bytes::Told told;
};

} // namespace soapy

#endif
