// What is lost where, how it is told, and how what is left is numbered and dated.

#include "Handed.hpp"

#include <cctype>
#include <sstream>

using namespace handed;

namespace
{

const DeviceInfo onlyInput{StreamInfo{}, std::nullopt};

/// "I:C" for each buffer: the index of its first count and the number of its counts, which must say the same.
std::string indicesOf(const std::vector<Buffer>& buffers)
{
    std::string text;
    for (const Buffer& buffer : buffers) {
        EXPECT_EQ(buffer.index, buffer.data.at(0));
        text += std::to_string(*buffer.index) + ":" + std::to_string(buffer.data.size()) + " ";
    }
    return text;
}

std::string timesOf(const std::vector<Buffer>& buffers)
{
    std::string text;
    for (const Buffer& buffer : buffers) {
        text += std::to_string(buffer.time.value()) + " ";
    }
    return text;
}

/// Refuses packets that begin with 50.
struct Refusing : Identity {
    void convertInput(Packet& packet) override
    {
        if (*dataOf(*packet.fields).data == 50) {
            packet.counts = 1000; // which makes no difference
            throw std::runtime_error("refused");
        }
    }
};

/// Does a script: pN pushes N counts, lN says that N were lost before the next packet, tN tells a loss of N,
/// i0 ends the input, kN lists N counts, rN reads N counts, f0 flushes, eN says that there were N errors so far.
/// Returns what was read, and then what is left.
class Script
{
public:
    explicit Script(Rig& theRig) : rig(theRig) {}

    std::string run(const std::string& script)
    {
        std::istringstream words(script);
        std::vector<Buffer> all;
        const auto read = [&](std::uint64_t count) {
            try {
                for (Buffer& buffer : rig.read(count)) {
                    all.push_back(std::move(buffer));
                }
            } catch (const brenixcore::CouldNotConvertInputData&) { // of the packet with 50
            }
        };
        char what = 0;
        for (std::uint64_t count = 0; words >> what >> count;) {
            if (what == 'r') {
                read(count);
            } else if (what == 'k') {
                std::uint64_t total = 0;
                std::vector<unsigned long> counts;
                rig.input->peekCounts(count, total, counts);
                EXPECT_EQ(total, count);
            } else if (what == 'f') {
                rig.input->flush();
            } else if (what == 'e') {
                EXPECT_EQ(learn().size(), count);
            } else {
                rig.device->perform([&](DeviceStreams& streams) { bring(streams, what, count); });
            }
        }
        rig.channel.close();
        while (rig.available() > 0) {
            read(rig.available());
        }
        return indicesOf(all);
    }

    /// All errors so far.
    const std::vector<std::string>& learn()
    {
        for (std::string& error : rig.log.takeErrors()) {
            errors.push_back(std::move(error));
        }
        return errors;
    }

private:
    void bring(DeviceStreams& streams, char what, std::uint64_t count)
    {
        if (what == 'p') {
            Packet packet;
            packet.lost = std::exchange(lost, 0);
            next += packet.lost;
            EXPECT_TRUE(streams.push(std::move(number(packet, next, count))));
            next += count;
        } else if (what == 'l') {
            lost = count;
        } else if (what == 't') {
            streams.tellLost(count, "it was told");
            next += count;
        } else {
            streams.endInput();
        }
    }

    Rig& rig;
    std::uint64_t next = 0, lost = 0;
    std::vector<std::string> errors;
};

} // namespace

