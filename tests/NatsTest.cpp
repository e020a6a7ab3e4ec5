// The device nats on servers that the tests start.

#include "Driver.hpp"

#include "nats/JetStream.hpp"
#include "nats/Order.hpp"

#include <nats/nats.h>

#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <deque>
#include <filesystem>
#include <fstream>
#include <functional>
#include <map>
#include <memory>
#include <sstream>
#include <string>
#include <utility>
#include <vector>

using namespace driver;

namespace
{

using Clock = std::chrono::steady_clock;

constexpr std::size_t npos = std::string::npos;

const std::filesystem::path folder = testing::TempDir() + "nats-" + std::to_string(getpid());

/// Ends a process of its own.
struct Process {
    explicit Process(const std::function<void()>& run) : id(fork())
    {
        if (id == 0) {
            prctl(PR_SET_PDEATHSIG, SIGKILL);
            run();
            _exit(0);
        }
    }
    Process(const Process&) = delete;
    Process& operator=(const Process&) = delete;
    ~Process() { end(SIGKILL); }

    /// What waitpid() tells.
    int end(int signal)
    {
        int status = -1;
        if (id > 0) {
            kill(id, signal);
            waitpid(std::exchange(id, 0), &status, 0);
        }
        return status;
    }

    pid_t id;
};

/// What a command prints.
std::string run(const std::string& command)
{
    std::string printed;
    FILE* const pipe = popen(command.c_str(), "r");
    for (int c = 0; (c = std::fgetc(pipe)) != EOF;) {
        printed += static_cast<char>(c);
    }
    EXPECT_EQ(pclose(pipe), 0) << command;
    return printed;
}

std::string contents(const std::string& file)
{
    std::ostringstream text;
    text << std::ifstream(file).rdbuf();
    return text.str();
}

/// A nats-server at a port that the system chooses, or at one where it was before.
struct Server {
    explicit Server(const std::string& name, const std::string& settings = "",
                    const std::string& at = "-1")
        : process([&] {
              const std::string file = folder / (name + ".conf");
              std::ofstream(file) << "listen: 127.0.0.1:" << at << "\nports_file_dir: " << folder
                                  << "\njetstream { store_dir: " << folder / name << " }\n"
                                  << settings << '\n';
              execlp("nats-server", "nats-server", "--config", file.c_str(), "--log",
                     (folder / (name + ".log")).c_str(), nullptr);
              _exit(127);
          })
    {
        const std::string file = folder / ("nats-server_" + std::to_string(process.id) + ".ports");
        Channel::waitUntil([&] { return contents(file).find("}") != npos; });
        const std::string text = contents(file);
        port = text.substr(text.find("127.0.0.1:") + 10);
        port.resize(port.find('"'));
        url = "nats://127.0.0.1:" + port;
    }

    Process process;
    std::string port;
    std::string url;
};

/// The one of all tests that need no other.
struct Shared : testing::Environment {
    void SetUp() override
    {
        std::filesystem::create_directories(folder);
        server = std::make_unique<Server>("shared");
    }
    void TearDown() override
    {
        server.reset();
        std::filesystem::remove_all(folder);
    }
    std::unique_ptr<Server> server;
};
auto* const shared = new Shared; // of GoogleTest from the next line on
[[maybe_unused]] const auto* const environment = testing::AddGlobalTestEnvironment(shared);

const Option none{"Timeout", 10.0};

/// A channel of the device that is open; its options, with those that all have.
struct Peer : Channel {
    Peer(const std::string& subject, Options more, double limit = infinity,
         const std::string& servers = shared->server->url)
        : Channel("nats", limit, limit)
    {
        const auto at = [&](std::size_t i) { return i < more.size() ? more.begin()[i] : none; };
        start({{"Servers", servers}, {"Subject", subject}, at(0), at(1), at(2), at(3), at(4)}, 20);
    }

    std::string text(const char* name) const
    {
        char value[CODER_ERROR_SIZE] = "";
        coderChannelGetPropertyValue(handle, name, "char", sizeof value, value);
        return value;
    }
};

const Option writing{"Mode", "write"};

/// The library itself, as other programs use it.
struct Raw {
    explicit Raw(const std::string& url = shared->server->url)
    {
        EXPECT_EQ(natsConnection_ConnectTo(&connection, url.c_str()), NATS_OK);
        EXPECT_EQ(natsConnection_JetStream(&context, connection, nullptr), NATS_OK);
    }
    Raw(const Raw&) = delete;
    Raw& operator=(const Raw&) = delete;
    ~Raw()
    {
        jsCtx_Destroy(context);
        natsConnection_Destroy(connection);
    }

