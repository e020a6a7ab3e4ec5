#include "files/Sound.hpp"

#include "Channel.hpp"

#include <algorithm>
#include <cmath>
#include <cstddef>
#include <cstdint>
#include <limits>
#include <type_traits>

namespace brenix
{

namespace
{

#define CONSTANT(name)                                                                             \
    SoundConstant                                                                                  \
    {                                                                                              \
        name, #name                                                                                \
    }
constexpr SoundConstant several = {0, ""};
constexpr SoundConstant asDouble = CONSTANT(SF_FORMAT_DOUBLE);
constexpr SoundConstant asFloat = CONSTANT(SF_FORMAT_FLOAT);
constexpr SoundConstant as32 = CONSTANT(SF_FORMAT_PCM_32);
constexpr SoundConstant as24 = CONSTANT(SF_FORMAT_PCM_24);
constexpr SoundConstant as16 = CONSTANT(SF_FORMAT_PCM_16);
constexpr SoundConstant asS8 = CONSTANT(SF_FORMAT_PCM_S8);
constexpr SoundConstant asU8 = CONSTANT(SF_FORMAT_PCM_U8);

template <typename T, sf_count_t (*function)(SNDFILE*, const T*, sf_count_t)>
sf_count_t writeAs(SNDFILE* sound, const void* elements, sf_count_t count)
{
    return function(sound, static_cast<const T*>(elements), count);
}

/// 8 bits as the upper ones of 16, unsigned ones around 128.
template <typename T>
sf_count_t writeWidened(SNDFILE* sound, const void* elements, sf_count_t count)
{
    constexpr int middle = std::is_signed_v<T> ? 0 : 128;
    std::vector<short> items(static_cast<std::size_t>(count));
    const auto* const first = static_cast<const T*>(elements);
    std::transform(first, first + count, items.begin(),
                   [](T element) { return static_cast<short>((element - middle) * 256); });
    return sf_write_short(sound, items.data(), count);
}

template <typename T, sf_count_t (*function)(SNDFILE*, T*, sf_count_t)>
sf_count_t readAs(SNDFILE* sound, void* elements, sf_count_t count)
{
    return function(sound, static_cast<T*>(elements), count);
}

/// Full scale is that of T for every file: libsndfile itself scales floating-point samples to
/// integers by the loudest of them, or not at all.
template <typename T>
sf_count_t readScaled(SNDFILE* sound, void* elements, sf_count_t count)
{
    constexpr double low = std::numeric_limits<T>::min();
    constexpr double high = std::numeric_limits<T>::max();
    std::vector<double> samples(static_cast<std::size_t>(count));
    auto* next = static_cast<T*>(elements);
    count = sf_read_double(sound, samples.data(), count);
    samples.resize(static_cast<std::size_t>(count));
    for (const double sample : samples) {
        const double level = std::isnan(sample) ? 0 : sample * -low;
        *next++ = static_cast<T>(std::lrint(std::clamp(level, low, high)));
    }
    return count;
}

constexpr std::array types = {
    SoundType{"double",
              "double",
              {asDouble, asFloat, as32, as24, as16},
              writeAs<double, sf_write_double>,
              readAs<double, sf_read_double>},
    SoundType{"float",
              "float",
              {asFloat, asDouble, as32, as24, as16},
              writeAs<float, sf_write_float>,
              readAs<float, sf_read_float>},
    SoundType{"int32",
              "int",
              {as32, asDouble, as24, asFloat, as16},
              writeAs<int, sf_write_int>,
              readScaled<std::int32_t>},
    SoundType{"int16",
              "short",
              {as16, as24, as32, asFloat, asDouble},
              writeAs<short, sf_write_short>,
              readScaled<std::int16_t>},
    SoundType{"int8", "short", {asS8, asU8, as16, as24, as32}, writeWidened<std::int8_t>, nullptr},
    SoundType{
        "uint8", "short", {asU8, asS8, as16, as24, as32}, writeWidened<std::uint8_t>, nullptr},
};

} // namespace

const std::vector<SoundFormat>& soundFormats()
{
    static const std::vector<SoundFormat> formats = {
        {"wav", CONSTANT(SF_FORMAT_WAV), several, false, true},
        {"aif", CONSTANT(SF_FORMAT_AIFF), several, false, true},
        {"aiff", CONSTANT(SF_FORMAT_AIFF), several, false, true},
        {"au", CONSTANT(SF_FORMAT_AU), several, false, true},
        {"avr", CONSTANT(SF_FORMAT_AVR), several, false, true},
        {"caf", CONSTANT(SF_FORMAT_CAF), several, true, false},
        {"flac", CONSTANT(SF_FORMAT_FLAC), several, true, false},
        {"mat", CONSTANT(SF_FORMAT_MAT5), several, false, true},
        {"mp3", CONSTANT(SF_FORMAT_MPEG), CONSTANT(SF_FORMAT_MPEG_LAYER_III), true, true},
        {"oga", CONSTANT(SF_FORMAT_OGG), CONSTANT(SF_FORMAT_VORBIS), true, true},
        {"ogg", CONSTANT(SF_FORMAT_OGG), CONSTANT(SF_FORMAT_VORBIS), true, true},
        {"opus", CONSTANT(SF_FORMAT_OGG), CONSTANT(SF_FORMAT_OPUS), true, true},
        {"pvf", CONSTANT(SF_FORMAT_PVF), several, false, true},
        {"rf64", CONSTANT(SF_FORMAT_RF64), several, true, false},
        {"sf", CONSTANT(SF_FORMAT_IRCAM), several, false, true},
        {"snd", CONSTANT(SF_FORMAT_AU), several, false, true},
        {"voc", CONSTANT(SF_FORMAT_VOC), several, false, false},
        {"w64", CONSTANT(SF_FORMAT_W64), several, true, true},
    };
    return formats;
}
#undef CONSTANT

const SoundFormat* findSoundFormat(std::string_view name)
{
    for (const SoundFormat& format : soundFormats()) {
        if (format.name == name) {
            return &format;
        }
    }
    return nullptr;
}

const SoundType& soundType(const ElementType& type)
{
    for (const SoundType& candidate : types) {
        if (candidate.type == type.name) {
            return candidate;
        }
    }
    throw Failure("", std::string("a sound file cannot hold samples of type ") + type.name);
}

std::string chooseFormat(const SoundFormat& format, const ElementType& type, SF_INFO& info)
{
    const auto fits = [&](const SoundConstant& encoding) {
        info.format = format.container.value | encoding.value;
        return encoding.value != 0 && sf_format_check(&info) != 0;
    };
    const SoundConstant* encoding = &format.encoding;
    if (encoding->value == 0) {
        const auto& encodings = soundType(type).encodings;
        encoding = std::find_if(encodings.begin(), encodings.end(), fits);
        encoding = encoding == encodings.end() ? &several : encoding;
    }
    if (!fits(*encoding)) {
        throw Failure("", "the format " + std::string(format.name) + " cannot hold " +
                              std::to_string(info.channels) + " channels of type " + type.name);
    }
    return format.container.name + std::string(" | ") + encoding->name;
}

bool startsWithHeader(const SoundFormat& format)
{
    return format.container.value != SF_FORMAT_OGG; // that would get another one
}

bool hasFullScale(const SF_INFO& info)
{
    const int encoding = info.format & SF_FORMAT_SUBMASK;
    return encoding != SF_FORMAT_FLOAT && encoding != SF_FORMAT_DOUBLE;
}

const ElementType& typeOfSound(const SF_INFO& info)
{
    switch (info.format & SF_FORMAT_SUBMASK) {
    case SF_FORMAT_PCM_S8:
    case SF_FORMAT_PCM_U8:
    case SF_FORMAT_PCM_16:
    case SF_FORMAT_ULAW:
    case SF_FORMAT_ALAW:
        return elementType("int16");
    case SF_FORMAT_PCM_24:
    case SF_FORMAT_PCM_32:
        return elementType("int32");
    case SF_FORMAT_FLOAT:
        return elementType("float");
    default:
        return elementType("double");
    }
}

} // namespace brenix
