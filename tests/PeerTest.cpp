// The devices tcp, udp, serial and audiofile on programs of other makers: socat, nc and sox, on
// loopback addresses, pseudo-terminals and files.

#include "Driver.hpp"
#include "Process.hpp"

#include <asio.hpp>

#include <fcntl.h>
#include <linux/serial.h>
#include <sys/ioctl.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <termios.h>
#include <unistd.h>

#include <array>
#include <atomic>
#include <cmath>
#include <cstdarg>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <sstream>
#include <tuple>

using namespace driver;

namespace
{

std::atomic<int> framingErrors = -1; ///< that lines have had; less than 0 where nobody counts

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
struct Program : Process {
    using Process::Process;
    ~Program()
    {
        end();
        std::remove(file.c_str());
    }
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

/// The system's, also for plug-ins, but that it counts for pseudo-terminals, too.
extern "C" __attribute__((visibility("default"))) int ioctl(int handle, unsigned long request,
                                                            ...) noexcept
{
    va_list rest;
    va_start(rest, request);
    void* const argument = va_arg(rest, void*);
    va_end(rest);
    if (request != TIOCGICOUNT || framingErrors < 0) {
        return static_cast<int>(syscall(SYS_ioctl, handle, request, argument));
    }
    *static_cast<serial_icounter_struct*>(argument) = {};
    static_cast<serial_icounter_struct*>(argument)->frame = framingErrors;
    return 0;
}

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
    EXPECT_EQ(channel.asyncError(), lost + "3 bytes from " + peer + " are no whole double.");
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
    EXPECT_EQ(channel.asyncError(), "brenix:Device:wrongType|Data to send must be uint8, but is "
                                    "double. 1 elements of another type were not sent to " +
                                        peer + ".");
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
        channel.start(
            {{"Host", host}, {"Port", acceptor.local_endpoint().port()}, {"HalfClose", "end"}});
        auto socket = acceptor.accept();
        socket.shutdown(socket.shutdown_send);
        std::size_t accepted = 0;
        const auto latest = std::chrono::steady_clock::now() + std::chrono::seconds(10);
        while (writeBytes(channel, "x") == 1) { // until the device is done
            ++accepted;
            ASSERT_LT(std::chrono::steady_clock::now(), latest);
        }
        EXPECT_EQ(channel.close(), 1);
        std::string got;
        asio::error_code end;
        asio::read(socket, asio::dynamic_buffer(got), end);
        const std::size_t late = accepted - got.size(); // what came while the device ended
        ASSERT_EQ(channel.error(coderChannelGetLastAsyncError),
                  late == 0 ? "|"
                            : "brenix:Stream:dataLost|The device ended and did not take " +
                                  std::to_string(late) + " counts.");
    }
}

TEST(TcpTest, OutputGoesOnWhenThePeerHasEndedItsOwn)
{
    Acceptor acceptor(context, any);
    for (const bool refuses : {false, true}) {
        Channel channel("tcp");
        channel.start({{"Host", host}, {"Port", acceptor.local_endpoint().port()}});
        auto socket = acceptor.accept();
        socket.shutdown(socket.shutdown_send);
        channel.waitForEnd();
        uint8_t done = 0;
        const std::string data(refuses ? 2 : 8 << 20, 'x');
        std::string got(data.size() - refuses, '\0');
        ASSERT_EQ(writeBytes(channel, data), 1);
        asio::read(socket, asio::buffer(got));
        if (refuses) {
            socket.close();
            Channel::waitUntil(
                [&] { return coderStreamIsDeviceDone(channel.output, &done) == 1 && done == 1; });
            EXPECT_EQ(channel.asyncError().find("brenix:Device:failed|Transfer with " + host), 0);
        }
        EXPECT_EQ(got, data.substr(refuses));
        EXPECT_EQ(channel.close(), 1);
        EXPECT_EQ(channel.error(coderChannelGetLastAsyncError), "|");
    }
}

