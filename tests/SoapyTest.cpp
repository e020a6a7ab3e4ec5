// The device soapy, on a radio of plugins/radio.cpp that does what each test says.

#include "Driver.hpp"
#include "brenixcore/plugin/Inspect.hpp"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstdlib>

using namespace driver;

namespace
{

const std::string script = "driver=script,serial=1,";

/// No other drivers than that one.
const int drivers =
    setenv("SOAPY_SDR_ROOT", TEST_RADIOS, 1) + setenv("SOAPY_SDR_PLUGIN_PATH", TEST_RADIOS, 1);

std::string textOf(const Channel& channel, const char* name)
{
    std::array<char, 200> text{};
    EXPECT_EQ(coderChannelGetPropertyValue(channel.handle, name, "char", text.size(), text.data()),
              1);
    return text.data();
}

/// What one read of at most so many counts delivers.
template <typename T>
struct Block {
    Block(const Channel& channel, double most = 1000)
    {
        Numbers counts;
        Channel::waitUntil([&] { return !(counts = channel.peek(most)).empty(); });
        EXPECT_EQ(coderInputStreamReadBuffers(channel.input, counts.at(0), 1), 1);
        pairs.resize(std::size_t(counts.at(0)) * 2);
        const auto read = [&](const char* field, const char* type, std::size_t size, void* values) {
            EXPECT_EQ(coderInputStreamReadBufferData(channel.input, 1, 0, field, type,
                                                     int32_t(size), values),
                      1)
                << channel.error();
        };
        read("data", sizeof(T) == 2 ? "int16" : "float", pairs.size(), pairs.data());
        read("Index", "uint64", 1, &index);
        read("Time", "int64", 1, &time);
    }
    /// Whether I counts up from the first number of all, and Q down.
    bool isScript() const
    {
        for (std::size_t i = 0; i < pairs.size() / 2; ++i) {
            if (pairs[2 * i] != T(index + i) || pairs[2 * i + 1] != T(-T(index + i))) {
                return false;
            }
        }
        return true;
    }
    std::vector<T> pairs;
    std::uint64_t index = 0;
    std::int64_t time = 0;
};

template <typename T>
void expectBlocks(const Channel& channel, std::uint64_t last, bool hasTime, std::int64_t ahead = 0)
{
    const auto now = std::chrono::nanoseconds(std::chrono::system_clock::now().time_since_epoch());
    std::int64_t start = 0;
    for (std::uint64_t index = 0; index < last && !testing::Test::HasFailure();) {
        const Block<T> block(channel);
        index = block.index;
        EXPECT_TRUE(block.isScript()) << index;
        start = start == 0 ? block.time - std::int64_t(index) * 1000 : start;
        EXPECT_EQ(block.time, hasTime ? start + std::int64_t(index) * 1000 : 0) << index;
    }
    EXPECT_TRUE(!hasTime || std::abs(start - now.count() - ahead) < 5'000'000'000);
}

template <typename T>
double write(const Channel& channel, const std::vector<T>& elements)
{
    double written = -1;
    coderOutputStreamWriteTypedDataOld(channel.output, &written, 1,
                                       sizeof(T) == 2 ? "int16" : "float",
                                       CODER_BUFFER(elements.size(), elements.data()));
    return written;
}

} // namespace

TEST(SoapyTest, WhatIsReceivedHasItsTimeAndWhatIsLostIsToldToTheCount)
{
    const struct {
        const char* arguments;
        std::uint64_t last; ///< index of the block that ends it
        std::uint64_t lost;
        const char* error;
    } cases[] = {
        {"rx=ddd", 2000, 0, ""},
        {"rx=dnnddood,clock=900000000000", 5500, 500, "500 counts were lost: the radio overflowed"},
        {"rx=dadad", 2500, 500, "lost: the radio overflowed; 500 since open."},
        {"rx=dddcd", 3250, 250, "lost: what came from the radio was damaged"},
        {"rx=ddj", 27000, 25000, "lost: the radio's time jumped"},
        {"rx=dsd", 1250, 250, "lost: the radio was silent"},
        {"rx=nnn", 2000, 0, ""},
    };
    for (const auto& [arguments, last, lost, error] : cases) {
        SCOPED_TRACE(arguments);
        const bool isSilent = arguments == "rx=dsd"s;
        Channel channel("soapy");
        channel.start({{"Device", script + arguments},
                       {"Format", isSilent ? "CF32" : "CS16"},
                       {"Stamps", 1}});
        if (isSilent) {
            EXPECT_EQ(channel.asyncError(),
                      "brenix:Device:timeout|Radio " + script + arguments + " delivers nothing.");
            expectBlocks<float>(channel, last, true);
        } else {
            const bool isAhead = std::string_view(arguments).find("clock") != std::string::npos;
            expectBlocks<std::int16_t>(channel, last, arguments != "rx=nnn"s,
                                       isAhead ? 100'000'000'000 : 0); // of its clock
        }
        // It is told behind the packet that ends the gap.
        Channel::waitUntil([&, sum = lost, text = error] {
            return channel.property<std::uint64_t>("LostCounts", "uint64") == sum &&
                   (sum == 0 || channel.asyncError().find(text) != std::string::npos);
        });
        EXPECT_EQ(channel.close(), 1);
    }
}

TEST(SoapyTest, WhatNobodyTakesIsToldAndSoIsALossOfUnknownLength)
{
    Channel slow("soapy", 1000);
    slow.start({{"Device", script + "rx=dddo"}, {"Stamps", 1}});
    Channel::waitUntil([&] { return slow.property<std::uint64_t>("Overflows", "uint64") == 1; });
    EXPECT_EQ(slow.close(), 1);
    EXPECT_EQ(slow.asyncError(), "brenix:Stream:dataLost|1000 counts were lost: nobody took them "
                                 "in time; 1000 since open.");

    Channel untimed("soapy");
    const std::string device = script + "rx=dodonnod";
    untimed.start({{"Device", device}, {"Stamps", 1}});
    while (Block<float>(untimed).index < 4250 && !HasFailure()) {
    }
    EXPECT_EQ(untimed.property<std::uint64_t>("LostCounts", "uint64"), 250);
    EXPECT_EQ(untimed.property<std::uint64_t>("Overflows", "uint64"), 3);
    EXPECT_EQ(untimed.asyncError(),
              "brenix:Device:dataLost|Radio " + device +
                  " lost counts 2 times since open and did not tell how many: the radio "
                  "overflowed.");
}

TEST(SoapyTest, WhatIsTransmittedComesBackBitByBit)
{
    const std::string device = script + "rx=l,tx=ptwppt";
    Channel receiver("soapy");
    Channel transmitter("soapy");
    receiver.start({{"Device", device}, {"Format", "CS16"}, {"Stamps", 1}, {"BlockSize", 100}});
    transmitter.start({{"Device", device}, {"Format", "CS16"}, {"Mode", "write"}});
    std::vector<std::int16_t> sent;
    for (const std::size_t size : {301U, 1U, 2U, 1001U, 3U, 1000U}) { // pairs are torn
        std::vector<std::int16_t> part(size);
        for (std::size_t i = 0; i < size; ++i) {
            part[i] = std::int16_t((sent.size() + i) * 7);
        }
        sent.insert(sent.end(), part.begin(), part.end());
        ASSERT_EQ(write(transmitter, part), size) << transmitter.error();
    }
    ASSERT_EQ(transmitter.close(), 1) << transmitter.error();
    std::vector<std::int16_t> got;
    while (got.size() < sent.size() && !HasFailure()) {
        const auto pairs = Block<std::int16_t>(receiver).pairs;
        EXPECT_LE(pairs.size(), 200);
        got.insert(got.end(), pairs.begin(), pairs.end());
    }
    EXPECT_TRUE(got == sent);
    uint8_t has = 0;
    EXPECT_EQ(coderChannelHasAsyncError(transmitter.handle, &has), 1);
    EXPECT_EQ(has, 0);
}

TEST(SoapyTest, WhatIsNotTransmittedAsItWasWrittenIsTold)
{
    const struct {
        const char* arguments;
        std::size_t buffers; ///< of three pairs
        const char* error;
    } cases[] = {
        {"tx=uuw,clock=1000000000", 3,
         "dataLost|Radio # ran dry 2 times since open, for 500 counts."},
        {"tx=vw", 2,
         "dataLost|Radio # ran dry 1 times since open, for 0 counts; it did not tell how long 1 of "
         "them were."},
        {"tx=wu,clock=9", 2, ""}, // at the end
        {"tx=c", 1, "dataLost|Radio # may not have sent all that it took: CORRUPTION."},
        {"tx=pe", 1, "failed|Radio # failed or is gone: STREAM_ERROR. 2 elements were not sent."},
    };
    for (const auto& [arguments, buffers, text] : cases) {
        SCOPED_TRACE(arguments);
        Channel channel("soapy");
        const std::string device = script + arguments;
        channel.start({{"Device", device}, {"Mode", "write"}});
        for (std::size_t i = 0; i < buffers; ++i) {
            ASSERT_EQ(write(channel, std::vector<float>(6)), 6) << channel.error();
        }
        EXPECT_EQ(channel.close(), 1);
        std::string error = text;
        if (!error.empty()) {
            error = "brenix:Device:" + error.replace(error.find('#'), 1, device);
            EXPECT_EQ(channel.asyncError().substr(0, error.size()), error);
        }
        const std::size_t dry = error.find("ran dry") == std::string::npos ? 0 : buffers - 1;
        EXPECT_EQ(channel.property<std::uint64_t>("Underflows", "uint64"), dry);
    }
    Channel channel("soapy");
    channel.start({{"Device", script + "tx=w"}, {"Mode", "write"}});
    ASSERT_EQ(channel.write({1, 2}), 2);
    const std::string wrongType = "Data to transmit must be float, but is double. 2 elements of "
                                  "another type were not sent by radio " +
                                  script + "tx=w.";
    EXPECT_EQ(channel.asyncError(), "brenix:Device:wrongType|" + wrongType);
    ASSERT_EQ(write(channel, std::vector<float>(1)), 1);
    EXPECT_EQ(channel.close(), 1); // of errors that nobody has read, only the last is kept
    EXPECT_EQ(channel.asyncError(), "brenix:Device:failed|The last I for radio " + script +
                                        "tx=w has no Q. 1 elements were not sent. " + wrongType);
}

TEST(SoapyTest, CloseWaitsUntilAllIsSent)
{
    for (const char* arguments : {"rate=1000", "rate=1000,quiet=1", "rate=1000,quiet=1,tx=xw"}) {
        const bool isQuiet = arguments != "rate=1000"s;
        const bool ranDry = std::string_view(arguments).ends_with("xw");
        Channel channel("soapy");
        channel.start({{"Device", script + arguments}, {"Mode", "write"}});
        if (ranDry) { // and tells that when it has got more
            ASSERT_EQ(write(channel, std::vector<float>(6)), 6);
        }
        const std::vector<float> seconds(isQuiet ? 600 : 40000); // 0.3 or 20
        ASSERT_EQ(write(channel, seconds), seconds.size());
        const auto begin = std::chrono::steady_clock::now();
        EXPECT_EQ(channel.close(), 1);
        const std::chrono::duration<double> took = std::chrono::steady_clock::now() - begin;
        EXPECT_TRUE(isQuiet ? took.count() > 0.2 : took.count() < 10) << took.count();
        EXPECT_EQ(channel.property<std::uint64_t>("Underflows", "uint64"), ranDry ? 1 : 0);
    }
}

TEST(SoapyTest, ARadioThatIsGoneEndsTheDeviceAndOneThatTakesNothingHoldsNobodyUp)
{
    Channel channel("soapy");
    channel.start({{"Device", script + "rx=de"}, {"Stamps", 1}, {"Gain", 20}});
    EXPECT_EQ(Block<float>(channel).index, 0);
    ASSERT_EQ(channel.execute("set", {{"Gain", 30}}), 1) << channel.error();
    channel.waitForEnd();
    EXPECT_EQ(channel.asyncError(),
              "brenix:Device:failed|Radio " + script + "rx=de failed or is gone: STREAM_ERROR.");
    EXPECT_EQ(channel.close(), 1);
    EXPECT_EQ(channel.execute("set", {{"Gain", 10}}), 0);
    ASSERT_EQ(channel.open(), 1) << channel.error(); // it is there again
    EXPECT_EQ(Block<float>(channel).index, 0);
    EXPECT_EQ(channel.property<double>("Gain", "double"), 30);

    Channel stuck("soapy");
    const std::string device = script + "tx=z";
    stuck.start({{"Device", device}, {"Mode", "write"}});
    ASSERT_EQ(write(stuck, std::vector<float>(8)), 8);
    EXPECT_EQ(stuck.close(), 1);
    EXPECT_EQ(stuck.asyncError(),
              "brenix:Device:failed|Radio " + device + " takes no more. 8 elements were not sent.");
}

TEST(SoapyTest, PropertiesSayWhatTheRadioDid)
{
    Channel channel("soapy");
    channel.start({{"Device", script + "rx=d"},
                   {"Frequency", 1e8 + 400},
                   {"Gain", 12.5},
                   {"Antenna", "B"},
                   {"Stamps", 1}});
    const auto expect = [&](double rate, double frequency, double gain, double bandwidth,
                            const char* antenna) {
        EXPECT_EQ(channel.property<double>("SampleRate", "double"), rate);
        EXPECT_EQ(channel.property<double>("Frequency", "double"), frequency);
        EXPECT_EQ(channel.property<double>("Gain", "double"), gain);
        EXPECT_EQ(channel.property<double>("Bandwidth", "double"), bandwidth);
        EXPECT_EQ(textOf(channel, "Antenna"), antenna);
    };
    expect(1e6, 1e8, 12.5, 0, "B");
    EXPECT_EQ(textOf(channel, "Driver") + textOf(channel, "Hardware"), "scriptpaper");
    ASSERT_EQ(channel.execute("set", {{"SampleRate", 250400.0},
                                      {"Frequency", 2e9},
                                      {"Gain", 60},
                                      {"Bandwidth", 2e5},
                                      {"Antenna", "A"}}),
              1)
        << channel.error();
    expect(250000, 2e9, 40, 2e5, "A");
    EXPECT_EQ(channel.execute("set", {{"Antenna", "B"}, {"Frequency", 7e9}}), 0);
    EXPECT_NE(channel.error().find("Option Frequency: is not possible for radio " + script +
                                   "rx=d: beyond 6 GHz."),
              std::string::npos)
        << channel.error();
    expect(250000, 2e9, 40, 2e5, "B");
}

TEST(SoapyTest, WhatARadioDoesNotHaveIsRefused)
{
    const struct {
        const char* arguments;
        Option option;
        const char* text;
    } cases[] = {
        {"driver=none",
         {"Mode", "read"},
         "Could not open radio driver=none: no radio matches, or SoapySDR has no module for it."},
        {"serial=0", {"Mode", "read"}, "Could not open radio serial=0: it is in use."},
        {"rate=0", {"Mode", "read"}, "Option SampleRate: must be given for radio rate=0."},
        {"a=b", {"SampleRate", 0}, "Option SampleRate: must be more than 0 Hz."},
        {"a=b", {"SampleRate", 100}, "Option SampleRate: is not possible for radio a=b."},
        {"a=b", {"Frequency", -1}, "Option Frequency: must be 0 Hz or more."},
        {"a=b", {"Gain", infinity}, "Option Gain: must be finite."},
        {"a=b", {"Channel", 2}, "Option Channel: must be less than 2: radio a=b has no more that"},
        {"a=b",
         {"Channel", 1},
         "Option Format: is not possible for radio a=b, which has CS8, S16."},
        {"a=b", {"Format", "CF64"}, "Option Format: must be CF32 or CS16, not CF64."},
        {"a=b", {"Antenna", "C"}, "Option Antenna: is not there: radio a=b has A, B."},
        {"driver=null",
         {"Mode", "write"},
         "Option Mode: is not possible: radio driver=null cannot"},
    };
    for (const auto& [arguments, option, text] : cases) {
        Channel channel("soapy");
        EXPECT_EQ(channel.init({{"Device", arguments}, option}), 0) << text;
        EXPECT_NE(channel.error().find(text), std::string::npos) << channel.error();
    }
    Channel channel("soapy");
    ASSERT_EQ(channel.init({{"Device", "serial=2"}}), 1) << channel.error();
    for (int i = 0; i < 3; ++i) { // no stream is left
        EXPECT_EQ(channel.open(), 0);
        EXPECT_NE(channel.error().find("Radio serial=2 does not stream: NOT_SUPPORTED."),
                  std::string::npos)
            << channel.error();
    }
}

TEST(SoapyTest, RadiosAreFound)
{
    const auto found = brenixcore::plugin::findDevices("soapy").found;
    ASSERT_EQ(found.size(), 1);
    EXPECT_EQ(found[0].what, "radio: Paper and pencil");
    ASSERT_EQ(found[0].options.size(), 1);
    EXPECT_EQ(found[0].options[0], std::pair("Device"s, "driver=script,serial=7"s));
    Channel channel("soapy");
    EXPECT_EQ(channel.init({{"Device", found[0].options[0].second}}), 1) << channel.error();
}
