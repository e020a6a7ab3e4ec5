// The built libraries with plug-ins: what the embedded core promises, seen through the C functions.

#include "Driver.hpp"

#include <filesystem>
#include <fstream>
#include <functional>

using namespace driver;
using namespace std::string_literals;

namespace
{

const std::string plugins = TEST_PLUGINS "/";
const std::string probe = plugins + "probe.so";
const std::string noInput = "brenix:InputStream:synchronousInputNotPossible|";
const std::string noOutput = "brenix:OutputStream:synchronousOutputNotPossible|";

int initProbe(Channel& channel, const std::string& streams, const std::vector<int>& packets = {},
              const std::string& failIn = "", const std::string& raiseIn = "",
              const std::string& failAs = "")
{
    return channel.init(packets.empty() ? 4 : 5,
                        CODER_OPTION("Streams", "char", 9, streams.c_str()),
                        CODER_OPTION("FailIn", "char", 9, failIn.c_str()),
                        CODER_OPTION("RaiseIn", "char", 9, raiseIn.c_str()),
                        CODER_OPTION("FailAs", "char", 9, failAs.c_str()),
                        CODER_OPTION("Packets", "int32", packets.size(), packets.data()));
}

} // namespace

TEST(LoadTest, FailuresHaveTheirIdentifiers)
{
    const std::filesystem::path folder = testing::TempDir();
    std::ofstream(folder / "text.so") << "not a library";
    std::ofstream(folder / "empty.so") << "";
    const std::string load = "brenix:Channel:couldNotLoadDevice|";
    const std::string make = "brenix:Channel:couldNotCreateDevice|";
    const std::pair<std::string, std::string> devices[] = {
        {"no such device", load},
        {"./no-such-device.so", load},
        {folder, load},
        {folder / "text.so", load},
        {folder / "empty.so", load},
        {"", load},
        {plugins + "throwsWhileLoading.so", load},
        {plugins + "otherAbiVersion.so", load},
        {plugins + "throwingStatic.so", load},
        {plugins + "throwingStatic.so", load}, // half loaded is not loaded
        {plugins + "noFactory.so", make},
        {plugins + "throwingFactory.so", make},
        {plugins + "throwingInt.so", make},
        {plugins + "nullFactory.so", make},
        {"identity", make}, // a converter is no device
    };
    for (const auto& [device, error] : devices) {
        SCOPED_TRACE(device);
        void* channel = nullptr;
        EXPECT_EQ(create(channel, device, "identity"), error);
        EXPECT_EQ(channel, nullptr);
    }
    void* channel = nullptr;
    EXPECT_EQ(create(channel, "no such device", "no such converter"),
              "brenix:Channel:couldNotLoadConverter|");
    EXPECT_EQ(create(channel, "no such device", "loopback"),
              "brenix:Channel:couldNotCreateConverter|");
    Channel works(probe); // after all that
}

TEST(StateTest, OperationsOutOfOrderNameOperationAndState)
{
    const auto run = [](void* channel, char operation) {
        switch (operation) {
        case 'i':
            return coderChannelInit(channel, 0);
        case 'o':
            return coderChannelOpen(channel, 0);
        case 'c':
            return coderChannelClose(channel);
        case 't':
            return coderChannelTerm(channel);
        default:
            return coderChannelExecute(channel, "updateFromThread", 0);
        }
    };
    const std::pair<std::string, const char*> names[] = {
        {"i", "init"}, {"o", "open"}, {"x", "execute"}, {"c", "close"}, {"t", "term"}};
    const struct {
        std::string way, state, allowed;
    } rows[] = {{"", "created", "i"},
                {"i", "initialised", "ioxt"},
                {"io", "open", "xc"},
                {"ioc", "closed", "ioxt"},
                {"iocoi", "open", "xc"},
                {"it", "terminated", "i"},
                {"ioctii", "initialised", "ioxt"}};
    for (const auto& row : rows) {
        for (const auto& [operation, name] : names) {
            SCOPED_TRACE(row.way + " " + name);
            Channel channel(probe);
            for (const char step : row.way) {
                run(channel.handle, step);
            }
            const bool allowed = row.allowed.find(operation) != std::string::npos;
            EXPECT_EQ(run(channel.handle, operation[0]), allowed);
            EXPECT_EQ(channel.error(), allowed ? "|"
                                               : unexpected + "Operation " + name +
                                                     " is not possible: the channel is " +
                                                     row.state + ".");
        }
    }
    Channel channel(probe);
    initProbe(channel, "i");
    EXPECT_EQ(coderChannelExecute(channel.handle, nullptr, 0), 0);
    EXPECT_EQ(channel.error(), unexpected + "The command to execute must not be null.");
    EXPECT_EQ(coderChannelExecute(channel.handle, "dance", 0), 0);
    EXPECT_EQ(channel.error(), unexpected + "Unknown command: dance");
}

