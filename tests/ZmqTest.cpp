// The device zmq: channels that talk to each other, and to sockets of libzmq alone.

#include "Driver.hpp"

#include <zmq.h>

#include <arpa/inet.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/time.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <memory>
#include <sstream>

using namespace driver;

namespace
{

constexpr std::size_t npos = std::string::npos;
const std::string anyPort = "tcp://127.0.0.1:*";
const std::string folder = testing::TempDir() + "zmq-" + std::to_string(getpid()) + "/";
// Of a reader of push, by ZMTP 3.0, the protocol of ZeroMQ.
const std::string handshake = "\xFF"s + std::string(8, '\0') + "\x7F\x03"s + "\0NULL"s +
                              std::string(48, '\0') +
                              "\x04\x1A\x05READY\x0BSocket-Type\0\0\0\x04PULL"s;
const Option none{"Timeout", 10.0}; // the core's

/// A channel of the device that is open, and where it is bound.
struct Peer : Channel {
    Peer(const char* pattern, const std::string& where = anyPort, Options more = {},
         double limit = infinity)
        : Channel("zmq", limit, limit)
    {
        const auto at = [&](std::size_t i) { return i < more.size() ? more.begin()[i] : none; };
        start({{"Endpoint", where}, {"Pattern", pattern}, at(0), at(1), at(2), at(3), at(4)});
        endpoint = text("Endpoint");
    }
    ~Peer() // before it is destroyed
    {
        coderChannelClose(handle);
        coderChannelTerm(handle);
    }
    Peer(const Peer&) = delete;
    Peer& operator=(const Peer&) = delete;

    /// What it says that is wrong, or "|".
    std::string lastError() const { return error(coderChannelGetLastAsyncError); }

    double lost() const { return double(property<uint64_t>("LostCounts", "uint64")); }

    std::string text(const char* name) const
    {
        char value[CODER_ERROR_SIZE] = "";
        coderChannelGetPropertyValue(handle, name, "char", sizeof value, value);
        return value;
    }

    /// Reads what comes, buffer by buffer, until the writers have ended.
    Numbers readAll() const
    {
        Numbers all;
        uint8_t done = 0;
        Channel::waitUntil([&] {
            coderStreamIsDeviceDone(input, &done); // before the last look
            for (double count : peek()) {
                const Numbers some = read(count, 1);
                all.insert(all.end(), some.begin(), some.end());
            }
            return done == 1 && peek().empty();
        });
        return all;
    }

