// The device alsa on PCMs of libasound that are files, on a card that the test steers, and on a PulseAudio server of
// the test's own with its programs paplay and parec.

#include "Driver.hpp"
#include "Process.hpp"
#include "brenixcore/plugin/Inspect.hpp"

#include <alsa/asoundlib.h>
#include <gmock/gmock.h>

#include <algorithm>
#include <array>
#include <atomic>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>

using namespace driver;
using namespace std::chrono_literals;

std::atomic<long> cardAhead = 0;
std::atomic<int> cardState = 0;
std::atomic<bool> cardHangs = false;
std::atomic<int> cardsOpen = 0;

namespace
{

const std::string folder = testing::TempDir() + "alsa-" + std::to_string(getpid()) + "/";
const std::string file = folder + "sound";

void save(const std::string& name, const std::string& text)
{
    std::ofstream(name, std::ios::binary) << text;
}

std::string load(const std::string& name)
{
    std::ifstream stream(name, std::ios::binary);
    return {std::istreambuf_iterator<char>(stream), {}};
}

template <typename T>
std::vector<T> samplesOf(const std::string& bytes)
{
    std::vector<T> samples(bytes.size() / sizeof(T));
    std::copy_n(bytes.data(), samples.size() * sizeof(T), reinterpret_cast<char*>(samples.data()));
    return samples;
}

/// The folder, the PCMs in it and an environment without the user's.
class Surroundings : public testing::Environment
{
    void SetUp() override
    {
        std::filesystem::create_directory(folder);
        const std::string null = "slave.pcm null file ";
        save(folder + "pcms",
             "</usr/share/alsa/alsa.conf>\n"
             "pcm.record { type file " +
                 null + "\"" + file +
                 "\" }\n"
                 "pcm.replay { type file " +
                 null + "/dev/null infile \"" + file +
                 "\" }\n"
                 "pcm_type.card { lib \"" TEST_CARD "\" }\npcm.card { type card }\n"
                 "pcm.server { type pulse hint { description \"It's\na server\" } server "
                 "\"unix:" +
                 folder + "socket\" }\n");
        setenv("ALSA_CONFIG_PATH", (folder + "pcms").c_str(), 1);
        save(folder + "server.pa",
             "load-module module-native-protocol-unix auth-anonymous=1 socket=" + folder +
                 "socket\nload-module module-null-sink sink_name=sink format=s16le rate=48000 "
                 "channels=2\n");
        for (const char* name : {"HOME", "XDG_RUNTIME_DIR", "XDG_CONFIG_HOME"}) {
            setenv(name, folder.c_str(), 1);
        }
        unsetenv("DBUS_SESSION_BUS_ADDRESS");
    }
    void TearDown() override { std::filesystem::remove_all(folder); }
};
const auto* const surroundings = testing::AddGlobalTestEnvironment(new Surroundings);

template <typename T>
double write(const Channel& channel, const char* type, const T* samples, std::size_t count)
{
    double written = -1;
    coderOutputStreamWriteTypedDataOld(channel.output, &written, 1, type,
                                       CODER_BUFFER(count, samples));
    return written;
}

/// A block of the test's card.
struct Block {
    /// Waits for the next one.
    explicit Block(const Channel& channel)
    {
        Numbers counts;
        Channel::waitUntil([&] { return !(counts = channel.peek(1)).empty(); });
        counts = channel.peek(4000);
        EXPECT_EQ(coderInputStreamReadBuffers(channel.input, counts.at(0), 1), 1);
        read(channel, "data", "int32", counts.at(0), &number);
        read(channel, "Index", "uint64", 1, &index);
        read(channel, "Time", "int64", 1, &time);
    }
    static void read(const Channel& channel, const char* field, const char* type, double count,
                     void* values)
    {
        std::array<std::int64_t, 4000> all{};
        EXPECT_EQ(coderInputStreamReadBufferData(channel.input, 1, 0, field, type, int32_t(count),
                                                 all.data()),
                  1)
            << channel.error();
        std::memcpy(values, all.data(), type == "int32"s ? 4 : 8);
    }
    /// The number that the first count of all had, if each count until here was delivered or told.
    double base() const { return number - double(index); }

