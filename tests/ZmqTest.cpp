// The device zmq: channels that talk to each other, and to sockets of libzmq alone.

#include "Driver.hpp"

#include <zmq.h>

#include <sys/stat.h>
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
const Option none{"Timeout", 10.0};

/// A channel of the device that is open, and where it is bound.
struct Peer : Channel {
    Peer(const char* pattern, const std::string& where, Options more = {}, double limit = infinity)
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
        EXPECT_EQ(zmq_connect(handle, endpoint.c_str()), 0);
    }
    Socket(const Socket&) = delete;
    Socket& operator=(const Socket&) = delete;
    ~Socket() { zmq_close(handle); }
    void* handle;
};

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

struct Seconds {
    const std::chrono::steady_clock::time_point start = std::chrono::steady_clock::now();
    double passed() const
    {
        return std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
    }
};

} // namespace

TEST(ZmqTest, EachTypeArrivesOverEachTransport)
{
    const char* const types[] = {"double", "float", "int8",   "uint8",  "int16",   "uint16",
                                 "int32",  "int64", "uint32", "uint64", "logical", "char"};
    const std::string ipc = "ipc://" + folder + "types";
    for (const auto& [out, in, where] : {std::tuple("push", "pull", anyPort),
                                         {"push", "pull", ipc},
                                         {"publish", "subscribe", anyPort},
                                         {"publish", "subscribe", ipc}}) {
        SCOPED_TRACE(out + where);
        Peer writer(out, where, {{"Readers", 1}, {"Unit", "V"}, {"Rate", 8.0}, {"Name", "w"}});
        Peer reader(in, writer.endpoint);
        unsigned char data[16] = {1, 0, 1, 1};
        for (const char* const type : types) {
            double written = 0;
            ASSERT_EQ(coderOutputStreamWriteTypedDataOld(writer.output, &written, 1, type,
                                                         CODER_BUFFER(2, data)),
                      1);
        }
        ASSERT_EQ(writer.close(), 1);
        EXPECT_EQ(writer.error(coderChannelGetLastAsyncError), "|");
        reader.waitForEnd();
        for (const char* const type : types) {
            const bool isText = type == "char"s;
            unsigned char got[16] = {};
            char source[64] = "";
            ASSERT_EQ(coderInputStreamReadBuffers(reader.input, isText ? 1 : 2, 1), 1);
            EXPECT_EQ(coderInputStreamReadBufferData(reader.input, 1, 0, "data", type,
                                                     isText ? 16 : 2, got),
                      1)
                << type << reader.error();
            const std::size_t size =
                type == "double"s || strchr(type, '6') == type + strlen(type) - 2 ? 2 : 1;
            EXPECT_EQ(std::string(got, got + size), std::string(data, data + size)) << type;
            EXPECT_EQ(
                coderInputStreamReadBufferData(reader.input, 1, 0, "Source", "char", 64, source),
                1);
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
            const Numbers values(size, written);
            double counts = 0;
            ASSERT_EQ(coderOutputStreamWriteTypedDataOld(writer.output, &counts, 1, "double",
                                                         CODER_BUFFER(size, values.data())),
                      1)
                << writer.error() << writer.reason();
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
    EXPECT_EQ(writer.error(coderChannelGetLastAsyncError), "|");
    EXPECT_EQ(reader.error(coderChannelGetLastAsyncError), "|");
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
        const auto lost = double(reader->property<uint64_t>("LostCounts", "uint64"));
        EXPECT_EQ(double(got.size()) + lost, sent);
        if (reader == &slow) {
            EXPECT_GT(lost, 0);
            EXPECT_NE(reader->asyncError().find(std::to_string(long(lost)) + " since open"), npos);
        }
        EXPECT_TRUE(std::is_sorted(got.begin(), got.end()));
    }
    closing.join();
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
        const char* name;
        const char *serverKey, *secret, *expected; ///< of the side that connects
        bool serverHasKey;
        std::string readerError, writerError;
    } rows[] = {
        {"right", "server.pub", "client", nullptr, true, "", ""},
        {"stranger", "server.pub", "stranger", nullptr, true,
         "it does not allow the key of " + stranger,
         "the key " + strangerKey + " from 127.0.0.1 is not in " + list},
        {"no key", nullptr, nullptr, nullptr, true, "has a key", "the other side has no key"},
        {"other server", "client.pub", "client", nullptr, true,
         "it has another key than that of " + client +
             ".pub, has no key, no Pattern that fits, or is no ZeroMQ socket",
         "it expected another key than that of " + server},
        {"server without key", "server.pub", "client", nullptr, false, "has no key", ""},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.name);
        std::unique_ptr<Peer> writer;
        if (row.serverHasKey) {
            writer = std::make_unique<Peer>("push", anyPort,
                                            Options{{"SecretKeyFile", server},
                                                    {"AllowedKeysFile", list},
                                                    {"CloseTimeout", 0.0}});
        } else {
            writer = std::make_unique<Peer>("push", anyPort, Options{{"CloseTimeout", 0.0}});
        }
        const std::string secret = folder + (row.secret ? row.secret : "");
        const std::string key = folder + (row.serverKey ? row.serverKey : "");
        const Peer reader = row.secret ? Peer("pull", writer->endpoint,
                                              {{"SecretKeyFile", secret}, {"ServerKeyFile", key}})
                                       : Peer("pull", writer->endpoint);
        ASSERT_EQ(writer->write({7}), 1);
        if (row.readerError.empty()) {
            EXPECT_EQ(reader.read(1, 1), Numbers{7});
            EXPECT_EQ(reader.text("PublicKey"), contents(client + ".pub").substr(0, 40));
            continue;
        }
        const std::string refused =
            "brenix:Device:refused|Could not be a peer of " + writer->endpoint + ": ";
        const std::string error = reader.asyncError();
        EXPECT_EQ(error.rfind(refused, 0), 0) << error;
        EXPECT_NE(error.find(row.readerError), npos) << error;
        if (!row.writerError.empty()) {
            const std::string peer = writer->asyncError();
            EXPECT_EQ(peer.rfind("brenix:Device:peerRefused|Peers were refused at " +
                                     writer->endpoint + ": ",
                                 0),
                      0)
                << peer;
            EXPECT_NE(peer.find(row.writerError), npos) << peer;
        }
        EXPECT_EQ(reader.peek(), Numbers{}); // and nothing of the data
        EXPECT_EQ(writer->close(), 1);
        EXPECT_EQ(writer->asyncError(), "brenix:Device:dataLost|1 counts were not sent to " +
                                            writer->endpoint + ": nobody took them in time.");
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
        EXPECT_EQ(channel.open(), row.error.empty()) << row.error;
        EXPECT_EQ(channel.error(), row.error.empty() ? "|" : unexpected + row.error);
    }
}

