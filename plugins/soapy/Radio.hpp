// A radio of SoapySDR, tuned as it is asked to be, and its stream.
#ifndef BRENIX_PLUGINS_SOAPY_RADIO_HPP
#define BRENIX_PLUGINS_SOAPY_RADIO_HPP

#include "ElementTypes.hpp"
#include "brenixcore/plugin/Plugin.hpp"

#include <SoapySDR/Device.hpp>

#include <array>
#include <atomic>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <stdexcept>
#include <string>
#include <string_view>
#include <vector>

namespace soapy
{

/// How long a call waits for the radio: no wake-up reaches a thread that is in one.
constexpr std::chrono::milliseconds callTime{20};

/// How long a radio may deliver or take nothing before that is told.
constexpr std::chrono::seconds patience{3};

/// Names of formats, in the order of the element types of I and Q.
constexpr std::array<std::string_view, 2> formatNames = {"CF32", "CS16"};
constexpr std::array<std::string_view, 2> typeNames = {"float", "int16"};

/// What a radio is to be tuned to; it keeps what is not given.
struct Tuning {
    /// Takes the options that are given.
    void read(bytes::Options& options);

    std::optional<std::string> antenna;
    std::optional<double> sampleRate; ///< Hz
    std::optional<double> bandwidth;  ///< Hz
    std::optional<double> frequency;  ///< Hz
    std::optional<double> gain;       ///< dB
};

/// What is asked of a radio.
struct Settings {
    std::string arguments; ///< as SoapySDR takes them
    bool transmits = false;
    std::size_t channel = 0;
    std::size_t format = 0; ///< index of its name
    Tuning tuning;
};

/// One channel of a radio, in one direction. Errors are std::runtime_error or those of options, and name it.
class Radio
{
public:
    /// Opens the radio and tunes it. Channels of a program that ask for the same arguments share the radio.
    explicit Radio(const Settings& settings);
    Radio(const Radio&) = delete;
    Radio& operator=(const Radio&) = delete;
    ~Radio();

    /// Also while it streams. Of what fails, the properties tell how far it came.
    void tune(const Tuning& tuning);

    /// What it is, and what it is tuned to as the driver has it.
    std::vector<bytes::OwnedProperty> properties() const;

    const std::string& name() const { return ownName; }
    const bytes::ElementType& elementType() const { return *bytes::findType(typeNames.at(format)); }
    /// Pairs a second.
    double rate() const { return sampleRate; }

    /// Begins to stream.
    void start();
    void stop() noexcept;

    /// Pairs that the driver moves at once; for a stream.
    std::size_t pairsAtOnce() const { return device->getStreamMTU(stream); }

    /// Nanoseconds of the radio's clock; nothing where it has none.
    std::optional<std::int64_t> clock() const;

    // Of a stream, as SoapySDR has them: the number of pairs that were moved, or its error.

    int read(void* pairs, std::size_t count, int& flags, long long& time);
    int write(const void* pairs, std::size_t count, int flags);
    int status(int& flags, long long& time);

    /// The error of a stream that cannot go on.
    std::runtime_error failure(int error) const;

private:
    struct Unmake {
        void operator()(SoapySDR::Device* made) const { SoapySDR::Device::unmake(made); }
    };

    void checkChannel() const;
    void checkFormat() const;
    void checkAntenna(const std::string& antenna) const;
    template <typename Call>
    void change(const char* option, const Call& call);

    const int direction;
    const std::size_t channel;
    const std::size_t format;
    std::string ownName; ///< set as the device is made
    std::unique_ptr<SoapySDR::Device, Unmake> device;
    SoapySDR::Stream* stream = nullptr;
    std::atomic<double> sampleRate = 0;
};

} // namespace soapy

#endif