TEST(StateTest, FailuresAndErrorsOfEachOperationReachTheCaller)
{
    const std::string unrecognized = unexpected + "Unrecognized error.";
    for (const std::string last : {"init", "open", "execute", "close", "term"}) {
        const std::string failed = unexpected + "failed in " + last;
        const std::pair<std::string, std::string> rows[] = {
            {"", failed},
            {"int", unrecognized},
            {"own", unrecognized},
            {"silent", unexpected},
            {"long", (failed + std::string(5000, '!')).substr(0, unexpected.size() + 1023)},
            {"raised", "|"}};
        for (const auto& row : rows) {
            const auto& [as, error] = row;
            SCOPED_TRACE(last + " " + as);
            const bool raises = as == "raised";
            Channel channel(probe);
            const std::function<int()> steps[] = {
                [&] {
                    return initProbe(channel, "i", {}, raises ? "" : last, raises ? last : "",
                                     row.first);
                },
                [&] { return channel.open(); },
                [&] { return coderChannelExecute(channel.handle, "updateFromThread", 0); },
                [&] { return coderChannelClose(channel.handle); },
                [&] { return coderChannelTerm(channel.handle); },
            };
            const auto* step = std::begin(steps);
            while (step != std::end(steps) && (*step)() == 1) {
                ++step;
            }
            EXPECT_EQ(channel.error(), error);
            EXPECT_EQ(channel.error(coderChannelGetLastSyncError),
                      raises ? "probe:raised|" + last : "|");
            coderChannelClose(channel.handle);     // if it is open
            EXPECT_EQ(initProbe(channel, "i"), 1); // and all is well again
        }
    }
}

TEST(StreamTest, PeekListsWhatReadDelivers)
{
    Channel channel(probe);
    ASSERT_EQ(initProbe(channel, "i", {10, 10, 10, 5}), 1);
    EXPECT_EQ(channel.ask(coderStreamGetSpaceAvailable, channel.input), infinity);
    ASSERT_EQ(channel.open(), 1);
    channel.waitForEnd();
    EXPECT_EQ(channel.ask(coderStreamGetDataAvailable, channel.input), 35);
    EXPECT_EQ(channel.peek(25), (Numbers{10, 10, 5}));
    EXPECT_EQ(channel.read(25, 3), range(0, 25));
    EXPECT_EQ(channel.peek(), (Numbers{5, 5}));
    EXPECT_EQ(channel.read(2, 1), range(25, 27));
    EXPECT_EQ(channel.read(1, 1, "Stamp"), Numbers{30}); // repeated in each part
    EXPECT_EQ(channel.read(1, 1, "Odd").size(), 7);      // does not divide either
    EXPECT_EQ(channel.read(8, 2), Numbers{});            // 6 are left
    EXPECT_EQ(channel.error(), noInput);
    EXPECT_EQ(coderChannelClose(channel.handle), 1);
    EXPECT_EQ(channel.read(6, 2), range(29, 35)); // also after close
    EXPECT_EQ(channel.peek(), Numbers{});
    EXPECT_EQ(coderInputStreamReadBuffers(channel.input, 0, 0), 1);
}