    /// Sends a message of a stream again, to a subject; with its headers, or as other programs would.
    void repeat(const char* stream, std::uint64_t place, const char* subject,
                bool isLabelled = true) const
    {
        natsMsg* message = nullptr;
        natsMsg* copy = nullptr;
        ASSERT_EQ(js_GetMsg(&message, context, stream, place, nullptr, nullptr), NATS_OK);
        natsMsg_Create(&copy, subject, nullptr, natsMsg_GetData(message),
                       natsMsg_GetDataLength(message));
        for (const char* const header : {"Nats-Msg-Id", "Brenix-Stored"}) {
            const char* value = nullptr;
            ASSERT_EQ(natsMsgHeader_Get(message, header, &value), NATS_OK);
            if (isLabelled) {
                natsMsgHeader_Set(copy, header, value);
            }
        }
        EXPECT_EQ(js_PublishMsg(nullptr, context, copy, nullptr, nullptr), NATS_OK);
        natsMsg_Destroy(copy);
        natsMsg_Destroy(message);
    }

    std::uint64_t messages(const char* stream) const
    {
        jsStreamInfo* info = nullptr;
        EXPECT_EQ(js_GetStreamInfo(&info, context, stream, nullptr, nullptr), NATS_OK);
        const std::uint64_t count = info->State.Msgs;
        jsStreamInfo_Destroy(info);
        return count;
    }

    natsConnection* connection = nullptr;
    jsCtx* context = nullptr;
};

/// What a reader has got of a buffer.
struct Got {
    std::uint64_t index = 0;
    double first = 0;
    double last = 0;
    std::uint64_t counts = 0;
};

/// Reads what comes next as one buffer.
Got readOne(const Channel& channel, bool hasIndex = true)
{
    const Clock::time_point end =
        Clock::now() + std::chrono::seconds(60); // servers may choose another leader
    while (channel.peek(1).empty()) {
        EXPECT_LT(Clock::now(), end) << "waited in vain";
        if (testing::Test::HasFailure()) {
            return {};
        }
        std::this_thread::sleep_for(std::chrono::milliseconds(1));
    }
    double available = 0;
    double buffers = 1;
    double counts = 0;
    EXPECT_EQ(coderInputStreamPeek(channel.input, &available, &counts, &buffers, infinity), 1);
    const Numbers values = channel.read(counts, 1);
    Got got;
    if (!values.empty()) {
        got = {0, values.front(), values.back(), values.size()};
        EXPECT_EQ(values, range(got.first, got.last + 1));
    }
    if (hasIndex) {
        EXPECT_EQ(
            coderInputStreamReadBufferData(channel.input, 1, 0, "Index", "uint64", 1, &got.index),
            1)
            << channel.error();
    }
    return got;
}

} // namespace

// --- Without a stream, and with one ---

TEST(NatsTest, EachTypeArrives)
{
    const char* const types[] = {"double", "float", "int8",   "uint8",  "int16",   "uint16",
                                 "int32",  "int64", "uint32", "uint64", "logical", "char"};
    for (const Option& stream : {none, Option{"Stream", "TYPES"}}) {
        const Peer reader("types", {stream}, infinity);
        const Peer writer("types", {writing, stream, {"Name", "w"}, {"Unit", "V"}, {"Rate", 8.0}});
        const unsigned char data[16] = {1, 0, 1, 1};
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
            const std::size_t size =
                type == "double"s || (type + std::strlen(type))[-2] == '6' ? 2 : 1;
            unsigned char got[16] = {};
            char source[64] = "";
            ASSERT_EQ(coderInputStreamReadBuffers(reader.input, isText ? 1 : 2, 1), 1);
            EXPECT_EQ(coderInputStreamReadBufferData(reader.input, 1, 0, "data", type,
                                                     isText ? 16 : 2, got),
                      1)
                << type << reader.error();
            EXPECT_EQ(std::string(got, got + size), std::string(data, data + size)) << type;
            EXPECT_EQ(
                coderInputStreamReadBufferData(reader.input, 1, 0, "Source", "char", 64, source),
                1);
            EXPECT_EQ(std::string(source).substr(0, 2), "w/");
        }
        EXPECT_EQ(reader.text("Writer") + reader.text("Unit") + reader.text("Server"),
                  "wV" + shared->server->url);
        EXPECT_EQ(reader.property<double>("Rate", "double"), 8);
    }
}

