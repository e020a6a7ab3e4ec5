// What is written to the output stream, on its way to a card.
#ifndef BRENIX_PLUGINS_ALSA_PLAYBACK_HPP
#define BRENIX_PLUGINS_ALSA_PLAYBACK_HPP

#include "Card.hpp"
#include "Elements.hpp"
#include "Event.hpp"
#include "Told.hpp"
#include "brenixcore/plugin/Plugin.hpp"

#include <asio/buffer.hpp>

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

namespace alsa
{

/// One run. The card starts when its buffer is full, or when nothing is written for half the time of that.
class Playback
{
public:
    Playback(std::shared_ptr<Card> ownCard, const Settings& what,
             brenixcore::plugin::DeviceHost& deviceHost,
             brenixcore::plugin::DeviceStreams& itsStreams, Event& wakeUp);

    /// Works until the channel closes and all is played.
    void work();

    /// After the work has failed or was left behind: sentences on what was not played, if anything is, and on what was
    /// told before.
    std::string notPlayed();

private:
    void play();
    bool fetch();
    bool write();
    void followCard();
    void start();
    void tellSilence();
    void await(bool closing);
    void finish();

    const std::shared_ptr<Card> shared;
    Card& card;
    const std::string name;
    const std::size_t channels;
    const bytes::ElementType& type;
    const std::size_t frameSize; ///< bytes
    brenixcore::plugin::DeviceHost& host;
    brenixcore::plugin::DeviceStreams& streams;
    Event& event;

    brenixplugin::OwnedProperty data; ///< of a packet
    std::vector<unsigned char>
        torn; ///< the first samples of a frame that goes on in the next packet
    std::vector<unsigned char> joined; ///< such samples, and the data of the next packet
    asio::const_buffer rest;           ///< of what is not written yet

    bool running = false;
    std::int64_t written = 0; ///< frames that the card has got while it does not run
    std::optional<std::int64_t>
        left;                   ///< frames that the card had got and not played as the work failed
    std::int64_t lastWrite = 0; ///< when it took frames
    std::int64_t end = 0;       ///< when all is played that it has got
    bool isReady = false;       ///< to be written
    bool ranDry = false;        ///< and has got nothing since
    std::int64_t silence = 0;   ///< frames
    std::uint64_t underruns = 0;
    std::uint64_t wrongType = 0; ///< counts
    bytes::Told told;
};

} // namespace alsa

#endif
