// What is written to the output stream, on its way to a card.
#ifndef BRENIX_PLUGINS_ALSA_PLAYBACK_HPP
#define BRENIX_PLUGINS_ALSA_PLAYBACK_HPP

#include "Card.hpp"
#include "Elements.hpp"
#include "Event.hpp"
#include "brenixcore/plugin/Plugin.hpp"

#include <asio/buffer.hpp>

#include <cstdint>
#include <string>
#include <vector>

namespace alsa
{

/// One run. The card starts when its buffer is full, or when nothing is written for half the time of that.
class Playback
{
public:
    Playback(Card& ownCard, const Settings& what, brenixcore::plugin::DeviceHost& deviceHost,
             brenixcore::plugin::DeviceStreams& itsStreams, Event& wakeUp);

    void run();

private:
    void play();
    bool fetch();
    bool write();
    void followCard();
    void start();
    void await(bool closing);
    void finish();
    std::string notPlayed();

    Card& card;
    const std::string& name;
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
    std::int64_t written = 0;   ///< frames that the card has got while it does not run
    std::int64_t lastWrite = 0; ///< when it took frames
    std::int64_t end = 0;       ///< when all is played that it has got
    bool ranDry = false;        ///< and has not started again
    std::int64_t silence = 0;   ///< frames
    std::uint64_t underruns = 0;
    std::uint64_t wrongType = 0; ///< counts
};

} // namespace alsa

#endif