TEST(NatsTest, ASlowReaderKnowsWhatItLost)
{
    constexpr int size = 65536;
    constexpr int packets = 250; // 125 MiB, of which 64 MiB may wait
    const Peer reader("slow", {}, size);
    const Peer writer("slow", {writing});
    const Numbers block(size, 7);
    for (int i = 0; i < packets; ++i) {
        ASSERT_EQ(writer.write(block), size);
    }
    ASSERT_EQ(writer.close(), 1);
    EXPECT_EQ(writer.error(coderChannelGetLastAsyncError), "|");
    double read = 0;
    uint8_t done = 0;
    Channel::waitUntil([&] {
        coderStreamIsDeviceDone(reader.input, &done); // before the last look
        for (const double count : reader.peek()) {
            read += coderInputStreamReadBuffers(reader.input, count, 1) * count;
        }
        return done == 1 && reader.peek().empty();
    });
    const auto lost = double(reader.property<std::uint64_t>("LostCounts", "uint64"));
    EXPECT_EQ(read + lost, double(size) * packets);
    EXPECT_GT(lost, 0);
    EXPECT_GE(read, 100 * size);
}

TEST(NatsTest, WhatIsTooLargeIsDividedOrTold)
{
    for (const Option& stream : {none, Option{"Stream", "LARGE"}}) {
        const Peer reader("large", {stream, {"Stamps", 1}});
        const Peer writer("large", {writing, stream});
        const std::string text(2 << 20, 'x'); // one count, larger than a message
        ASSERT_EQ(writer.write(range(0, 300000)), 300000);
        double written = 0;
        ASSERT_EQ(coderOutputStreamWriteTypedDataOld(writer.output, &written, 1, "char",
                                                     CODER_BUFFER(text.size(), text.data())),
                  1);
        ASSERT_EQ(writer.write({300001}), 1);
        ASSERT_EQ(writer.close(), 1);
        EXPECT_EQ(writer.error(coderChannelGetLastAsyncError),
                  "brenix:Device:tooLarge|1 counts are each too large for a message to "s +
                      (stream.name == none.name ? "large." : "stream LARGE."));
        reader.waitForEnd();
        double next = 0;
        const Numbers counts = reader.peek();
        EXPECT_EQ(counts.size(), 4); // 2.4 MB are three messages
        for (std::size_t i = 0; i < counts.size(); ++i) {
            std::vector<double> values(static_cast<std::size_t>(counts[i]));
            ASSERT_EQ(coderInputStreamReadBuffers(reader.input, counts[i], 1), 1);
            ASSERT_EQ(coderInputStreamReadBufferData(reader.input, 1, 0, "data", "double",
                                                     static_cast<int>(values.size()),
                                                     values.data()),
                      1);
            next += i == 3 ? 1 : 0;
            EXPECT_EQ(values, range(next, next + counts[i]));
            next += counts[i];
        }
        EXPECT_EQ(reader.property<std::uint64_t>("LostCounts", "uint64"), 1);
    }
}

TEST(NatsTest, OneReaderOfManyWriters)
{
    const Peer reader("many.*", {{"Writers", 3}});
    std::map<std::string, double> expected;
    for (const char* const name : {"a", "b", "c"}) {
        const Peer writer("many."s + name, {writing, {"Name", name}});
        expected[name] = 1 + *name;
        ASSERT_EQ(writer.write({expected[name]}), 1);
        ASSERT_EQ(writer.close(), 1);
    }
    reader.waitForEnd();
    std::map<std::string, double> got;
    for (int i = 0; i < 3; ++i) {
        const Numbers values = reader.read(1, 1);
        char source[64] = "";
        ASSERT_EQ(coderInputStreamReadBufferData(reader.input, 1, 0, "Source", "char", 64, source),
                  1);
        got[std::string(source, std::strchr(source, '/'))] = values.at(0);
    }
    EXPECT_EQ(got, expected);
}

TEST(NatsTest, AServerThatComesBack)
{
    for (const Option& stream : {none, Option{"Stream", "BACK"}}) {
        const std::string name = "back"s + stream.name;
        auto server = std::make_unique<Server>(name);
        const Peer reader("back",
                          {stream, stream.name == none.name ? none : Option{"Start", "all"}},
                          infinity, server->url);
        const Peer writer("back", {writing, stream}, infinity, server->url);
        ASSERT_EQ(writer.write({0}), 1);
        EXPECT_EQ(readOne(reader, false).first, 0);
        const std::string port = server->port;
        server->process.end(SIGKILL);
        server = std::make_unique<Server>(name, "", port);
        // Without a stream it comes when both are there again; a writer does not know of readers.
        double next = 1;
        Channel::waitUntil([&] {
            EXPECT_EQ(writer.write({next++}), 1);
            std::this_thread::sleep_for(std::chrono::milliseconds(20));
            return !reader.peek(1).empty();
        });
        ASSERT_EQ(writer.close(), 1);
        reader.waitForEnd();
        double read = 1;
        for (const double count : reader.peek()) {
            read += double(reader.read(count, 1).size());
        }
        const auto lost = double(reader.property<std::uint64_t>("LostCounts", "uint64"));
        EXPECT_EQ(read + lost, next);
        EXPECT_TRUE(stream.name == none.name || lost == 0) << lost;
    }
}

