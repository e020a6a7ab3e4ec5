// What a radio receives, on its way to the input stream.
#ifndef BRENIX_PLUGINS_SOAPY_RECEIVER_HPP
#define BRENIX_PLUGINS_SOAPY_RECEIVER_HPP

#include "Radio.hpp"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <optional>

namespace soapy
{

/// One run. The radio is read all the time, so that what nobody takes is lost here, where it can be counted.
class Receiver
{
public:
    /// Packets have at most so many pairs; 0: as many as the driver moves at once.
    Receiver(Radio& ownRadio, std::size_t blockSize, brenixcore::plugin::DeviceHost& deviceHost,
             brenixcore::plugin::DeviceStreams& itsStreams);

    void run();

private:
    /// Counts since the driver last told the time.
    struct Stamp {
        std::int64_t time; ///< nanoseconds of the radio's clock, of the first of them
        std::uint64_t counts;
    };

    void take(brenixplugin::OwnedProperty data, std::size_t counts, int flags, long long time);
    bool hasJumped(std::int64_t time) const;
    void compareClocks();
    std::int64_t sinceEpoch(std::int64_t time, std::size_t counts);
    void noteGap(const char* reason);
    void closeGap(bool hasTime, std::int64_t time);
    void noteSilence();
    /// Nanoseconds of the radio's clock that have passed since the stamp.
    std::int64_t passed() const;

    Radio& radio;
    const std::size_t size; ///< pairs
    brenixcore::plugin::DeviceHost& host;
    brenixcore::plugin::DeviceStreams& streams;

    double rate;                                   ///< of the counts since the stamp
    std::optional<Stamp> stamp;                    ///< nothing where the driver tells no time
    std::chrono::steady_clock::time_point settled; ///< when no more may come at another rate
    std::optional<std::int64_t> offset; ///< from the radio's clock to the time since 1970
    const char* gap = nullptr;          ///< why counts are missing behind those that came last
    std::uint64_t overflows = 0;
    std::uint64_t unknown = 0; ///< gaps of which nobody knows how long they are
    std::chrono::steady_clock::time_point lastBlock;
    bool isSilent = false; ///< and that was told
};

} // namespace soapy

#endif