    std::string endpoint;
};

struct Context {
    void* handle = zmq_ctx_new();
    ~Context() { zmq_ctx_term(handle); }
} const context;

/// A socket of libzmq alone.
struct Socket {
    Socket(int type, const std::string& endpoint) : handle(zmq_socket(context.handle, type))
    {
        const int zero = 0;
        const int one = 1;
        zmq_setsockopt(handle, ZMQ_LINGER, &zero, sizeof zero);
        zmq_setsockopt(handle, ZMQ_RCVHWM, &one, sizeof one);
        zmq_setsockopt(handle, ZMQ_SUBSCRIBE, "", 0); // means nothing to others
        EXPECT_EQ(zmq_connect(handle, endpoint.c_str()), 0);
    }
    Socket(const Socket&) = delete;
    Socket& operator=(const Socket&) = delete;
    ~Socket() { zmq_close(handle); }
    void* handle;
};

/// Connects without libzmq. What is waited for in vain for ten seconds has not come.
int dial(const std::string& endpoint)
{
    const int handle = socket(AF_INET, SOCK_STREAM, 0);
    sockaddr_in address{};
    address.sin_family = AF_INET;
    address.sin_port = htons(uint16_t(std::stoi(endpoint.substr(endpoint.rfind(':') + 1))));
    address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    const timeval limit{10, 0};
    setsockopt(handle, SOL_SOCKET, SO_RCVTIMEO, &limit, sizeof limit);
    EXPECT_EQ(connect(handle, reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
    return handle;
}

/// Whether the text comes before the end.
bool awaits(int handle, const std::string& text)
{
    std::string all;
    for (char byte = 0; all.find(text) == npos && recv(handle, &byte, 1, 0) == 1;) {
        all += byte;
    }
    return all.find(text) != npos;
}

struct Folder : testing::Environment {
    void SetUp() override { mkdir(folder.c_str(), 0700); }
    void TearDown() override { EXPECT_EQ(std::system(("rm -r " + folder).c_str()), 0); }
};
[[maybe_unused]] const auto* const environment = testing::AddGlobalTestEnvironment(new Folder);

std::string write(const std::string& name, const std::string& text, mode_t mode = 0600)
{
    std::ofstream(folder + name) << text;
    chmod((folder + name).c_str(), mode);
    return folder + name;
}

std::string contents(const std::string& name)
{
    std::ostringstream text;
    text << std::ifstream(name).rdbuf();
    return text.str();
}

std::string makeKeys(const std::string& name)
{
    std::remove((folder + name).c_str()); // of a run before
    std::remove((folder + name + ".pub").c_str());
    Channel channel("zmq");
    EXPECT_EQ(channel.init({{"Endpoint", anyPort}, {"Pattern", "push"}}), 1);
    EXPECT_EQ(channel.execute("keys", {{"FileName", folder + name}}), 1) << channel.error();
    return folder + name;
}

} // namespace

TEST(ZmqTest, EachTypeArrivesOverEachTransport)
{
    const std::pair<std::string, std::size_t> types[] = {
        // and bytes of two elements that are compared
        {"double", 16}, {"float", 8},  {"int8", 2},   {"uint8", 2},   {"int16", 4},   {"uint16", 4},
        {"int32", 8},   {"uint32", 8}, {"int64", 16}, {"uint64", 16}, {"logical", 2}, {"char", 2}};
    const std::string ipc = "ipc://" + folder + "types";
    for (const auto& [out, in, where] : {std::tuple("push", "pull", anyPort),
                                         {"push", "pull", ipc},
                                         {"publish", "subscribe", anyPort},
                                         {"publish", "subscribe", ipc}}) {
        SCOPED_TRACE(out + where);
        Peer writer(out, where, {{"Readers", 1}, {"Unit", "V"}, {"Rate", 8.0}, {"Name", "w"}});
        Peer reader(in, writer.endpoint);
        const unsigned char data[16] = {1, 0, 1, 1, 5, 6, 7, 8, 9};
        for (const auto& [type, size] : types) {
            double written = 0;
            ASSERT_EQ(coderOutputStreamWriteTypedDataOld(writer.output, &written, 1, type.c_str(),
                                                         CODER_BUFFER(2, data)),
                      1);
        }
        ASSERT_EQ(writer.close(), 1);
        EXPECT_EQ(writer.lastError(), "|");
        reader.waitForEnd();
        for (const auto& [type, size] : types) {
            const bool isText = type == "char";
            unsigned char got[16] = {};
            char source[64] = "";
            ASSERT_EQ(coderInputStreamReadBuffers(reader.input, isText ? 1 : 2, 1), 1);
            const auto get = [&](const char* field, const char* as, int most, void* place) {
                return coderInputStreamReadBufferData(reader.input, 1, 0, field, as, most, place);
            };
            EXPECT_EQ(get("data", type.c_str(), isText ? 16 : 2, got), 1) << type << reader.error();
            EXPECT_EQ(memcmp(got, data, isText ? 1 : size), 0) << type; // a text ends at its zero
            EXPECT_EQ(get("Source", "char", 64, source), 1);
            EXPECT_EQ(std::string(source).substr(0, 2), "w/");
        }
        EXPECT_EQ(reader.text("Writer") + reader.text("Unit"), "wV");
        EXPECT_EQ(reader.property<double>("Rate", "double"), 8);
    }
}

TEST(ZmqTest, AReaderThatStopsHoldsTheWriterBack)
{
    constexpr int size = 8192;
    constexpr int blocks = 800 / STRESS_SCALE + 200; // more than all that can wait on the way
    Peer writer("push", anyPort, {{"HighWater", 2}, {"Readers", 1}}, 2.0 * size);
    Peer reader("pull", writer.endpoint, {{"HighWater", 2}}, 2.0 * size);
    std::atomic<int> written = 0;
    std::thread writing([&] {
        for (; written < blocks; ++written) {
            ASSERT_EQ(writer.write(Numbers(size, written)), size) << writer.reason();
        }
        EXPECT_EQ(writer.close(), 1);
    });
    int before = -1; // until nothing moves, as all on the way is full
    while (std::exchange(before, written) != written || written == 0) {
        std::this_thread::sleep_for(std::chrono::milliseconds(100));
    }
    EXPECT_LT(written, blocks);
    for (int i = 0; i < blocks; ++i) {
        std::vector<double> values(size);
        ASSERT_EQ(coderInputStreamReadBuffers(reader.input, size, 1), 1) << reader.reason();
        ASSERT_EQ(coderInputStreamReadBufferData(reader.input, 1, 0, "data", "double", size,
                                                 values.data()),
                  1);
        ASSERT_EQ(values, Numbers(size, i));
    }
    writing.join();
    reader.waitForEnd();
    EXPECT_EQ(writer.lastError(), "|");
    EXPECT_EQ(reader.lastError(), "|");
}

TEST(ZmqTest, ASlowSubscriberKnowsWhatItMissed)
{
    constexpr double size = 4000;
    Peer writer("publish", anyPort, {{"HighWater", 1}, {"Readers", 2}, {"Topic", "abc"}});
    Peer slow("subscribe", writer.endpoint, {{"HighWater", 1}, {"Topic", "ab"}}, size);
    Peer other("subscribe", writer.endpoint, {{"Topic", "abc"}});
    Peer deaf("subscribe", writer.endpoint, {{"Topic", "b"}});
    double sent = 0;
    for (; sent < 1000 * size; sent += size) {
        ASSERT_EQ(writer.write(range(sent, sent + size)), size);
    }
    std::thread closing([&] { EXPECT_EQ(writer.close(), 1); });
    for (Peer* const reader : {&slow, &other}) {
        const Numbers got = reader->readAll();
        EXPECT_EQ(double(got.size()) + reader->lost(), sent);
        EXPECT_TRUE(std::is_sorted(got.begin(), got.end()));
    }
    closing.join();
    EXPECT_GT(slow.lost(), 0);
    EXPECT_NE(slow.asyncError().find(std::to_string(long(slow.lost())) + " since open"), npos);
    EXPECT_EQ(deaf.peek(), Numbers{});
}

TEST(ZmqTest, OnlyTheKeysOfTheListComeIn)
{
    const std::string server = makeKeys("server");
    const std::string client = makeKeys("client");
    const std::string stranger = makeKeys("stranger");
    const std::string list =
        write("list", "# who may come in\n" + contents(client + ".pub").substr(0, 40) + " # one\n");
    const std::string strangerKey = contents(stranger + ".pub").substr(0, 40);
    const struct {
        const char *name, *serverKey, *secret; ///< of the side that connects
        bool serverHasKey;
        std::string readerError, writerError;
    } rows[] = {
        {"right", "server.pub", "client", true, "", ""},
        {"stranger", "server.pub", "stranger", true, "it does not allow the key of " + stranger,
         "the key " + strangerKey + " from 127.0.0.1 is not in " + list},
        {"no key", "", "", true, "has a key", "the other side has no key"},
        {"other server", "client.pub", "client", true,
         "it has another key than that of " + client +
             ".pub, has no key, no Pattern that fits, or is no ZeroMQ socket",
         "it expected another key than that of " + server},
        {"server without key", "server.pub", "client", false, "has no key", ""},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.name);
        const Option hasty{"CloseTimeout", 0.0};
        const std::string secret = folder + row.secret;
        const std::string key = folder + row.serverKey;
        const Options own{hasty, {"SecretKeyFile", server}, {"AllowedKeysFile", list}};
        const Options open{hasty};
        const Options keyless{none};
        const Options others{{"SecretKeyFile", secret}, {"ServerKeyFile", key}};
        const Peer writer("push", anyPort, row.serverHasKey ? own : open);
        const Peer reader("pull", writer.endpoint, *row.secret != 0 ? others : keyless);
        ASSERT_EQ(writer.write({7}), 1);
        if (row.readerError.empty()) {
            EXPECT_EQ(reader.read(1, 1), Numbers{7});
            EXPECT_EQ(reader.text("PublicKey"), contents(client + ".pub").substr(0, 40));
            continue;
        }
        const auto isTold = [&](const Peer& side, const std::string& what, const std::string& why) {
            const std::string error = side.asyncError();
            EXPECT_EQ(error.rfind(what + writer.endpoint + ": ", 0), 0) << error;
            EXPECT_NE(error.find(why), npos) << error;
        };
        isTold(reader, "brenix:Device:refused|Could not be a peer of ", row.readerError);
        if (!row.writerError.empty()) {
            isTold(writer, "brenix:Device:peerRefused|Peers were refused at ", row.writerError);
        }
        EXPECT_EQ(reader.peek(), Numbers{}); // and nothing of the data
        EXPECT_EQ(writer.close(), 1);
        EXPECT_EQ(writer.asyncError(), "brenix:Device:dataLost|1 counts were not sent to " +
                                           writer.endpoint + ": they were not taken in time.");
    }
}

TEST(ZmqTest, FilesOfKeys)
{
    const std::string name = makeKeys("pair");
    const std::string secret = contents(name);
    const std::string key = contents(name + ".pub").substr(0, 40);
    struct stat status {
    };
    EXPECT_EQ(stat(name.c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 0777, 0600U);
    Channel maker("zmq");
    ASSERT_EQ(maker.init({{"Endpoint", anyPort}, {"Pattern", "push"}}), 1);
    EXPECT_EQ(maker.execute("keys", {{"FileName", name}}), 0);
    EXPECT_EQ(maker.error(), unexpected + name + ": File exists");
    EXPECT_EQ(contents(name), secret);
    std::remove(name.c_str());
    EXPECT_EQ(maker.execute("keys", {{"FileName", name}}), 0);
    EXPECT_EQ(maker.error(), unexpected + name + ".pub: File exists");
    EXPECT_NE(stat(name.c_str(), &status), 0);

    write("pair", secret);
    const std::string other = makeKeys("other");
    const std::string otherKey = contents(other + ".pub");
    const std::string missing = folder + "missing";
    const struct {
        std::string secretFile, listFile, serverFile, error; ///< one of two files is given
    } rows[] = {
        {write("open", secret, 0640), other + ".pub", "",
         folder + "open: others than its owner may use it; chmod 600 it"},
        {missing, other + ".pub", "", missing + ": No such file or directory"},
        {write("public", otherKey), other + ".pub", "",
         folder + "public:1: is no line of a secret key"},
        {write("short", "secret abc\n"), other + ".pub", "", folder + "short: has no secret key"},
        {name, missing, "", missing + ": No such file or directory"},
        {name, folder, "", folder + ": Is a directory"},
        {name, write("bad", "# x\n\n" + otherKey + "abc\n"), "",
         folder + "bad:4: is no public key"},
        {name, name, "", name + ":2: is no public key"},
        {name, "", write("two", otherKey + key + "\n"),
         folder + "two: must have one public key, and has 2"},
    };
    for (const auto& row : rows) {
        Channel channel("zmq");
        const bool binds = !row.listFile.empty();
        ASSERT_EQ(channel.init({{"Endpoint", binds ? anyPort : "tcp://127.0.0.1:9"},
                                {"Pattern", "pull"},
                                {"Bind", int(binds)},
                                {"SecretKeyFile", row.secretFile},
                                {binds ? "AllowedKeysFile" : "ServerKeyFile",
                                 binds ? row.listFile : row.serverFile}}),
                  1);
        EXPECT_EQ(channel.open(), 0);
        EXPECT_EQ(channel.error(), unexpected + row.error);
    }
}

TEST(ZmqTest, OptionsAreForSomePatterns)
{
    const struct {
        const char* pattern;
        Option option;
        const char* error;
    } rows[] = {
        {"pair", none, "Pattern: must be push, pull, publish or subscribe, not pair"},
        {"", none, "Pattern: must be push, pull, publish or subscribe, not "},
        {"push", {"Endpoint", ""}, "Endpoint: is required, such as tcp://127.0.0.1:5000"},
        {"push", {"Endpoint", "udp://x"}, "Endpoint: must be tcp://... or ipc://..., not udp://x"},
        {"push",
         {"Endpoint", "tcp://*:65536"},
         "Endpoint: must end with a port from 1 to 65535, or *, not as tcp://*:65536"},
        {"pull",
         {"Endpoint", "tcp://a:*"},
         "Endpoint: must end with a port from 1 to 65535, not as tcp://a:*"},
        {"push", {"Topic", "a"}, "Topic: is not for push: publish and subscribe have topics"},
        {"push", {"Writers", 1}, "Writers: is not for push, which writes"},
        {"publish", {"Share", 1}, "Share: is not for publish: readers share what pull takes"},
        {"subscribe", {"Readers", 1}, "Readers: is not for subscribe, which reads"},
        {"pull", {"Unit", "V"}, "Unit: is not for pull, which reads"},
        {"push", {"CloseTimeout", -1.0}, "CloseTimeout: must be from 0 to 86400 seconds"},
        {"push", {"HighWater", 0}, "HighWater: must be a whole number from 1 to 1073741824"},
        {"push",
         {"SecretKeyFile", "x"},
         "AllowedKeysFile: is required: who may come in to a side that binds"},
        {"pull",
         {"SecretKeyFile", "x"},
         "ServerKeyFile: is required: the key of the side that binds"},
        {"push", {"AllowedKeysFile", "x"}, "AllowedKeysFile: needs SecretKeyFile"},
        {"push", {"ServerKeyFile", "x"}, "ServerKeyFile: is not for a side that binds"},
        {"pull", {"AllowedKeysFile", "x"}, "AllowedKeysFile: is for the side that binds"},
        {"pull", {"Foo", 1}, "Foo: is not known"},
    };
    for (const auto& row : rows) {
        Channel channel("zmq");
        const Option where{"Endpoint", "tcp://127.0.0.1:9"};
        EXPECT_EQ(channel.init({where, {"Pattern", row.pattern}, row.option}), 0);
        EXPECT_EQ(channel.error(), unexpected + "Option " + row.error + ".");
    }
}

TEST(ZmqTest, AnEndpointThatCannotBeBound)
{
    const Peer tcp("push", anyPort);
    const Peer ipc("push", "ipc://" + folder + "bound");
    for (const auto& [where, why] : {std::pair(tcp.endpoint, "Address already in use"),
                                     {ipc.endpoint, "Address already in use"},
                                     {"tcp://nowhere:5000"s, "No such device"},
                                     {"ipc://" + folder + "none/x", "No such file or directory"}}) {
        Channel channel("zmq");
        ASSERT_EQ(channel.init({{"Endpoint", where}, {"Pattern", "publish"}}), 1);
        EXPECT_EQ(channel.open(), 0);
        EXPECT_EQ(channel.error(), unexpected + "Could not bind " + where + ": " + why);
    }
    EXPECT_EQ(Peer("push", "ipc://" + folder + "free").close(), 1);
    Peer("push", "ipc://" + folder + "free"); // again
}

TEST(ZmqTest, WhatNobodyTakesIsToldWhenTheTimeIsOver)
{
    for (const bool isThere : {false, true}) {
        for (const char* const pattern : {"push", "publish"}) {
            SCOPED_TRACE(pattern);
            Peer writer(pattern, anyPort,
                        {{"CloseTimeout", 0.3}, {"Readers", isThere ? 1 : 2}, {"HighWater", 5000}});
            // One that does not read.
            const Socket reader(pattern == "push"s ? ZMQ_PULL : ZMQ_SUB, writer.endpoint);
            const Numbers block(1 << 16, 1.0);
            double sent = 0;
            for (int i = 0; i < 100; ++i) {
                sent += writer.write(block);
            }
            ASSERT_EQ(writer.close(), 1);
            const std::string error = writer.asyncError();
            EXPECT_EQ(error.rfind("brenix:Device:dataLost|", 0), 0) << error;
            // What is told and what was handed over are all.
            double told = std::strtod(error.c_str() + error.find('|') + 1, nullptr);
            for (zmq_msg_t frame; isThere && told < sent;) {
                zmq_msg_init(&frame);
                ASSERT_GE(zmq_msg_recv(&frame, reader.handle, 0), 0);
                told += zmq_msg_size(&frame) > block.size() ? double(block.size()) : 0;
                zmq_msg_close(&frame);
            }
            EXPECT_EQ(told, sent);
        }
    }
    const auto start = std::chrono::steady_clock::now(); // nothing is lost when nothing was written
    for (const char* const pattern : {"push", "publish"}) {
        Peer writer(pattern, anyPort, {{"Readers", 1}});
        EXPECT_EQ(writer.close(), 1);
        EXPECT_EQ(writer.lastError(), "|");
    }
    EXPECT_LT(std::chrono::steady_clock::now() - start, std::chrono::seconds(9));
}

TEST(ZmqTest, AReaderThatIsStuckKeepsTheEndFromNobody)
{
    constexpr int size = 1 << 16;
    Peer writer("publish", anyPort, {{"CloseTimeout", 1.0}, {"Readers", 2}});
    const Peer follows("subscribe", writer.endpoint);
    const Socket stuck(ZMQ_SUB, writer.endpoint);
    for (int i = 0; i < 100; ++i) { // more than the system has room for
        ASSERT_EQ(writer.write(Numbers(size, 1.0)), size);
        ASSERT_EQ(coderInputStreamReadBuffers(follows.input, size, 1), 1);
    }
    EXPECT_EQ(writer.close(), 1);
    EXPECT_EQ(writer.asyncError().rfind("brenix:Device:dataLost|", 0), 0);
    follows.waitForEnd();
    EXPECT_EQ(follows.lastError(), "|");
}

TEST(ZmqTest, AStrangerWhoIsSilentIsTakenForNoReader)
{
    const Peer writer("push");
    const int reader = dial(writer.endpoint);
    const int stranger = dial(writer.endpoint); // newer than the one that is then let in
    ASSERT_EQ(send(reader, handshake.data(), handshake.size(), 0), ssize_t(handshake.size()));
    Channel::waitUntil([&] { return writer.property<uint32_t>("Peers", "uint32") == 1; });
    shutdown(stranger, SHUT_WR);
    EXPECT_FALSE(awaits(stranger, "fields"));              // until the writer has ended it
    for (const char* const packet : {"first", "second"}) { // before the second, it has looked
        ASSERT_EQ(writer.write({1}), 1);
        EXPECT_TRUE(awaits(reader, "fields")) << packet;
    }
    close(stranger);
    close(reader);
}

TEST(ZmqTest, APeerGoesAndComesBack)
{
    auto reader = std::make_unique<Peer>("pull", anyPort, Options{{"Bind", 1}});
    const std::string endpoint = reader->endpoint;
    const Peer writer("push", endpoint, {{"Bind", 0}});
    for (const double value : {1.0, 2.0}) { // it may come later, too
        ASSERT_EQ(writer.write({value}), 1);
        EXPECT_EQ(reader->read(1, 1), Numbers{value});
        reader.reset();
        Channel::waitUntil([&] { return writer.property<uint32_t>("Peers", "uint32") == 0; });
        ASSERT_EQ(writer.write({value + 10}), 1);
        reader = std::make_unique<Peer>("pull", endpoint, Options{{"Bind", 1}});
        EXPECT_EQ(reader->read(1, 1), Numbers{value + 10});
    }
    ASSERT_EQ(writer.close(), 1);
    EXPECT_EQ(writer.lastError(), "|");
    reader->waitForEnd();

    // A reader that goes takes with it what was on its way.
    Peer other("push", anyPort, {{"HighWater", 100}, {"CloseTimeout", 0.0}});
    {
        const Socket goes(ZMQ_PULL, other.endpoint);
        const Numbers block(1 << 16, 1.0);
        for (int i = 0; i < 100; ++i) {
            other.write(block);
        }
        char byte = 0;
        EXPECT_GT(zmq_recv(goes.handle, &byte, 1, 0), 0);
    }
    const std::string error = other.asyncError();
    EXPECT_NE(error.find(" counts were on their way when a reader at " + other.endpoint), npos)
        << error;
}

TEST(ZmqTest, WhatIsNoMessageIsSkipped)
{
    {
        Peer reader("pull", anyPort, {{"Bind", 1}, {"MaxMessage", 4096}});
        const Socket stranger(ZMQ_PUSH, reader.endpoint);
        for (const std::string bytes : {"", "abc", "\xA1"}) {
            ASSERT_GE(zmq_send(stranger.handle, bytes.data(), bytes.size(), ZMQ_SNDMORE), 0);
        }
        ASSERT_GE(zmq_send(stranger.handle, "x", 1, 0), 0);
        Channel::waitUntil([&] { return reader.property<uint64_t>("BadMessages", "uint64") == 4; });
        EXPECT_EQ(reader.asyncError().rfind("brenix:Device:badMessage|What arrived from " +
                                                reader.endpoint + " was skipped: ",
                                            0),
                  0);
        Peer writer("push", reader.endpoint, {{"Bind", 0}});
        ASSERT_EQ(writer.write({1}), 1);
        EXPECT_EQ(reader.read(1, 1), Numbers{1});
    }
    // One that is too large ends the connection, which is made again.
    Peer writer("publish", anyPort, {{"Readers", 1}});
    Peer reader("subscribe", writer.endpoint, {{"MaxMessage", 4096}});
    ASSERT_EQ(writer.write({1}), 1);
    EXPECT_EQ(reader.read(1, 1), Numbers{1});
    ASSERT_EQ(writer.write(Numbers(1000, 1.0)), 1000);
    EXPECT_EQ(reader.asyncError(), "brenix:Device:badMessage|The connection to " + writer.endpoint +
                                       " has ended: what came over it is no message, or larger "
                                       "than MaxMessage.");
    Channel::waitUntil([&] {
        writer.write({2});
        return !reader.peek().empty();
    });
    EXPECT_EQ(reader.read(1, 1), Numbers{2});
    EXPECT_GE(reader.lost(), 1000);
}

TEST(ZmqTest, ReadersShareWhatIsPushed)
{
    Peer writer("push", anyPort, {{"Readers", 2}});
    const Peer stranger("subscribe", writer.endpoint); // counts for none
    const auto isTold = [](const Peer& side) {
        return side.lastError().find("Pattern that fits") != npos;
    };
    Channel::waitUntil([&] { return isTold(writer) || isTold(stranger); });
    const Peer first("pull", writer.endpoint, {{"Share", 1}});
    const Peer second("pull", writer.endpoint, {{"Share", 1}});
    for (int i = 0; i < 100; ++i) {
        ASSERT_EQ(writer.write({double(i)}), 1);
    }
    ASSERT_EQ(writer.close(), 1);
    Numbers all = first.readAll();
    const Numbers others = second.readAll();
    EXPECT_FALSE(all.empty() || others.empty());
    all.insert(all.end(), others.begin(), others.end());
    std::sort(all.begin(), all.end());
    EXPECT_EQ(all, range(0, 100));
    for (const Peer* const reader : {&first, &second}) {
        EXPECT_EQ(reader->lost(), 0);
    }
}
