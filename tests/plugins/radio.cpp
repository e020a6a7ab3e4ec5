// A driver of SoapySDR, "script", whose radio does what its arguments say, a letter a call. Argument rx, receiving, where
// I counts up and Q down: d 1000 pairs and their time, n without it, a with an overflow behind them, j after 25000 that
// it says nothing of, o overflow, c corruption, s silence for 4 seconds (each of which loses 250 pairs), e error, l what
// was transmitted. Argument tx, transmitting: w takes all, p half, t nothing, z nothing any more, u all and then runs
// dry for 250 pairs, v the same without time, x the same but says so behind the next write, c all and then says that it
// was damaged, e error. With quiet=1 it does not say that a burst has ended.

#include <SoapySDR/Device.hpp>
#include <SoapySDR/Registry.hpp>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <cmath>
#include <deque>
#include <mutex>
#include <stdexcept>
#include <thread>
#include <utility>

namespace
{

using Strings = std::vector<std::string>;

class Script : public SoapySDR::Device
{
public:
    explicit Script(const SoapySDR::Kwargs& given) : arguments(given)
    {
        if (value("serial") == "0") {
            throw std::runtime_error("it is in use");
        }
        rate = value("rate").empty() ? 1e6 : std::stod(value("rate"));
    }
    std::string getDriverKey() const override { return "script"; }
    std::string getHardwareKey() const override { return "paper"; }
    size_t getNumChannels(int /*direction*/) const override { return 2; }
    Strings getStreamFormats(int /*direction*/, size_t channel) const override
    {
        return channel == 0 ? Strings{"CF32", "CS16"} : Strings{"CS8", "S16"};
    }
    Strings listAntennas(int /*direction*/, size_t /*channel*/) const override
    {
        return {"A", "B"};
    }
    void setAntenna(int /*direction*/, size_t /*channel*/, const std::string& name) override
    {
        antenna = name;
    }
    std::string getAntenna(int /*direction*/, size_t /*channel*/) const override { return antenna; }
    bool hasGainMode(int /*direction*/, size_t /*channel*/) const override { return true; }
    void setGainMode(int /*direction*/, size_t /*channel*/, bool automatic) override
    {
        isAutomatic = automatic;
    }
    void setGain(int /*direction*/, size_t /*channel*/, double decibels) override
    {
        gain = std::min(decibels, 40.0);
    }
    double getGain(int /*direction*/, size_t /*channel*/) const override
    {
        return isAutomatic ? 99 : gain;
    }
    void setFrequency(int /*direction*/, size_t /*channel*/, double hertz,
                      const SoapySDR::Kwargs& /*arguments*/) override
    {
        if (hertz > 6e9) {
            throw std::invalid_argument("beyond 6 GHz");
        }
        frequency = std::round(hertz / 1000) * 1000;
    }
    double getFrequency(int /*direction*/, size_t /*channel*/) const override { return frequency; }
    void setSampleRate(int /*direction*/, size_t /*channel*/, double hertz) override
    {
        rate = std::round(hertz / 1000) * 1000;
    }
    double getSampleRate(int /*direction*/, size_t /*channel*/) const override { return rate; }
    void setBandwidth(int /*direction*/, size_t /*channel*/, double hertz) override
    {
        bandwidth = hertz;
    }
    double getBandwidth(int /*direction*/, size_t /*channel*/) const override { return bandwidth; }
    bool hasHardwareTime(const std::string& /*what*/) const override
    {
        return !value("clock").empty();
    }
    long long getHardwareTime(const std::string& /*what*/) const override
    {
        return std::stoll(value("clock"));
    }

    SoapySDR::Stream* setupStream(int direction, const std::string& format,
                                  const std::vector<size_t>& /*channels*/,
                                  const SoapySDR::Kwargs& /*arguments*/) override
    {
        if (++streams > 2) {
            throw std::runtime_error("it has no more streams");
        }
        isShort = format == "CS16";
        script[direction] = value(direction == SOAPY_SDR_RX ? "rx" : "tx");
        place[direction] = 0;
        if (direction == SOAPY_SDR_RX) {
            number = 0;
        }
        return reinterpret_cast<SoapySDR::Stream*>(this);
    }
    void closeStream(SoapySDR::Stream* /*stream*/) override { --streams; }
    size_t getStreamMTU(SoapySDR::Stream* /*stream*/) const override { return 4096; }
    int activateStream(SoapySDR::Stream* /*stream*/, int /*flags*/, long long /*time*/,
                       size_t /*count*/) override
    {
        return value("serial") == "2" ? SOAPY_SDR_NOT_SUPPORTED : 0;
    }
    int deactivateStream(SoapySDR::Stream* /*stream*/, int /*flags*/, long long /*time*/) override
    {
        return value("serial") == "2" ? throw std::runtime_error("it is not active") : 0;
    }

