// Device `soapy`: a software-defined radio, received into the input stream or transmitted from the output stream. A
// count of input is a pair, I and Q, interleaved in the field "data".

#include "soapy/Radio.hpp"
#include "soapy/Receiver.hpp"
#include "soapy/Transmitter.hpp"

#include "brenixcore/plugin/Describe.hpp"
#include "brenixcore/plugin/Find.hpp"
#include "brenixcore/plugin/Make.hpp"
#include "brenixcore/plugin/Options.hpp"
#include "brenixcore/plugin/Plugin.hpp"

#include <SoapySDR/Logger.hpp>

#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <mutex>
#include <optional>
#include <stdexcept>
#include <string>
#include <utility>
#include <vector>

namespace
{

using namespace brenixcore::plugin;
using brenixplugin::PropertyMap;

class Soapy : public Device
{
public:
    DeviceInfo init(const PropertyMap& optionMap, PropertyMap& properties,
                    DeviceHost& deviceHost) override
    {
        Options options(optionMap);
        settings = {};
        settings.arguments = options.text("Device").value_or("");
        settings.transmits = bytes::readChoice<2>(options, "Mode", {"read", "write"}) == 1;
        settings.channel =
            static_cast<std::size_t>(options.wholeNumber("Channel", 0, 1023).value_or(0));
        settings.format = bytes::readChoice(options, "Format", soapy::formatNames);
        settings.tuning.read(options);
        blockSize = 0;
        if (!settings.transmits) {
            blockSize =
                static_cast<std::size_t>(options.wholeNumber("BlockSize", 1, 1L << 24).value_or(0));
        }
        options.requireAllKnown();

        host = &deviceHost;
        radio.emplace(settings);
        for (auto& property : radio->properties()) {
            const std::string name = property->getName();
            storeProperty(properties, name, std::move(property));
        }
        publish(properties, "Format", std::string(soapy::formatNames.at(settings.format)));
        publish(properties, "ElementType", std::string(soapy::typeNames.at(settings.format)));
        publish(properties, "Overflows", std::uint64_t{0});
        publish(properties, "Underflows", std::uint64_t{0});
        return settings.transmits ? DeviceInfo{std::nullopt, StreamInfo{}}
                                  : DeviceInfo{StreamInfo{1, radio->rate()}, std::nullopt};
    }

    void open(const PropertyMap& options) override
    {
        Options(options).requireAllKnown();
        if (!radio) { // it was gone
            radio.emplace(settings);
            update();
        }
        radio->start();
        host->updateProperty(makeScalar("Overflows", std::uint64_t{0}));
        host->updateProperty(makeScalar("Underflows", std::uint64_t{0}));
    }

    void run(DeviceStreams& streams) override
    {
        try {
            if (settings.transmits) {
                const auto wait = [&](std::chrono::steady_clock::time_point time) {
                    std::unique_lock lock(mutex);
                    woken.wait_until(lock, time, [&] { return isWoken; });
                    isWoken = false;
                };
                soapy::Transmitter(*radio, *host, streams, wait).run();
            } else {
                soapy::Receiver(*radio, blockSize, *host, streams).run();
            }
        } catch (const std::exception&) {
            isGone = true;
            throw;
        }
    }

    void wake() noexcept override
    {
        const std::lock_guard lock(mutex);
        isWoken = true;
        woken.notify_all();
    }

    /// Command `set`: what the radio is tuned to, at once.
    void execute(const std::string& command, const PropertyMap& optionMap) override
    {
        if (command != "set") {
            Device::execute(command, optionMap);
        }
        Options options(optionMap);
        soapy::Tuning changes;
        changes.read(options);
        options.requireAllKnown();
        if (!radio) {
            throw std::runtime_error("The radio is gone: it can be set when it was opened again.");
        }
        try {
            radio->tune(changes);
        } catch (const std::exception&) {
            update();
            throw;
        }
        update();
        Options again(optionMap);
        settings.tuning.read(again); // for the next time that it is opened
    }

    void close() override
    {
        radio->stop();
        if (std::exchange(isGone, false)) {
            radio.reset();
        }
    }

    void term() override { radio.reset(); }

private:
    void update()
    {
        for (auto& property : radio->properties()) {
            host->updateProperty(std::move(property));
        }
    }