TEST(NatsTest, CloseTellsWhatAServerDidNotTake)
{
    const struct {
        const char* subject;
        Option stream;
        int signal;
        const char* error;
    } rows[] = {
        {"gone", none, SIGKILL, " counts "}, // what was just on its way is told apart
        {"gone",
         {"Stream", "GONE"},
         SIGKILL,
         " counts were not acknowledged by stream GONE: there is no connection with a server."},
        {"stopped", none, SIGSTOP, " counts were not taken by a server for stopped"},
        {"stopped",
         {"Stream", "STOPPED"},
         SIGSTOP,
         " counts were not acknowledged by stream STOPPED"},
    };
    for (const auto& [subject, stream, signal, error] : rows) {
        SCOPED_TRACE(subject + "s "s + stream.name);
        Server server(subject + ""s + stream.name);
        const Peer writer(subject, {writing, stream, {"CloseTimeout", 0.5}}, infinity, server.url);
        const auto isHandedOver = [&] {
            return writer.ask(coderStreamGetDataAvailable, writer.output) == 0;
        };
        ASSERT_EQ(writer.write({0}), 1); // goes once the first message was acknowledged
        Channel::waitUntil(isHandedOver);
        if (signal == SIGKILL) {
            server.process.end(SIGKILL);
        } else {
            kill(server.process.id, SIGSTOP);
            waitpid(server.process.id, nullptr, WUNTRACED); // until it has stopped
        }
        for (int i = 0; i < 10; ++i) {
            ASSERT_EQ(writer.write(range(0, 100)), 100);
        }
        if (signal == SIGSTOP) {
            Channel::waitUntil(isHandedOver);
        }
        const auto begin = Clock::now();
        EXPECT_EQ(writer.close(), 1);
        EXPECT_LT(Clock::now() - begin, std::chrono::seconds(4)); // docs/plugins.md
        const std::string told = writer.asyncError();
        EXPECT_EQ(told.find("brenix:Device:dataLost|"), 0) << told;
        EXPECT_NE(told.find(error), npos) << told;
        int counts = 0;
        for (std::size_t at = 0; (at = told.find(" counts ", at)) != npos; ++at) {
            counts += std::atoi(told.c_str() + told.find_last_of(" |", at - 1) + 1);
        }
        EXPECT_TRUE(counts == 1000 || counts == 1001) << told; // the first may be on its way
    }
}

// --- With a stream ---

TEST(NatsStreamTest, WhereAReaderStarts)
{
    timespec time{};
    do { // for a fraction that begins with 0
        std::this_thread::sleep_for(std::chrono::milliseconds(2));
        clock_gettime(CLOCK_REALTIME, &time);
    } while (time.tv_nsec >= 20000000);
    {
        const Peer first("start",
                         {writing, {"Stream", "START"}, {"MaxAge", 600}, {"MaxBytes", 1e6}});
        ASSERT_EQ(first.write({0}), 1);
        ASSERT_EQ(first.write({1}), 1);
        ASSERT_EQ(first.close(), 1);
    } // messages 1 to 4: hello, two packets, the end
    std::this_thread::sleep_for(std::chrono::milliseconds(2)); // no two at the same time
    std::array<char, 32> now{};
    clock_gettime(CLOCK_REALTIME, &time);
    const std::size_t end =
        std::strftime(now.data(), now.size(), "%FT%T", std::gmtime(&time.tv_sec));
    std::snprintf(&now[end], now.size() - end, ".%09ldZ", time.tv_nsec);
    const Peer fresh("start", {{"Start", "new"}});
    {
        const Peer second("start", {writing, {"Stream", "START"}});
        ASSERT_EQ(second.write({2}), 1);
        ASSERT_EQ(second.close(), 1);
    }
    const struct {
        const char* name;
        Option start, more;
        double writers;
        Numbers expected;
    } rows[] = {
        {"all", {"Start", "all"}, none, 2, {0, 1, 2}},
        {"index", {"Start", "index"}, {"StartIndex", 3}, 2, {1, 2}},
        {"time", {"Start", "time"}, {"StartTime", now.data()}, 1, {2}},
        {"a place", {"Durable", "place"}, none, 2, {0, 1, 2}},
        {"a new place", {"Durable", "late"}, {"Start", "new"}, 1, {}},
    };
    for (const auto& [name, start, more, writers, expected] : rows) {
        SCOPED_TRACE(name);
        const Peer reader("start", {start, more, {"Writers", writers}});
        if (!expected.empty()) {
            reader.waitForEnd();
        }
        EXPECT_EQ(reader.peek(), Numbers(expected.size(), 1));
        EXPECT_EQ(reader.read(double(expected.size()), double(expected.size())), expected);
        EXPECT_EQ(reader.property<std::uint64_t>("LostCounts", "uint64"), 0);
    }
    fresh.waitForEnd();
    EXPECT_EQ(fresh.read(1, 1), Numbers{2});
}

