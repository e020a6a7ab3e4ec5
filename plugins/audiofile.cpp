// Device `audiofile`: reads a sound file into the input stream, or writes one from the output
// stream. A count is a frame: one sample of each channel, interleaved in the field "data" as
// double, full scale from -1 to 1.

#include "brenixcore/plugin/Describe.hpp"
#include "brenixcore/plugin/Make.hpp"
#include "brenixcore/plugin/Options.hpp"
#include "brenixcore/plugin/Plugin.hpp"

#include <sndfile.h>

#include <algorithm>
#include <array>
#include <cctype>
#include <cmath>
#include <iterator>
#include <memory>
#include <stdexcept>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace
{

using namespace brenixcore::plugin;
using brenixplugin::PropertyMap;
using brenixplugin::kit::coderconverter::TPointerProperty;

struct SampleFormat {
    std::string_view name;
    int subtype;
};

#define SAMPLE_FORMAT(name)                                                                        \
    SampleFormat                                                                                   \
    {                                                                                              \
#name, SF_FORMAT_##name                                                                    \
    }
constexpr std::array sampleFormats = {
    SAMPLE_FORMAT(PCM_S8),       SAMPLE_FORMAT(PCM_16),        SAMPLE_FORMAT(PCM_24),
    SAMPLE_FORMAT(PCM_32),       SAMPLE_FORMAT(PCM_U8),        SAMPLE_FORMAT(FLOAT),
    SAMPLE_FORMAT(DOUBLE),       SAMPLE_FORMAT(ULAW),          SAMPLE_FORMAT(ALAW),
    SAMPLE_FORMAT(IMA_ADPCM),    SAMPLE_FORMAT(MS_ADPCM),      SAMPLE_FORMAT(GSM610),
    SAMPLE_FORMAT(VOX_ADPCM),    SAMPLE_FORMAT(NMS_ADPCM_16),  SAMPLE_FORMAT(NMS_ADPCM_24),
    SAMPLE_FORMAT(NMS_ADPCM_32), SAMPLE_FORMAT(G721_32),       SAMPLE_FORMAT(G723_24),
    SAMPLE_FORMAT(G723_40),      SAMPLE_FORMAT(DWVW_12),       SAMPLE_FORMAT(DWVW_16),
    SAMPLE_FORMAT(DWVW_24),      SAMPLE_FORMAT(DPCM_8),        SAMPLE_FORMAT(DPCM_16),
    SAMPLE_FORMAT(VORBIS),       SAMPLE_FORMAT(OPUS),          SAMPLE_FORMAT(ALAC_16),
    SAMPLE_FORMAT(ALAC_20),      SAMPLE_FORMAT(ALAC_24),       SAMPLE_FORMAT(ALAC_32),
    SAMPLE_FORMAT(MPEG_LAYER_I), SAMPLE_FORMAT(MPEG_LAYER_II), SAMPLE_FORMAT(MPEG_LAYER_III),
};
#undef SAMPLE_FORMAT

/// The container format of a file name's ending; 0 when there is none for it.
int containerOf(const std::string& fileName)
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
        if (info.extension != nullptr && ending == info.extension) {
            return info.format & SF_FORMAT_TYPEMASK;
        }
    }
    return 0;
}

class AudioFile : public Device
{
public:
    DeviceInfo init(const PropertyMap& optionMap, PropertyMap& properties,
                    DeviceHost& host) override
    {
        Options options(optionMap);
        fileName = options.text("FileName").value_or("");
        if (fileName.empty()) {
            Options::fail("FileName", "must name a sound file");
        }
        const std::string mode = options.text("Mode").value_or("read");
        if (mode != "read" && mode != "write") {
            Options::fail("Mode", "must be read or write, not " + mode);
        }
        writes = mode == "write";
        if (writes) {
            readWriteOptions(options);
        } else {
            blockSize = options.wholeNumber("BlockSize", 1, 1L << 24).value_or(1024);
        }
        options.requireAllKnown();

        deviceHost = &host;
        if (!writes) {
            openFile(); // tells what is in it, and whether it can be read
        }
        publish(properties, "SampleRate", static_cast<double>(format.samplerate));
        publish(properties, "Channels", static_cast<unsigned int>(format.channels));
        publish(properties, "Frames", static_cast<long>(format.frames));
        return writes ? DeviceInfo{std::nullopt, StreamInfo{}}
                      : DeviceInfo{StreamInfo{}, std::nullopt};
    }

    void open(const PropertyMap& options) override
    {
        Options(options).requireAllKnown();
        openFile();
    }

    void run(DeviceStreams& streams) override
    {
        if (writes) {
            write(streams);
        } else {
            read(streams);
        }
    }

    void close() override
    {
        if (const int error = sf_close(file.release()); error != SF_ERR_NO_ERROR) {
            throw std::runtime_error("Could not close " + fileName + ": " + sf_error_number(error));
        }
    }

