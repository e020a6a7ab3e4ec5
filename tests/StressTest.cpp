// Threads of a device against the owner's, and many channels, and many lives of one.

#include "Allocations.hpp"
#include "Driver.hpp"

#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <memory>
#include <set>

using namespace driver;
using Clock = std::chrono::steady_clock;

namespace
{

long entries(const char* folder)
{
    const std::filesystem::directory_iterator all(folder);
    return std::distance(begin(all), end(all));
}

/// The memory of the process that is there, in KiB.
long resident()
{
    long pages = 0;
    std::ifstream("/proc/self/statm") >> pages >> pages;
    return pages * sysconf(_SC_PAGESIZE) / 1024;
}

} // namespace

TEST(StressTest, FourThreadsReportWhileTheOwnerWorks)
{
    const auto end = Clock::now() + std::chrono::seconds(STRESS_SECONDS);
    long lives = 0;
    long errors = 0;
    std::set<double> levels; // values of the property
    for (; Clock::now() < end; ++lives) {
        Channel channel(TEST_PLUGINS "/probe.so", 20);
        for (int round = 0; round < 2; ++round) { // the second init ends and starts the threads
            ASSERT_EQ(channel.init({{"Threads", 4}, {"Streams", "io"}, {"Packets", "30 30"}}), 1);
            ASSERT_EQ(channel.open(), 1);
            for (double next = 0; next < 60; next += 10) {
                channel.peek();
                ASSERT_EQ(coderInputStreamReadBuffers(channel.input, 10, 1), 1) << channel.error();
                EXPECT_EQ(coderInputStreamReadBufferData(channel.input, 1, 0, "data", "double", 10,
                                                         Numbers(10).data()),
                          1);
                EXPECT_EQ(channel.write({1, 2}), 2);
                levels.insert(channel.property<double>("Level", "double"));
                uint8_t has = 0;
                EXPECT_EQ(coderChannelHasAsyncError(channel.handle, &has), 1);
                const std::string error = channel.error(coderChannelGetLastAsyncError);
                const std::size_t middle = error.find('|');
                EXPECT_EQ(error.substr(0, middle), error.substr(middle + 1)); // of one event
                EXPECT_TRUE(has == 0 || error != "|");
                errors += has;
            }
            EXPECT_EQ(channel.close(), 1);
        }
        EXPECT_EQ(channel.term(), 1);
    }
    EXPECT_GT(errors, 0);
    EXPECT_GT(levels.size(), 1);
    std::printf("%ld channels, %ld errors, %zu property values\n", lives, errors, levels.size());
}

TEST(StressTest, ManyChannelsAtOnce)
{
    const long before = allocations::live;
    const long files = entries("/proc/self/fd");
    {
        std::vector<std::unique_ptr<Channel>> channels(1000 / STRESS_SCALE);
        for (auto& channel : channels) {
            channel = std::make_unique<Channel>("loopback");
            ASSERT_EQ(channel->init(), 1);
            ASSERT_EQ(channel->open(), 1) << channel->error();
        }
        EXPECT_GT(entries("/proc/self/task"), 1000 / STRESS_SCALE);
        double number = 0;
        for (const auto& channel : channels) {
            ASSERT_EQ(channel->write({++number}), 1) << channel->error();
        }
        number = 0;
        for (const auto& channel : channels) { // each has its own
            ASSERT_EQ(channel->read(1, 1), Numbers{++number}) << channel->error();
        }
        for (const auto& channel : channels) {
            ASSERT_EQ(channel->close(), 1);
            ASSERT_EQ(channel->term(), 1);
        }
    }
    EXPECT_EQ(allocations::live, before);
    EXPECT_EQ(entries("/proc/self/fd"), files);
}

TEST(StressTest, ManyLivesOfAChannel)
{
    Channel channel("loopback");
    const Numbers numbers = range(0, 100);
    const auto live = [&] {
        ASSERT_EQ(channel.init(), 1);
        ASSERT_EQ(channel.open(), 1);
        ASSERT_EQ(channel.write(numbers), 100) << channel.error();
        ASSERT_EQ(channel.read(100, 1), numbers) << channel.error();
        ASSERT_EQ(channel.close(), 1);
        ASSERT_EQ(channel.term(), 1);
    };
    const int cycles = 10000 / STRESS_SCALE;
    for (int i = 0; i < cycles / 10; ++i) {
        live();
    }
    const long before = allocations::live;
    const long files = entries("/proc/self/fd");
    const long memory = resident();
    for (int i = 0; i < cycles; ++i) {
        live();
        ASSERT_FALSE(HasFailure());
    }
    EXPECT_EQ(allocations::live, before + 2L * cycles); // the stream handles of each
    EXPECT_EQ(entries("/proc/self/fd"), files);
    const long growth = resident() - memory;
    if (STRESS_SCALE == 1) { // a sanitizer keeps what is freed
        EXPECT_LT(growth, 2048) << "KiB";
    }
    std::printf("%d cycles, grown by %ld KiB\n", cycles, growth);
}