TEST(NatsStreamTest, WhatIsNotReadComesAgain)
{
    const Peer writer("again", {writing, {"Stream", "AGAIN"}});
    for (int i = 0; i < 6; ++i) {
        ASSERT_EQ(writer.write(range(10 * i, 10 * i + 10)), 10);
    }
    ASSERT_EQ(writer.close(), 1);
    const Options options = {{"Durable", "reader"}, {"Stamps", 1}};
    for (const double first : {0, 20, 40}) {
        const Peer reader("again", options);
        Channel::waitUntil([&] { return reader.peek().size() == std::size_t(6 - first / 10); });
        for (const double index : {first, first + 10}) {
            const Got got = readOne(reader);
            EXPECT_EQ(got.first, index);
            EXPECT_EQ(got.index, index);
        }
        EXPECT_EQ(reader.read(5, 1).size(), 5 * (first < 40)); // a part is not all of it
        if (first < 40) {
            Channel second("nats");
            ASSERT_EQ(second.init({{"Servers", shared->server->url},
                                   {"Subject", "again"},
                                   {"Durable", "reader"},
                                   {"ConnectTimeout", 2}}),
                      1);
            EXPECT_EQ(second.open(), 0);
            EXPECT_NE(
                second.error().find("Durable reader of stream AGAIN is in use by another reader"),
                npos)
                << second.error();
        }
        EXPECT_EQ(reader.close(), 1);
        EXPECT_EQ(reader.error(coderChannelGetLastAsyncError), "|");
    }
}

TEST(NatsStreamTest, RepeatsAndWhatIsOutOfOrder)
{
    const Raw raw;
    {
        const Peer writer("made", {writing, {"Stream", "MADE"}});
        for (double i = 0; i < 7; ++i) {
            ASSERT_EQ(writer.write({i}), 1);
        }
        ASSERT_EQ(writer.close(), 1);
    } // hello is message 1, packet i is i + 2, the end is 9
    EXPECT_EQ(raw.messages("MADE"), 9);
    raw.repeat("MADE", 4, "made"); // the stream keeps it once
    EXPECT_EQ(raw.messages("MADE"), 9);
    const struct {
        const char* name;
        std::vector<std::uint64_t> places;
        double window;
        Numbers expected;
        bool isLabelled;
    } rows[] = {
        {"SHUFFLED", {1, 4, 3, 2, 8, 6, 7, 5, 9}, 100, range(0, 7), true},
        {"TWICE", {1, 2, 3, 2, 4, 5, 3, 6, 7, 8, 9}, 100, range(0, 7), true},
        {"MISSING", {1, 2, 4, 5, 6, 7, 8, 9}, 4, {0, 2, 3, 4, 5, 6}, true},
        {"FOREIGN", {1, 2, 3, 2, 4, 5, 6, 7, 8, 9}, 100, range(0, 7), false},
    };
    for (const auto& row : rows) {
        const auto& [name, places, window, expected, isLabelled] = row;
        SCOPED_TRACE(name);
        jsStreamConfig config;
        jsStreamConfig_Init(&config);
        const char* subject = name;
        config.Name = name;
        config.Subjects = &subject;
        config.SubjectsLen = 1;
        config.Duplicates = 100000000; // 0.1 s: keeps what is sent again later
        ASSERT_EQ(js_AddStream(nullptr, raw.context, &config, nullptr, nullptr), NATS_OK);
        for (std::size_t i = 0; i < places.size(); ++i) {
            Channel::waitUntil([&] {
                raw.repeat("MADE", row.places[i], row.name, row.isLabelled);
                return raw.messages(row.name) == i + 1;
            });
        }
        const Peer reader(name, {{"Stream", name}, {"Start", "all"}, {"Window", window}});
        reader.waitForEnd();
        EXPECT_EQ(reader.read(double(expected.size()), double(expected.size())), expected);
        EXPECT_EQ(reader.property<std::uint64_t>("LostCounts", "uint64"), 7 - expected.size());
    }
}