TEST(StreamTest, AnInputLimitNeitherLosesNorBlocks)
{
    Channel channel(probe, 4);
    ASSERT_EQ(initProbe(channel, "i", {3, 3, 10}), 1);
    ASSERT_EQ(channel.open(), 1);
    EXPECT_EQ(channel.read(5, 1), Numbers{});
    EXPECT_EQ(channel.error(), noInput); // beyond the limit: at once
    EXPECT_EQ(channel.read(4, 2), range(0, 4));
    for (double next = 4; next < 16; next += 2) {
        Channel::waitUntil([&] {
            const Numbers waiting = channel.peek(2);
            return std::accumulate(waiting.begin(), waiting.end(), 0.0) == 2;
        });
        EXPECT_LE(channel.ask(coderStreamGetDataAvailable, channel.input), 4);
        EXPECT_EQ(channel.read(2, static_cast<double>(channel.peek(2).size())),
                  range(next, next + 2));
    }
}

TEST(StreamTest, EveryWaitEnds)
{
    Channel slow(probe);
    ASSERT_EQ(initProbe(slow, "io", {1, 1}), 1);
    ASSERT_EQ(slow.open(0.05), 1);
    EXPECT_EQ(slow.read(3, 1), Numbers{});
    EXPECT_EQ(slow.error(), noInput);
    EXPECT_EQ(slow.read(2, 2), range(0, 2));

    Channel full(probe, 1); // the device waits for room, and close ends it
    ASSERT_EQ(initProbe(full, "i", {1, 1, 1}), 1);
    ASSERT_EQ(full.open(), 1);
    Channel::waitUntil([&] { return full.peek().size() == 1; });
    EXPECT_EQ(coderChannelClose(full.handle), 1);
    EXPECT_EQ(full.asyncError(), "probe:push|refused");
    EXPECT_EQ(full.read(1, 1), Numbers{0});

    Channel destroyed(probe, 1); // or the end of the channel does
    ASSERT_EQ(initProbe(destroyed, "io", {1, 1, 1}), 1);
    ASSERT_EQ(destroyed.open(infinity), 1);
}

TEST(StreamTest, WritesAreTakenWholeOrNotAtAll)
{
    Channel channel("loopback", infinity, 5);
    ASSERT_EQ(channel.init(0), 1);
    EXPECT_EQ(channel.write(range(0, 6)), 0);
    EXPECT_EQ(channel.error(), noOutput);
    EXPECT_EQ(channel.write(range(0, 3)), 3); // before open, up to the limit
    EXPECT_EQ(channel.write(range(3, 6)), 0);
    EXPECT_EQ(channel.error(), noOutput);
    EXPECT_EQ(channel.ask(coderStreamGetDataAvailable, channel.output), 3);
    EXPECT_EQ(channel.ask(coderStreamGetSpaceAvailable, channel.output), 2);
    EXPECT_EQ(coderStreamFlush(channel.output), 1);
    EXPECT_EQ(channel.write(range(0, 5)), 5);
    ASSERT_EQ(channel.open(), 1);
    EXPECT_EQ(channel.write(range(5, 10)), 5); // waits for room
    EXPECT_EQ(coderChannelClose(channel.handle), 1);
    EXPECT_EQ(channel.read(10, 2), range(0, 10)); // close let the device take all of it
    EXPECT_EQ(channel.write({10}), 1);            // for the next time
    ASSERT_EQ(channel.open(), 1);
    EXPECT_EQ(channel.read(1, 1), Numbers{10});
}

TEST(StreamTest, DevicesMayLackStreams)
{
    Channel channel(probe);
    ASSERT_EQ(initProbe(channel, "o"), 1);
    EXPECT_EQ(channel.read(1, 1), Numbers{});
    EXPECT_EQ(channel.error(), "brenix:InputStream:notSupported|");
    EXPECT_EQ(channel.ask(coderStreamGetCountDimension, channel.output), 2);
    ASSERT_EQ(initProbe(channel, "i"), 1);
    EXPECT_EQ(channel.write({1}), 0);
    EXPECT_EQ(channel.error(), "brenix:OutputStream:notSupported|");
}

