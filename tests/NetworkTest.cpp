// The devices tcp, udp and serial on peers of other makers: socat and nc, on loopback addresses and
// pseudo-terminals.

#include "Driver.hpp"

#include <asio.hpp>

#include <sys/wait.h>
#include <unistd.h>

#include <fstream>

using namespace driver;

namespace
{

constexpr std::size_t npos = std::string::npos;
asio::io_context context;
using Acceptor = asio::ip::tcp::acceptor;
const asio::ip::tcp::endpoint any(asio::ip::address_v4::loopback(), 0);
const int port = Acceptor(context, any).local_endpoint().port(); // free by now
const std::string peer = "127.0.0.1:" + std::to_string(port);
const std::string server =
    "socat TCP-LISTEN:" + std::to_string(port) + ",bind=127.0.0.1,reuseaddr ";
const std::string lost = "brenix:Device:dataLost|";
const std::string file = testing::TempDir() + "network-" + std::to_string(getpid());

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
        4, CODER_OPTION("Host", "char", 9, "127.0.0.1"), CODER_OPTION("Port", "int32", 1, &at),
        CODER_OPTION("ElementType", "char", 9, type), CODER_OPTION("ByteOrder", "char", 9, order));
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
    const Program nc("sh -c \"printf '\\277\\360\\0\\0\\0\\0\\0\\0abc' | exec nc -N -l 127.0.0.1 " +
                     std::to_string(port) + "\" >" + file);
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
    EXPECT_EQ(coderChannelClose(channel.handle), 1);
    Channel::waitUntil([&] { return readFile() == data; });
}

TEST(TcpTest, PeersThatDoNotAnswer)
{
    Acceptor full(context, any); // takes one connection, does not read, and lets the next one wait
    full.listen(0);
    const int number = full.local_endpoint().port();
    Channel channel("tcp");
    ASSERT_EQ(init(channel, "uint8", number), 1);
    ASSERT_EQ(channel.open(), 1);
    const double seconds = 0.3;
    Channel second("tcp");
    second.init(3, CODER_OPTION("Host", "char", 9, "localhost"),
                CODER_OPTION("Port", "int32", 1, &number),
                CODER_OPTION("ConnectTimeout", "double", 1, &seconds));
    EXPECT_EQ(second.open(), 0);
    EXPECT_NE(second.error().find(": Connection timed out"), npos);
    ASSERT_EQ(writeBytes(channel, std::string(20 << 20, 'x')), 1);
    EXPECT_EQ(coderChannelClose(channel.handle), 1);
    EXPECT_NE(channel.asyncError().find(" bytes were not sent to 127.0.0.1:"), npos);
}

TEST(UdpTest, DatagramsArePackets)
{
    Channel receiver("udp");
    ASSERT_EQ(receiver.init(1, CODER_OPTION("ElementType", "char", 9, "double")), 1);
    EXPECT_EQ(receiver.write({1}), 0);
    uint16_t local = 0;
    ASSERT_EQ(coderChannelGetPropertyValue(receiver.handle, "LocalPort", "uint16", 1, &local), 1);
    ASSERT_EQ(receiver.open(), 1);
    Channel sender("udp");
    ASSERT_EQ(init(sender, "uint8", local), 1);
    for (const unsigned int size : {70000U, 16U, 3U, 11U}) {
        ASSERT_EQ(writeBytes(sender, std::string(size, '\0')), 1);
    }
    ASSERT_EQ(sender.open(), 1);
    EXPECT_EQ(receiver.read(3, 2), (Numbers{0, 0, 0}));
    EXPECT_EQ(receiver.asyncError(), lost + "The last 3 bytes of a datagram are no whole double.");
    EXPECT_NE(sender.asyncError().find(lost + "70000 bytes were not sent to 127.0.0.1:"), npos);
}

TEST(SerialTest, APortIsDuplex)
{
    auto echo = std::make_unique<Program>("socat PTY,raw,echo=0,link=" + file + " PIPE");
    Channel channel("serial");
    ASSERT_EQ(channel.init(2, CODER_OPTION("Port", "char", 999, file.c_str()),
                           CODER_OPTION("ElementType", "char", 9, "double")),
              1);
    Channel::waitUntil([&] { return channel.open(5) == 1; });
    const double special = 0x1.A11131A03047Fp-815; // its bytes mean something to a terminal
    ASSERT_EQ(channel.write({special, 1}), 2);
    EXPECT_EQ(channel.read(2, 1), (Numbers{special, 1}));
    echo.reset();
    channel.waitForEnd();
    EXPECT_EQ(channel.peek(), Numbers{});
}

TEST(TcpTest, BadOptionsAndNobodyThere)
{
    Channel channel("tcp");
    EXPECT_EQ(init(channel, "int24"), 0);
    EXPECT_EQ(channel.error(), unexpected + "Option ElementType: is not a numeric type: int24.");
    EXPECT_EQ(init(channel, "int8", port, "pdp"), 0);
    EXPECT_EQ(channel.error(), unexpected + "Option ByteOrder: must be little or big, not pdp.");
    ASSERT_EQ(init(channel, "int8"), 1);
    EXPECT_EQ(channel.open(), 0);
    EXPECT_EQ(channel.error(),
              unexpected + "Could not connect to " + peer + ": Connection refused");
}
