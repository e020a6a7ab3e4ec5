#include <cstdarg>

extern "C" { // which the header forgets for its last function
#include <alsa/error.h>
}

#include "Open.hpp"

#include "brenixcore/plugin/Options.hpp"

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <stdexcept>

namespace alsa
{

using brenixcore::plugin::Options;

namespace
{

using HwParams = std::unique_ptr<snd_pcm_hw_params_t, decltype(&::snd_pcm_hw_params_free)>;
using SwParams = std::unique_ptr<snd_pcm_sw_params_t, decltype(&::snd_pcm_sw_params_free)>;

/// What libasound says of a failure before it returns; it would print it otherwise.
thread_local std::string said; // NOLINT(cppcoreguidelines-avoid-non-const-global-variables)

void keep(const char* /*file*/, int /*line*/, const char* /*function*/, int /*error*/,
          const char* format, va_list values)
{
    char text[256] = "";
    if (said.empty() && std::vsnprintf(text, sizeof text, format, values) > 0) {
        said = text; // the first is the cause
    }
}

/// For the time that something is opened.
struct KeepErrors {
    KeepErrors() : before(::snd_lib_error_set_local(keep)) { said.clear(); }
    KeepErrors(const KeepErrors&) = delete;
    KeepErrors& operator=(const KeepErrors&) = delete;
    ~KeepErrors() { ::snd_lib_error_set_local(before); }

    snd_local_error_handler_t before;
};

void require(int result, const Settings& settings)
{
    if (result < 0) {
        throw std::runtime_error("Could not open card " + settings.name + ": " +
                                 (said.empty() ? "" : said + ": ") + ::snd_strerror(result));
    }
}

[[noreturn]] void refuse(const Settings& settings, const char* option, const std::string& problem)
{
    Options::fail(option, "is not possible for card " + settings.name + ", " + problem);
}

void setFormat(snd_pcm_t* pcm, snd_pcm_hw_params_t* hardware, const Settings& settings)
{
    if (::snd_pcm_hw_params_set_format(pcm, hardware, settings.format.format) < 0) {
        std::string others;
        for (const SampleFormat& other : sampleFormats) {
            if (::snd_pcm_hw_params_test_format(pcm, hardware, other.format) == 0) {
                others.append(others.empty() ? "" : " or ").append(other.name);
            }
        }
        refuse(settings, "SampleFormat",
               others.empty() ? "which has none of the three; plughw: in place of hw: converts"
                              : "which has " + others);
    }
}

void setChannels(snd_pcm_t* pcm, snd_pcm_hw_params_t* hardware, const Settings& settings)
{
    if (::snd_pcm_hw_params_set_channels(pcm, hardware, settings.channels) < 0) {
        unsigned int least = 0;
        unsigned int most = 0;
        ::snd_pcm_hw_params_get_channels_min(hardware, &least);
        ::snd_pcm_hw_params_get_channels_max(hardware, &most);
        refuse(settings, "Channels",
               "which has " + std::to_string(least) +
                   (most > least ? " to " + std::to_string(most) : ""));
    }
}

/// Clocks are divided, so that a rate may be somewhat off.
void setRate(snd_pcm_t* pcm, snd_pcm_hw_params_t* hardware, const Settings& settings,
             unsigned int& rate)
{
    rate = settings.rate;
    require(::snd_pcm_hw_params_set_rate_near(pcm, hardware, &rate, nullptr), settings);
    if (std::abs(static_cast<double>(rate) - settings.rate) > 0.01 * settings.rate) {
        refuse(settings, "SampleRate", "the nearest of which is " + std::to_string(rate) + " Hz");
    }
}

void setBuffer(snd_pcm_t* pcm, snd_pcm_hw_params_t* hardware, const Settings& settings,
               Opened& opened)
{
    constexpr double usual = 0.5;
    const auto frames = [&](double seconds) {
        return static_cast<snd_pcm_uframes_t>(std::lround(seconds * opened.rate));
    };
    snd_pcm_uframes_t buffer = settings.bufferTime > 0
                                   ? frames(settings.bufferTime)
                                   : std::max(frames(usual), 4 * settings.blockSize);
    require(::snd_pcm_hw_params_set_buffer_size_near(pcm, hardware, &buffer), settings);
    snd_pcm_uframes_t period = settings.blockSize > 0 ? settings.blockSize : buffer / 4;
    require(::snd_pcm_hw_params_set_period_size_near(pcm, hardware, &period, nullptr), settings);
    require(::snd_pcm_hw_params(pcm, hardware), settings);
    require(::snd_pcm_hw_params_get_buffer_size(hardware, &opened.bufferSize), settings);
    require(::snd_pcm_hw_params_get_period_size(hardware, &opened.periodSize, nullptr), settings);
    if (2 * settings.blockSize > opened.bufferSize) {
        refuse(settings, "BlockSize",
               "whose buffer of " + std::to_string(opened.bufferSize) +
                   " frames has to hold two blocks");
    }
}

void setSoftware(snd_pcm_t* pcm, const Settings& settings, const Opened& opened)
{
    snd_pcm_sw_params_t* allocated = nullptr;
    require(::snd_pcm_sw_params_malloc(&allocated), settings);
    const SwParams software(allocated, &::snd_pcm_sw_params_free);
    require(::snd_pcm_sw_params_current(pcm, allocated), settings);
    snd_pcm_uframes_t never = 0;
    require(::snd_pcm_sw_params_get_boundary(allocated, &never), settings);
    require(::snd_pcm_sw_params_set_start_threshold(pcm, allocated, never), settings);
    if (!settings.plays) { // what is available then tells how many frames were overwritten
        require(::snd_pcm_sw_params_set_stop_threshold(pcm, allocated, never), settings);
    }
    require(::snd_pcm_sw_params_set_avail_min(
                pcm, allocated, settings.plays ? opened.periodSize : settings.blockSize),
            settings);
    require(::snd_pcm_sw_params_set_tstamp_mode(pcm, allocated, SND_PCM_TSTAMP_ENABLE), settings);
    require(::snd_pcm_sw_params_set_tstamp_type(pcm, allocated, SND_PCM_TSTAMP_TYPE_MONOTONIC),
            settings);
    require(::snd_pcm_sw_params(pcm, allocated), settings);
}

} // namespace

Opened open(const Settings& settings)
{
    const KeepErrors keeper;
    Opened opened;
    snd_pcm_t* pcm = nullptr;
    require(::snd_pcm_open(&pcm, settings.name.c_str(),
                           settings.plays ? SND_PCM_STREAM_PLAYBACK : SND_PCM_STREAM_CAPTURE,
                           SND_PCM_NONBLOCK),
            settings);
    opened.pcm.reset(pcm);
    snd_pcm_hw_params_t* allocated = nullptr;
    require(::snd_pcm_hw_params_malloc(&allocated), settings);
    const HwParams hardware(allocated, &::snd_pcm_hw_params_free);
    require(::snd_pcm_hw_params_any(pcm, allocated), settings);
    require(::snd_pcm_hw_params_set_access(pcm, allocated, SND_PCM_ACCESS_RW_INTERLEAVED),
            settings);
    setFormat(pcm, allocated, settings);
    setChannels(pcm, allocated, settings);
    setRate(pcm, allocated, settings, opened.rate);
    setBuffer(pcm, allocated, settings, opened);
    setSoftware(pcm, settings, opened);
    return opened;
}

} // namespace alsa
