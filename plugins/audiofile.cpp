// Device `audiofile`: reads a sound file into the input stream, or writes one from the output
// stream. A count is a frame: one sample of each channel, interleaved in the field "data" as
// double, full scale from -1 to 1.

#include "SoundFile.hpp"
#include "SoundFormat.hpp"
#include "SoundSamples.hpp"
#include "brenixcore/plugin/Describe.hpp"
#include "brenixcore/plugin/Make.hpp"
#include "brenixcore/plugin/Options.hpp"
#include "brenixcore/plugin/Plugin.hpp"
#include "brenixcore/plugin/Visit.hpp"

#include <sndfile.h>

#include <cstdint>
#include <cstdio>
#include <filesystem>
#include <memory>
#include <optional>
#include <stdexcept>
#include <string>
#include <system_error>
#include <utility>
#include <vector>

namespace
{

using namespace brenix;
using namespace brenixcore::plugin;
using brenixplugin::PropertyMap;

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
        if (!writes) {
            blockSize = options.wholeNumber("BlockSize", 1, 1L << 24).value_or(1024);
        }
        format = {};
        if (writes || containerOf(fileName) == SF_FORMAT_RAW) {
            format = formatOptions(options, fileName, writes);
        } else {
            refuseFormatOptions(optionMap, fileName);
        }
        options.requireAllKnown();

        deviceHost = &host;
        if (!writes) {
            openInput(); // tells what is in it, and whether it can be read
            std::vector<double> frame(static_cast<std::size_t>(format.channels));
            if (format.frames == SF_COUNT_MAX && // it does not tell
                sf_readf_double(input.get(), frame.data(), 1) == 0) {
                format.frames = 0;
            }
        }
        publish(properties, "SampleRate", static_cast<double>(format.samplerate));
        publish(properties, "Channels", static_cast<unsigned int>(format.channels));
        publish(properties, "Frames", static_cast<long>(format.frames));
        return writes ? DeviceInfo{std::nullopt, StreamInfo{}}
                      : DeviceInfo{StreamInfo{1, static_cast<double>(format.samplerate)},
                                   std::nullopt};
    }

    void open(const PropertyMap& options) override
    {
        Options(options).requireAllKnown();
        if (writes) {
            openOutput();
        } else {
            openInput();
        }
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
        input.reset();
        if (!output) {
            return;
        }
        if (framesWritten == 0 && (isIn(SF_FORMAT_FLAC) || isIn(SF_FORMAT_MPEG))) {
            sf_command(output->get(), SFC_UPDATE_HEADER_NOW, nullptr, 0); // or the file stays empty
        }
        const std::string error = output->close();
        output.reset();
        if (!error.empty()) {
            throw std::runtime_error("Could not write " + fileName + ": " + error +
                                     ". The file is not complete.");
        }
        if (framesWritten == 0 && isEncodedAs(SF_FORMAT_OPUS)) {
            throw std::runtime_error("No frames were written to " + fileName +
                                     ": an Opus file without any cannot be read.");
        }
    }

    void term() override { input.reset(); } // which init opened

