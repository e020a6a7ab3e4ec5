// Device `alsa`: a sound card, captured into the input stream or played from the output stream. A count of input is
// a frame: one sample of each channel, interleaved in the field "data" as the card has them.

#include "alsa/Capture.hpp"
#include "alsa/Card.hpp"
#include "alsa/Event.hpp"
#include "alsa/Find.hpp"
#include "alsa/Playback.hpp"

#include "Elements.hpp"
#include "brenixcore/plugin/Describe.hpp"
#include "brenixcore/plugin/Make.hpp"
#include "brenixcore/plugin/Options.hpp"
#include "brenixcore/plugin/Plugin.hpp"

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <memory>
#include <optional>
#include <stdexcept>
#include <string>

namespace
{

using namespace brenixcore::plugin;
using brenixplugin::PropertyMap;

class Alsa : public Device
{
public:
    DeviceInfo init(const PropertyMap& optionMap, PropertyMap& properties,
                    DeviceHost& deviceHost) override
    {
        Options options(optionMap);
        settings = {};
        settings.name = options.text("Card").value_or("default");
        settings.plays = bytes::readChoice<2>(options, "Mode", {"read", "write"}) == 1;
        settings.rate = static_cast<unsigned int>(
            options.wholeNumber("SampleRate", 1, 1L << 24).value_or(48000));
        settings.channels =
            static_cast<unsigned int>(options.wholeNumber("Channels", 1, 1024).value_or(2));
        settings.format = alsa::sampleFormats.at(bytes::readChoice<alsa::sampleFormats.size()>(
            options, "SampleFormat", {"int16", "int32", "float"}));
        if (!settings.plays) {
            settings.blockSize = static_cast<snd_pcm_uframes_t>(
                options.wholeNumber("BlockSize", 1, 1L << 20).value_or(1024));
        }
        settings.bufferTime = options.number("BufferTime").value_or(0);
        options.requireAllKnown();
        if (options.number("BufferTime") &&
            !(settings.bufferTime >= 0.001 && settings.bufferTime <= 60)) {
            Options::fail("BufferTime", "must be from 0.001 to 60 seconds");
        }

        host = &deviceHost;
        const alsa::Card found(settings); // what it really does; closed for others until open
        rate = found.rate();
        publish(properties, "SampleRate", static_cast<double>(rate));
        publish(properties, "Channels", settings.channels);
        publish(properties, "SampleFormat", std::string(settings.format.name));
        publish(properties, "BufferSize", static_cast<std::uint64_t>(found.bufferSize()));
        publish(properties, "PeriodSize", static_cast<std::uint64_t>(found.periodSize()));
        publish(properties, "Overruns", std::uint64_t{0});
        publish(properties, "Underruns", std::uint64_t{0});
        return settings.plays ? DeviceInfo{std::nullopt, StreamInfo{}}
                              : DeviceInfo{StreamInfo{1, static_cast<double>(rate)}, std::nullopt};
    }

    void open(const PropertyMap& options) override
    {
        Options(options).requireAllKnown();
        card = std::make_shared<alsa::Card>(settings);
        if (card->rate() != rate) {
            const auto now = std::to_string(card->rate());
            card.reset();
            throw std::runtime_error("Card " + settings.name + " now has " + now + " Hz, and had " +
                                     std::to_string(rate) + " Hz at init.");
        }
        host->updateProperty(
            makeScalar("BufferSize", static_cast<std::uint64_t>(card->bufferSize())));
        host->updateProperty(
            makeScalar("PeriodSize", static_cast<std::uint64_t>(card->periodSize())));
        host->updateProperty(makeScalar("Overruns", std::uint64_t{0}));
        host->updateProperty(makeScalar("Underruns", std::uint64_t{0}));
    }

    void run(DeviceStreams& streams) override
    {
        if (settings.plays) {
            const auto playback =
                std::make_shared<alsa::Playback>(card, settings, *host, streams, event);
            try {
                card->run([playback] { playback->work(); });
            } catch (const std::exception& error) {
                throw std::runtime_error(error.what() + playback->notPlayed());
            }
        } else {
            const auto capture =
                std::make_shared<alsa::Capture>(card, settings, *host, streams, event);
            try {
                card->run([capture] { capture->work(); });
            } catch (const std::exception&) {
                capture->fail();
                throw;
            }
        }
    }

    void wake() noexcept override { event.wake(); }

    void close() override
    {
        const std::shared_ptr<alsa::Card> last = std::move(card);
        if (last.use_count() == 1 && !last->close()) { // or else what was left behind closes it
            throw std::runtime_error("Card " + settings.name +
                                     " does not close, and is left to itself.");
        }
    }

private:
    DeviceHost* host = nullptr;
    alsa::Settings settings;
    unsigned int rate = 0; ///< of the card, at init
    std::shared_ptr<alsa::Card> card;
    alsa::Event event;
};

constexpr OptionInfo optionTable[] = {
    {"Card", "text", "", "default", "name of a PCM of libasound, such as hw:1 or plughw:1"},
    {"Mode", "text", "", "read", "read captures, write plays"},
    {"SampleRate", "whole number", "Hz", "48000", "within 1 % of what the card has"},
    {"Channels", "whole number", "", "2", ""},
    {"SampleFormat", "text", "", "int16", "int16, int32 or float"},
    {"BlockSize", "whole number", "frames", "1024", "reading: frames of one packet"},
    {"BufferTime", "number", "seconds", "0.5, or four blocks",
     "how much the card's buffer should hold, 0.001 to 60"},
    {},
};

constexpr PropertyInfo propertyTable[] = {
    {"SampleRate", "double", "Hz", "as the card has it"},
    {"Channels", "uint32", "", ""},
    {"SampleFormat", "char", "", "type of the samples"},
    {"BufferSize", "uint64", "frames", "that the card's buffer holds"},
    {"PeriodSize", "uint64", "frames", "in which the card moves them"},
    {"Overruns", "uint64", "", "since open: times that frames of input were lost"},
    {"Underruns", "uint64", "", "since open: times that the card had nothing to play"},
    {},
};

constexpr FieldInfo inputFields[] = {
    {dataField, "(SampleFormat)", "", "a sample of each channel for each frame"}, {}};

constexpr FieldInfo outputFields[] = {{dataField, "(SampleFormat)", "", "the same"}, {}};

} // namespace

BRENIXCORE_EXPORT_DEVICE(Alsa)
BRENIXCORE_EXPORT_FIND(alsa::findCards)
BRENIXCORE_DESCRIBE_OPTIONS(optionTable)
BRENIXCORE_DESCRIBE_PROPERTIES(propertyTable)
BRENIXCORE_DESCRIBE_FIELDS(inputFields, outputFields)
