// How a PCM of libasound is opened and set up.
#ifndef BRENIX_PLUGINS_ALSA_OPEN_HPP
#define BRENIX_PLUGINS_ALSA_OPEN_HPP

#include <alsa/asoundlib.h>

#include <array>
#include <memory>
#include <string>
#include <string_view>

namespace alsa
{

/// The formats by the names of their element types.
struct SampleFormat {
    std::string_view name;
    snd_pcm_format_t format;
};
constexpr std::array sampleFormats = {SampleFormat{"int16", SND_PCM_FORMAT_S16},
                                      SampleFormat{"int32", SND_PCM_FORMAT_S32},
                                      SampleFormat{"float", SND_PCM_FORMAT_FLOAT}};

/// What is asked of a card.
struct Settings {
    std::string name; ///< of the PCM
    bool plays = false;
    SampleFormat format = sampleFormats[0];
    unsigned int channels = 0;
    unsigned int rate = 0;
    snd_pcm_uframes_t blockSize = 0; ///< frames that are read at once; 0 when playing
    double bufferTime = 0;           ///< seconds; 0: the default
};

struct ClosePcm {
    void operator()(snd_pcm_t* pcm) const noexcept
    {
        ::snd_pcm_drop(pcm);
        ::snd_pcm_close(pcm);
    }
};

/// A PCM that does not wait, and what it really does.
struct Opened {
    std::unique_ptr<snd_pcm_t, ClosePcm> pcm;
    unsigned int rate = 0;
    snd_pcm_uframes_t bufferSize = 0; ///< frames
    snd_pcm_uframes_t periodSize = 0; ///< frames
};

/// Opens a PCM. May wait for a sound server. Throws the error of an option, or a std::runtime_error.
Opened open(const Settings& settings);

} // namespace alsa

#endif