private:
    bool isIn(int container) const { return (format.format & SF_FORMAT_TYPEMASK) == container; }
    bool isEncodedAs(int subtype) const { return (format.format & SF_FORMAT_SUBMASK) == subtype; }

    void openInput()
    {
        if (!isIn(SF_FORMAT_RAW)) {
            format = {}; // which sf_open fills in
        }
        input.reset(sf_open(fileName.c_str(), SFM_READ, &format));
        if (!input) {
            throw std::runtime_error("Could not open " + fileName + ": " + sf_strerror(nullptr));
        }
    }

    void openOutput()
    {
        framesWritten = 0;
        output.emplace(std::fopen(fileName.c_str(), "wbe"), format);
        if (output->get() == nullptr) {
            const std::string error = output->error();
            output.reset();
            throw std::runtime_error("Could not open " + fileName + ": " + error);
        }
        sf_command(output->get(), SFC_SET_CLIPPING, nullptr, SF_TRUE); // the scale of PCM is 2^n
    }

    void read(DeviceStreams& streams)
    {
        const auto channels = static_cast<std::uint64_t>(format.channels);
        sf_count_t delivered = 0;
        for (;;) {
            std::unique_ptr<double[]> samples(
                new double[static_cast<std::uint64_t>(blockSize) * channels]);
            const sf_count_t frames = sf_readf_double(input.get(), samples.get(), blockSize);
            const int error = sf_error(input.get());
            if (frames > 0) { // also before an error
                delivered += frames;
                Packet packet;
                packet.counts = static_cast<std::uint64_t>(frames);
                setField(packet,
                         makeArray(dataField, std::move(samples), packet.counts * channels));
                if (!streams.push(std::move(packet))) {
                    return;
                }
            }
            if (error != SF_ERR_NO_ERROR) {
                throw std::runtime_error("Could not read " + fileName + ": " +
                                         sf_error_number(error));
            }
            if (frames <= 0) {
                requireEnd(delivered);
                return;
            }
        }
    }

    /// Throws when a file that ends after so many frames should have had more.
    void requireEnd(sf_count_t delivered) const
    {
        if (const std::string missing = missingAtEnd(input.get(), format, delivered);
            !missing.empty()) {
            throw std::runtime_error(fileName + ": " + missing + ".");
        }
        const std::uint64_t size =
            sampleSize(format.format) * static_cast<std::uint64_t>(format.channels);
        if (isIn(SF_FORMAT_RAW) && size > 0) { // libsndfile leaves out part of a frame
            if (const auto torn = std::filesystem::file_size(fileName) % size; torn > 0) {
                throw std::runtime_error("The last frame of " + fileName + " has " +
                                         std::to_string(torn) + " of " + std::to_string(size) +
                                         " bytes.");
            }
        }
    }

    void write(DeviceStreams& streams)
    {
        const bool clips = !isEncodedAs(SF_FORMAT_FLOAT) && !isEncodedAs(SF_FORMAT_DOUBLE);
        const auto channels = static_cast<std::uint64_t>(format.channels);
        std::vector<double> samples; // a frame may be spread over packets
        std::uint64_t refused = 0;
        std::string besides; // which each further error tells, too: only the last is kept
        while (auto packet = streams.pull()) {
            const auto data = takeField(*packet, dataField);
            AppendSamples append{samples, clips};
            visitNumbers(data.get(), append);
            if (!append.known) {
                refused += packet->counts;
                besides = ' ' + std::to_string(refused) + " counts were not written to " +
                          fileName + ": samples must be double, float, int8, int16 or int32.";
                deviceHost->raise("error", "brenix:Device:wrongType", besides.c_str() + 1);
                continue;
            }
            const auto frames = static_cast<sf_count_t>(samples.size() / channels);
            if (!encoderHasRoom(samples.size())) {
                failToWrite(streams, "no space left for the encoder's temporary file",
                            samples.size(), besides);
            }
            const sf_count_t written = sf_writef_double(output->get(), samples.data(), frames);
            framesWritten += written;
            samples.erase(samples.begin(),
                          samples.begin() + static_cast<std::ptrdiff_t>(written) *
                                                static_cast<std::ptrdiff_t>(channels));
            if (const std::string error = output->error(); written != frames || !error.empty()) {
                failToWrite(streams, error, samples.size(), besides);
            }
        }
        if (!samples.empty()) {
            throw std::runtime_error(
                "The last frame for " + fileName + " has " + std::to_string(samples.size()) +
                " of " + std::to_string(channels) + " samples and was not written." + besides);
        }
    }

    /// libsndfile encodes ALAC into a temporary file, and ends the process when that has no room.
    bool encoderHasRoom(std::uint64_t samples) const
    {
        const int subtype = format.format & SF_FORMAT_SUBMASK;
        if (subtype < SF_FORMAT_ALAC_16 || subtype > SF_FORMAT_ALAC_32) {
            return true;
        }
        std::error_code unknown; // the space is then unlimited
        const auto space =
            std::filesystem::space(std::filesystem::temp_directory_path(unknown), unknown);
        constexpr std::uint64_t reserve = 1U << 20U; // for what the encoder has not written
        return space.available >= reserve + samples * sizeof(std::int32_t);
    }

    /// Takes what is left of the output and tells how much it was, with so many samples before it, and what
    /// else was lost.
    [[noreturn]] void failToWrite(DeviceStreams& streams, const std::string& error,
                                  std::uint64_t lost, const std::string& besides) const
    {
        lost += discardOutput(streams);
        throw std::runtime_error(
            "Could not write " + fileName + (error.empty() ? "." : ": " + error + ".") +
            (lost > 0 ? " " + std::to_string(lost) + " samples were not taken." : "") + besides);
    }

    struct CloseFile {
        void operator()(SNDFILE* open) const noexcept { sf_close(open); }
    };

    std::string fileName;
    bool writes = false;
    sf_count_t blockSize = 0;
    SF_INFO format{};
    std::unique_ptr<SNDFILE, CloseFile> input;
    std::optional<SoundFile> output;
    sf_count_t framesWritten = 0;
    DeviceHost* deviceHost = nullptr;
};

constexpr OptionInfo optionTable[] = {
    {"FileName", "text", "", "(required)", "the file; when writing, its ending names the format"},
    {"Mode", "text", "", "read", "read or write"},
    {"BlockSize", "whole number", "frames", "1024", "reading: frames of one packet"},
    {"SampleRate", "whole number", "Hz", "48000", "writing; reading .raw, where it is required"},
    {"Channels", "whole number", "", "1", "writing; reading .raw, where it is required"},
    {"SampleFormat", "text", "", "PCM_16",
     "writing; reading .raw, where it is required: libsndfile's name of an encoding, such as "
     "PCM_24, FLOAT, DOUBLE, ULAW, VORBIS, ALAC_16; which ones a file format has is its own "
     "matter, and refused otherwise"},
    {},
};

constexpr PropertyInfo propertyTable[] = {
    {"SampleRate", "double", "Hz", ""},
    {"Channels", "uint32", "", ""},
    {"Frames", "int64", "frames",
     "of the file as it was at init; the largest number where it does not tell"},
    {},
};

constexpr FieldInfo inputFields[] = {
    {dataField, "double", "", "a sample of each channel for each frame, full scale from -1 to 1"},
    {},
};

constexpr FieldInfo outputFields[] = {
    {dataField, "double", "", "the same; also float, int8, int16 or int32 at their full scale"},
    {},
};

} // namespace

BRENIXCORE_EXPORT_DEVICE(AudioFile)
BRENIXCORE_DESCRIBE_OPTIONS(optionTable)
BRENIXCORE_DESCRIBE_PROPERTIES(propertyTable)
BRENIXCORE_DESCRIBE_FIELDS(inputFields, outputFields)