    int readStream(SoapySDR::Stream* /*stream*/, void* const* buffers, size_t count, int& flags,
                   long long& time, long timeout) override
    {
        const char letter = next(SOAPY_SDR_RX);
        flags = letter == 'd' || letter == 'a' || letter == 'j' ? SOAPY_SDR_HAS_TIME : 0;
        number += letter == 'j' ? 25000 : 0;
        time = 1000000000000 + std::llround(number * 1e9 / rate);
        switch (letter) {
        case 'a':
            flags |= SOAPY_SDR_END_ABRUPT;
            [[fallthrough]];
        case 'd':
        case 'j':
        case 'n':
            count = std::min<size_t>(count, 1000);
            for (size_t i = 0; i < count; ++i, ++number) {
                set(buffers[0], 2 * i, number);
                set(buffers[0], 2 * i + 1, -number);
            }
            number += letter == 'a' ? 250 : 0;
            return static_cast<int>(count);
        case 'o':
            number += 250;
            return SOAPY_SDR_OVERFLOW;
        case 'c':
            number += 250;
            return SOAPY_SDR_CORRUPTION;
        case 'e':
            return SOAPY_SDR_STREAM_ERROR;
        case 'l':
            --place[SOAPY_SDR_RX];
            if (const int got = fromLoop(buffers[0], count); got > 0) {
                return got;
            }
            break;
        case 's':
            if (silence == 0) {
                number += 250;
            }
            silence += timeout;
            if (silence < 4000000) {
                --place[SOAPY_SDR_RX];
            }
            break;
        default:
            break;
        }
        std::this_thread::sleep_for(std::chrono::microseconds(timeout));
        return SOAPY_SDR_TIMEOUT;
    }

    int writeStream(SoapySDR::Stream* /*stream*/, const void* const* buffers, size_t count,
                    int& /*flags*/, long long /*time*/, long timeout) override
    {
        if (count == 0) {
            hasEnded = value("quiet").empty();
            return 0;
        }
        const char letter = next(SOAPY_SDR_TX);
        if (letter == 'e') {
            return SOAPY_SDR_STREAM_ERROR;
        }
        if (letter == 't' || letter == 'z') {
            place[SOAPY_SDR_TX] -= letter == 'z' ? 1 : 0;
            std::this_thread::sleep_for(std::chrono::microseconds(timeout));
            return SOAPY_SDR_TIMEOUT;
        }
        count = letter == 'p' ? (count + 1) / 2 : count;
        const bool isDry = letter == 'u' || letter == 'v' || letter == 'c';
        dry = std::exchange(late, letter == 'x' ? 'v' : ' ');
        dry = isDry ? letter : dry;
        const std::lock_guard lock(mutex);
        const auto* const bytes = static_cast<const char*>(buffers[0]);
        loop.insert(loop.end(), bytes, bytes + count * pairSize());
        return static_cast<int>(count);
    }

    int readStreamStatus(SoapySDR::Stream* /*stream*/, size_t& /*channels*/, int& flags,
                         long long& time, long /*timeout*/) override
    {
        const char letter = std::exchange(dry, ' ');
        flags = letter == 'u' ? SOAPY_SDR_HAS_TIME : 0;
        time = letter == 'u' ? getHardwareTime("") - std::llround(250e9 / rate) : 0;
        if (letter == ' ' && std::exchange(hasEnded, false)) {
            flags = SOAPY_SDR_END_BURST;
            return 0;
        }
        if (letter == 'c') {
            return SOAPY_SDR_CORRUPTION;
        }
        return letter == ' ' ? SOAPY_SDR_TIMEOUT : SOAPY_SDR_UNDERFLOW;
    }

private:
    std::string value(const char* key) const
    {
        const auto found = arguments.find(key);
        return found == arguments.end() ? "" : found->second;
    }
    char next(int direction)
    {
        const std::string& letters = script[direction];
        return place[direction] < letters.size() ? letters[place[direction]++] : ' ';
    }
    size_t pairSize() const { return isShort ? 4 : 8; }
    void set(void* buffer, size_t index, double sample) const
    {
        if (isShort) {
            static_cast<short*>(buffer)[index] = static_cast<short>(sample);
        } else {
            static_cast<float*>(buffer)[index] = static_cast<float>(sample);
        }
    }
    int fromLoop(void* buffer, size_t count)
    {
        const std::lock_guard lock(mutex);
        count = std::min(count, loop.size() / pairSize());
        const auto end = loop.begin() + static_cast<std::ptrdiff_t>(count * pairSize());
        std::copy(loop.begin(), end, static_cast<char*>(buffer));
        loop.erase(loop.begin(), end);
        return static_cast<int>(count);
    }

    const SoapySDR::Kwargs arguments;
    std::string antenna = "A";
    bool isAutomatic = true;
    double gain = 0;
    double frequency = 1e8;
    double bandwidth = 0;
    std::atomic<double> rate = 0;
    std::atomic<bool> isShort = false;
    std::string script[2]; ///< by direction
    size_t place[2]{};     ///< in it
    double number = 0;     ///< of the next pair
    long silence = 0;      ///< microseconds
    char dry = ' ';
    char late = ' ';
    bool hasEnded = false;
    std::atomic<int> streams = 0; ///< that are not closed
    std::mutex mutex;
    std::deque<char> loop; ///< what was transmitted, which another thread may receive
};

SoapySDR::KwargsList find(const SoapySDR::Kwargs& arguments)
{
    SoapySDR::Kwargs radio = arguments;
    radio.emplace("label", "Paper and pencil");
    radio.emplace("serial", "7");
    return {radio};
}

const SoapySDR::Registry registry(
    "script", find,
    [](const SoapySDR::Kwargs& given) -> SoapySDR::Device* { return new Script(given); },
    SOAPY_SDR_ABI_VERSION);

} // namespace