TEST(EventTest, AFailureOfTheDevicesThreadIsAnError)
{
    const struct {
        std::string failAs; // or else:
        int mistake;
        std::string message;
    } rows[] = {{"", 0, "failed in run"},
                {"int", 0, "Unrecognized error."},
                {"own", 0, "Unrecognized error."},
                {"silent", 0, ""},
                {"long", 0, ("failed in run" + std::string(5000, '!')).substr(0, 1023)},
                {"", -1, "The device pushed a packet without counts."},
                {"", -2, "A packet has no fields."},
                {"", -3, "Field unknown is of a class that cannot be copied."},
                {"", -4, "Field none has no elements."},
                {"", -5, "Field null is of a class that cannot be copied."}};
    Channel channel(probe);
    for (const auto& [failAs, mistake, message] : rows) {
        SCOPED_TRACE(message);
        const bool pushes = mistake < 0;
        ASSERT_EQ(
            initProbe(channel, "i", {pushes ? 4 : 1, mistake, 1}, pushes ? "" : "run", "", failAs),
            1);
        ASSERT_EQ(channel.open(infinity), 1);
        EXPECT_EQ(channel.read(5, 2), Numbers{}); // the device's end ends the wait
        EXPECT_EQ(channel.error(), noInput);
        EXPECT_EQ(channel.asyncError(), "brenix:Device:failed|" + message);
        EXPECT_EQ(coderChannelClose(channel.handle), 1);
        EXPECT_EQ(channel.read(4, 1), pushes ? range(0, 4) : Numbers{}); // what came before
    }
}

TEST(EventTest, SlowAndEarlyEnds)
{
    Channel channel(probe);
    for (const std::string failAs : {"slow", "early"}) {
        SCOPED_TRACE(failAs);
        const bool slow = failAs == "slow";
        ASSERT_EQ(initProbe(channel, "i", {}, slow ? "run" : "", "", failAs), 1);
        const auto begin = std::chrono::steady_clock::now();
        ASSERT_EQ(channel.open(), 1);
        if (!slow) {
            channel.waitForEnd();
            EXPECT_EQ(channel.read(1, 1), Numbers{});
            EXPECT_EQ(channel.error(), noInput);
        }
        EXPECT_EQ(coderChannelClose(channel.handle), 1) << channel.error();
        const auto time = std::chrono::steady_clock::now() - begin;
        EXPECT_GE(time, std::chrono::milliseconds(slow ? 290 : 0)); // close waits for the device
        uint8_t failed = 1;
        EXPECT_EQ(coderChannelHasAsyncError(channel.handle, &failed), 1);
        EXPECT_EQ(failed, 0);
    }
}

TEST(EventTest, StormsAndStreamsAfterTheEnd)
{
    Channel channel(probe, 4);
    ASSERT_EQ(initProbe(channel, "io", {1}), 1);
    ASSERT_EQ(channel.open(), 1);
    EXPECT_EQ(coderChannelExecute(channel.handle, "storm", 0), 1);
    EXPECT_EQ(channel.asyncError(), "brenix:Device:failed|" + std::string(1023, 'x'));
    double level = 0;
    EXPECT_EQ(coderChannelGetPropertyValue(channel.handle, "Level", "double", 1, &level), 1);
    EXPECT_EQ(level, 3);
    EXPECT_EQ(channel.read(1, 1), Numbers{0});
    EXPECT_EQ(coderChannelClose(channel.handle), 1);
    EXPECT_EQ(channel.write({1, 2}), 2); // for the next time
    EXPECT_EQ(coderChannelExecute(channel.handle, "streamAfterClose", 0), 1) << channel.error();
    EXPECT_EQ(channel.peek(), Numbers{});
    EXPECT_EQ(channel.ask(coderStreamGetDataAvailable, channel.output), 2);
}

TEST(EventTest, PropertiesFollowTheDevice)
{
    Channel channel(probe);
    for (int round = 0; round < 2; ++round) { // the second init replaces the property
        double level = 0;
        ASSERT_EQ(initProbe(channel, "i"), 1);
        EXPECT_EQ(coderChannelGetPropertyValue(channel.handle, "Level", "double", 1, &level), 1);
        EXPECT_EQ(level, 1);
        EXPECT_EQ(coderChannelExecute(channel.handle, "updateFromThread", 0), 1);
        EXPECT_EQ(coderChannelGetPropertyValue(channel.handle, "Level", "double", 1, &level), 1);
        EXPECT_EQ(level, 2);
        EXPECT_EQ(coderChannelGetPropertyValue(channel.handle, "Other", "int32", 1, &level), 0);
        EXPECT_EQ(channel.asyncError(), "probe:thread|from a thread");
    }
}