    void term() override { file.reset(); }

private:
    void readWriteOptions(Options& options)
    {
        format = {};
        format.samplerate =
            static_cast<int>(options.wholeNumber("SampleRate", 1, 655350).value_or(48000));
        format.channels = static_cast<int>(options.wholeNumber("Channels", 1, 1024).value_or(1));
        const std::string name = options.text("SampleFormat").value_or("PCM_16");
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
            Options::fail("SampleFormat", name + " with this number of channels and this sample " +
                                              "rate is not possible in " + fileName);
        }
    }

    void openFile()
    {
        if (!writes) {
            format = {};
        }
        file.reset(sf_open(fileName.c_str(), writes ? SFM_WRITE : SFM_READ, &format));
        if (!file) {
            throw std::runtime_error("Could not open " + fileName + ": " + sf_strerror(nullptr));
        }
        sf_command(file.get(), SFC_SET_CLIPPING, nullptr, SF_TRUE); // the scale of PCM is 2^n
    }

    void read(DeviceStreams& streams)
    {
        const auto channels = static_cast<std::uint64_t>(format.channels);
        for (;;) {
            std::unique_ptr<double[]> samples(
                new double[static_cast<std::uint64_t>(blockSize) * channels]);
            const sf_count_t frames = sf_readf_double(file.get(), samples.get(), blockSize);
            if (const int error = sf_error(file.get()); error != SF_ERR_NO_ERROR) {
                throw std::runtime_error("Could not read " + fileName + ": " +
                                         sf_error_number(error));
            }
            if (frames <= 0) {
                return;
            }
            Packet packet;
            packet.counts = static_cast<std::uint64_t>(frames);
            setField(packet, makeArray(dataField, std::move(samples), packet.counts * channels));
            if (!streams.push(std::move(packet))) {
                return;
            }
        }
    }

    void write(DeviceStreams& streams)
    {
        const auto channels = static_cast<std::uint64_t>(format.channels);
        std::vector<double> samples; // a frame may be spread over packets
        while (auto packet = streams.pull()) {
            const auto data = takeField(*packet, dataField);
            const auto* const array = dynamic_cast<const TPointerProperty<double>*>(data.get());
            if (array == nullptr) {
                deviceHost->raise("error", "brenix:Device:wrongType",
                                  "Samples to write must be double.");
                continue;
            }
            std::transform(array->data, array->data + array->count, std::back_inserter(samples),
                           [this](double sample) { return encodable(sample); });
            const std::uint64_t frames = samples.size() / channels;
            const auto written =
                sf_writef_double(file.get(), samples.data(), static_cast<sf_count_t>(frames));
            if (written != static_cast<sf_count_t>(frames)) {
                throw std::runtime_error("Could not write " + fileName + ": " +
                                         sf_strerror(file.get()));
            }
            samples.erase(samples.begin(),
                          samples.begin() + static_cast<std::ptrdiff_t>(frames * channels));
        }
        if (!samples.empty()) {
            throw std::runtime_error("The last frame for " + fileName + " has " +
                                     std::to_string(samples.size()) + " of " +
                                     std::to_string(channels) + " samples and was not written.");
        }
    }

    /// Full scale for what is beyond it, and 0 for what is no number: libsndfile sees to that for PCM
    /// only, and looks up other encodings in tables without a check.
    double encodable(double sample) const
    {
        const int subtype = format.format & SF_FORMAT_SUBMASK;
        if (subtype == SF_FORMAT_FLOAT || subtype == SF_FORMAT_DOUBLE) {
            return sample;
        }
        return std::isnan(sample) ? 0 : std::clamp(sample, -1.0, 1.0);
    }

    struct CloseFile {
        void operator()(SNDFILE* open) const noexcept { sf_close(open); }
    };

    std::string fileName;
    bool writes = false;
    sf_count_t blockSize = 0;
    SF_INFO format{};
    std::unique_ptr<SNDFILE, CloseFile> file;
    DeviceHost* deviceHost = nullptr;
};

constexpr OptionInfo optionTable[] = {
    {"FileName", "text", "", "(required)", "the file; when writing, its ending names the format"},
    {"Mode", "text", "", "read", "read or write"},
    {"BlockSize", "whole number", "frames", "1024", "reading: frames of one packet"},
    {"SampleRate", "whole number", "Hz", "48000", "writing"},
    {"Channels", "whole number", "", "1", "writing"},
    {"SampleFormat", "text", "", "PCM_16",
     "writing: libsndfile's name of an encoding, such as PCM_24, FLOAT, DOUBLE, ULAW, VORBIS, "
     "ALAC_16; which ones a file format has is its own matter, and refused otherwise"},
    {},
};

constexpr PropertyInfo propertyTable[] = {
    {"SampleRate", "double", "Hz", ""},
    {"Channels", "uint32", "", ""},
    {"Frames", "int64", "frames", "of the file as it was at init"},
    {},
};

} // namespace

BRENIXCORE_EXPORT_DEVICE(AudioFile)
BRENIXCORE_DESCRIBE_OPTIONS(optionTable)
BRENIXCORE_DESCRIBE_PROPERTIES(propertyTable)
