#include "Card.hpp"

#include <sys/eventfd.h>

#include <algorithm>
#include <cerrno>
#include <ctime>
#include <future>
#include <optional>
#include <stdexcept>
#include <thread>
#include <tuple>
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

/// Calls what waits for a sound server, and waits no longer than the limit for it. Returns whether there is a
/// result, or throws what the call threw. A call that has not returned goes on alone.
template <typename Result>
std::optional<Result> callWithin(std::chrono::nanoseconds limit, std::function<Result()> call)
{
    std::packaged_task<Result()> task(std::move(call));
    std::future<Result> result = task.get_future();
    std::thread thread(std::move(task));
    if (result.wait_for(limit) == std::future_status::timeout) {
        thread.detach();
        return std::nullopt;
    }
    thread.join();
    return result.get();
}

} // namespace

std::int64_t steadyTime()
{
    timespec now{};
    ::clock_gettime(CLOCK_MONOTONIC, &now);
    return nanosecondsOf(now);
}

Card::Card(const Settings& settings) : name(settings.name)
{
    auto result = callWithin<Opened>(patience, [settings] { return open(settings); });
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
    if (hangs) {
        std::ignore = opened.pcm.release(); // it stays with the call
        return;
    }
    try {
        within(patience, [pcm = opened.pcm.release()] {
            ClosePcm()(pcm);
            return 0;
        });
    } catch (...) { // there is no thread to be had: it stays open
    }
}

int Card::within(std::chrono::nanoseconds limit, std::function<int()> call)
{
    const std::optional<int> result = callWithin<int>(limit, std::move(call));
    hangs = !result;
    return result.value_or(-ETIMEDOUT);
}

snd_pcm_sframes_t Card::require(snd_pcm_sframes_t result) const
{
    if (result == -ENODEV) {
        throw std::runtime_error("Card " + name + " is gone: " + ::snd_strerror(-ENODEV) + ".");
    }
    if (result == -ETIMEDOUT) {
        throw std::runtime_error("Card " + name + " does not answer.");
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
    require(::snd_pcm_status(opened.pcm.get(), status.get()));
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
    require(within(patience, [pcm = opened.pcm.get()] { return ::snd_pcm_start(pcm); }));
    clocked = ::snd_pcm_avail_update(opened.pcm.get()) != bufferSize();
}

void Card::prepare()
{
    require(within(patience, [pcm = opened.pcm.get()] { return ::snd_pcm_prepare(pcm); }));
}

snd_pcm_sframes_t Card::moved(snd_pcm_sframes_t result) const
{
    const bool isNone = result == -EAGAIN || result == -EPIPE || result == -ESTRPIPE;
    return isNone ? 0 : require(result);
}

snd_pcm_sframes_t Card::read(void* frames, snd_pcm_sframes_t count)
{
    return moved(::snd_pcm_readi(opened.pcm.get(), frames, static_cast<snd_pcm_uframes_t>(count)));
}

snd_pcm_sframes_t Card::write(const void* frames, snd_pcm_sframes_t count)
{
    return moved(::snd_pcm_writei(opened.pcm.get(), frames, static_cast<snd_pcm_uframes_t>(count)));
}

snd_pcm_sframes_t Card::skip(snd_pcm_sframes_t count)
{
    return moved(::snd_pcm_forward(opened.pcm.get(), static_cast<snd_pcm_uframes_t>(count)));
}

bool Card::wait(int event, bool forCard, int milliseconds)
{
    auto* const pcm = opened.pcm.get();
    const int count =
        forCard ? static_cast<int>(require(::snd_pcm_poll_descriptors_count(pcm))) : 0;
    descriptors.resize(1 + static_cast<std::size_t>(count));
    descriptors[0] = {event, POLLIN, 0};
    const auto own = static_cast<unsigned int>(count);
    if (forCard) {
        require(::snd_pcm_poll_descriptors(pcm, &descriptors[1], own));
    }
    ::poll(descriptors.data(), descriptors.size(), milliseconds);
    if (descriptors[0].revents != 0) {
        eventfd_t times = 0;
        ::eventfd_read(event, &times);
    }
    unsigned short happened = 0;
    if (forCard) {
        require(::snd_pcm_poll_descriptors_revents(pcm, &descriptors[1], own, &happened));
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
        while (!now.hasStopped() && now.avail < bufferSize() && now.time < latest) {
            wait(event, false, soon);
            now = look();
        }
        // One that does not stop has, by now, played what it has not asked for anew: up to a period.
        const bool isPlayed = now.delay <= 0 && now.avail >= bufferSize() - periodSize();
        return now.hasStopped() || isPlayed ? 0 : left();
    }
    auto* const pcm = opened.pcm.get();
    ::snd_pcm_nonblock(pcm, 0);
    const int result =
        within(std::chrono::nanoseconds(limit), [pcm] { return ::snd_pcm_drain(pcm); });
    if (result == -ETIMEDOUT) {
        return left();
    }
    if (result != -EPIPE) { // which it has when all is played
        require(result);
    }
    return 0;
}

} // namespace alsa