    DeviceHost* host = nullptr;
    soapy::Settings settings;
    std::size_t blockSize = 0; ///< 0: by the driver
    std::optional<soapy::Radio> radio;
    bool isGone = false; ///< a run has failed

    std::mutex mutex; ///< guards the wait of a run
    std::condition_variable woken;
    bool isWoken = false;
};

/// Each radio, with what tells it from others: its serial number, or else all that its driver says of it.
void findRadios(std::vector<Found>& found)
{
    struct Quiet { // drivers write what they do to the standard error
        Quiet()
        {
            SoapySDR::registerLogHandler([](SoapySDR::LogLevel /*level*/, const char* /*text*/) {});
        }
        Quiet(const Quiet&) = delete;
        Quiet& operator=(const Quiet&) = delete;
        ~Quiet() { SoapySDR::registerLogHandler(nullptr); }
    } const quiet;
    for (const SoapySDR::Kwargs& radio : SoapySDR::Device::enumerate()) {
        const auto label = radio.find("label");
        const bool hasSerial = radio.contains("serial");
        std::string arguments;
        for (const auto& [key, value] : radio) {
            if (key == "driver" || (hasSerial ? key == "serial" : key != "label")) {
                arguments.append(arguments.empty() ? "" : ",").append(key + '=' + value);
            }
        }
        found.push_back({"radio: " + (label == radio.end() ? arguments : label->second),
                         {{"Device", arguments}},
                         ""});
    }
}

constexpr OptionInfo optionTable[] = {
    {"Device", "text", "", "the first one",
     "which radio, by SoapySDR's arguments, such as driver=rtlsdr,serial=00000001"},
    {"Mode", "text", "", "read", "read receives, write transmits"},
    {"Channel", "whole number", "", "0", "of the radio, for this direction"},
    {"Format", "text", "", "CF32", "CF32 for float, CS16 for int16"},
    {"SampleRate", "number", "Hz", "the radio's", "pairs of I and Q a second"},
    {"Frequency", "number", "Hz", "the radio's", "of the middle of what it hears or sends"},
    {"Bandwidth", "number", "Hz", "the radio's", "of its filter"},
    {"Gain", "number", "dB", "the radio's", "of all stages; turns an automatic gain off"},
    {"Antenna", "text", "", "the radio's", "name of the connector"},
    {"BlockSize", "whole number", "pairs", "the driver's", "reading: of the largest packet"},
    {},
};

constexpr OptionInfo setOptions[] = {
    {"SampleRate", "number", "Hz", "unchanged", "where the radio can while it runs"},
    {"Frequency", "number", "Hz", "unchanged", ""},
    {"Bandwidth", "number", "Hz", "unchanged", ""},
    {"Gain", "number", "dB", "unchanged", ""},
    {"Antenna", "text", "", "unchanged", ""},
    {},
};

constexpr CommandInfo commandTable[] = {
    {"set", setOptions, "tunes the radio; the properties say what it did"},
    {},
};

constexpr PropertyInfo propertyTable[] = {
    {"Driver", "char", "", ""},
    {"Hardware", "char", "", "as the driver calls it"},
    {"Format", "char", "", ""},
    {"ElementType", "char", "", "of I and Q"},
    {"SampleRate", "double", "Hz", "as the driver has it, as are the next four"},
    {"Frequency", "double", "Hz", ""},
    {"Bandwidth", "double", "Hz", ""},
    {"Gain", "double", "dB", ""},
    {"Antenna", "char", "", ""},
    {"Overflows", "uint64", "", "since open: times that the radio lost input"},
    {"Underflows", "uint64", "", "since open: times that the radio ran dry amid what was written"},
    {},
};

constexpr FieldInfo inputFields[] = {
    {dataField, "", "", "I and Q for each count, of the type of the Format"},
    {},
};

constexpr FieldInfo outputFields[] = {
    {dataField, "float", "", "the same, int16 for CS16; a buffer need not end with a Q"},
    {},
};

} // namespace

BRENIXCORE_EXPORT_DEVICE(Soapy)
BRENIXCORE_EXPORT_FIND(findRadios)
BRENIXCORE_DESCRIBE_OPTIONS(optionTable)
BRENIXCORE_DESCRIBE_PROPERTIES(propertyTable)
BRENIXCORE_DESCRIBE_FIELDS(inputFields, outputFields)
BRENIXCORE_DESCRIBE_COMMANDS(commandTable)