TEST(ConversionTest, AFailureLosesOnePacketAtMost)
{
    Channel channel(probe, infinity, infinity, plugins + "pickyConverter.so");
    ASSERT_EQ(initProbe(channel, "io", {10, 10, 10}), 1);
    EXPECT_EQ(channel.write({1, 13}), 0);
    EXPECT_EQ(channel.error(), "brenix:OutputStream:couldNotConvertOutputData|");
    ASSERT_EQ(channel.open(), 1);
    EXPECT_EQ(channel.read(30, 3), Numbers{});
    EXPECT_EQ(channel.error(), "brenix:InputStream:couldNotConvertInputData|");
    EXPECT_EQ(channel.peek(), (Numbers{10, 10}));
    Numbers rest = range(0, 10);
    const Numbers third = range(20, 30);
    rest.insert(rest.end(), third.begin(), third.end());
    EXPECT_EQ(channel.read(20, 2), rest);
}

TEST(ConversionTest, SpoiltPacketsGoNoFurther)
{
    const std::string noConversion = "brenix:InputStream:couldNotConvertInputData|";
    const std::string noOutputConversion = "brenix:OutputStream:couldNotConvertOutputData|";
    Channel channel(probe, infinity, infinity, plugins + "pickyConverter.so");
    ASSERT_EQ(initProbe(channel, "io", {14, 1, 1, 1, 1, 1}), 1);
    ASSERT_EQ(channel.open(), 1);
    EXPECT_EQ(channel.read(14, 1), Numbers{}); // 0 to 13
    for (const double mistake : range(14, 18)) {
        SCOPED_TRACE(mistake);
        EXPECT_EQ(channel.read(1, 1), Numbers{});
        EXPECT_EQ(channel.error(), noConversion);
        EXPECT_EQ(channel.write({mistake}), 0);
        EXPECT_EQ(channel.error(), noOutputConversion);
    }
    EXPECT_EQ(channel.read(1, 1), Numbers{18});

    Channel filtered("loopback");
    ASSERT_EQ(filtered.init(0), 1);
    const std::string filter = plugins + "pickyFilter.so";
    ASSERT_EQ(coderStreamAddFilter(filtered.output, filter.c_str(), 0), 1);
    for (const double mistake : {13, 14, 16, 17}) {
        EXPECT_EQ(filtered.write({mistake}), 0);
        EXPECT_EQ(filtered.error(), noOutputConversion) << mistake;
    }
    const double numbers[] = {15, 1}; // the first becomes as many counts as there can be
    double written = 0;
    EXPECT_EQ(coderOutputStreamWriteTypedDataOld(filtered.output, &written, 2, "double",
                                                 CODER_BUFFER(1, numbers),
                                                 CODER_BUFFER(1, numbers + 1)),
              0);
    EXPECT_EQ(filtered.error(), noOutputConversion);
    ASSERT_EQ(coderStreamAddFilter(filtered.input, filter.c_str(), 0), 1);
    EXPECT_EQ(filtered.write({1}), 1);
    ASSERT_EQ(filtered.open(), 1);
    EXPECT_EQ(filtered.read(1, 1), Numbers{1});
}