    std::int32_t number = 0;
    std::uint64_t index = 0;
    std::int64_t time = 0; ///< nanoseconds
};

std::uint64_t lostCounts(const Channel& channel)
{
    return channel.property<std::uint64_t>("LostCounts", "uint64");
}

void startCard(Channel& channel)
{
    cardAhead = 0;
    channel.start({{"Card", "card"},
                   {"SampleFormat", "int32"},
                   {"Channels", 1},
                   {"BlockSize", 1000},
                   {"BufferTime", 1},
                   {"Stamps", 1}});
}

/// A PulseAudio server with a sink that nobody hears.
struct Server : Process {
    Server()
        : Process("pulseaudio -n -F " + folder +
                  "server.pa --daemonize=no --use-pid-file=no "
                  "--exit-idle-time=-1 2>/dev/null")
    {
        Channel::waitUntil([] { return std::filesystem::exists(folder + "socket"); });
    }
    ~Server()
    {
        end();
        std::filesystem::remove(folder + "socket");
    }
};
const std::string clientOptions = " --server=unix:" + folder +
                                  "socket --raw --format=s16le "
                                  "--rate=48000 --channels=2 ";

/// Frames of the numbers from `first` on, on both channels.
std::vector<std::int16_t> ramp(int first, int end)
{
    std::vector<std::int16_t> samples;
    for (int i = first; i < end; ++i) {
        samples.insert(samples.end(), 2, std::int16_t(i));
    }
    return samples;
}

/// Whether the samples have the numbers up to the end, and each follows the one before; how much silence is
/// between them. Of what a sink begins to play, its monitor may have
/// silence instead at first.
bool hasRamp(const std::vector<std::int16_t>& samples, int end, std::size_t& silence)
{
    int last = 0;
    std::size_t zeros = 0;
    silence = 0;
    for (std::size_t i = 0; i + 1 < samples.size() && last != end - 1; i += 2) {
        EXPECT_EQ(samples[i], samples[i + 1]);
        if (samples[i] == 0) {
            ++zeros;
        } else {
            const std::size_t swallowed = std::size_t(samples[i] - last - 1);
            EXPECT_LE(swallowed, last == 0 || zeros > 0 ? 12000 : 0)
                << samples[i] << " follows " << last;
            silence = last == 0 ? 0 : silence + zeros;
            zeros = 0;
            last = samples[i];
        }
    }
    return last == end - 1;
}

} // namespace

TEST(AlsaTest, FilesGetAndGiveEachBit)
{
    const std::string bytes = [] {
        std::string all;
        for (unsigned i = 0; i < 120000; ++i) {
            all += char(i * 2654435761U >> 24);
        }
        return all;
    }();
    for (const char* type : {"int16", "int32", "float"}) {
        const std::size_t size = type == "int16"s ? 2 : 4;
        const auto count = bytes.size() / size;
        {
            Channel channel("alsa");
            channel.start(
                {{"Card", "record"}, {"Mode", "write"}, {"SampleFormat", type}, {"Channels", 3}});
            for (std::size_t first = 0; first < count; first += 1000) { // frames are torn
                const void* const data = bytes.data() + first * size;
                ASSERT_EQ(write(channel, type, data, 1000), 1000) << channel.error();
            }
            ASSERT_EQ(channel.close(), 1);
        }
        EXPECT_TRUE(load(file) == bytes) << type;
        Channel channel("alsa", 2000);
        channel.start(
            {{"Card", "replay"}, {"SampleFormat", type}, {"Channels", 3}, {"BlockSize", 1000}});
        std::string got(bytes.size(), ' ');
        for (std::size_t next = 0; next < got.size() && !HasFailure(); next += 3000 * size) {
            ASSERT_EQ(coderInputStreamReadBuffers(channel.input, 1000, 1), 1) << channel.error();
            ASSERT_EQ(coderInputStreamReadBufferData(channel.input, 1, 0, "data", type, 3000,
                                                     got.data() + next),
                      1);
        }
        EXPECT_TRUE(got == bytes) << type;
    }
}

TEST(AlsaCardTest, WhatIsNotTakenIsToldToTheCount)
{
    const struct {
        double limit;
        long ahead;
        const char* reason;
    } cases[] = {{3000, 0, "nobody took them in time"},
                 {infinity, 1000000, "the card's buffer was full"}};
    for (const auto& [limit, ahead, reason] : cases) {
        Channel channel("alsa", limit);
        startCard(channel);
        const Block first(channel);
        const auto now = std::chrono::system_clock::now().time_since_epoch();
        EXPECT_NEAR(double(first.time), double(std::chrono::nanoseconds(now).count()), 5e9);
        cardAhead = ahead;
        Channel::waitUntil([&] { return lostCounts(channel) > 0; });
        const std::uint64_t least = 100000;
        Block block = first;
        do {
            block = Block(channel);
            ASSERT_EQ(block.base(), first.base());
            if (ahead == 0) {
                EXPECT_NEAR(double(block.time - first.time), double(block.index) / 48e-6, 3e8);
            }
        } while (block.index < least && !HasFailure());
        EXPECT_NE(channel.asyncError().find("lost: "s + reason), std::string::npos);
        EXPECT_GE(channel.property<std::uint64_t>("Overruns", "uint64"), 1);
    }
}

