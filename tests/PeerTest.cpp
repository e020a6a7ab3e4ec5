// The devices tcp, udp, serial and audiofile on programs of other makers: socat, nc and sox, on
// loopback addresses, pseudo-terminals and files.

#include "Driver.hpp"

#include <asio.hpp>

#include <fcntl.h>
#include <sys/wait.h>
#include <termios.h>
#include <unistd.h>

#include <cmath>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <tuple>

using namespace driver;

namespace
{

constexpr std::size_t npos = std::string::npos;
asio::io_context context;
using Acceptor = asio::ip::tcp::acceptor;
const std::string host = "127.2." + std::to_string(getpid() >> 8 & 255) + "." +
                         std::to_string(getpid() & 255); // of this process alone
const asio::ip::tcp::endpoint any(asio::ip::make_address(host), 0);
constexpr int port = 27110;
const std::string peer = host + ":" + std::to_string(port);
const std::string server = "socat TCP-LISTEN:27110,reuseaddr,bind=" + host + " ";
const std::string lost = "brenix:Device:dataLost|";
const std::string file = testing::TempDir() + "peer-" + std::to_string(getpid());

/// A running program that may write the file.
struct Program {
    explicit Program(const std::string& command) : id(fork())
    {
        if (id == 0) {
            execl("/bin/sh", "sh", "-c", ("exec " + command).c_str(), nullptr);
            _exit(127);
        }
    }
    ~Program()
    {
        kill(id, SIGKILL);
        waitpid(id, nullptr, 0);
        std::remove(file.c_str());
    }

    pid_t id;
};

int init(Channel& channel, const char* type, int at = port, const char* order = "little")
{
    return channel.init(
        {{"Host", host}, {"Port", at}, {"ElementType", type}, {"ByteOrder", order}});
}

int writeBytes(const Channel& channel, const std::string& data)
{
    double written = 0;
    return coderOutputStreamWriteTypedDataOld(channel.output, &written, 1, "uint8",
                                              CODER_BUFFER(data.size(), data.data()));
}

/// Reads what waits of the numbers that go up from `next`; whether there was any.
bool readOn(const Channel& channel, double& next)
{
    const Numbers counts = channel.peek();
    const double end = std::accumulate(counts.begin(), counts.end(), next);
    EXPECT_EQ(channel.read(end - next, double(counts.size())), range(next, end));
    return std::exchange(next, end) < end;
}

std::string readFile()
{
    std::ifstream stream(file, std::ios::binary);
    return {std::istreambuf_iterator<char>(stream), {}};
}

void sox(const std::string& arguments)
{
    ASSERT_EQ(std::system(("sox -D " + arguments).c_str()), 0) << arguments;
}

/// The samples of a sound file as sox has them, full scale from -1 to 1.
Numbers soxSamples(const std::string& soundFile)
{
    sox(soundFile + " -t s32 " + file);
    const std::string raw = readFile();
    std::remove(file.c_str());
    std::vector<std::int32_t> samples(raw.size() / sizeof(std::int32_t));
    std::memcpy(samples.data(), raw.data(), samples.size() * sizeof(std::int32_t));
    Numbers numbers(samples.begin(), samples.end());
    for (double& number : numbers) {
        number /= 1U << 31U;
    }
    return numbers;
}

} // namespace

TEST(TcpTest, SixtyFourMiBComeBackAndThenThePeerIsKilled)
{
    auto echo = std::make_unique<Program>(server + "EXEC:cat");
    Channel channel("tcp", 3000, 5000);
    ASSERT_EQ(init(channel, "double"), 1);
    Channel::waitUntil([&] { return channel.open(0.5) == 1; });
    double next = 0;
    double sent = 0;
    const auto end = std::chrono::steady_clock::now() + std::chrono::seconds(60);
    while (next < 8 << 20 && !HasFailure()) {
        ASSERT_LT(std::chrono::steady_clock::now(), end);
        const double room = channel.ask(coderStreamGetSpaceAvailable, channel.output);
        if (const double count = std::min(room, (8 << 20) - sent); count > 0) {
            ASSERT_EQ(channel.write(range(sent, sent + count)), count);
            sent += count;
        }
        readOn(channel, next);
    }
    for (; channel.write(range(sent, sent + 1000)) == 1000; sent += 1000) { // until all is full
    }
    echo.reset();
    Channel::waitUntil([&] {
        uint8_t done = 0;
        coderStreamIsDeviceDone(channel.input, &done);
        return !readOn(channel, next) && done == 1;
    });
    EXPECT_GE(next, (8 << 20) + 3000);
    EXPECT_EQ(channel.asyncError().rfind("brenix:Device:failed|Transfer with " + peer, 0), 0);
}