TEST(FilterTest, FiltersApplyInOrderAndAreTuned)
{
    const std::string filter = plugins + "pickyFilter.so";
#ifdef OTHER_FILTER
    const std::string inputFilter = OTHER_FILTER; // made by another compiler
#else
    const std::string& inputFilter = filter;
#endif
    Channel channel("loopback");
    ASSERT_EQ(channel.init(0), 1);
    double factor = 2;
    const auto add = [&](void* stream, const std::string& name) {
        coderStreamAddFilter(stream, name.c_str(), 1, CODER_OPTION("Factor", "double", 1, &factor));
        return channel.error();
    };
    EXPECT_EQ(add(channel.input, inputFilter), "|");
    EXPECT_EQ(add(channel.output, filter), "|");
    EXPECT_EQ(add(channel.output, "./none"), "brenix:Stream:couldNotLoadFilter|");
    EXPECT_EQ(add(channel.output, "loopback"), "brenix:Stream:couldNotCreateFilter|");
    EXPECT_EQ(coderStreamAddFilter(channel.input, inputFilter.c_str(), 1,
                                   CODER_OPTION("Factr", "double", 1, &factor)),
              0);
    EXPECT_EQ(channel.error(), unexpected + "Option Factr: is not known.");
    ASSERT_EQ(channel.open(), 1);
    EXPECT_EQ(add(channel.input, filter), "brenix:Stream:cannotAddFilterWhileOpen|");

    EXPECT_EQ(channel.write({1, 2}), 2);
    EXPECT_EQ(channel.read(2, 1), (Numbers{4, 8}));
    EXPECT_EQ(channel.write({13}), 0);
    EXPECT_EQ(channel.error(), "brenix:OutputStream:couldNotConvertOutputData|");
    EXPECT_EQ(channel.write({6.5}), 1); // 13 for the second filter
    EXPECT_EQ(channel.asyncError(), "brenix:Stream:filterFailed|13 is refused");

    factor = 0; // drops all output
    EXPECT_EQ(
        coderStreamTuneFilters(channel.output, 1, CODER_OPTION("Factor", "double", 1, &factor)), 1);
    EXPECT_EQ(channel.write({1}), 1);
    factor = 5;
    EXPECT_EQ(
        coderStreamTuneFilters(channel.output, 1, CODER_OPTION("Factor", "double", 1, &factor)), 1);
    EXPECT_EQ(channel.write({3}), 1);
    EXPECT_EQ(channel.read(1, 1), Numbers{30});
}

TEST(FilterTest, ScaleAndDecimate)
{
    Channel channel("loopback");
    ASSERT_EQ(channel.init(0), 1);
    const int factor = 3;
    const double gain = -2;
    const double offset = 0.5;
    ASSERT_EQ(coderStreamAddFilter(channel.output, "decimate", 1,
                                   CODER_OPTION("Factor", "int32", 1, &factor)),
              1);
    ASSERT_EQ(coderStreamAddFilter(channel.input, "scale", 2,
                                   CODER_OPTION("Gain", "double", 1, &gain),
                                   CODER_OPTION("Offset", "double", 1, &offset)),
              1);
    ASSERT_EQ(channel.open(), 1);
    EXPECT_EQ(channel.write(range(0, 5)), 5); // 0 and 3 stay
    EXPECT_EQ(channel.write(range(5, 6)), 1); // none
    EXPECT_EQ(channel.write(range(6, 8)), 2); // 6
    EXPECT_EQ(channel.read(3, 2), (Numbers{0.5, -5.5, -11.5}));

    // Integers are rounded and stop at their ends.
    const int8_t bytes[] = {0, 70, 2, 3, -70, 5, 6};
    int8_t back[3] = {};
    double written = 0;
    ASSERT_EQ(coderOutputStreamWriteTypedDataOld(channel.output, &written, 1, "int8",
                                                 CODER_BUFFER(7, bytes)),
              1);
    ASSERT_EQ(coderInputStreamReadBuffers(channel.input, 2, 1), 1); // 70 and -70
    ASSERT_EQ(coderInputStreamReadBufferData(channel.input, 1, 0, "", "int8", 3, back), 1);
    EXPECT_EQ(std::vector<int>(back, back + 3), (std::vector<int>{-128, 127, 0}));
}