TEST(NatsStreamTest, WhatIsDeletedEndsTheDevice)
{
    const Raw raw;
    const Peer writer("deleted", {writing, {"Stream", "DELETED"}, {"CloseTimeout", 0.3}});
    const Peer reader("deleted", {{"Durable", "reader"}});
    ASSERT_EQ(writer.write({1}), 1);
    EXPECT_EQ(readOne(reader, false).first, 1);
    ASSERT_EQ(js_DeleteStream(raw.context, "DELETED", nullptr, nullptr), NATS_OK);
    EXPECT_EQ(reader.asyncError(),
              "brenix:Device:failed|Reading deleted failed: Durable reader in stream "
              "DELETED is not there any more.");
    ASSERT_EQ(writer.write({1, 2}), 2);
    EXPECT_EQ(writer.asyncError(),
              "brenix:Device:failed|Writing to stream DELETED failed: stream DELETED is "
              "not there any more. 2 counts were not acknowledged by stream DELETED.");
}

TEST(NatsOrderTest, AWriterBeginsWhenNothingEarlierCanCome)
{
    using namespace natsio;
    Order order;
    const Moment begin;
    std::uint64_t place = 0;
    const auto take = [&](std::uint64_t seq, std::uint64_t stored) {
        Order::Item item{nullptr, ++place, 0, true};
        return order.take({"w", {seq, Rank::Data}, stored}, item, begin);
    };
    const auto places = [&] {
        std::string all;
        for (auto item = order.next(); item; item = order.next()) {
            all += std::to_string(item->place) + (item->follows ? " " : "! ");
        }
        return all;
    };
    EXPECT_TRUE(take(7, 5) && take(8, 6));
    order.settle(begin);
    EXPECT_EQ(places(), ""); // the fifth and the sixth may come
    EXPECT_TRUE(take(6, 5));
    order.settle(begin);
    EXPECT_EQ(places(), "3 1 2 "); // the fifth was stored before the second of these was sent
    EXPECT_FALSE(take(6, 5));

    order = {};
    EXPECT_TRUE(take(1, 0) && take(3, 2) && take(9, 9) && take(11, 10));
    EXPECT_TRUE(order.isBeginning());
    order.settle(begin);
    EXPECT_FALSE(order.isBeginning());
    EXPECT_EQ(places(), "5 6! 7! "); // what is between them was acknowledged, but for the tenth
    order.giveUp(begin + patience - std::chrono::seconds(1), 2);
    EXPECT_EQ(places(), "");
    order.giveUp(begin + patience, 2);
    EXPECT_EQ(places(), "8 ");

    order = {};
    EXPECT_TRUE(take(7, 5));
    order.settle(begin + patience);
    EXPECT_EQ(places(), "9 "); // their writer has died
}

// --- Who may come in ---

TEST(NatsAccessTest, WhoIsRefusedAndWhy)
{
    const std::string keys = folder / "keys";
    ASSERT_EQ(
        std::system(("exec 2>&1 >" + keys + R"(.log; set -e; mkdir )" + keys + "; cd " + keys + R"(
        for ca in ca other; do
            openssl req -x509 -newkey ed25519 -nodes -keyout $ca.key -out $ca.pem -subj /CN=$ca -days 2
        done
        sign() { # NAME BEGIN END
            openssl req -newkey ed25519 -nodes -keyout $1.key -out $1.csr -subj /CN=$1
            printf 'subjectAltName=IP:127.0.0.1' >ext
            openssl x509 -req -in $1.csr -CA ca.pem -CAkey ca.key -CAcreateserial -out $1.pem -extfile ext $2
        }
        sign server '-days 2'
        sign client '-days 2'
        sign old '-days -1')")
                        .c_str()),
        0)
        << contents(keys + ".log");
    const auto tls = [&](const std::string& name) {
        return "tls { cert_file: " + keys + "/" + name + ".pem, key_file: " + keys + "/" + name +
               ".key, ca_file: " + keys + "/ca.pem, verify: true }";
    };
    const Server tokens("tokens", "authorization { token: secret }");
    const Server good("good", tls("server"));
    const Server old("old", tls("old"));
    std::deque<std::string> files;
    const auto file = [&](const char* name, const char* key) {
        return Option{name, files.emplace_back(keys + key)};
    };
    const struct {
        const char* name;
        std::string url;
        Option options[3];
        const char* error;
    } rows[] = {
        {"token", "nats://secret@127.0.0.1:" + tokens.port, {none, none, none}, ""},
        {"no token", tokens.url, {none, none, none}, "Authorization"},
        {"wrong token",
         "nats://guess@127.0.0.1:" + tokens.port,
         {none, none, none},
         "Authorization"},
        {"certificate",
         good.url,
         {file("CaFile", "/ca.pem"), file("CertificateFile", "/client.pem"),
          file("KeyFile", "/client.key")},
         ""},
        {"another CA", good.url, {file("CaFile", "/other.pem"), none, none}, "certificate"},
        {"expired",
         good.url,
         {file("CaFile", "/ca.pem"), file("CertificateFile", "/old.pem"),
          file("KeyFile", "/old.key")},
         "certificate"},
        {"server's expired",
         old.url,
         {file("CaFile", "/ca.pem"), none, none},
         "certificate has expired"},
        {"no CA", good.url, {none, none, none}, "certificate"},
        {"for another host",
         good.url,
         {file("CaFile", "/ca.pem"), {"ServerName", "127.0.0.2"}, none},
         "mismatch"},
        {"nobody", "nats://127.0.0.1:1", {none, none, none}, "no server answers there"},
        {"the second of two",
         "nats://127.0.0.1:1,nats://secret@127.0.0.1:" + tokens.port,
         {none, none, none},
         ""},
        {"neither of two",
         "nats://127.0.0.1:1,nats://guess@127.0.0.1:" + tokens.port,
         {none, none, none},
         "Authorization"},
    };
    for (const auto& [name, url, options, error] : rows) {
        SCOPED_TRACE(name);
        Channel channel("nats");
        ASSERT_EQ(channel.init({{"Servers", url},
                                {"Subject", "a"},
                                options[0],
                                options[1],
                                options[2],
                                {"ConnectTimeout", 5}}),
                  1)
            << channel.error();
        EXPECT_EQ(channel.open(), *error == '\0') << channel.error();
        const std::string told = channel.error();
        EXPECT_NE(told.find(error), npos) << told;
        EXPECT_EQ(told.find("guess"), npos) << told;
        EXPECT_TRUE(*error == '\0' || told.find(url.substr(url.rfind(':'))) != npos) << told;
    }
}