TEST(AlsaCardTest, ACardThatStopsIsStartedAndOneThatIsGoneEndsTheDevice)
{
    Channel channel("alsa");
    startCard(channel);
    const Block first(channel);
    cardState = SND_PCM_STATE_XRUN;
    const auto begin = std::chrono::steady_clock::now();
    Channel::waitUntil([&] { return std::chrono::steady_clock::now() - begin > 200ms; });
    cardState = 0;
    Channel::waitUntil([&] { return lostCounts(channel) > 0; });
    EXPECT_GT(lostCounts(channel), 9000);
    while (Block(channel).index < 12000) {
    }
    EXPECT_NEAR(Block(channel).base(), first.base(), 480); // as good as clocks are compared
    cardState = SND_PCM_STATE_DISCONNECTED;
    channel.waitForEnd();
    EXPECT_EQ(channel.asyncError(), "brenix:Device:failed|Card card is gone: No such device.");
    cardState = 0;
    EXPECT_EQ(channel.close(), 1);
    EXPECT_EQ(coderStreamFlush(channel.input), 1);
    EXPECT_EQ(channel.open(), 1) << channel.error(); // it is there again
    EXPECT_EQ(Block(channel).index, 0);
}

TEST(AlsaCardTest, ACallThatDoesNotReturnIsLeftBehind)
{
    Channel channel("alsa");
    startCard(channel);
    const Block first(channel);
    cardHangs = true;
    channel.waitForEnd();
    EXPECT_EQ(channel.asyncError(), "brenix:Device:failed|Card card does not answer.");
    EXPECT_EQ(channel.close(), 1);
    EXPECT_EQ(cardsOpen, 1);
    cardHangs = false;
    Channel::waitUntil([] { return cardsOpen == 0; }); // it closes what it has used
}

TEST(AlsaTest, WhatACardDoesNotHaveIsRefused)
{
    const struct {
        Option option;
        const char* text;
    } cases[] = {
        {{"Card", "nowhere"}, "Could not open card nowhere: Unknown PCM nowhere: No such file"},
        {{"SampleFormat", "int16"},
         "Option SampleFormat: is not possible for card card, which has int32."},
        {{"Channels", 2}, "Option Channels: is not possible for card card, which has 1."},
        {{"SampleRate", 44100}, "card card, the nearest of which is 48000 Hz."},
        {{"BlockSize", 60000}, "card card, whose buffer of 100000 frames has to hold two blocks."},
        {{"BufferTime", 0}, "Option BufferTime: must be from 0.001 to 60 seconds."},
        {{"Mode", "both"}, "Option Mode: must be read or write, not both."},
    };
    for (const auto& [option, text] : cases) {
        const auto given = [&, &changed = option](const char* name, Option usual) {
            return changed.name == std::string_view(name) ? changed : usual;
        };
        Channel channel("alsa");
        EXPECT_EQ(channel.init({given("Card", {"Card", "card"}), given("Channels", {"Channels", 1}),
                                given("SampleFormat", {"SampleFormat", "int32"}), option}),
                  0);
        EXPECT_NE(channel.error().find(text), std::string::npos) << channel.error();
    }
    Channel channel("alsa");
    channel.start({{"Card", "record"}, {"Mode", "write"}});
    ASSERT_EQ(channel.write({1, 2}), 2);
    const std::string wrongType = "Data to play must be int16, but is double. 2 elements of "
                                  "another type were not played on card record.";
    EXPECT_EQ(channel.asyncError(), "brenix:Device:wrongType|" + wrongType);
    ASSERT_EQ(write(channel, "int16", ramp(1, 2).data(), 1), 1);
    EXPECT_EQ(channel.close(), 1);
    EXPECT_EQ(channel.asyncError(), "brenix:Device:failed|The last frame for card record has 1 of "
                                    "2 samples and was not played. " +
                                        wrongType);
}

TEST(AlsaTest, WhatIsListedIsFound)
{
    std::vector<std::string> lines;
    for (const auto& [what, options, problem] : brenixcore::plugin::findDevices("alsa").found) {
        lines.push_back(what);
        for (const auto& [name, value] : options) {
            lines.back() += "|" + name + "=" + value;
        }
    }
    EXPECT_THAT(lines, testing::IsSupersetOf({"It's, a server: captures|Card=server",
                                              "It's, a server: plays|Card=server|Mode=write"}));
}

