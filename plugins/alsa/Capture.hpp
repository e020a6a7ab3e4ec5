// What a card hears, on its way into the input stream.
#ifndef BRENIX_PLUGINS_ALSA_CAPTURE_HPP
#define BRENIX_PLUGINS_ALSA_CAPTURE_HPP

#include "Card.hpp"
#include "Elements.hpp"
#include "Event.hpp"
#include "brenixcore/plugin/Plugin.hpp"

#include <cstdint>
#include <memory>
#include <optional>

namespace alsa
{

/// One run. A packet that finds no room waits, and the card keeps what comes meanwhile; before its buffer is
/// full, the packet is lost in favour of the next one: so a caller who is late costs what is told, to the count.
class Capture
{
public:
    Capture(std::shared_ptr<Card> ownCard, const Settings& what,
            brenixcore::plugin::DeviceHost& deviceHost,
            brenixcore::plugin::DeviceStreams& itsStreams, Event& wakeUp);

    /// Works until the channel closes.
    void work();

    /// Pushes what came before the work has failed or was left behind.
    void fail();

private:
    /// How far the card has come.
    struct Position {
        std::int64_t time;
        std::int64_t frames; ///< since the start
    };

    void restart();
    void passOverLost(const Moment& now);
    void compareClock(const Moment& now);
    snd_pcm_sframes_t take(const Moment& now);
    void endBlock();
    bool makeRoom(snd_pcm_sframes_t available);
    bool deliver();
    void dropWaiting();
    void await(snd_pcm_sframes_t available);
    void lose(std::int64_t frames, const char* reason);
    void tellLost(std::uint64_t frames, const char* reason);

    const std::shared_ptr<Card> shared;
    Card& card;
    const snd_pcm_sframes_t blockSize;
    const snd_pcm_sframes_t mostKept; ///< frames that may wait in the card
    const snd_pcm_sframes_t channels;
    const bytes::ElementType& type;
    brenixcore::plugin::DeviceHost& host;
    brenixcore::plugin::DeviceStreams& streams;
    Event& event;

    brenixplugin::OwnedProperty block;                 ///< that is being filled
    snd_pcm_sframes_t filled = 0;                      ///< frames of it
    std::int64_t blockTime = 0;                        ///< of its first frame, since 1970
    std::optional<brenixcore::plugin::Packet> waiting; ///< for room
    std::int64_t taken = 0;                            ///< frames that were read or lost
    std::optional<Position> known;                     ///< of the last look at the card
    std::optional<Position> before; ///< of the last one before the card was not looked at for long
    bool isReady = false;           ///< the card, as it says
    bool losing = false;            ///< since the last packet that was delivered
    std::uint64_t overruns = 0;
};

} // namespace alsa

#endif