TEST(NatsTest, OptionsThatAreOfNoUse)
{
    const Option read{"Mode", "read"};
    const Option stream{"Stream", "S"};
    const struct {
        Option one, two, three;
        const char* error;
    } rows[] = {
        {none, none, none, "Subject: is required"},
        {{"Subject", "a..b"}, none, none, "Subject: must be tokens"},
        {{"Subject", "a.>.b"}, none, none, "Subject: may have > at its end only"},
        {{"Subject", "a.*"}, writing, none, "Subject: may have wildcards for reading only"},
        {{"Subject", "a"}, {"Mode", "both"}, none, "Mode: must be read or write, not both"},
        {{"Subject", "a"}, {"Servers", "a, ,b"}, none, "Servers: must be URLs"},
        {{"Subject", "a"}, {"Stream", "a.b"}, none, "Stream: must be a name"},
        {{"Subject", "a"}, {"Replicas", 3}, none, "Replicas: is of a Stream"},
        {{"Subject", "a"}, {"Window", 3}, none, "Window: is of no use without a Stream"},
        {{"Subject", "a"}, stream, {"MaxAge", 0.01}, "MaxAge: must be 0.1 to"},
        {{"Subject", "a"}, writing, {"Durable", "d"}, "Durable: is for reading"},
        {{"Subject", "a"}, read, {"Name", "n"}, "Name: is for writing"},
        {{"Subject", "a"},
         {"Start", "soon"},
         none,
         "Start: must be new, all, index or time, not soon"},
        {{"Subject", "a"}, {"Start", "index"}, none, "StartIndex: is required for Start=index"},
        {{"Subject", "a"}, {"StartIndex", 1}, none, "StartIndex: is of no use for Start=new"},
        {{"Subject", "a"},
         {"Start", "time"},
         {"StartTime", "noon"},
         "StartTime: must be a time of UTC"},
        {{"Subject", "a"},
         {"Start", "time"},
         {"StartTime", "2026-01-31T12:00:00."},
         "StartTime: must be a time of UTC"},
        {{"Subject", "a"}, {"KeyFile", "/dev/null"}, none, "CertificateFile: is missing"},
        {{"Subject", "a"}, {"CaFile", "/nowhere"}, none, "CaFile: could not read /nowhere"},
        {{"Subject", "a"}, {"Servers", "tls://a,tls://b"}, none, "ServerName: is required for TLS"},
        {{"Subject", "a"}, {"CloseTimeout", 0}, none, "CloseTimeout: must be 0.001 to 86400"},
        {{"Subject", "a"}, {"Subjects", "b"}, none, "Subjects: is not known"},
    };
    for (const auto& [one, two, three, error] : rows) {
        Channel channel("nats");
        EXPECT_EQ(channel.init({one, two, three}), 0) << error;
        EXPECT_EQ(channel.error().find(unexpected + "Option " + error), 0) << channel.error();
    }
    Channel channel("nats");
    ASSERT_EQ(
        channel.init({{"Servers", shared->server->url}, {"Subject", "nobody"}, {"Durable", "d"}}),
        1);
    EXPECT_EQ(channel.open(), 0);
    EXPECT_EQ(channel.error(),
              unexpected + "No stream has the subject nobody: give the option Stream");
}

