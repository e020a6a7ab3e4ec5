// A sound card for libasound that a test steers: by the clock, at 48 kHz, it hears the numbers 0, 1, 2 and so on, and
// goes on over what nobody reads.

#include <alsa/asoundlib.h>
#include <alsa/pcm_external.h>
#include <poll.h>
#include <sys/timerfd.h>
#include <unistd.h>

#include <atomic>
#include <cstdint>
#include <ctime>

extern std::atomic<long> cardAhead; ///< frames that it hears at once, besides
extern std::atomic<int> cardState;  ///< other than running, if any
extern std::atomic<bool> cardHangs; ///< when it is read
extern std::atomic<int> cardsOpen;

namespace
{

struct Card : snd_pcm_ioplug_t {
    snd_pcm_ioplug_callback_t calls{};
    long first = 0; ///< number, of this start
};

long heard()
{
    timespec now{};
    clock_gettime(CLOCK_MONOTONIC, &now);
    return now.tv_sec % 20000 * 48000 + now.tv_nsec / 1000 * 48 / 1000 + cardAhead;
}

int start(snd_pcm_ioplug_t* io)
{
    static_cast<Card*>(io)->first = heard();
    return 0;
}

snd_pcm_sframes_t pointer(snd_pcm_ioplug_t* io)
{
    if (cardState == SND_PCM_STATE_DISCONNECTED) {
        snd_pcm_ioplug_set_state(io, SND_PCM_STATE_DISCONNECTED);
    }
    return cardState == SND_PCM_STATE_XRUN ? -EPIPE : heard() - static_cast<Card*>(io)->first;
}

snd_pcm_sframes_t transfer(snd_pcm_ioplug_t* io, const snd_pcm_channel_area_t* areas,
                           snd_pcm_uframes_t offset, snd_pcm_uframes_t size)
{
    while (cardHangs) {
        usleep(1000);
    }
    auto* const samples = static_cast<std::int32_t*>(areas->addr) + offset;
    for (snd_pcm_uframes_t i = 0; i < size; ++i) {
        samples[i] = static_cast<std::int32_t>(static_cast<Card*>(io)->first +
                                               static_cast<long>(io->appl_ptr + i));
    }
    return static_cast<snd_pcm_sframes_t>(size);
}

int tick(snd_pcm_ioplug_t* io, pollfd* descriptor, unsigned int /*count*/, unsigned short* events)
{
    std::uint64_t times = 0;
    const auto got = read(io->poll_fd, &times, sizeof times);
    *events = got > 0 ? static_cast<unsigned short>(descriptor->events) : 0;
    return 0;
}

int close(snd_pcm_ioplug_t* io)
{
    ::close(io->poll_fd);
    delete static_cast<Card*>(io);
    --cardsOpen;
    return 0;
}

} // namespace

extern "C" {
SND_PCM_PLUGIN_DEFINE_FUNC(card)
{
    static_cast<void>(root);
    static_cast<void>(conf);
    auto* const card = new Card();
    ++cardsOpen;
    card->calls.start = start;
    card->calls.stop = [](snd_pcm_ioplug_t*) { return 0; };
    card->calls.pointer = pointer;
    card->calls.transfer = transfer;
    card->calls.poll_revents = tick;
    card->calls.close = close;
    card->version = SND_PCM_IOPLUG_VERSION;
    card->name = "card";
    card->callback = &card->calls;
    card->flags = SND_PCM_IOPLUG_FLAG_BOUNDARY_WA | SND_PCM_IOPLUG_FLAG_MONOTONIC;
    card->poll_fd = timerfd_create(CLOCK_MONOTONIC, TFD_NONBLOCK | TFD_CLOEXEC);
    card->poll_events = POLLIN;
    constexpr itimerspec often{{0, 10000000}, {0, 10000000}};
    timerfd_settime(card->poll_fd, 0, &often, nullptr);
    snd_pcm_ioplug_create(card, name, stream, mode);
    constexpr unsigned int format[] = {SND_PCM_FORMAT_S32};
    snd_pcm_ioplug_set_param_list(card, SND_PCM_IOPLUG_HW_FORMAT, 1, format);
    snd_pcm_ioplug_set_param_minmax(card, SND_PCM_IOPLUG_HW_CHANNELS, 1, 1);
    snd_pcm_ioplug_set_param_minmax(card, SND_PCM_IOPLUG_HW_RATE, 48000, 48000);
    snd_pcm_ioplug_set_param_minmax(card, SND_PCM_IOPLUG_HW_BUFFER_BYTES, 4096, 400000);
    *pcmp = card->pcm;
    return 0;
}
SND_PCM_PLUGIN_SYMBOL(card)
}
