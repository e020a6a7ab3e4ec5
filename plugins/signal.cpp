// Device `signal`: a test signal, on one or more channels. A count is a frame: one sample of each
// channel, interleaved in the field "data" as double.

#include "brenixcore/plugin/Describe.hpp"
#include "brenixcore/plugin/Make.hpp"
#include "brenixcore/plugin/Options.hpp"
#include "brenixcore/plugin/Plugin.hpp"

#include <algorithm>
#include <chrono>
#include <cmath>
#include <condition_variable>
#include <cstdint>
#include <limits>
#include <memory>
#include <mutex>
#include <random>
#include <string>
#include <utility>

namespace
{

using namespace brenixcore::plugin;
using brenixplugin::PropertyMap;

constexpr double pi = 3.14159265358979323846;

/// The value of a waveform at a phase from 0 up to 1; null for a name that is not known.
using Waveform = double (*)(double phase, std::mt19937_64& random);

Waveform waveformOf(const std::string& name)
{
    if (name == "sine") {
        return [](double phase, std::mt19937_64&) { return std::sin(2 * pi * phase); };
    }
    if (name == "square") {
        return [](double phase, std::mt19937_64&) { return phase < 0.5 ? 1.0 : -1.0; };
    }
    if (name == "ramp") {
        return [](double phase, std::mt19937_64&) { return 2 * phase - 1; };
    }
    if (name == "noise") {
        return [](double, std::mt19937_64& random) {
            return std::uniform_real_distribution<double>(-1, 1)(random);
        };
    }
    return nullptr;
}

enum class Pace { RealTime, Live, Fast };

Pace paceOf(const std::string& name)
{
    if (name == "realtime") {
        return Pace::RealTime;
    }
    if (name == "live") {
        return Pace::Live;
    }
    if (name != "fast") {
        Options::fail("Pace", "must be realtime, live or fast, not " + name);
    }
    return Pace::Fast;
}

class Signal : public Device
{
public:
    DeviceInfo init(const PropertyMap& optionMap, PropertyMap& properties,
                    DeviceHost& deviceHost) override
    {
        Options options(optionMap);
        const std::string name = options.text("Waveform").value_or("sine");
        waveform = waveformOf(name);
        if (waveform == nullptr) {
            Options::fail("Waveform", "must be sine, square, ramp or noise, not " + name);
        }
        pace = paceOf(options.text("Pace").value_or("realtime"));
        channels = options.wholeNumber("Channels", 1, 1024).value_or(1);
        blockSize = options.wholeNumber("BlockSize", 1, 1L << 20).value_or(1024);
        frames = options.wholeNumber("Frames", 1, 1L << 53).value_or(0);
        sampleRate = options.number("SampleRate").value_or(48000);
        if (!(sampleRate > 0 && std::isfinite(sampleRate))) {
            Options::fail("SampleRate", "must be more than 0 Hz");
        }
        frequency = std::min(440.0, sampleRate / 4);
        amplitude = 1;
        readTunable(options);

        host = &deviceHost;
        publish(properties, "SampleRate", sampleRate);
        publish(properties, "Channels", static_cast<unsigned int>(channels));
        publish(properties, "Frequency", frequency);
        publish(properties, "Amplitude", amplitude);
        return {StreamInfo{1, sampleRate}, std::nullopt};
    }

    void open(const PropertyMap& options) override { Options(options).requireAllKnown(); }

    void run(DeviceStreams& streams) override
    {
        using std::chrono::system_clock;
        const auto start = std::chrono::steady_clock::now();
        const auto startTime = system_clock::now();
        double phase = 0;
        std::mt19937_64 random; // NOLINT(cert-msc32-c,cert-msc51-cpp): the same noise each time
        for (long first = 0; frames == 0 || first < frames; first += blockSize) {
            const long count = frames == 0 ? blockSize : std::min(blockSize, frames - first);
            Packet packet;
            if (pace != Pace::Fast) {
                // A block is there when its last frame is.
                std::unique_lock lock(mutex);
                changed.wait_until(lock, start + durationOf(first + count),
                                   [&] { return streams.isClosing(); });
                packet.time = std::chrono::duration_cast<std::chrono::nanoseconds>(
                                  (startTime + durationOf(first)).time_since_epoch())
                                  .count();
            }
            fill(packet, count, phase, random);
            if (pace != Pace::Live) {
                if (!streams.push(std::move(packet))) {
                    return;
                }
            } else if (!streams.tryPush(packet)) {
                if (streams.isClosing()) {
                    return;
                }
                streams.tellLost(static_cast<std::uint64_t>(count), "nobody took them in time");
            }
        }
    }

    void wake() noexcept override
    {
        const std::lock_guard lock(mutex);
        changed.notify_all();
    }