TEST(TcpTest, APeerThatClosesEndsTheDevice)
{
    const Program nc("sh -c \"printf '\\277\\360\\0\\0\\0\\0\\0\\0abc' | exec nc -N -l " + host +
                     " 27110\" >" + file);
    Channel channel("tcp");
    ASSERT_EQ(init(channel, "double", port, "big"), 1);
    ASSERT_EQ(channel.write({-2}), 1);
    Channel::waitUntil([&] { return channel.open(0.5) == 1; });
    channel.waitForEnd();
    EXPECT_EQ(channel.read(1, 1), Numbers{-1});
    EXPECT_EQ(channel.asyncError(),
              lost + "The last 3 bytes of the data from " + peer + " are no whole double.");
    Channel::waitUntil([] { return readFile() == "\xC0\0\0\0\0\0\0\0"s; }); // only one side ended
}

TEST(TcpTest, ClosingSendsWhatIsLeft)
{
    // The peer sends without end and is not read: the other way goes on.
    const Program socat(server + "OPEN:/dev/zero!!STDOUT 2>/dev/null >" + file);
    Channel channel("tcp", 10);
    ASSERT_EQ(init(channel, "uint8"), 1);
    Channel::waitUntil([&] { return channel.open(0.5) == 1; });
    ASSERT_EQ(channel.write({1}), 1);
    EXPECT_EQ(channel.asyncError(),
              "brenix:Device:wrongType|Data to send must be uint8, but is double.");
    const std::string data(8 << 20, 'x');
    ASSERT_EQ(writeBytes(channel, data), 1);
    EXPECT_EQ(channel.close(), 1);
    Channel::waitUntil([&] { return readFile() == data; });
}

TEST(TcpTest, WhatAnswersTheLastOutputIsTaken)
{
    const Program answers(server + "SYSTEM:'head -c 5; sleep 0.1; echo more'");
    Channel channel("tcp");
    ASSERT_EQ(init(channel, "uint8"), 1);
    Channel::waitUntil([&] { return channel.open(0.5) == 1; });
    EXPECT_EQ(writeBytes(channel, "12345"), 1);
    EXPECT_EQ(channel.close(), 1) << channel.error();
    EXPECT_EQ(channel.ask(coderStreamGetDataAvailable, channel.input), 10);
}

TEST(TcpTest, NothingIsLostUnseenWhenThePeerEnds)
{
    Acceptor acceptor(context, any);
    for (int round = 0; round < 40; ++round) {
        Channel channel("tcp");
        ASSERT_EQ(init(channel, "uint8", acceptor.local_endpoint().port()), 1);
        ASSERT_EQ(channel.open(), 1);
        auto socket = acceptor.accept();
        socket.shutdown(socket.shutdown_send);
        std::size_t accepted = 0;
        while (writeBytes(channel, "x") == 1) { // until the device is done
            ++accepted;
        }
        EXPECT_EQ(channel.close(), 1);
        std::string got;
        asio::error_code end;
        asio::read(socket, asio::dynamic_buffer(got), end);
        ASSERT_EQ(got.size(), accepted);
    }
}

