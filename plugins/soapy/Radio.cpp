#include "Radio.hpp"

#include "brenixcore/plugin/Make.hpp"

#include <SoapySDR/Constants.h>
#include <SoapySDR/Errors.h>

#include <algorithm>
#include <cmath>
#include <exception>
#include <limits>
#include <utility>

namespace soapy
{

using brenixcore::plugin::makeScalar;
using brenixcore::plugin::Options;

namespace
{

constexpr long callMicroseconds = std::chrono::microseconds(callTime).count();

/// Opens a radio; how it is called in errors is `name`.
SoapySDR::Device* make(const std::string& arguments, std::string& name)
{
    try {
        auto* const made = SoapySDR::Device::make(arguments);
        name = arguments.empty() ? made->getHardwareKey() : arguments;
        return made;
    } catch (const std::exception& error) {
        const bool isThere = !SoapySDR::Device::enumerate(arguments).empty();
        throw std::runtime_error(
            "Could not open " + (arguments.empty() ? "a radio" : "radio " + arguments) + ": " +
            (isThere ? error.what() : "no radio matches, or SoapySDR has no module for it") + ".");
    }
}

std::string listOf(const std::vector<std::string>& texts)
{
    std::string list;
    for (const auto& text : texts) {
        list.append(list.empty() ? "" : ", ").append(text);
    }
    return list;
}

bool contains(const std::vector<std::string>& texts, std::string_view text)
{
    return std::find(texts.begin(), texts.end(), text) != texts.end();
}

} // namespace

void Tuning::read(Options& options)
{
    const auto number = [&](const char* name, std::optional<double>& value, double least) {
        const auto given = options.number(name);
        if (given && !(std::isfinite(*given) && *given >= least)) {
            Options::fail(name, least == 0 ? "must be 0 Hz or more" : "must be finite");
        }
        value = given ? given : value;
    };
    number("SampleRate", sampleRate, 0);
    number("Bandwidth", bandwidth, 0);
    number("Frequency", frequency, 0);
    number("Gain", gain, std::numeric_limits<double>::lowest());
    if (auto given = options.text("Antenna")) {
        antenna = std::move(given);
    }
    if (sampleRate == 0.0) {
        Options::fail("SampleRate", "must be more than 0 Hz");
    }
}

Radio::Radio(const Settings& settings)
    : direction(settings.transmits ? SOAPY_SDR_TX : SOAPY_SDR_RX), channel(settings.channel),
      format(settings.format), device(make(settings.arguments, ownName))
{
    checkChannel();
    checkFormat();
    tune(settings.tuning);
}

Radio::~Radio()
{
    stop();
}

void Radio::checkChannel() const
{
    const std::size_t channels = device->getNumChannels(direction);
    const char* const verb = direction == SOAPY_SDR_TX ? "transmit" : "receive";
    if (channels == 0) {
        Options::fail("Mode", "is not possible: radio " + ownName + " cannot " + verb);
    }
    if (channel >= channels) {
        Options::fail("Channel", "must be less than " + std::to_string(channels) + ": radio " +
                                     ownName + " has no more that " + verb);
    }
}

void Radio::checkFormat() const
{
    const auto formats = device->getStreamFormats(direction, channel);
    if (!formats.empty() && !contains(formats, formatNames.at(format))) {
        Options::fail("Format",
                      "is not possible for radio " + ownName + ", which has " + listOf(formats));
    }
}

/// Some drivers pass over one that is not there.
void Radio::checkAntenna(const std::string& antenna) const
{
    const auto antennas = device->listAntennas(direction, channel);
    if (!antennas.empty() && !contains(antennas, antenna)) {
        Options::fail("Antenna", "is not there: radio " + ownName + " has " + listOf(antennas));
    }
}

template <typename Call>
void Radio::change(const char* option, const Call& call)
{
    try {
        call();
    } catch (const std::exception& error) {
        Options::fail(option, "is not possible for radio " + ownName + ": " + error.what());
    }
}

void Radio::tune(const Tuning& tuning)
{
    if (tuning.antenna) {
        checkAntenna(*tuning.antenna);
        change("Antenna", [&] { device->setAntenna(direction, channel, *tuning.antenna); });
    }
    if (tuning.sampleRate) {
        change("SampleRate",
               [&] { device->setSampleRate(direction, channel, *tuning.sampleRate); });
    }
    const double got = device->getSampleRate(direction, channel);
    if (!(got > 0 && std::isfinite(got))) {
        Options::fail("SampleRate", tuning.sampleRate ? "is not possible for radio " + ownName
                                                      : "must be given for radio " + ownName);
    }
    sampleRate = got;
    if (tuning.bandwidth) {
        change("Bandwidth", [&] { device->setBandwidth(direction, channel, *tuning.bandwidth); });
    }
    if (tuning.frequency) {
        change("Frequency", [&] { device->setFrequency(direction, channel, *tuning.frequency); });
    }
    if (tuning.gain) {
        change("Gain", [&] {
            if (device->hasGainMode(direction, channel)) {
                device->setGainMode(direction, channel, false); // or it would choose its own
            }
            device->setGain(direction, channel, *tuning.gain);
        });
    }
}

std::vector<bytes::OwnedProperty> Radio::properties() const
{
    std::vector<bytes::OwnedProperty> all;
    const auto add = [&](const char* name, auto value) {
        all.push_back(makeScalar(name, std::move(value)));
    };
    add("Driver", device->getDriverKey());
    add("Hardware", device->getHardwareKey());
    add("SampleRate", device->getSampleRate(direction, channel));
    add("Frequency", device->getFrequency(direction, channel));
    add("Gain", device->getGain(direction, channel));
    add("Bandwidth", device->getBandwidth(direction, channel));
    add("Antenna", device->getAntenna(direction, channel));
    return all;
}

void Radio::start()
{
    try {
        stream = device->setupStream(direction, std::string(formatNames.at(format)), {channel});
        if (const int error = device->activateStream(stream); error != 0) {
            throw std::runtime_error(SoapySDR_errToStr(error));
        }
    } catch (const std::exception& error) {
        stop();
        throw std::runtime_error("Radio " + ownName + " does not stream: " + error.what() + ".");
    }
}

void Radio::stop() noexcept
{
    if (auto* const used = std::exchange(stream, nullptr)) {
        const auto attempt = [&](auto call) {
            try {
                call();
            } catch (const std::exception&) { // it is gone
                return;
            }
        };
        attempt([&] { device->deactivateStream(used); });
        attempt([&] { device->closeStream(used); });
    }
}

std::optional<std::int64_t> Radio::clock() const
{
    return device->hasHardwareTime() ? std::optional(device->getHardwareTime()) : std::nullopt;
}

int Radio::read(void* pairs, std::size_t count, int& flags, long long& time)
{
    return device->readStream(stream, &pairs, count, flags, time, callMicroseconds);
}

int Radio::write(const void* pairs, std::size_t count, int flags)
{
    return device->writeStream(stream, &pairs, count, flags, 0, callMicroseconds);
}

int Radio::status(int& flags, long long& time)
{
    std::size_t channels = 0;
    return device->readStreamStatus(stream, channels, flags, time, 0);
}

std::runtime_error Radio::failure(int error) const
{
    return std::runtime_error("Radio " + ownName +
                              " failed or is gone: " + SoapySDR_errToStr(error) + ".");
}

} // namespace soapy
