// The formats that sound files can have.
#ifndef BRENIX_PLUGINS_SOUND_FORMAT_HPP
#define BRENIX_PLUGINS_SOUND_FORMAT_HPP

#include "brenixcore/plugin/Options.hpp"

#include <sndfile.h>

#include <algorithm>
#include <array>
#include <cctype>
#include <cstdint>
#include <string>
#include <string_view>

namespace brenix
{

/// An encoding of samples.
struct SampleFormat {
    std::string_view name; ///< without libsndfile's SF_FORMAT_
    int subtype;
    std::uint64_t size; ///< bytes of a sample; 0 where that varies
};

#define SAMPLE_FORMAT(name, size)                                                                  \
    SampleFormat                                                                                   \
    {                                                                                              \
#name, SF_FORMAT_##name, size                                                              \
    }
constexpr std::array sampleFormats = {
    SAMPLE_FORMAT(PCM_S8, 1),         SAMPLE_FORMAT(PCM_16, 2),
    SAMPLE_FORMAT(PCM_24, 3),         SAMPLE_FORMAT(PCM_32, 4),
    SAMPLE_FORMAT(PCM_U8, 1),         SAMPLE_FORMAT(FLOAT, 4),
    SAMPLE_FORMAT(DOUBLE, 8),         SAMPLE_FORMAT(ULAW, 1),
    SAMPLE_FORMAT(ALAW, 1),           SAMPLE_FORMAT(IMA_ADPCM, 0),
    SAMPLE_FORMAT(MS_ADPCM, 0),       SAMPLE_FORMAT(GSM610, 0),
    SAMPLE_FORMAT(VOX_ADPCM, 0),      SAMPLE_FORMAT(NMS_ADPCM_16, 0),
    SAMPLE_FORMAT(NMS_ADPCM_24, 0),   SAMPLE_FORMAT(NMS_ADPCM_32, 0),
    SAMPLE_FORMAT(G721_32, 0),        SAMPLE_FORMAT(G723_24, 0),
    SAMPLE_FORMAT(G723_40, 0),        SAMPLE_FORMAT(DWVW_12, 0),
    SAMPLE_FORMAT(DWVW_16, 0),        SAMPLE_FORMAT(DWVW_24, 0),
    SAMPLE_FORMAT(DPCM_8, 0),         SAMPLE_FORMAT(DPCM_16, 0),
    SAMPLE_FORMAT(VORBIS, 0),         SAMPLE_FORMAT(OPUS, 0),
    SAMPLE_FORMAT(ALAC_16, 0),        SAMPLE_FORMAT(ALAC_20, 0),
    SAMPLE_FORMAT(ALAC_24, 0),        SAMPLE_FORMAT(ALAC_32, 0),
    SAMPLE_FORMAT(MPEG_LAYER_I, 0),   SAMPLE_FORMAT(MPEG_LAYER_II, 0),
    SAMPLE_FORMAT(MPEG_LAYER_III, 0),
};
#undef SAMPLE_FORMAT

/// The bytes of a sample in a format of libsndfile's; 0 where that varies.
inline std::uint64_t sampleSize(int format)
{
    for (const SampleFormat& candidate : sampleFormats) {
        if (candidate.subtype == (format & SF_FORMAT_SUBMASK)) {
            return candidate.size;
        }
    }
    return 0;
}

/// What a sound file lacks of which so many frames were read to the end; empty when it lacks nothing. A huge
/// length stands for one that is not known.
inline std::string missingAtEnd(SNDFILE* sound, const SF_INFO& info, sf_count_t frames)
{
    const int container = info.format & SF_FORMAT_TYPEMASK;
    sf_count_t all = info.frames;
    if (container == SF_FORMAT_WAV || container == SF_FORMAT_WAVEX) {
        // Of a file that was cut, libsndfile counts what is there.
        const auto frameSize = static_cast<sf_count_t>(sampleSize(info.format)) * info.channels;
        SF_CHUNK_INFO data{"data", 4, 0, nullptr};
        SF_CHUNK_ITERATOR* const chunk = sf_get_chunk_iterator(sound, &data);
        if (frameSize == 0 || chunk == nullptr ||
            sf_get_chunk_size(chunk, &data) != SF_ERR_NO_ERROR || data.datalen >= 0x7FFFF000) {
            return "";
        }
        all = data.datalen / frameSize;
        if (const sf_count_t torn = data.datalen % frameSize; torn > 0 && frames == all) {
            return "the last frame has " + std::to_string(torn) + " of " +
                   std::to_string(frameSize) + " bytes";
        }
    }
    // An empty AIFF file has some frames for libsndfile.
    return frames < all && all < 1L << 40 && container != SF_FORMAT_AIFF
               ? "it ends after " + std::to_string(frames) + " of " + std::to_string(all) +
                     " frames"
               : "";
}

/// The container format of a file name's ending; 0 when there is none for it. SD2 is none: its header is a
/// file of its own.
inline int containerOf(const std::string& fileName)
{
    const std::size_t dot = fileName.rfind('.');
    if (dot == std::string::npos) {
        return 0;
    }
    std::string ending = fileName.substr(dot + 1);
    std::transform(ending.begin(), ending.end(), ending.begin(),
                   [](unsigned char letter) { return static_cast<char>(std::tolower(letter)); });
    // libsndfile lists one ending for each format.
    constexpr std::string_view others[][2] = {{"ogg", "oga"},   {"opus", "oga"}, {"aif", "aiff"},
                                              {"aifc", "aiff"}, {"snd", "au"},   {"mp3", "m1a"},
                                              {"mp2", "m1a"}};
    for (const auto& [other, listed] : others) {
        if (ending == other) {
            ending = listed;
        }
    }
    int formats = 0;
    sf_command(nullptr, SFC_GET_FORMAT_MAJOR_COUNT, &formats, sizeof formats);
    for (int i = 0; i < formats; ++i) {
        SF_FORMAT_INFO info{};
        info.format = i;
        sf_command(nullptr, SFC_GET_FORMAT_MAJOR, &info, sizeof info);
        if (info.extension != nullptr && ending == info.extension && info.format != SF_FORMAT_SD2) {
            return info.format;
        }
    }
    return 0;
}

/// The options SampleRate, Channels and SampleFormat as the format of a file whose ending names its
/// container. They have defaults, or else must be given. Throws what Options does.
inline SF_INFO formatOptions(brenixcore::plugin::Options& options, const std::string& fileName,
                             bool hasDefaults)
{
    using brenixcore::plugin::Options;
    const auto valueOf = [&](const char* name, const auto& given, auto defaultValue) {
        if (!given && !hasDefaults) {
            Options::fail(name, "must be given: " + fileName + " does not tell it");
        }
        return given.value_or(defaultValue);
    };
    SF_INFO format{};
    format.samplerate = static_cast<int>(
        valueOf("SampleRate", options.wholeNumber("SampleRate", 1, 655350), 48000));
    format.channels =
        static_cast<int>(valueOf("Channels", options.wholeNumber("Channels", 1, 1024), 1));
    const std::string name = valueOf("SampleFormat", options.text("SampleFormat"), "PCM_16");
    const auto* const found =
        std::find_if(sampleFormats.begin(), sampleFormats.end(),
                     [&](const SampleFormat& candidate) { return candidate.name == name; });
    if (found == sampleFormats.end()) {
        Options::fail("SampleFormat", "is not known: " + name);
    }
    const int container = containerOf(fileName);
    if (container == 0) {
        Options::fail("FileName", "has an ending that names no sound file format: " + fileName);
    }
    format.format = container | found->subtype;
    if (sf_format_check(&format) == 0) {
        Options::fail("SampleFormat", name +
                                          " with this number of channels and this sample rate is "
                                          "not possible in " +
                                          fileName);
    }
    return format;
}

/// Refuses these options for a file that tells them itself.
inline void refuseFormatOptions(const brenixplugin::PropertyMap& options,
                                const std::string& fileName)
{
    for (const char* name : {"SampleRate", "Channels", "SampleFormat"}) {
        if (options.find(name) != options.end()) {
            brenixcore::plugin::Options::fail(name,
                                              "cannot be given: " + fileName + " tells it itself");
        }
    }
}

} // namespace brenix

#endif