TEST(TcpTest, AResetEndsEveryWaitAndTellsWhatIsLost)
{
    Acceptor acceptor(context, any);
    const int number = acceptor.local_endpoint().port();
    const std::string name = host + ":" + std::to_string(number);
    for (const bool closes : {false, true}) {
        Channel channel("tcp", 10);
        ASSERT_EQ(init(channel, "uint8", number), 1);
        ASSERT_EQ(channel.open(infinity), 1);
        auto socket = acceptor.accept();
        asio::write(socket, asio::buffer(std::string(200, 'x'))); // fills the input
        Channel::waitUntil(
            [&] { return channel.ask(coderStreamGetDataAvailable, channel.input) == 10; });
        const std::string block(closes ? 1 : 1 << 20, 'x');
        std::size_t written = writeBytes(channel, block) == 1 ? block.size() : 0;
        std::size_t taken = 0;
        std::thread reset([&] {
            std::this_thread::sleep_for(std::chrono::milliseconds(300));
            taken = socket.available();
            socket.set_option(asio::socket_base::linger(true, 0));
            socket.close();
        });
        double unpulled = 0;
        if (closes) {
            EXPECT_EQ(channel.close(), 1);
        } else {
            for (; writeBytes(channel, block) == 1; written += block.size()) {
            }
            EXPECT_EQ(channel.error(), "brenix:OutputStream:synchronousOutputNotPossible|");
            unpulled = channel.ask(coderStreamGetDataAvailable, channel.output);
            std::ignore = coderStreamFlush(channel.input); // the device waits for room no longer
        }
        reset.join();
        std::ostringstream error;
        error << "brenix:Device:failed|Transfer with " << name
              << " failed: Connection reset by peer.";
        if (const double unsent = double(written - taken) - unpulled; unsent > 0) {
            error << ' ' << std::size_t(unsent) << " bytes were not sent to " << name << '.';
        }
        EXPECT_EQ(channel.asyncError(), error.str());
    }
}

TEST(TcpTest, ClosingTellsWhatFindsNoRoom)
{
    Acceptor acceptor(context, any);
    const int number = acceptor.local_endpoint().port();
    const std::string name = host + ":" + std::to_string(number);
    Channel channel("tcp", 10);
    channel.start({{"Host", host}, {"Port", number}, {"BlockSize", 10}, {"ElementType", "double"}});
    auto socket = acceptor.accept();
    asio::write(socket, asio::buffer(range(0, 250)));
    socket.shutdown(socket.shutdown_send);
    Channel::waitUntil(
        [&] { return channel.ask(coderStreamGetSpaceAvailable, channel.input) == 0; });
    ASSERT_EQ(channel.write({1}), 1);
    ASSERT_EQ(channel.close(), 1); // waits for the end of the input
    double next = 0;
    while (readOn(channel, next)) {
    }
    EXPECT_GE(next, 10);
    EXPECT_EQ(channel.asyncError(), lost + std::to_string(250 - int(next)) + " elements from " +
                                        name + " found no room while the channel closed.");
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
    ASSERT_EQ(writeBytes(channel, std::string(90 << 20, 'x')),
              1); // which the device does not get to
    EXPECT_EQ(channel.close(), 1);
    const std::string error = channel.asyncError();
    EXPECT_NE(error.find(" bytes were not sent to localhost:"), npos) << error;
    EXPECT_GT(std::strtol(error.c_str() + error.find('|') + 1, nullptr, 10), 90 << 20) << error;
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
    EXPECT_EQ(receiver.asyncError(), lost + "6 bytes from datagrams to " + host + ":" +
                                         std::to_string(local) + " are no whole double.");
    EXPECT_NE(sender.asyncError().find(lost + "70000 bytes were not sent to " + host + ":"), npos);
}

