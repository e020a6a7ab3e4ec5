#include "Card.hpp"

#include <sys/eventfd.h>

#include <algorithm>
#include <cerrno>
#include <ctime>
#include <optional>
#include <stdexcept>
#include <utility>

namespace alsa
{

namespace
{

constexpr std::int64_t second = 1000000000;

std::int64_t nanosecondsOf(const timespec& time)
{
    return static_cast<std::int64_t>(time.tv_sec) * second + time.tv_nsec;
}

} // namespace

Card::Card(const Settings& settings) : name(settings.name)
{
    auto result = callWithPatience<Opened>([settings] { return open(settings); });
    if (!result) {
        throw std::runtime_error("Could not open card " + name + ": it does not answer.");
    }
    opened = std::move(*result);
    snd_pcm_status_t* allocated = nullptr;
    require(::snd_pcm_status_malloc(&allocated));
    status.reset(allocated);
}

Card::~Card()
{
    try {
        close();
    } catch (...) { // there is no thread to be had: it stays open
    }
}

bool Card::close()
{
    return !opened.pcm || callWithPatience<bool>([pcm = opened.pcm.release()] {
        ClosePcm()(pcm);
        return true;
    });
}

void Card::run(const std::function<void()>& work)
{
    if (!watch.run(work)) {
        throw std::runtime_error("Card " + name + " does not answer.");
    }
}

snd_pcm_sframes_t Card::require(snd_pcm_sframes_t result) const
{
    if (result == -ENODEV) {
        throw std::runtime_error("Card " + name + " is gone: " + ::snd_strerror(-ENODEV) + ".");
    }
    if (result < 0) {
        throw std::runtime_error("Card " + name +
                                 " failed: " + ::snd_strerror(static_cast<int>(result)) + ".");
    }
    return result;
}

bool Card::isPlugin() const
{
    return ::snd_pcm_type(opened.pcm.get()) == SND_PCM_TYPE_IOPLUG;
}

std::int64_t Card::framesIn(std::int64_t nanoseconds) const
{
    return nanoseconds / second * opened.rate + nanoseconds % second * opened.rate / second;
}

std::int64_t Card::timeOf(std::int64_t frames) const
{
    return frames / opened.rate * second + frames % opened.rate * second / opened.rate;
}

Moment Card::look()
{
    require(watch.call([&] { return ::snd_pcm_status(opened.pcm.get(), status.get()); }));
    snd_htimestamp_t time{};
    ::snd_pcm_status_get_htstamp(status.get(), &time);
    const Moment now{::snd_pcm_status_get_state(status.get()),
                     static_cast<snd_pcm_sframes_t>(::snd_pcm_status_get_avail(status.get())),
                     ::snd_pcm_status_get_delay(status.get()),
                     nanosecondsOf(time) > 0 ? nanosecondsOf(time) : steadyTime()};
    return now;
}

void Card::start()
{
    auto* const pcm = opened.pcm.get();
    require(watch.call([pcm] { return ::snd_pcm_start(pcm); }));
    clocked = watch.call([pcm] { return ::snd_pcm_avail_update(pcm); }) != bufferSize();
}

void Card::prepare()
{
    require(watch.call([&] { return ::snd_pcm_prepare(opened.pcm.get()); }));
}

/// Moves frames by one of libasound's functions.
template <typename Function, typename... Frames>
snd_pcm_sframes_t Card::move(Function function, snd_pcm_sframes_t count, Frames... frames)
{
    const auto result = watch.call([&] {
        return function(opened.pcm.get(), frames..., static_cast<snd_pcm_uframes_t>(count));
    });
    const bool isNone = result == -EAGAIN || result == -EPIPE || result == -ESTRPIPE;
    return isNone ? 0 : require(result);
}

snd_pcm_sframes_t Card::read(void* frames, snd_pcm_sframes_t count)
{
    return move(::snd_pcm_readi, count, frames);
}

snd_pcm_sframes_t Card::write(const void* frames, snd_pcm_sframes_t count)
{
    return move(::snd_pcm_writei, count, frames);
}

snd_pcm_sframes_t Card::skip(snd_pcm_sframes_t count)
{
    return move(::snd_pcm_forward, count);
}

bool Card::wait(int event, bool forCard, int milliseconds)
{
    auto* const pcm = opened.pcm.get();
    const auto calls = [&](auto function, auto... arguments) {
        return require(watch.call([&] { return function(pcm, arguments...); }));
    };
    const auto count = forCard ? calls(::snd_pcm_poll_descriptors_count) : 0;
    descriptors.resize(1 + static_cast<std::size_t>(count));
    descriptors[0] = {event, POLLIN, 0};
    const auto own = static_cast<unsigned int>(count);
    if (forCard) {
        calls(::snd_pcm_poll_descriptors, &descriptors[1], own);
    }
    ::poll(descriptors.data(), descriptors.size(), milliseconds);
    if (descriptors[0].revents != 0) {
        eventfd_t times = 0;
        ::eventfd_read(event, &times);
    }
    unsigned short happened = 0;
    if (forCard) {
        calls(::snd_pcm_poll_descriptors_revents, &descriptors[1], own, &happened);
    }
    return (happened & (POLLIN | POLLOUT)) != 0;
}

snd_pcm_sframes_t Card::left()
{
    const Moment now = look();
    return now.state == SND_PCM_STATE_XRUN ? 0 : std::max(now.delay, bufferSize() - now.avail);
}

snd_pcm_sframes_t Card::drain(int event)
{
    Moment now = look();
    const std::int64_t limit =
        timeOf(std::max(bufferSize(), now.delay)) + std::chrono::nanoseconds(patience).count();
    if (clocked && isPlugin()) { // PulseAudio's may hang when it is drained after it has run dry
        const std::int64_t latest = now.time + limit;
        constexpr int soon = 10; // milliseconds
        std::int64_t end = now.time;
        while (!now.hasStopped() && now.avail < bufferSize() && now.time < latest) {
            end = now.time + timeOf(now.delay);
            wait(event, false, soon);
            now = look();
        }
        while (now.hasStopped() && steadyTime() < std::min(end, latest)) {
            wait(event, false, soon); // the server has got all, and is to play it
        }
        return now.hasStopped() || hasRunDry(now) ? 0 : left();
    }
    const int result = watch.call(
        [pcm = opened.pcm.get()] {
            ::snd_pcm_nonblock(pcm, 0);
            return ::snd_pcm_drain(pcm);
        },
        std::chrono::nanoseconds(limit));
    if (result != -EPIPE) { // which it has when all is played
        require(result);
    }
    return 0;
}

} // namespace alsa