TEST(ZmqTest, OptionsAreForSomePatterns)
{
    const Option text{"Endpoint", "tcp://127.0.0.1:9"};
    const Option one{"Bind", 1};
    const struct {
        const char* pattern;
        Option more, another;
        const char* error;
    } rows[] = {
        {"pair", text, text, "Pattern: must be push, pull, publish or subscribe, not pair"},
        {"", text, text, "Pattern: must be push, pull, publish or subscribe, not "},
        {"push",
         {"Endpoint", ""},
         {"Endpoint", ""},
         "Endpoint: is required, such as tcp://127.0.0.1:5000"},
        {"push",
         {"Endpoint", "udp://x"},
         {"Endpoint", "udp://x"},
         "Endpoint: must be tcp://... or ipc://..., not udp://x"},
        {"push",
         {"Endpoint", "tcp://*:65536"},
         {"Endpoint", "tcp://*:65536"},
         "Endpoint: must end with a port from 1 to 65535, or *, not as tcp://*:65536"},
        {"pull",
         {"Endpoint", "tcp://a:*"},
         {"Endpoint", "tcp://a:*"},
         "Endpoint: must end with a port from 1 to 65535, not as tcp://a:*"},
        {"push", {"Topic", "a"}, text, "Topic: is not for push: publish and subscribe have topics"},
        {"push", {"Writers", 1}, text, "Writers: is not for push, which writes"},
        {"publish", {"Share", 1}, text, "Share: is not for publish: readers share what pull takes"},
        {"subscribe", {"Readers", 1}, text, "Readers: is not for subscribe, which reads"},
        {"pull", {"Unit", "V"}, text, "Unit: is not for pull, which reads"},
        {"push", {"CloseTimeout", -1.0}, text, "CloseTimeout: must be from 0 to 86400 seconds"},
        {"push", {"HighWater", 0}, text, "HighWater: must be a whole number from 1 to 1073741824"},
        {"push",
         {"SecretKeyFile", "x"},
         text,
         "AllowedKeysFile: is required: who may come in to a side that binds"},
        {"pull",
         {"SecretKeyFile", "x"},
         text,
         "ServerKeyFile: is required: the key of the side that binds"},
        {"pull",
         {"SecretKeyFile", "x"},
         one,
         "AllowedKeysFile: is required: who may come in to a side that binds"},
        {"push", {"AllowedKeysFile", "x"}, text, "AllowedKeysFile: needs SecretKeyFile"},
        {"push", {"ServerKeyFile", "x"}, text, "ServerKeyFile: is not for a side that binds"},
        {"pull", {"AllowedKeysFile", "x"}, text, "AllowedKeysFile: is for the side that binds"},
        {"pull", {"Foo", 1}, text, "Foo: is not known"},
    };
    for (const auto& row : rows) {
        Channel channel("zmq");
        EXPECT_EQ(channel.init({text, {"Pattern", row.pattern}, row.another, row.more}), 0);
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
    const Seconds seconds;
    for (const bool isThere : {false, true}) {
        for (const char* const pattern : {"push", "publish"}) {
            SCOPED_TRACE(pattern);
            Peer writer(pattern, anyPort,
                        {{"CloseTimeout", 0.3}, {"Readers", isThere ? 1 : 2}, {"HighWater", 5000}});
            // One that does not read.
            const Socket reader(pattern == "push"s ? ZMQ_PULL : ZMQ_SUB, writer.endpoint);
            if (pattern == "publish"s) {
                zmq_setsockopt(reader.handle, ZMQ_SUBSCRIBE, "", 0);
            }
            const Numbers block(1 << 16, 1.0);
            double sent = 0;
            for (int i = 0; i < 100; ++i) {
                sent += writer.write(block);
            }
            ASSERT_EQ(writer.close(), 1);
            const std::string error = writer.asyncError();
            EXPECT_EQ(error.rfind("brenix:Device:dataLost|", 0), 0) << error;
            EXPECT_NE(error.find(" counts were not sent to " + writer.endpoint +
                                 ": nobody took them in time."),
                      npos)
                << error;
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
    EXPECT_LT(seconds.passed(), 60);
    const Seconds atOnce; // nothing is lost when nothing was written
    for (const char* const pattern : {"push", "publish"}) {
        Peer writer(pattern, anyPort, {{"Readers", 1}});
        EXPECT_EQ(writer.close(), 1);
        EXPECT_EQ(writer.error(coderChannelGetLastAsyncError), "|");
    }
    EXPECT_LT(atOnce.passed(), 9);
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
    EXPECT_EQ(writer.error(coderChannelGetLastAsyncError), "|");
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
    EXPECT_NE(error.find(" counts, or some of them, were lost with a reader at " + other.endpoint),
              npos)
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
    EXPECT_GE(reader.property<uint64_t>("LostCounts", "uint64"), 1000);
}

TEST(ZmqTest, ReadersShareWhatIsPushed)
{
    Peer writer("push", anyPort, {{"Readers", 2}});
    const Peer stranger("subscribe", writer.endpoint); // counts for none
    const auto isTold = [](const Peer& side) {
        return side.error(coderChannelGetLastAsyncError).find("Pattern that fits") != npos;
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
        EXPECT_EQ(reader->property<uint64_t>("LostCounts", "uint64"), 0);
    }
}
