// The device nats on servers that the tests start.

#include "Driver.hpp"

#include <nats/nats.h>

#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <functional>
#include <memory>
#include <sstream>
#include <string>
#include <utility>
#include <vector>

using namespace driver;

namespace
{

using Text = std::string;

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

/// As generated programs have them.
std::string run(const std::string& command)
{
    std::string printed;
    FILE* const pipe = popen(command.c_str(), "r");
    for (int c = 0; (c = std::fgetc(pipe)) != EOF;) {
        printed += static_cast<char>(c);
    }
    const int status = pclose(pipe);
    EXPECT_EQ(status, 0) << command << '\n' << printed;
    return printed;
}

/// What a reader has got of a buffer.
struct Got {
    std::uint64_t index = 0;
    double first = 0;
    double last = 0;
    std::uint64_t counts = 0;
};

/// Reads what comes next as one buffer.
Got readOne(const Channel& channel)
{
    Channel::waitUntil([&] { return !channel.peek(1).empty(); });
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
    EXPECT_EQ(coderInputStreamReadBufferData(channel.input, 1, 0, "Index", "uint64", 1, &got.index),
              1)
        << channel.error();
    return got;
}

} // namespace

// --- A cluster ---

TEST(ClusterTest, LeadersAndReadersAreKilledAndNothingIsMissing)
{
    std::filesystem::create_directories(folder);
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
        channel.close();
        _exit(testing::Test::HasFailure() ? 1 : 0);
    };
    const auto countRead = [&] {
        std::error_code none;
        const auto bytes = std::filesystem::file_size(log, none);
        return none ? 0 : bytes / sizeof(Got);
    };
    Process first(read);
    Process second([&] { // before this process has threads
        char byte = 0;
        if (::read(go[0], &byte, 1) == 1) {
            read();
        }
    });

    natsConnection* connection = nullptr;
    jsCtx* context = nullptr;
    ASSERT_EQ(natsConnection_ConnectTo(&connection, servers.c_str()), NATS_OK);
    ASSERT_EQ(natsConnection_JetStream(&context, connection, nullptr), NATS_OK);
    const auto leader = [&] {
        std::string name;
        jsStreamInfo* info = nullptr;
        if (js_GetStreamInfo(&info, context, "CLUSTER", nullptr, nullptr) == NATS_OK &&
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
    jsCtx_Destroy(context);
    natsConnection_Destroy(connection);

    const auto end = std::chrono::steady_clock::now() + std::chrono::seconds(60);
    int status = 0;
    while (waitpid(second.id, &status, WNOHANG) == 0) {
        ASSERT_LT(std::chrono::steady_clock::now(), end) << countRead();
        std::this_thread::sleep_for(std::chrono::milliseconds(10));
    }
    second.id = 0;
    EXPECT_EQ(status, 0);
    std::ifstream input(log, std::ios::binary);
    std::uint64_t next = 0;
    std::uint64_t repeats = 0;
    int returns = 0;
    for (Got got; input.read(reinterpret_cast<char*>(&got), sizeof got);) {
        ASSERT_EQ(double(got.index), got.first);
        if (got.index < next) { // where the second one begins
            ++returns;
            repeats += next - got.index;
            next = got.index;
        }
        ASSERT_EQ(got.index, next);
        next += got.counts;
    }
    EXPECT_EQ(next, std::uint64_t(packets) * size);
    EXPECT_LE(returns, 1);
    std::printf("%llu counts were read again\n", static_cast<unsigned long long>(repeats));
    pclose(guard);
    std::filesystem::remove_all(folder);
}
