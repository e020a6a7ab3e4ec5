// Sound files in libsndfile's terms.
#ifndef BRENIX_TOOLS_SOUND_HPP
#define BRENIX_TOOLS_SOUND_HPP

#include "Values.hpp"

#include <sndfile.h>

#include <array>
#include <string>
#include <string_view>
#include <vector>

namespace brenix
{

/// A constant of libsndfile and its name in C.
struct SoundConstant {
    int value;
    const char* name;
};

/// A format of sound files.
struct SoundFormat {
    std::string_view name; ///< also the ending of its files
    SoundConstant container;
    SoundConstant encoding; ///< 0 when it has several: then the elements decide
    bool isLarge;           ///< whether its files may have more than 4 GiB
    bool isStream;          ///< whether libsndfile reads them from a pipe
};

/// All that libsndfile writes and that keep the sample rate and the number of frames.
const std::vector<SoundFormat>& soundFormats();

/// Null when there is none of the name.
const SoundFormat* findSoundFormat(std::string_view name);

/// How libsndfile takes and gives the elements of a type. A read returns how many there were.
struct SoundType {
    std::string_view type;
    const char* item;                       ///< the type of its functions, in C
    std::array<SoundConstant, 5> encodings; ///< for them, the best first
    sf_count_t (*write)(SNDFILE* sound, const void* elements, sf_count_t count);
    sf_count_t (*read)(SNDFILE* sound, void* elements, sf_count_t count); ///< null if there is none
};

/// Throws a Failure for a type that sound files do not have.
const SoundType& soundType(const ElementType& type);

/// Sets the format of `info`, which has the rest, to what holds the elements best. Returns it in C. Throws
/// a Failure when there is none.
std::string chooseFormat(const SoundFormat& format, const ElementType& type, SF_INFO& info);

/// Whether its header can be written before there is a frame.
bool startsWithHeader(const SoundFormat& format);

/// Whether samples beyond full scale, from -1 to 1, cannot be written.
bool hasFullScale(const SF_INFO& info);

/// The smallest type that holds the samples of a file as they are.
const ElementType& typeOfSound(const SF_INFO& info);

} // namespace brenix

#endif
