// Device `gstreamer`: a pipeline of GStreamer, whose end is the input stream or whose beginning the output stream. A
// count of input is a frame of audio, one sample of each channel, or a byte of anything else.

#include "gstreamer/Find.hpp"
#include "gstreamer/Pipeline.hpp"
#include "gstreamer/Reading.hpp"
#include "gstreamer/Writing.hpp"

#include "brenixcore/plugin/Describe.hpp"
#include "brenixcore/plugin/Find.hpp"
#include "brenixcore/plugin/Make.hpp"
#include "brenixcore/plugin/Options.hpp"
#include "brenixcore/plugin/Plugin.hpp"

#include <chrono>
#include <cstdint>
#include <memory>
#include <optional>
#include <stdexcept>
#include <string>

namespace
{

using namespace brenixcore::plugin;
using namespace gstreamer;
using brenixplugin::PropertyMap;

class GStreamer : public Device
{
public:
    DeviceInfo init(const PropertyMap& optionMap, PropertyMap& properties,
                    DeviceHost& deviceHost) override
    {
        Options options(optionMap);
        description = options.text("Pipeline").value_or("");
        if (description.empty()) {
            Options::fail("Pipeline", "must be given, such as audiotestsrc or filesrc "
                                      "location=a.ogg ! decodebin ! audioconvert");
        }
        caps = options.text("Caps").value_or("");
        writes = bytes::readChoice<2>(options, "Mode", {"read", "write"}) == 1;
        closeTimeout = options.number("CloseTimeout").value_or(10);
        options.requireAllKnown();
        if (!(closeTimeout >= 0 && closeTimeout <= 3600)) {
            Options::fail("CloseTimeout", "must be from 0 to 3600 seconds");
        }
        prepare();
        format = {};
        Owned<GstCaps> given;
        if (!caps.empty()) {
            given.reset(gst_caps_from_string(caps.c_str()));
            if (!given) {
                Options::fail("Caps", "are none of GStreamer's: " + caps);
            }
        }
        if (writes && given) {
            readFormat(given.get());
        }
        try {
            const Pipeline valid(description, caps, writes);
        } catch (const std::invalid_argument& problem) {
            Options::fail("Pipeline", problem.what());
        }
        host = &deviceHost;
        publish(properties, "SampleRate", format.rate);
        publish(properties, "Channels", static_cast<unsigned int>(format.channels));
        publish(properties, "ElementType", std::string(format.type->name));
        publish(properties, "Caps", caps);
        return writes ? DeviceInfo{std::nullopt, StreamInfo{}}
                      : DeviceInfo{StreamInfo{}, std::nullopt};
    }

    void open(const PropertyMap& options) override
    {
        Options(options).requireAllKnown();
        auto made = std::make_shared<Pipeline>(description, caps, writes);
        made->start();
        pipeline = made;
    }

    void run(DeviceStreams& streams) override
    {
        if (writes) {
            Writing(*pipeline, format, std::chrono::duration<double>(closeTimeout), *host, streams)
                .run();
        } else {
            Reading(*pipeline, *host, streams, [this](const Format& now, GstCaps* itsCaps) {
                host->updateProperty(makeScalar("SampleRate", now.rate));
                host->updateProperty(
                    makeScalar("Channels", static_cast<unsigned int>(now.channels)));
                host->updateProperty(makeScalar("ElementType", std::string(now.type->name)));
                const Owned<char> text(gst_caps_to_string(itsCaps));
                host->updateProperty(makeScalar("Caps", std::string(text.get())));
            }).run();
        }
    }

    void wake() noexcept override
    {
        if (pipeline) {
            pipeline->signal().set();
        }
    }

    void close() override
    {
        const auto used = std::move(pipeline);
        if (!used->stop()) {
            throw std::runtime_error("The pipeline did not stop within " +
                                     std::to_string(patience.count()) +
                                     " seconds and is left behind: " + description);
        }
    }

private:
    /// Of what is written: samples must be elements.
    void readFormat(const GstCaps* given)
    {
        if (gst_caps_is_fixed(given) == FALSE) {
            Options::fail("Caps", "must be fixed for what is written, not " + caps);
        }
        try {
            format = formatOf(given);
        } catch (const std::runtime_error&) {
            Options::fail("Caps", "of audio must tell format, rate, channels and "
                                  "layout=interleaved, not " +
                                      caps);
        }
        if (format.packed != nullptr) {
            Options::fail("Caps", "must have a format whose samples are elements, such as S16LE or "
                                  "S32LE, not " +
                                      caps);
        }
    }

    DeviceHost* host = nullptr;
    std::string description;
    std::string caps;
    bool writes = false;
    double closeTimeout = 0;
    Format format; ///< of what is written
    std::shared_ptr<Pipeline> pipeline;
};

constexpr OptionInfo optionTable[] = {
    {"Pipeline", "text", "", "(required)",
     "as gst-launch-1.0 takes it, without the end that is ours: the device adds the last element, "
     "an "
     "appsink, when reading, and the first, an appsrc, when writing"},
    {"Mode", "text", "", "read", "read what a pipeline delivers, or write what it takes"},
    {"Caps", "text", "", "any; writing, bytes", "of our end, such as audio/x-raw,format=S16LE"},
    {"CloseTimeout", "number", "seconds", "10",
     "writing: how long a pipeline may take nothing while it is closed, 0 to 3600"},
    {},
};

constexpr PropertyInfo propertyTable[] = {
    {"SampleRate", "double", "Hz", "of audio; 0: not known"},
    {"Channels", "uint32", "", "of audio; 1 of other data"},
    {"ElementType", "char", "", "of the data"},
    {"Caps", "char", "", "of our end"},
    {},
};

constexpr FieldInfo inputFields[] = {
    {dataField, "", "", "a sample of each channel for each frame of audio, or bytes as uint8"}, {}};

constexpr FieldInfo outputFields[] = {
    {dataField, "", "", "the same; a buffer need not end with a frame"}, {}};

} // namespace

BRENIXCORE_EXPORT_DEVICE(GStreamer)
BRENIXCORE_EXPORT_FIND(findSources)
BRENIXCORE_DESCRIBE_OPTIONS(optionTable)
BRENIXCORE_DESCRIBE_PROPERTIES(propertyTable)
BRENIXCORE_DESCRIBE_FIELDS(inputFields, outputFields)