TEST(UdpTest, ReadAndLostAreAllThatWereSent)
{
    Channel receiver("udp", 10);
    ASSERT_EQ(receiver.init({{"LocalHost", host}, {"ReceiveBuffer", 4096}}), 1);
    EXPECT_EQ(receiver.property<uint32_t>("ReceiveBuffer", "uint32"), 4096);
    const auto local = receiver.property<uint16_t>("LocalPort", "uint16");
    const auto countLost = [&] { return receiver.property<uint64_t>("LostDatagrams", "uint64"); };
    asio::ip::udp::socket socket(context, {asio::ip::make_address(host), 0});
    double sent = 0;
    double read = 0;
    const auto send = [&](int count) {
        for (sent += count; count > 0; --count) {
            socket.send_to(asio::buffer("x", 1), {asio::ip::make_address(host), local});
        }
    };
    const auto readAll = [&] {
        for (Numbers counts = receiver.peek(); !counts.empty(); counts = receiver.peek()) {
            const double total = std::accumulate(counts.begin(), counts.end(), 0.0);
            ASSERT_EQ(coderInputStreamReadBuffers(receiver.input, total, double(counts.size())), 1);
            read += total;
        }
    };
    uint64_t lostEarlier = 0;
    const auto expectError = [&] {
        const std::string error = receiver.asyncError(); // before the property is asked for
        EXPECT_EQ(error, lost + std::to_string(countLost() - lostEarlier) + " datagrams to " +
                             host + ":" + std::to_string(local) + " found no room.");
    };

    send(1000); // most find no room before the channel is open
    ASSERT_EQ(receiver.open(), 1);
    expectError();
    Channel::waitUntil([&] {
        readAll();
        return read + double(countLost()) == sent;
    });
    EXPECT_GT(read, 0);

    EXPECT_EQ(receiver.close(), 1);
    ASSERT_EQ(receiver.open(), 1);
    lostEarlier = countLost();
    Channel::waitUntil([&] { // and now while it is
        send(1);
        return receiver.ask(coderStreamGetSpaceAvailable, receiver.input) == 0;
    });
    send(1000);
    EXPECT_EQ(receiver.close(), 1);
    expectError();
    readAll();
    EXPECT_EQ(receiver.term(), 1);
    EXPECT_EQ(read + double(countLost()), sent);
}

TEST(UdpTest, OutputLeavesFromWhereItsPeerCanAnswer)
{
    const bool hasIpv6 = std::ifstream("/proc/net/if_inet6").peek() != EOF;
    const std::string group = "239" + host.substr(host.find('.'));
    const Option none{"ElementType", "double"};
    const Option loopback{"Interface", "lo"};
    const struct {
        const char* name;
        Option local, more, host;
    } rows[] = {
        {"nothing said", none, none, {"Host", "localhost"}},
        {"broadcast", {"LocalHost", "0.0.0.0"}, none, {"Host", "127.255.255.255"}},
        {"IPv6", {"LocalHost", "::1"}, none, {"Host", "::1"}},
        {"multicast", {"Group", group}, loopback, {"Host", group}},
    };
    for (const auto& [name, local, more, peerHost] : rows) {
        if (name == "IPv6"s && !hasIpv6) {
            continue;
        }
        SCOPED_TRACE(name);
        Channel receiver("udp");
        receiver.start({none, local, more});
        const int number = receiver.property<uint16_t>("LocalPort", "uint16");
        Channel sender("udp");
        sender.start({none, more, peerHost, {"Port", number}});
        EXPECT_EQ(sender.write({7}), 1);
        EXPECT_EQ(receiver.read(1, 1), Numbers{7});
    }

    // One that sees where output comes from, and one that receives on one interface only.
    using asio::ip::udp, asio::ip::make_address_v4;
    udp::socket outward(context, udp::v4());
    asio::error_code isAlone; // nothing is sent
    outward.connect({make_address_v4("192.0.2.1"), 9}, isAlone);
    const std::string own = isAlone ? "127.0.0.1" : outward.local_endpoint().address().to_string();
    udp::socket socket(context, udp::endpoint(udp::v4(), 0));
    socket.non_blocking(true);
    socket.set_option(
        asio::ip::multicast::join_group(make_address_v4(group), make_address_v4("127.0.0.1")));
    for (const bool multicasts : {false, true}) {
        Channel sender("udp");
        sender.start({none,
                      multicasts ? loopback : none,
                      {"Host", multicasts ? group : own},
                      {"Port", socket.local_endpoint().port()}});
        EXPECT_EQ(sender.write({7}), 1);
        Channel::waitUntil([&] { return socket.available() > 0; });
        std::array<char, 8> bytes{};
        udp::endpoint from;
        socket.receive_from(asio::buffer(bytes), from);
        EXPECT_TRUE(multicasts || from.address().to_string() == own) << from.address();
    }
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

TEST(SerialTest, ErrorsOfTheLineAreCounted)
{
    const Program line("socat PTY,link=" + file + " PTY");
    framingErrors = 7; // before
    Channel channel("serial");
    ASSERT_EQ(channel.init({{"Port", file}}), 1);
    Channel::waitUntil([&] { return channel.open() == 1; });
    for (const unsigned int errors : {1U, 2U}) {
        ++framingErrors;
        EXPECT_EQ(channel.asyncError(),
                  lost + "Line " + file + " had " + std::to_string(errors) + " framing errors.");
        EXPECT_EQ(channel.property<uint64_t>("FramingErrors", "uint64"), errors);
    }
    framingErrors = -1;
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