TEST(AlsaServerTest, WhatIsPlayedIsCaptured)
{
    const Server server;
    const auto sent = ramp(1, 30000);
    save(file, {reinterpret_cast<const char*>(sent.data()), sent.size() * 2});
    Channel channel("alsa");
    channel.start({{"Card", "server"}});
    Channel::waitUntil([&] { return !channel.peek(1).empty(); });
    const Process paplay("paplay" + clientOptions + file);
    std::vector<std::int16_t> got;
    std::size_t silence = 0;
    while (!hasRamp(got, 30000, silence) && !HasFailure()) {
        ASSERT_EQ(coderInputStreamReadBuffers(channel.input, 1024, 1), 1) << channel.error();
        got.resize(got.size() + 2048);
        ASSERT_EQ(coderInputStreamReadBufferData(channel.input, 1, 0, "data", "int16", 2048,
                                                 got.data() + got.size() - 2048),
                  1);
    }
    EXPECT_EQ(silence, 0);
    EXPECT_EQ(lostCounts(channel), 0);
}

TEST(AlsaServerTest, WhatIsWrittenIsPlayedAndSilenceIsTold)
{
    const Server server;
    const Process parec("parec --latency-msec=20" + clientOptions + file);
    const auto recorded = [] { return samplesOf<std::int16_t>(load(file)); };
    Channel::waitUntil([&] { return !recorded().empty(); });
    Channel channel("alsa");
    channel.start({{"Card", "server"}, {"Mode", "write"}});
    std::size_t silence = 0;
    const auto frames = [](auto time) {
        return std::chrono::duration<double>(time).count() * 48000;
    };
    const auto begin = std::chrono::steady_clock::now();
    ASSERT_EQ(write(channel, "int16", ramp(1, 15000).data(), 29998), 29998);
    Channel::waitUntil([&] { return hasRamp(recorded(), 15000, silence); }); // it starts by itself
    const auto pause = std::chrono::steady_clock::now();
    Channel::waitUntil([&] { return std::chrono::steady_clock::now() > pause + 1s; });
    ASSERT_EQ(write(channel, "int16", ramp(15000, 30000).data(), 30000), 30000);
    ASSERT_EQ(channel.close(), 1) << channel.error();
    const auto end = std::chrono::steady_clock::now();
    Channel::waitUntil([&] { return hasRamp(recorded(), 30000, silence); });
    const std::string error = channel.asyncError();
    unsigned long told = 0;
    EXPECT_EQ(std::sscanf(error.c_str(), "brenix:Device:dataLost|Card server ran dry: %lu", &told),
              1)
        << error;
    EXPECT_GT(double(told), frames(500ms)); // it is heard later than it is recorded
    EXPECT_LT(double(told), frames(end - begin));
    EXPECT_EQ(channel.property<std::uint64_t>("Underruns", "uint64"), 1);
}

TEST(AlsaServerTest, AServerThatHangsOrEndsHoldsNobodyUp)
{
    Server server;
    Channel capture("alsa");
    Channel playback("alsa");
    capture.start({{"Card", "server"}});
    Channel::waitUntil([&] { return !capture.peek(1).empty(); });
    playback.start({{"Card", "server"}, {"Mode", "write"}});
    const std::vector<std::int16_t> second(96000);
    for (int i = 0; i < 10; ++i) {
        ASSERT_EQ(write(playback, "int16", second.data(), second.size()), second.size());
    }
    Channel::waitUntil(
        [&] { return playback.ask(coderStreamGetDataAvailable, playback.output) < 800000; });
    kill(server.id, SIGSTOP);
    const auto begin = std::chrono::steady_clock::now();
    for (const Channel* const channel : {&capture, &playback}) {
        EXPECT_EQ(channel->close(), 0);
        EXPECT_NE(channel->error().find("|Card server does not close, and is left to itself."),
                  std::string::npos)
            << channel->error();
    }
    EXPECT_LT(std::chrono::steady_clock::now() - begin, 30s);
    const std::string error = playback.asyncError();
    unsigned long left = 0;
    EXPECT_EQ(
        std::sscanf(error.c_str(), "brenix:Device:failed|Card server takes no more. %lu", &left), 1)
        << error;
    EXPECT_GT(left, 100000);
    kill(server.id, SIGCONT);
    Channel again("alsa");
    again.start({{"Card", "server"}});
    Channel::waitUntil([&] { return !again.peek(1).empty(); });
    server.end();
    again.waitForEnd();
    const std::string end =
        again.asyncError(); // the library tells, or waits for what does not come
    EXPECT_TRUE(end.rfind("brenix:Device:failed|Card server failed: ", 0) == 0 ||
                end == "brenix:Device:failed|Card server does not answer.")
        << end;
}