    /// Command `set`: a new Frequency or Amplitude, from the next block on.
    void execute(const std::string& command, const PropertyMap& optionMap) override
    {
        if (command != "set") {
            Device::execute(command, optionMap);
        }
        Options options(optionMap);
        readTunable(options);
        host->updateProperty(makeScalar("Frequency", frequency));
        host->updateProperty(makeScalar("Amplitude", amplitude));
    }

private:
    void readTunable(Options& options)
    {
        const double newFrequency = options.number("Frequency").value_or(frequency);
        const double newAmplitude = options.number("Amplitude").value_or(amplitude);
        options.requireAllKnown();
        if (!(newFrequency >= 0 && newFrequency <= sampleRate / 2)) {
            Options::fail("Frequency", "must be from 0 Hz to half the sample rate");
        }
        if (!std::isfinite(newAmplitude)) {
            Options::fail("Amplitude", "must be finite");
        }
        const std::lock_guard lock(mutex);
        frequency = newFrequency;
        amplitude = newAmplitude;
    }

    /// How long so many frames take.
    std::chrono::nanoseconds durationOf(long count) const
    {
        constexpr double longest = 1e9; // what comes later than a clock can tell never comes
        const std::chrono::duration<double> seconds(
            std::min(static_cast<double>(count) / sampleRate, longest));
        return std::chrono::duration_cast<std::chrono::nanoseconds>(seconds);
    }

    /// Puts the next frames into a packet. Channel i of k runs ahead by i / k of a period.
    void fill(Packet& packet, long count, double& phase, std::mt19937_64& random)
    {
        double step = 0;
        double factor = 0;
        {
            const std::lock_guard lock(mutex);
            step = frequency / sampleRate;
            factor = amplitude;
        }
        const auto size = static_cast<std::uint64_t>(count * channels);
        std::unique_ptr<double[]> samples(new double[size]);
        double* next = samples.get();
        for (long frame = 0; frame < count; ++frame) {
            for (long channel = 0; channel < channels; ++channel) {
                const double ahead =
                    phase + static_cast<double>(channel) / static_cast<double>(channels);
                *next++ = factor * waveform(ahead - std::floor(ahead), random);
            }
            phase += step;
            phase -= std::floor(phase);
        }
        packet.counts = static_cast<std::uint64_t>(count);
        setField(packet, makeArray(dataField, std::move(samples), size));
    }

    DeviceHost* host = nullptr;
    Waveform waveform = nullptr;
    Pace pace = Pace::RealTime;
    long channels = 1;
    long blockSize = 1024;
    long frames = 0; ///< 0 is without end
    double sampleRate = 48000;

    std::mutex mutex; ///< guards these two, and the wait for a block's time
    std::condition_variable changed;
    double frequency = 440;
    double amplitude = 1;
};

constexpr OptionInfo optionTable[] = {
    {"Waveform", "text", "", "sine", "sine, square, ramp (-1 to 1) or noise (evenly from -1 to 1)"},
    {"Frequency", "number", "Hz", "440",
     "0 to half the sample rate; the default is a quarter of it where that is less than 440"},
    {"Amplitude", "number", "", "1", "of the highest and the lowest value"},
    {"Channels", "whole number", "", "1", ""},
    {"SampleRate", "number", "Hz", "48000", ""},
    {"BlockSize", "whole number", "frames", "1024", "of one packet"},
    {"Frames", "whole number", "frames", "endless", "after which the device is done"},
    {"Pace", "text", "", "realtime",
     "realtime delivers a block when its last frame is due, and what is due meanwhile later; live "
     "as an instrument does that cannot be held back: what has no room at once is lost; fast as "
     "soon as there is room"},
    {},
};

constexpr OptionInfo setOptions[] = {
    {"Frequency", "number", "Hz", "unchanged", "0 to half the sample rate"},
    {"Amplitude", "number", "", "unchanged", "of the highest and the lowest value"},
    {},
};

constexpr CommandInfo commandTable[] = {
    {"set", setOptions, "from the next block on; the properties follow"},
    {},
};

constexpr FieldInfo inputFields[] = {
    {dataField, "double", "", "a sample of each channel for each frame"},
    {},
};

constexpr PropertyInfo propertyTable[] = {
    {"SampleRate", "double", "Hz", ""},
    {"Frequency", "double", "Hz", ""},
    {"Amplitude", "double", "", ""},
    {"Channels", "uint32", "", ""},
    {},
};

} // namespace

BRENIXCORE_EXPORT_DEVICE(Signal)
BRENIXCORE_DESCRIBE_OPTIONS(optionTable)
BRENIXCORE_DESCRIBE_PROPERTIES(propertyTable)
BRENIXCORE_DESCRIBE_FIELDS(inputFields, noFields)
BRENIXCORE_DESCRIBE_COMMANDS(commandTable)