// --- A cluster ---

TEST(NatsClusterTest, LeadersAndReadersAreKilledAndNothingIsMissing)
{
    const std::string place = folder / "cluster";
    const std::string script = SCRIPTS "/cluster ";
    std::string servers = run(script + "start " + place);
    servers.pop_back();
    // Ends it also if this process is killed.
    FILE* const guard = popen(("cat; " + script + "stop " + place).c_str(), "w");

    constexpr int packets = 2000;
    constexpr int size = 512; // 4 KiB
    const std::string log = folder / "read";
    int go[2];
    ASSERT_EQ(pipe(go), 0);
    const auto read = [&] {
        std::ofstream output(log, std::ios::app | std::ios::binary);
        Channel channel("nats");
        channel.start({{"Servers", servers},
                       {"Subject", "cluster.data"},
                       {"Stream", "CLUSTER"},
                       {"Replicas", 3},
                       {"Durable", "reader"},
                       {"Stamps", 1},
                       {"ConnectTimeout", 30}},
                      60);
        for (Got got; !testing::Test::HasFailure() && got.last < packets * size - 1;) {
            got = readOne(channel);
            output.write(reinterpret_cast<const char*>(&got), sizeof got).flush();
        }
        EXPECT_EQ(channel.property<std::uint64_t>("LostCounts", "uint64"), 0);
        EXPECT_EQ(channel.close(), 1);
        EXPECT_EQ(channel.error(coderChannelGetLastAsyncError), "|");
        _exit(testing::Test::HasFailure() ? 1 : 0);
    };
    const auto countRead = [&] {
        std::error_code missing;
        const auto bytes = std::filesystem::file_size(log, missing);
        return missing ? 0 : bytes / sizeof(Got);
    };
    Process first(read);
    Process second([&] { // before this process has threads
        char byte = 0;
        if (::read(go[0], &byte, 1) == 1) {
            read();
        }
    });

    const Raw raw(servers);
    const auto leader = [&] {
        std::string name;
        jsStreamInfo* info = nullptr;
        if (js_GetStreamInfo(&info, raw.context, "CLUSTER", nullptr, nullptr) == NATS_OK &&
            info->Cluster->Leader != nullptr) {
            name = info->Cluster->Leader;
        }
        jsStreamInfo_Destroy(info);
        return name;
    };
    Channel writer("nats", infinity, 10 * size);
    writer.start({{"Servers", servers},
                  {"Mode", "write"},
                  {"Subject", "cluster.data"},
                  {"Stream", "CLUSTER"},
                  {"Replicas", 3},
                  {"Window", 100},
                  {"CloseTimeout", 60}},
                 60);
    std::string killed;
    for (int packet = 0; packet < packets; ++packet) {
        if (packet == 500 || packet == 1300) {
            Channel::waitUntil([&] { return countRead() > 0 && !(killed = leader()).empty(); });
            run(script + "kill " + place + " " + killed.substr(1));
        } else if (packet == 650 || packet == 1450) {
            run(script + "restart " + place + " " + killed.substr(1));
        } else if (packet == 1000) {
            Channel::waitUntil([&] { return countRead() > 600; });
            first.end(SIGKILL);
            ASSERT_EQ(::write(go[1], "", 1), 1);
        }
        ASSERT_EQ(writer.write(range(packet * size, (packet + 1) * size)), size) << writer.error();
    }
    EXPECT_EQ(writer.close(), 1) << writer.error();
    EXPECT_EQ(writer.error(coderChannelGetLastAsyncError), "|");

    const auto end = Clock::now() + std::chrono::seconds(60);
    int status = 0;
    while (waitpid(second.id, &status, WNOHANG) == 0) {
        ASSERT_LT(Clock::now(), end) << countRead();
        std::this_thread::sleep_for(std::chrono::milliseconds(10));
    }
    second.id = 0;
    EXPECT_EQ(status, 0);
    std::ifstream input(log, std::ios::binary);
    std::uint64_t next = 0; // that nobody has read yet
    std::uint64_t last = 0; // that was read by the same reader
    std::uint64_t repeats = 0;
    int readers = 0;
    for (Got got; input.read(reinterpret_cast<char*>(&got), sizeof got); last = got.index) {
        ASSERT_EQ(double(got.index), got.first);
        readers += readers == 0 || got.index <= last ? 1 : 0;
        if (got.index < next) {
            EXPECT_EQ(readers, 2);
            repeats += got.counts;
        } else {
            ASSERT_EQ(got.index, next);
            next += got.counts;
        }
    }
    EXPECT_EQ(next, std::uint64_t(packets) * size);
    EXPECT_LE(readers, 2);
    RecordProperty("CountsReadAgain", std::to_string(repeats));
    pclose(guard);
}