TEST(LossTest, EachPolicyKeepsWhatItSaysAndTellsEachGapOnce)
{
    const std::string full = "the input stream was full";
    const std::string device = "the device lost them";
    const struct {
        const char* overflow;
        std::uint64_t limit;
        const char* script;
        const char* left;
        std::vector<std::pair<Counts, std::string>> gaps; ///< counts and sum, and reason
    } rows[] = {
        {"dropNewest", 7, "p3 p3 p5 e0 r3 e0 p3 e1", "0:3 3:3 11:3 ", {{{5, 5}, full}}},
        {"dropNewest", 7, "p3 p5 p5 r3 p2", "0:3 13:2 ", {{{10, 10}, full}}}, // one gap
        {"dropNewest", 7, "p5 p3 r5 p1 p7", "0:5 8:1 ", {{{3, 3}, full}, {{7, 10}, full}}},
        {"dropNewest", 7, "p9", "0:7 ", {{{2, 2}, full}}}, // beyond the limit
        {"dropNewest", 7, "t2 p9", "2:7 ", {{{2, 2}, "it was told"}, {{2, 4}, full}}},
        {"dropNewest", 0, "p9 p1", "", {{{10, 10}, full}}},
        {"dropOldest", 7, "p3 p3 p5 e0 r3 e0 p3 e1", "4:2 6:1 7:4 11:3 ", {{{4, 4}, full}}},
        {"dropOldest", 7, "p3 p3 p3 p3 p3", "8:1 9:3 12:3 ", {{{8, 8}, full}}}, // one gap
        {"dropOldest", 7, "p7 p1 r2 p4", "1:2 5:2 7:1 8:4 ", {{{1, 1}, full}, {{2, 3}, full}}},
        {"dropOldest", 7, "p7 p1 f0 p8", "9:7 ", {{{1, 1}, full}, {{1, 2}, full}}},
        {"dropOldest", 7, "p3 p20", "16:7 ", {{{16, 16}, full}}},
        {"dropOldest", 0, "p9 p1", "", {{{10, 10}, full}}},
        {"dropOldest", 7, "p3 p3 k3 p5 r3", "0:3 7:4 ", {{{4, 4}, full}}}, // listed is kept
        {"dropOldest", 7, "p3 p3 k4 p5", "0:3 3:3 10:1 ", {{{4, 4}, full}}},
        {"dropOldest", 7, "p7 k7 p3 r7 p7 p1", "0:7 11:6 17:1 ", {{{4, 4}, full}}}, // one gap
        {"dropOldest", 7, "p3 p3 k3 p5 k4 p2", "0:3 7:4 ", {{{4, 4}, full}, {{2, 6}, full}}},
        {"dropOldest",
         7,
         "p3 t47 p3 k6 r6 p3 p3", // 50 is refused: what is put back is kept, too
         "0:3 55:1 56:3 ",
         {{{47, 47}, "it was told"}, {{2, 52}, full}}},
        {"dropOldest",
         7,
         "p1 p1 p1 p1 p1 p1 p1 k3 p1 p1 p1 p1 p1 p1 p1 p1 p1 p1 p1 p1 p1 r1 k3 p1 p1",
         "0:1 1:1 2:1 16:1 18:1 19:1 20:1 21:1 ",
         {{{13, 13}, full}, {{1, 14}, full}}},
        {"wait", 7, "l2 p3 p1", "2:3 5:1 ", {{{2, 2}, device}}},
        {"wait", 7, "p3 t4 t1 l2 p1", "0:3 10:1 ", {{{7, 7}, "it was told"}}}, // one gap
        {"wait", 7, "p3 t4 p1 l2", "0:3 7:1 ", {{{4, 4}, "it was told"}}},
        {"wait", 7, "p3 t4 e0 i0 e1", "0:3 ", {{{4, 4}, "it was told"}}},
        {"wait", 7, "p5 l3 p5 r5 p1", "0:5 8:5 13:1 ", {{{3, 3}, device}}}, // one waits beside
        {"wait", UINT64_MAX, "p5 f0 p5", "5:5 ", {}},
        {"", 4, "p3 p9 r4 r4", "0:3 3:1 4:4 8:4 ", {}},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(std::string(row.overflow) + ": " + row.script);
        Rig rig(onlyInput, row.limit, new Refusing);
        rig.init(Rig::options("", true));
        rig.open(row.overflow);
        Script script(rig);
        EXPECT_EQ(script.run(row.script), row.left);
        std::vector<std::string> errors;
        std::uint64_t sum = 0;
        for (const auto& [counts, reason] : row.gaps) {
            sum = counts[1];
            errors.push_back("brenix:Stream:dataLost|" + std::to_string(counts[0]) +
                             " counts were lost: " + reason + "; " + std::to_string(sum) +
                             " since open.");
        }
        EXPECT_EQ(script.learn(), errors);
        EXPECT_EQ(rig.log.getLostCounts(), sum);
    }
}

TEST(LossTest, TheFailureThatEndsADeviceIsToldAfterWhatWasLost)
{
    Rig rig(onlyInput, 4);
    rig.init(Rig::options("dropNewest"));
    rig.open();
    rig.device->start([](DeviceStreams& streams) {
        Packet packet;
        streams.push(std::move(number(packet, 0, 9)));
        throw std::runtime_error("it broke");
    });
    for (int i = 0; i < 5000 && !rig.input->isDeviceDone(); ++i) {
        std::this_thread::sleep_for(std::chrono::milliseconds(1));
    }
    EXPECT_EQ(rig.log.takeErrors(),
              (std::vector<std::string>{"brenix:Stream:dataLost|5 counts were lost: the input "
                                        "stream was full; 5 since open.",
                                        "brenix:Device:failed|it broke"}));
}