TEST(FilterTest, DifferentOnesTogether)
{
    Channel channel("loopback", infinity, 2);
    ASSERT_EQ(channel.init(0), 1);
    const int factor = 3;
    const double gain = 10;
    ASSERT_EQ(coderStreamAddFilter(channel.output, "decimate", 1,
                                   CODER_OPTION("Factor", "int32", 1, &factor)),
              1);
    ASSERT_EQ(coderStreamAddFilter(channel.output, "scale", 0), 1);
    ASSERT_EQ(coderStreamTuneFilters(channel.output, 1, CODER_OPTION("Gain", "double", 1, &gain)),
              1)
        << channel.error();
    EXPECT_EQ(coderStreamTuneFilters(channel.output, 1, CODER_OPTION("Gian", "double", 1, &gain)),
              0);
    EXPECT_EQ(channel.error(), unexpected + "Option Gian: is not known.");
    EXPECT_EQ(channel.write({0, 1}), 2);
    EXPECT_EQ(channel.write({2, 3}), 0); // has room for one; the filters have not seen it
    ASSERT_EQ(channel.open(), 1);
    EXPECT_EQ(channel.write({2, 3}), 2);
    EXPECT_EQ(channel.read(2, 2), (Numbers{0, 30}));
}

TEST(SignalTest, WaveformsChannelsAndCommands)
{
    Channel channel("signal", 16, 0, "columns");
    const double rate = 8;
    double frequency = 1;
    const int channels = 2;
    const int block = 4;
    const auto start = [&](const char* waveform, const char* pace, int frames) {
        const int result = channel.init(7, CODER_OPTION("Waveform", "char", 9, waveform),
                                        CODER_OPTION("Pace", "char", 9, pace),
                                        CODER_OPTION("SampleRate", "double", 1, &rate),
                                        CODER_OPTION("Frequency", "double", 1, &frequency),
                                        CODER_OPTION("Channels", "int32", 1, &channels),
                                        CODER_OPTION("BlockSize", "int32", 1, &block),
                                        CODER_OPTION("Frames", "int32", 1, &frames));
        return result == 1 && channel.open() == 1;
    };
    const auto stop = [&] { ASSERT_EQ(coderChannelClose(channel.handle), 1); };

    ASSERT_TRUE(start("ramp", "fast", 8)) << channel.error();
    EXPECT_EQ(channel.read(8, 2, "Data1"), (Numbers{-1, -0.75, -0.5, -0.25, 0, 0.25, 0.5, 0.75}));
    stop();
    ASSERT_TRUE(start("square", "fast", 6));
    EXPECT_EQ(channel.read(6, 2, "Data2"), (Numbers{-1, -1, -1, -1, 1, 1})); // half a period ahead
    stop();
    ASSERT_TRUE(start("noise", "fast", 4));
    const Numbers noise = channel.read(4, 1, "Data1");
    stop();
    ASSERT_TRUE(start("noise", "fast", 4));
    EXPECT_EQ(channel.read(4, 1, "Data1"), noise);
    stop();

    const auto begin = std::chrono::steady_clock::now();
    ASSERT_TRUE(start("sine", "realtime", 1000)); // a block takes half a second
    EXPECT_EQ(channel.read(4, 1, "Data1")[2], 1);
    EXPECT_GE(std::chrono::steady_clock::now() - begin, std::chrono::milliseconds(500));
    frequency = 2;
    ASSERT_EQ(coderChannelExecute(channel.handle, "set", 1,
                                  CODER_OPTION("Frequency", "double", 1, &frequency)),
              1);
    double reflected = 0;
    EXPECT_EQ(coderChannelGetPropertyValue(channel.handle, "Frequency", "double", 1, &reflected),
              1);
    EXPECT_EQ(reflected, 2);
    frequency = 4.5;
    EXPECT_EQ(coderChannelExecute(channel.handle, "set", 1,
                                  CODER_OPTION("Frequency", "double", 1, &frequency)),
              0);
    EXPECT_EQ(channel.error(),
              unexpected + "Option Frequency: must be from 0 Hz to half the sample rate.");
    stop();
}