TEST(TcpTest, AResetEndsEveryWait)
{
    Acceptor acceptor(context, any);
    for (const bool closes : {false, true}) {
        Channel channel("tcp", 10);
        ASSERT_EQ(init(channel, "uint8", acceptor.local_endpoint().port()), 1);
        ASSERT_EQ(channel.open(infinity), 1);
        auto socket = acceptor.accept();
        asio::write(socket, asio::buffer(std::string(200, 'x'))); // fills the input
        if (closes) {
            EXPECT_EQ(writeBytes(channel, "x"), 1);
        }
        std::thread reset([&] {
            std::this_thread::sleep_for(std::chrono::milliseconds(300));
            socket.set_option(asio::socket_base::linger(true, 0));
            socket.close();
        });
        if (closes) {
            EXPECT_EQ(channel.close(), 1);
        } else {
            while (writeBytes(channel, std::string(1 << 20, 'x')) == 1) {
            }
            EXPECT_EQ(channel.error(), "brenix:OutputStream:synchronousOutputNotPossible|");
            std::ignore = coderStreamFlush(channel.input); // the device waits for room no longer
        }
        reset.join();
        EXPECT_NE(channel.asyncError().find(": Connection reset by peer"), npos);
    }
}

TEST(TcpTest, TheExampleStreams)
{
    const Program echo(server + "EXEC:cat");
    const std::string run = EXAMPLE_STREAM " " + host + " 27110 >" + file;
    Channel::waitUntil([&] { return std::system((run + " 2>/dev/null").c_str()) == 0; });
    EXPECT_NE(readFile().find("all came back"), npos);
}

TEST(TcpTest, PeersThatDoNotAnswer)
{
    // Takes one connection, does not read, and lets the next one wait.
    Acceptor full(context, {asio::ip::address_v4::loopback(), 0});
    full.listen(0);
    const int number = full.local_endpoint().port();
    Channel channel("tcp");
    ASSERT_EQ(channel.init({{"Host", "localhost"}, {"Port", number}}), 1);
    ASSERT_EQ(channel.open(), 1);
    Channel second("tcp");
    second.init({{"Host", "localhost"}, {"Port", number}, {"ConnectTimeout", 0.3}});
    EXPECT_EQ(second.open(), 0);
    EXPECT_NE(second.error().find(": Connection timed out"), npos);
    ASSERT_EQ(writeBytes(channel, std::string(20 << 20, 'x')), 1);
    EXPECT_EQ(channel.close(), 1);
    EXPECT_NE(channel.asyncError().find(" bytes were not sent to localhost:"), npos);
}

TEST(UdpTest, DatagramsArePackets)
{
    Channel receiver("udp");
    ASSERT_EQ(receiver.init({{"LocalHost", host}, {"ElementType", "double"}}), 1);
    EXPECT_EQ(receiver.write({1}), 0);
    const int local = receiver.property<uint16_t>("LocalPort", "uint16");
    ASSERT_EQ(receiver.open(), 1);
    Channel sender("udp");
    ASSERT_EQ(init(sender, "uint8", local), 1);
    for (const unsigned int size : {70000U, 16U, 3U, 11U}) {
        ASSERT_EQ(writeBytes(sender, std::string(size, '\0')), 1);
    }
    ASSERT_EQ(sender.open(), 1);
    EXPECT_EQ(receiver.read(3, 2), (Numbers{0, 0, 0}));
    EXPECT_EQ(receiver.asyncError(), lost + "The last 3 bytes of a datagram are no whole double.");
    EXPECT_NE(sender.asyncError().find(lost + "70000 bytes were not sent to " + host + ":"), npos);
}

TEST(UdpTest, APeerAnswers)
{
    const Program echo("socat UDP-RECVFROM:27110,bind=" + host + ",fork EXEC:cat");
    Channel channel("udp");
    ASSERT_EQ(init(channel, "double", port, "big"), 1);
    ASSERT_EQ(channel.open(0), 1);
    Channel::waitUntil([&] { // the first ones may come before the peer listens
        return channel.write({1.5, -2}) == 2 && channel.read(2, 1) == Numbers{1.5, -2};
    });
}