TEST(LossTest, PartsOfPacketsHaveTheirOwnTimes)
{
    struct Halving : Filter {
        void tune(Options& /*options*/) override {}
        void apply(Packet& packet) override { number(packet, 0, packet.counts / 2); }
    };
    const struct {
        double rate;
        std::int64_t time; ///< of a packet of 8
        bool isHalved;
        const char* overflow;
        Counts reads;
        const char* times;
    } rows[] = {{4, 1000, false, "wait", {1, 3, 4}, "1000 250001000 1000001000 "},
                {3, 1000, false, "wait", {1, 1, 6}, "1000 333334333 666667667 "}, // rounded
                {0, 1000, false, "wait", {1, 7}, "1000 1000 "},
                {4, 0, false, "wait", {1, 7}, "0 0 "},
                {4, -7, false, "wait", {2, 6}, "-7 499999993 "},
                {4, 1000, true, "wait", {1, 3}, "1000 500001000 "},
                {4, 1000, false, "dropOldest", {1, 4}, "750001000 1000001000 "}};
    for (const auto& row : rows) {
        SCOPED_TRACE(row.times);
        Rig rig({StreamInfo{1, row.rate}, std::nullopt}, row.overflow[0] == 'd' ? 5 : 8);
        rig.init(Rig::options(row.overflow, true));
        if (row.isHalved) {
            rig.addFilter(new Halving);
        }
        rig.open();
        rig.push(0, 8, row.time);
        std::string times;
        for (const std::uint64_t count : row.reads) {
            times += timesOf(rig.read(count));
        }
        EXPECT_EQ(times, row.times);
        rig.channel.close();
    }

    // Of 0 to 7 and 8 to 15 the counts 0, 3, 6 and 9, 12, 15 are left.
    Rig rig({StreamInfo{1, 4}, std::nullopt}, 8);
    rig.init(Rig::options("", true));
    rig.input->addFilter(PLUGINS "/decimate.so", {{"Factor", makeScalar("Factor", 3.0).release()}});
    rig.open();
    rig.push(0, 8, 1000);
    rig.push(8, 8, 2'000'001'000);
    EXPECT_EQ(timesOf(rig.read(1)), "1000 ");
    EXPECT_EQ(timesOf(rig.read(5)), "750001000 2250001000 ");
    rig.channel.close();
}

/// The core's own numbers go on beside those of the source: 4 counts, 1 lost, 4 counts.
TEST(LossTest, ASourceMayNumberItsCounts)
{
    struct Same : Filter {
        void tune(Options& /*options*/) override {}
        void apply(Packet& /*packet*/) override {}
    };
    for (const bool isFiltered : {false, true}) {
        Rig rig({StreamInfo{}, std::nullopt}, 100);
        rig.init(Rig::options("", true));
        if (isFiltered) {
            rig.addFilter(new Same);
        }
        rig.open();
        rig.device->perform([](DeviceStreams& streams) {
            for (const std::uint64_t lost : {0U, 1U}) {
                Packet packet;
                packet.index = 900 + lost;
                packet.lost = lost;
                EXPECT_TRUE(streams.push(std::move(number(packet, 0, 4))));
            }
        });
        std::string indices;
        for (const std::uint64_t count : {1U, 3U, 2U, 2U}) {
            indices += std::to_string(rig.read(count).at(0).index.value()) + " ";
        }
        EXPECT_EQ(indices, isFiltered ? "0 1 5 7 " : "900 901 901 903 ");
        EXPECT_EQ(rig.log.getLostCounts(), 1U);
        rig.channel.close();
    }
}

TEST(LossTest, WithoutMemoryNothingIsLostUncounted)
{
    for (const char* const overflow : {"wait", "dropOldest", "dropNewest"}) {
        SCOPED_TRACE(overflow);
        allocations::sweep([&](long which, bool lasts) {
            Rig rig(onlyInput, 4);
            rig.init(Rig::options(overflow, true));
            rig.open("", 0);
            std::uint64_t counted = 0;
            std::uint64_t numbered = 0;
            bool failed = false;
            rig.device->perform([&](DeviceStreams& streams) {
                std::vector<Packet> packets(4);
                for (Packet& packet : packets) {
                    packet.lost = 2;
                    number(packet, 0, 3);
                }
                packets[3].lost = 0;
                allocations::Failing failing(which, lasts);
                for (Packet& packet : packets) {
                    try {
                        streams.tryPush(packet);
                    } catch (const std::bad_alloc&) {
                    }
                }
                failed = allocations::Failing::end();
                streams.tellLost(1, "the last");
            });
            while (rig.available() > 0) {
                for (const Buffer& buffer : rig.read(rig.available())) {
                    counted += buffer.data.size();
                }
            }
            rig.device->perform([&](DeviceStreams& streams) { numbered = streams.takenCounts(); });
            EXPECT_EQ(counted + rig.log.getLostCounts(), numbered);
            rig.channel.close();
            std::uint64_t told = 0;
            for (const std::string& error : rig.log.takeErrors()) {
                told += lossOf(error).counts;
            }
            EXPECT_EQ(told, rig.log.getLostCounts());
            return failed;
        });
    }
}