TEST(AudioFileTest, WhatIsWrittenIsReadBack)
{
    const std::string file = testing::TempDir() + "t\xC3\xB6ne.wav";
    const double rate = 44100;
    const int channels = 2;
    const Numbers samples = {0.5, -0.25, 0.125, -1, 0.75, 0.1};
    {
        Channel writer("audiofile");
        ASSERT_EQ(writer.init(5, CODER_OPTION("FileName", "char", 4096, file.c_str()),
                              CODER_OPTION("Mode", "char", 9, "write"),
                              CODER_OPTION("SampleRate", "double", 1, &rate),
                              CODER_OPTION("Channels", "int32", 1, &channels),
                              CODER_OPTION("SampleFormat", "char", 9, "DOUBLE")),
                  1)
            << writer.error();
        ASSERT_EQ(writer.open(), 1);
        EXPECT_EQ(writer.write({samples.begin(), samples.begin() + 3}), 3); // in mid-frame
        EXPECT_EQ(writer.write({samples.begin() + 3, samples.end()}), 3);
        EXPECT_EQ(coderChannelClose(writer.handle), 1) << writer.error();
        ASSERT_EQ(writer.open(), 1) << writer.error();
    }
    {
        Channel writer("audiofile");
        ASSERT_EQ(writer.init(4, CODER_OPTION("FileName", "char", 4096, file.c_str()),
                              CODER_OPTION("Mode", "char", 9, "write"),
                              CODER_OPTION("Channels", "int32", 1, &channels),
                              CODER_OPTION("SampleFormat", "char", 9, "DOUBLE")),
                  1);
        ASSERT_EQ(writer.open(), 1);
        EXPECT_EQ(writer.write(samples), 6);
        EXPECT_EQ(writer.write({1}), 1);
        EXPECT_EQ(coderChannelClose(writer.handle), 1);
        EXPECT_NE(writer.asyncError().find("has 1 of 2 samples"), std::string::npos);
    }
    Channel reader("audiofile", infinity, infinity, "columns");
    const int block = 2;
    ASSERT_EQ(reader.init(2, CODER_OPTION("FileName", "char", 4096, file.c_str()),
                          CODER_OPTION("BlockSize", "int32", 1, &block)),
              1)
        << reader.error();
    int64_t frames = 0;
    EXPECT_EQ(coderChannelGetPropertyValue(reader.handle, "Frames", "int64", 1, &frames), 1);
    EXPECT_EQ(frames, 3);
    for (int round = 0; round < 2; ++round) { // opening again starts from the first frame
        ASSERT_EQ(reader.open(), 1);
        reader.waitForEnd();
        EXPECT_EQ(reader.peek(), (Numbers{2, 1}));
        EXPECT_EQ(reader.read(3, 2, "Data1"), (Numbers{0.5, 0.125, 0.75}));
        double second[2] = {};
        EXPECT_EQ(coderInputStreamReadBufferData(reader.input, 1, 2, "Data", "double", 2, second),
                  1);
        EXPECT_EQ(second[1], -1);
        EXPECT_EQ(coderChannelClose(reader.handle), 1);
    }
}

TEST(AudioFileTest, BadOptionsAreNamed)
{
    const double zero = 0;
    const std::string rows[][4] = {
        {"FileName", "", "x", "Option FileName: must name a sound file."},
        {"FileName", "/no/such.wav", "x", "Could not open /no/such.wav: "},
        {"Mode", "play", "x", "Option Mode: must be read or write, not play."},
        {"Mode", "write", "x",
         "Option FileName: has an ending that names no sound file format: a.x"},
        {"SampleFormat", "PCM_16", "x", "Option SampleFormat: is not known."},
        {"BlokSize", "1", "x", "Option BlokSize: is not known."},
        {"BlockSize", "", "n", "Option BlockSize: must be a whole number from 1 to 16777216."},
        {"BlockSize", "1", "x", "Option BlockSize: must be one number."},
        {"Mode", "", "n", "Option Mode: must be a text."},
        {"Timeout", "1", "x", "Option Timeout: must be one number."},
    };
    for (const auto& [name, text, kind, error] : rows) {
        SCOPED_TRACE(name + "=" + text);
        Channel channel("audiofile");
        const int result =
            kind == "n"
                ? coderChannelInit(channel.handle, 2, CODER_OPTION("FileName", "char", 4, "a.x"),
                                   CODER_OPTION(name.c_str(), "double", 1, &zero))
                : coderChannelInit(channel.handle, 2, CODER_OPTION("FileName", "char", 4, "a.x"),
                                   CODER_OPTION(name.c_str(), "char", 99, text.c_str()));
        EXPECT_EQ(result, 0);
        EXPECT_EQ(channel.error().substr(0, unexpected.size() + error.size()), unexpected + error);
    }
}