TEST(SerialTest, TwoPortsTalk)
{
    const std::string other = file + "-other";
    auto line = std::make_unique<Program>("socat PTY,link=" + file + " PTY,link=" + other);
    Channel near("serial");
    Channel far("serial");
    for (Channel* end : {&near, &far}) {
        ASSERT_EQ(end->init({{"Port", end == &near ? file : other},
                             {"BaudRate", 115200},
                             {"StopBits", 2},
                             {"FlowControl", "hardware"},
                             {"ElementType", "double"}}),
                  1);
        Channel::waitUntil([&] { return end->open(5) == 1; });
    }
    const int opened = ::open(file.c_str(), O_RDWR | O_NOCTTY);
    termios settings{};
    EXPECT_EQ(tcgetattr(opened, &settings), 0);
    ::close(opened);
    EXPECT_EQ(cfgetospeed(&settings), speed_t(B115200));
    EXPECT_EQ(settings.c_cflag & (CSTOPB | CRTSCTS), tcflag_t(CSTOPB | CRTSCTS));

    const double special = 0x1.A11131A03047Fp-815; // its bytes mean something to a terminal
    ASSERT_EQ(near.write({special, 1}), 2);
    ASSERT_EQ(far.write({2}), 1);
    Channel::waitUntil([&] { return far.ask(coderStreamGetDataAvailable, far.input) == 2; });
    EXPECT_EQ(far.read(2, double(far.peek().size())), (Numbers{special, 1}));
    EXPECT_EQ(near.read(1, 1), Numbers{2});
    line.reset();
    for (const Channel* end : {&near, &far}) {
        end->waitForEnd();
        EXPECT_EQ(end->peek(), Numbers{});
    }
    std::remove(other.c_str());
}

TEST(AudioFileTest, WhatIsWrittenIsWhatSoxReads)
{
    const struct {
        const char *ending, *format;
        int bits;
    } rows[] = {{".wav", "PCM_16", 16}, {".flac", "PCM_24", 24}, {".aiff", "PCM_32", 32},
                {".wav", "FLOAT", 25},  {".au", "DOUBLE", 32},   {".caf", "PCM_S8", 8}};
    for (const auto& [ending, format, bits] : rows) {
        SCOPED_TRACE(format);
        const std::string soundFile = file + ending;
        Channel writer("audiofile");
        ASSERT_EQ(writer.init({{"FileName", soundFile},
                               {"Mode", "write"},
                               {"Channels", 2},
                               {"SampleFormat", format}}),
                  1)
            << writer.error();
        Numbers samples = {-1, 1 - std::ldexp(1, 1 - bits)};
        for (double value = 1; samples.size() < 2000;
             value = std::fmod(value * 16807, 2147483647)) {
            const double scale = std::ldexp(1, bits - 1);
            samples.push_back(std::floor((value / 1073741824 - 1) * scale) / scale);
        }
        ASSERT_EQ(writer.open(), 1);
        ASSERT_EQ(writer.write(samples), 2000);
        ASSERT_EQ(writer.close(), 1);
        EXPECT_EQ(soxSamples(soundFile), samples);
        std::remove(soundFile.c_str());
    }
}

TEST(AudioFileTest, WhatSoxMakesIsRead)
{
    for (const std::string made : {".wav -b 16", ".wav -b 8", ".wav -b 32 -e floating-point",
                                   ".flac -b 24", ".aiff -b 24", ".au -b 8 -e mu-law"}) {
        SCOPED_TRACE(made);
        const std::string soundFile = file + made.substr(0, made.find(' '));
        sox("-n -r 8000 -c 2 " + made.substr(made.find(' ')) + " " + soundFile +
            " synth 0.1 brownnoise");
        Channel reader("audiofile");
        reader.start({{"FileName", soundFile}});
        EXPECT_EQ(reader.read(800, 1), soxSamples(soundFile));
        std::remove(soundFile.c_str());
    }
}

TEST(TcpTest, NobodyListens)
{
    Channel channel("tcp");
    ASSERT_EQ(init(channel, "int8"), 1);
    EXPECT_EQ(channel.open(), 0);
    EXPECT_EQ(channel.error(),
              unexpected + "Could not connect to " + peer + ": Connection refused");
}
