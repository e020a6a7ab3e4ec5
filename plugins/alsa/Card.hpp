// A sound card that is used without waiting for it.
#ifndef BRENIX_PLUGINS_ALSA_CARD_HPP
#define BRENIX_PLUGINS_ALSA_CARD_HPP

#include "Open.hpp"
#include "Watch.hpp"

#include <alsa/asoundlib.h>
#include <poll.h>

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <vector>

namespace alsa
{

/// A card at one time.
struct Moment {
    snd_pcm_state_t state = SND_PCM_STATE_OPEN;
    snd_pcm_sframes_t avail = 0; ///< frames that can be read or written
    snd_pcm_sframes_t delay = 0; ///< frames between the program and the converter
    std::int64_t time = 0;       ///< as of steadyTime()

    /// Whether it has stopped by itself: its buffer has run over or dry, or the system has slept.
    bool hasStopped() const
    {
        return state != SND_PCM_STATE_RUNNING && state != SND_PCM_STATE_PREPARED;
    }
};

/// Its operations throw a std::runtime_error that names the card when it fails. Those that move frames, and those that
/// tell of the card, are for the work of run() alone.
class Card
{
public:
    /// Opens it.
    explicit Card(const Settings& settings);
    Card(const Card&) = delete;
    Card& operator=(const Card&) = delete;
    /// Closes it, if that was not done.
    ~Card();

    /// Closes it; what is not played is dropped. Returns whether it is closed, or else is left to itself, as it does
    /// not answer.
    bool close();

    /// Runs work on a thread of its own and throws what it throws. Where the card does not answer, throws that and
    /// leaves the work behind: that must share all it uses, the card, too.
    void run(const std::function<void()>& work);

    unsigned int rate() const { return opened.rate; }
    snd_pcm_sframes_t bufferSize() const { return snd_pcm_sframes_t(opened.bufferSize); }
    snd_pcm_sframes_t periodSize() const { return snd_pcm_sframes_t(opened.periodSize); }

    /// Whether frames come and go by a clock. There are always some where not.
    bool hasClock() const { return clocked; }

    /// Whether frames that wait to be read may be overwritten at any time.
    bool overwrites() const { return clocked && !isPlugin(); }

    /// Whether each look should be followed by reading all: PulseAudio's client waits for ever when its server
    /// ends while a piece is read in part.
    bool isToBeEmptied() const { return clocked && isPlugin(); }

    /// Whether all is played, though it has not stopped: PulseAudio's does not where its server has not asked for the
    /// last period anew.
    bool hasRunDry(const Moment& now) const
    {
        return clocked && now.delay <= 0 && now.avail >= bufferSize() - periodSize();
    }

    std::int64_t framesIn(std::int64_t nanoseconds) const;
    std::int64_t timeOf(std::int64_t frames) const;

    Moment look();

    void start();
    /// After it has stopped.
    void prepare();

    /// Move frames; how many, which are none where the card has stopped.
    snd_pcm_sframes_t read(void* frames, snd_pcm_sframes_t count);
    snd_pcm_sframes_t write(const void* frames, snd_pcm_sframes_t count);
    /// Passes over frames.
    snd_pcm_sframes_t skip(snd_pcm_sframes_t count);

    /// Waits for the event, for the card where that is asked for, and for some milliseconds: -1 is for ever.
    /// Returns whether the card says that it is ready.
    bool wait(int event, bool forCard, int milliseconds);

    /// Frames that it has got and not played.
    snd_pcm_sframes_t left();

    /// Waits until all is played, with an event that it may use up, as long as that should take and the patience.
    /// Returns how many frames were not.
    snd_pcm_sframes_t drain(int event);

private:
    bool isPlugin() const;
    snd_pcm_sframes_t require(snd_pcm_sframes_t result) const;
    template <typename Function, typename... Frames>
    snd_pcm_sframes_t move(Function function, snd_pcm_sframes_t count, Frames... frames);

    const std::string name;
    Opened opened;
    Watch watch;
    bool clocked = true;
    std::vector<pollfd> descriptors;
    std::unique_ptr<snd_pcm_status_t, decltype(&::snd_pcm_status_free)> status{
        nullptr, &::snd_pcm_status_free};
};

} // namespace alsa

#endif
