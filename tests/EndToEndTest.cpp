// The built libraries with plug-ins: what the embedded core promises, seen through the C functions.

#include "Driver.hpp"
#include "brenixcore/plugin/Inspect.hpp"

#include <sys/resource.h>
#include <unistd.h>

#include <cmath>
#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <map>
#include <regex>

using namespace driver;

namespace
{

constexpr std::size_t npos = std::string::npos;
const std::string plugins = TEST_PLUGINS "/";
const std::string probe = plugins + "probe.so";
const std::string pickyFilter = plugins + "pickyFilter.so";
const std::string noInput = "brenix:InputStream:synchronousInputNotPossible|";
const std::string noOutput = "brenix:OutputStream:synchronousOutputNotPossible|";
const std::string noInputConversion = "brenix:InputStream:couldNotConvertInputData|";
const std::string noOutputConversion = "brenix:OutputStream:couldNotConvertOutputData|";

const std::string soundFile = testing::TempDir() + std::to_string(getpid());

const struct Operation {
    std::string name;
    int (*run)(Channel& channel);
} operations[] = {
    {"init", [](Channel& channel) { return channel.init(); }},
    {"open", [](Channel& channel) { return channel.open(); }},
    {"execute", [](Channel& channel) { return channel.execute("updateFromThread"); }},
    {"close", [](Channel& channel) { return channel.close(); }},
    {"term", [](Channel& channel) { return channel.term(); }},
};

} // namespace

TEST(LoadTest, AConverterIsLoadedFirst)
{
    void* channel = nullptr;
    EXPECT_EQ(create(channel, "no such device", "no such converter"),
              "brenix:Channel:couldNotLoadConverter|");
    EXPECT_EQ(create(channel, "no such device", "loopback"),
              "brenix:Channel:couldNotCreateConverter|");
    EXPECT_EQ(create(channel, "no such device", "identity"), "brenix:Channel:couldNotLoadDevice|");
    EXPECT_EQ(create(channel, "identity", "identity"), "brenix:Channel:couldNotCreateDevice|");
    EXPECT_EQ(channel, nullptr);
}

TEST(LoadTest, FieldsAndCommandsAreDescribed)
{
    const auto report = brenixcore::plugin::inspectPlugin("signal");
    ASSERT_EQ(report.inputFields.size() + report.commands.size(), 2);
    EXPECT_EQ(report.inputFields[0].name, "data");
    EXPECT_EQ(report.commands[0].options.size(), 2);
}

TEST(StateTest, OperationsOutOfOrderNameOperationAndState)
{
    const struct {
        std::string way; ///< first letters of operations
        std::string state, allowed;
    } rows[] = {{"", "created", "i"},
                {"i", "initialised", "ioet"},
                {"io", "open", "ec"},
                {"ioc", "closed", "ioet"},
                {"iocoi", "open", "ec"},
                {"it", "terminated", "i"},
                {"ioctii", "initialised", "ioet"}};
    for (const auto& row : rows) {
        for (const Operation& last : operations) {
            SCOPED_TRACE(row.way + " " + last.name);
            Channel channel(probe);
            for (const char letter : row.way) {
                for (const Operation& step : operations) {
                    letter == step.name[0] ? step.run(channel) : 0;
                }
            }
            const bool allowed = row.allowed.find(last.name[0]) != std::string::npos;
            EXPECT_EQ(last.run(channel), allowed);
            EXPECT_EQ(channel.error(), allowed ? "|"
                                               : unexpected + "Operation " + last.name +
                                                     " is not possible: the channel is " +
                                                     row.state + ".");
        }
    }
    Channel channel(probe);
    channel.init();
    EXPECT_EQ(channel.execute(nullptr), 0);
    EXPECT_EQ(channel.error(), unexpected + "The command to execute must not be null.");
    EXPECT_EQ(channel.execute("dance"), 0);
    EXPECT_EQ(channel.error(), unexpected + "Unknown command: dance");
}

TEST(StateTest, FailuresAndErrorsOfEachOperationReachTheCaller)
{
    for (const Operation& last : operations) {
        const std::string failed = unexpected + "failed in " + last.name;
        const std::pair<std::string, std::string> rows[] = {
            {"", failed},
            {"int", unexpected + "Unrecognized error."},
            {"own", unexpected + "Unrecognized error."},
            {"silent", unexpected},
            {"long", (failed + std::string(5000, '!')).substr(0, unexpected.size() + 1023)},
            {"raised", "|"}};
        for (const auto& [as, error] : rows) {
            SCOPED_TRACE(last.name + " " + as);
            const bool raises = as == "raised";
            Channel channel(probe);
            int result = channel.init({{raises ? "RaiseIn" : "FailIn", last.name}, {"FailAs", as}});
            for (const auto* step = operations + 1; result == 1 && step != std::end(operations);
                 ++step) {
                result = step->run(channel);
            }
            EXPECT_EQ(channel.error(), error);
            EXPECT_EQ(channel.error(coderChannelGetLastSyncError),
                      raises ? "probe:raised|" + last.name : "|");
            if (last.name != "init") { // of which there is no property yet
                EXPECT_EQ(channel.reason(), raises ? last.name : error.substr(unexpected.size()));
            }
            channel.close();              // if it is open
            EXPECT_EQ(channel.init(), 1); // and all is well again
            EXPECT_EQ(channel.reason(), "");
        }
    }
}

TEST(StreamTest, PeekListsWhatReadDelivers)
{
    Channel channel(probe);
    ASSERT_EQ(channel.init({{"Streams", "i"}, {"Packets", "10 10 10 5"}}), 1);
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
    EXPECT_EQ(channel.readError(8, 2), noInput);         // 6 are left
    EXPECT_EQ(channel.reason(), "Cannot read 8 counts: there are 6 and the device is done.");
    EXPECT_EQ(channel.close(), 1);
    EXPECT_EQ(channel.read(6, 2), range(29, 35)); // also after close
    EXPECT_EQ(channel.peek(), Numbers{});
    EXPECT_EQ(coderInputStreamReadBuffers(channel.input, 0, 0), 1);
}

TEST(StreamTest, AnInputLimitNeitherLosesNorBlocks)
{
    Channel channel(probe, 4);
    channel.start({{"Streams", "i"}, {"Packets", "3 3 10"}});
    EXPECT_EQ(channel.readError(5, 1), noInput); // beyond the limit: at once
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

    channel.close();
    channel.start({{"Streams", "i"}, {"Packets", "3 3 2 1"}});
    const auto waiting = [&] { return channel.ask(coderStreamGetDataAvailable, channel.input); };
    Channel::waitUntil([&] { return waiting() == 3; });
    std::this_thread::sleep_for(std::chrono::milliseconds(20)); // for the second, which has no room
    EXPECT_EQ(coderStreamFlush(channel.input), 1);
    Channel::waitUntil([&] { return waiting() == 3; });
    EXPECT_EQ(channel.peek(), (Numbers{2, 1})); // both were discarded
}

TEST(StreamTest, EveryWaitEnds)
{
    const auto begin = std::chrono::steady_clock::now();
    Channel slow(probe);
    slow.start({{"Streams", "io"}, {"Packets", "1 1"}}, 0.05);
    EXPECT_EQ(slow.readError(3, 1), noInput);
    EXPECT_LT(std::chrono::steady_clock::now() - begin, std::chrono::seconds(5)); // not the default
    EXPECT_EQ(slow.read(2, 2), range(0, 2));
    slow.close();
    slow.start({{"Streams", "io"}, {"FailIn", "run"}});
    slow.waitForEnd();
    EXPECT_EQ(slow.writeError({1}), noOutput); // nobody takes it

    // Nor what was written before, which is not for the next time.
    slow.close();
    EXPECT_EQ(slow.write({1, 2, 3}), 3);
    ASSERT_EQ(slow.open(), 1);
    slow.waitForEnd();
    EXPECT_EQ(slow.asyncError(), "brenix:Device:failed|failed in run");
    EXPECT_EQ(slow.close(), 1);
    EXPECT_EQ(slow.asyncError(),
              "brenix:Device:failed|The device ended and did not take 3 counts: failed in run");
    EXPECT_EQ(slow.ask(coderStreamGetDataAvailable, slow.output), 0);

    Channel full(probe, 1); // the device waits for room, and close ends it
    full.start({{"Streams", "i"}, {"Packets", "1 1 1"}});
    Channel::waitUntil([&] { return full.peek().size() == 1; });
    EXPECT_EQ(full.close(), 1);
    EXPECT_EQ(full.asyncError(), "probe:push|refused");
    EXPECT_EQ(full.read(1, 1), Numbers{0});

    Channel destroyed(probe, 1); // or the end of the channel does
    destroyed.start({{"Streams", "io"}, {"Packets", "1 1 1"}}, infinity);
}

TEST(StreamTest, WritesAreTakenWholeOrNotAtAll)
{
    Channel channel("loopback", infinity, 5);
    ASSERT_EQ(channel.init(), 1);
    EXPECT_EQ(channel.writeError(range(0, 6)), noOutput);
    EXPECT_EQ(channel.write(range(0, 3)), 3); // before open, up to the limit
    EXPECT_EQ(channel.writeError(range(3, 6)), noOutput);
    EXPECT_EQ(channel.reason(),
              "Cannot write 3 counts: there is no room and the channel is not open.");
    EXPECT_EQ(channel.ask(coderStreamGetDataAvailable, channel.output), 3);
    EXPECT_EQ(channel.ask(coderStreamGetSpaceAvailable, channel.output), 2);
    EXPECT_EQ(coderStreamFlush(channel.output), 1);
    EXPECT_EQ(channel.write(range(0, 5)), 5);
    ASSERT_EQ(channel.open(), 1);
    EXPECT_EQ(channel.write(range(5, 10)), 5); // waits for room
    EXPECT_EQ(channel.close(), 1);
    EXPECT_EQ(channel.read(10, 2), range(0, 10)); // close let the device take all of it
    EXPECT_EQ(channel.write({10}), 1);            // for the next time
    ASSERT_EQ(channel.open(), 1);
    EXPECT_EQ(channel.read(1, 1), Numbers{10});
}

TEST(StreamTest, DevicesMayLackStreams)
{
    Channel channel(probe);
    ASSERT_EQ(channel.init({{"Streams", "o"}}), 1);
    EXPECT_EQ(channel.readError(1, 1), "brenix:InputStream:notSupported|");
    EXPECT_EQ(channel.ask(coderStreamGetCountDimension, channel.output), 2);
    ASSERT_EQ(channel.init({{"Streams", "i"}}), 1);
    EXPECT_EQ(channel.write({1}), 0);
    EXPECT_EQ(channel.error(), "brenix:OutputStream:notSupported|");
}

TEST(StreamTest, LoopbackCountsWhatItLoses)
{
    Channel channel("loopback", 2);
    channel.start();
    for (int i = 0; i < 4; ++i) { // one has room and one waits for it
        ASSERT_EQ(channel.write({1, 2}), 2);
    }
    EXPECT_EQ(channel.close(), 1);
    EXPECT_EQ(channel.asyncError(), "brenix:Device:dataLost|4 counts were lost: the channel closed "
                                    "and its input stream was full.");
    EXPECT_EQ(channel.property<std::uint64_t>("LostCounts", "uint64"), 4);
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
        channel.start({{"Packets", "4 " + std::to_string(mistake) + " 1"},
                       {"FailIn", pushes ? "" : "run"},
                       {"FailAs", failAs}},
                      infinity);
        EXPECT_EQ(channel.readError(5, 2), noInput); // the device's end ends the wait
        EXPECT_EQ(channel.asyncError(), "brenix:Device:failed|" + message);
        EXPECT_EQ(channel.close(), 1);
        EXPECT_EQ(channel.read(4, 1), pushes ? range(0, 4) : Numbers{}); // what came before
    }
}

TEST(EventTest, SlowAndEarlyEnds)
{
    Channel channel(probe);
    for (const std::string failAs : {"slow", "early"}) {
        SCOPED_TRACE(failAs);
        const bool slow = failAs == "slow";
        ASSERT_EQ(channel.init({{"FailIn", slow ? "run" : ""}, {"FailAs", failAs}}), 1);
        const auto begin = std::chrono::steady_clock::now();
        ASSERT_EQ(channel.open(), 1);
        if (!slow) {
            channel.waitForEnd();
            EXPECT_EQ(channel.readError(1, 1), noInput);
        }
        EXPECT_EQ(channel.close(), 1) << channel.error();
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
    channel.start({{"Streams", "io"}, {"Packets", "1"}});
    EXPECT_EQ(channel.execute("storm"), 1);
    EXPECT_EQ(channel.asyncError(), "brenix:Device:failed|" + std::string(1023, 'x'));
    EXPECT_EQ(channel.property<double>("Level", "double"), 3);
    EXPECT_EQ(channel.read(1, 1), Numbers{0});
    EXPECT_EQ(channel.close(), 1);
    EXPECT_EQ(channel.write({1, 2}), 2); // for the next time
    EXPECT_EQ(channel.execute("streamAfterClose"), 1) << channel.error();
    EXPECT_EQ(channel.peek(), Numbers{});
    EXPECT_EQ(channel.ask(coderStreamGetDataAvailable, channel.output), 2);
}

TEST(EventTest, PropertiesFollowTheDevice)
{
    Channel channel(probe);
    for (int round = 0; round < 2; ++round) { // the second init replaces the property
        ASSERT_EQ(channel.init(), 1);
        EXPECT_EQ(channel.property<double>("Level", "double"), 1);
        EXPECT_EQ(channel.execute("updateFromThread"), 1);
        EXPECT_EQ(channel.property<double>("Level", "double"), 2);
        int other = 0;
        EXPECT_EQ(coderChannelGetPropertyValue(channel.handle, "Other", "int32", 1, &other), 0);
        EXPECT_EQ(channel.asyncError(), "probe:thread|from a thread");
    }
}

TEST(EventTest, ATraceHasALineForEachEvent)
{
    const std::string file = testing::TempDir() + "trace-" + std::to_string(getpid());
    ASSERT_EQ(setenv("BRENIX_TRACE", file.c_str(), 1), 0);
    {
        Channel channel(probe);
        unsetenv("BRENIX_TRACE");
        channel.init();
        EXPECT_EQ(channel.execute("updateFromThread"), 1);
    }
    std::ifstream stream(file);
    const std::string text{std::istreambuf_iterator<char>(stream), {}};
    const std::string start =
        "\\d{4}-\\d\\d-\\d\\dT\\d\\d:\\d\\d:\\d\\d\\.\\d{6}Z thread \\d+ " + probe + " ";
    EXPECT_TRUE(std::regex_match(text, std::regex(start + "warning probe:warning: is dropped\n" +
                                                  start + " brenix:Device:failed: \n" + start +
                                                  "error probe:thread: from a thread\n")))
        << text;
    std::remove(file.c_str());
}

TEST(ConversionTest, AFailureLosesOnePacketAtMost)
{
    Channel channel(probe, infinity, infinity, plugins + "pickyConverter.so");
    ASSERT_EQ(channel.init({{"Streams", "io"}, {"Packets", "10 10 10"}}), 1);
    EXPECT_EQ(channel.writeError({1, 13}), noOutputConversion);
    ASSERT_EQ(channel.open(), 1);
    EXPECT_EQ(channel.readError(30, 3), noInputConversion);
    EXPECT_EQ(channel.reason(), "13 is refused");
    EXPECT_EQ(channel.peek(), (Numbers{10, 10}));
    Numbers rest = range(0, 10);
    const Numbers third = range(20, 30);
    rest.insert(rest.end(), third.begin(), third.end());
    EXPECT_EQ(channel.read(20, 2), rest);
}

TEST(ConversionTest, SpoiltPacketsGoNoFurther)
{
    Channel channel(probe, infinity, infinity, plugins + "pickyConverter.so");
    channel.start({{"Streams", "io"}, {"Packets", "14 1 1 1 1 1"}});
    EXPECT_EQ(channel.read(14, 1), Numbers{}); // 0 to 13
    for (const double mistake : range(14, 18)) {
        SCOPED_TRACE(mistake);
        EXPECT_EQ(channel.readError(1, 1), noInputConversion);
        EXPECT_EQ(channel.writeError({mistake}), noOutputConversion);
    }
    EXPECT_EQ(channel.read(1, 1), Numbers{18});

    Channel filtered("loopback");
    ASSERT_EQ(filtered.init(), 1);
    ASSERT_EQ(Channel::addFilter(filtered.output, pickyFilter), 1);
    for (const double mistake : {13, 14, 16, 17}) {
        EXPECT_EQ(filtered.writeError({mistake}), noOutputConversion) << mistake;
    }
    const double numbers[] = {15, 1}; // the first becomes as many counts as there can be
    double written = 0;
    EXPECT_EQ(coderOutputStreamWriteTypedDataOld(filtered.output, &written, 2, "double",
                                                 CODER_BUFFER(1, numbers),
                                                 CODER_BUFFER(1, numbers + 1)),
              0);
    EXPECT_EQ(filtered.error(), noOutputConversion);
    ASSERT_EQ(Channel::addFilter(filtered.input, pickyFilter), 1);
    EXPECT_EQ(filtered.write({1}), 1);
    ASSERT_EQ(filtered.open(), 1);
    EXPECT_EQ(filtered.read(1, 1), Numbers{1});
}

TEST(FilterTest, FiltersApplyInOrderAndAreTuned)
{
#ifdef OTHER_FILTER
    const std::string inputFilter = OTHER_FILTER; // made by another compiler
#else
    const std::string& inputFilter = pickyFilter;
#endif
    Channel channel("loopback");
    ASSERT_EQ(channel.init(), 1);
    const auto add = [&](void* stream, const std::string& name, const char* option = "Factor") {
        Channel::addFilter(stream, name, {{option, 2.0}});
        return channel.error();
    };
    EXPECT_EQ(add(channel.input, inputFilter), "|");
    EXPECT_EQ(add(channel.output, pickyFilter), "|");
    EXPECT_EQ(add(channel.output, "./none"), "brenix:Stream:couldNotLoadFilter|");
    EXPECT_EQ(channel.reason().find("Could not load ./none: ./none: cannot open"), 0);
    EXPECT_EQ(add(channel.output, "loopback"), "brenix:Stream:couldNotCreateFilter|");
    EXPECT_NE(channel.reason().find(": it is a device and no filter"), npos);
    for (const std::string option : {"Factr", "Timeout"}) { // the second is the channel's
        EXPECT_EQ(add(channel.input, inputFilter, option.c_str()),
                  unexpected + "Option " + option + ": is not known.");
    }
    ASSERT_EQ(channel.open(), 1);
    EXPECT_EQ(add(channel.input, pickyFilter), "brenix:Stream:cannotAddFilterWhileOpen|");

    EXPECT_EQ(channel.write({1, 2}), 2);
    EXPECT_EQ(channel.read(2, 1), (Numbers{4, 8}));
    EXPECT_EQ(channel.writeError({13}), noOutputConversion);
    EXPECT_EQ(channel.write({6.5}), 1); // 13 for the second filter
    EXPECT_EQ(channel.asyncError(), "brenix:Stream:filterFailed|13 is refused");

    EXPECT_EQ(Channel::tune(channel.output, {{"Factor", 0.0}}), 1); // drops all output
    EXPECT_EQ(channel.write({1}), 1);
    EXPECT_EQ(Channel::tune(channel.output, {{"Factor", 5.0}}), 1);
    EXPECT_EQ(channel.write({3}), 1);
    EXPECT_EQ(channel.read(1, 1), Numbers{30});
}

TEST(FilterTest, ScaleAndDecimate)
{
    Channel channel("loopback");
    ASSERT_EQ(channel.init(), 1);
    ASSERT_EQ(Channel::addFilter(channel.output, "decimate", {{"Factor", 3}}), 1);
    ASSERT_EQ(Channel::addFilter(channel.input, "scale", {{"Gain", -2.0}, {"Offset", 0.5}}), 1);
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

TEST(FilterTest, WhatFiltersMakeMoreOfWaitsForRoom)
{
    // 30 and 10 are on the input's side, the device has 40, 80 wait, and 40 found no room in time.
    for (const auto& [limit, writes, waits] :
         {std::tuple(infinity, 20, 0), std::tuple(30.0, 5, 2)}) {
        Channel channel("loopback", limit, 100);
        ASSERT_EQ(channel.init(), 1);
        ASSERT_EQ(Channel::addFilter(channel.output, pickyFilter, {{"Times", 2}}), 1);
        ASSERT_EQ(channel.open(limit == infinity ? 10 : 0.2), 1);
        Numbers all;
        const auto begin = std::chrono::steady_clock::now();
        for (int i = 0; i < 20 && channel.write(Numbers(20, 100 + i)) == 20; ++i) {
            all.insert(all.end(), 40, 100 + i);
        }
        EXPECT_GE(std::chrono::steady_clock::now() - begin, waits * std::chrono::milliseconds(200));
        EXPECT_EQ(all.size(), writes * 40);
        EXPECT_EQ(channel.reason(),
                  waits == 0 ? ""
                             : "Cannot write 20 counts: there is no room and the time is over.");
        Numbers back;
        while (back.size() < all.size() && !HasFailure()) {
            Channel::waitUntil(
                [&] { return channel.ask(coderStreamGetDataAvailable, channel.input) >= 20; });
            for (const double value :
                 channel.read(20, static_cast<double>(channel.peek(20).size()))) {
                back.push_back(value);
            }
        }
        EXPECT_EQ(back, all);
    }
}

TEST(FilterTest, VectorsAreArrays)
{
    Channel channel(probe, infinity, infinity, "columns");
    ASSERT_EQ(channel.init({{"Packets", "4 3"}, {"Vectors", 1}}), 1);
    ASSERT_EQ(Channel::addFilter(channel.input, "decimate", {{"Factor", 3}}), 1);
    ASSERT_EQ(Channel::addFilter(channel.input, "scale", {{"Gain", 10.0}}), 1);
    ASSERT_EQ(channel.open(), 1);
    EXPECT_EQ(channel.read(3, 2, "Data1"), (Numbers{0, 30, 60}));
    uint8_t even[2] = {};
    EXPECT_EQ(coderInputStreamReadBufferData(channel.input, 1, 0, "Even", "logical", 2, even), 1);
    EXPECT_EQ(even[0] * 2 + even[1], 2);
}

TEST(FilterTest, FiltersOfOneStreamSeeWhatIsWrittenOnce)
{
    Channel picky("loopback", infinity, 2, plugins + "pickyConverter.so");
    ASSERT_EQ(picky.init(), 1);
    EXPECT_EQ(picky.write({20}), 1); // becomes the number of packets that the converter has seen
    EXPECT_EQ(picky.writeError({20, 20}), noOutput);
    ASSERT_EQ(picky.open(), 1);
    EXPECT_EQ(picky.write({20, 5}), 2);
    EXPECT_EQ(picky.read(3, 2), (Numbers{1, 2, 5}));

    Channel channel("loopback", infinity, 2);
    ASSERT_EQ(channel.init(), 1);
    ASSERT_EQ(Channel::addFilter(channel.output, "decimate", {{"Factor", 3}}), 1);
    ASSERT_EQ(Channel::addFilter(channel.output, "scale"), 1);
    ASSERT_EQ(Channel::tune(channel.output, {{"Gain", 10.0}}), 1) << channel.error();
    EXPECT_EQ(Channel::tune(channel.output, {{"Gian", 10.0}}), 0);
    EXPECT_EQ(channel.error(), unexpected + "Option Gian: is not known.");
    EXPECT_EQ(channel.write({0, 1}), 2);
    EXPECT_EQ(channel.writeError({2, 3}), noOutput); // has room for one
    ASSERT_EQ(channel.open(), 1);
    EXPECT_EQ(channel.write({2, 3}), 2);
    EXPECT_EQ(channel.read(2, 2), (Numbers{0, 30}));
    channel.close();
    ASSERT_EQ(Channel::addFilter(channel.input, "decimate", {{"Factor", 2}}), 1);
    ASSERT_EQ(channel.open(), 1);
    for (const double value : {0, 0, 4, 0, 0, 5}) { // 4 and 5 pass the output's filters
        EXPECT_EQ(channel.write({value}), 1);
    }
    channel.close();
    EXPECT_EQ(channel.peek(), Numbers{1}); // nothing is left of the packet that was dropped
    EXPECT_EQ(channel.read(1, 1), Numbers{40});
}

TEST(SignalTest, WaveformsChannelsAndCommands)
{
    Channel channel("signal", 16, 0, "columns");
    const auto start = [&](const char* waveform, const char* pace, int frames) {
        channel.close(); // the one before
        const int result = channel.init({{"Waveform", waveform},
                                         {"Pace", pace},
                                         {"SampleRate", 8.0},
                                         {"Frequency", 1.0},
                                         {"Channels", 2},
                                         {"BlockSize", 4},
                                         {"Frames", frames}});
        return result == 1 && channel.open() == 1;
    };
    ASSERT_TRUE(start("ramp", "fast", 8)) << channel.error();
    EXPECT_EQ(channel.read(8, 2, "Data1"), (Numbers{-1, -0.75, -0.5, -0.25, 0, 0.25, 0.5, 0.75}));
    ASSERT_TRUE(start("square", "fast", 6));
    EXPECT_EQ(channel.read(6, 2, "Data2"), (Numbers{-1, -1, -1, -1, 1, 1})); // half a period ahead
    ASSERT_TRUE(start("noise", "fast", 4));
    const Numbers noise = channel.read(4, 1, "Data1");
    ASSERT_TRUE(start("noise", "fast", 4));
    EXPECT_EQ(channel.read(4, 1, "Data1"), noise);

    const auto begin = std::chrono::steady_clock::now();
    ASSERT_TRUE(start("sine", "realtime", 1000)); // a block takes half a second
    EXPECT_EQ(channel.read(4, 1, "Data1")[2], 1);
    EXPECT_GE(std::chrono::steady_clock::now() - begin, std::chrono::milliseconds(500));
    ASSERT_EQ(channel.execute("set", {{"Frequency", 2.0}}), 1);
    EXPECT_EQ(channel.property<double>("Frequency", "double"), 2);
    EXPECT_EQ(channel.execute("set", {{"Frequency", 4.5}}), 0);
    EXPECT_EQ(channel.error(),
              unexpected + "Option Frequency: must be from 0 Hz to half the sample rate.");
    channel.close();
    ASSERT_EQ(channel.init({{"SampleRate", 100}}), 1);
    EXPECT_EQ(channel.property<double>("Frequency", "double"), 25);
}

TEST(AudioFileTest, WhatIsWrittenIsReadBack)
{
    const std::string file = soundFile + "t\xC3\xB6ne.wav";
    const Numbers samples = {0.5, -0.25, 0.125, -1, 0.75, 0.1};
    {
        Channel writer("audiofile");
        ASSERT_EQ(writer.init({{"FileName", file},
                               {"Mode", "write"},
                               {"Channels", 2},
                               {"SampleFormat", "DOUBLE"}}),
                  1)
            << writer.error();
        ASSERT_EQ(writer.open(), 1);
        EXPECT_EQ(writer.write(samples), 6);
        EXPECT_EQ(writer.close(), 1) << writer.error();
        ASSERT_EQ(writer.open(), 1) << writer.error();                      // starts again
        EXPECT_EQ(writer.write({samples.begin(), samples.begin() + 3}), 3); // in mid-frame
        EXPECT_EQ(writer.write({samples.begin() + 3, samples.end()}), 3);
        EXPECT_EQ(writer.write({1}), 1);
        EXPECT_EQ(writer.close(), 1);
        EXPECT_NE(writer.asyncError().find("has 1 of 2 samples"), std::string::npos);
    }
    Channel reader("audiofile", infinity, infinity, "columns");
    ASSERT_EQ(reader.init({{"FileName", file}, {"BlockSize", 2}}), 1) << reader.error();
    EXPECT_EQ(reader.property<int64_t>("Frames", "int64"), 3);
    for (int round = 0; round < 2; ++round) { // opening again starts from the first frame
        ASSERT_EQ(reader.open(), 1);
        reader.waitForEnd();
        EXPECT_EQ(reader.peek(), (Numbers{2, 1}));
        EXPECT_EQ(reader.read(3, 2, "Data1"), (Numbers{0.5, 0.125, 0.75}));
        double second[2] = {};
        EXPECT_EQ(coderInputStreamReadBufferData(reader.input, 1, 2, "Data", "double", 2, second),
                  1);
        EXPECT_EQ(second[1], -1);
        EXPECT_EQ(reader.close(), 1);
    }
    std::remove(file.c_str());
}

TEST(AudioFileTest, AFileWithoutFramesIsReadBack)
{
    for (const auto& [ending, format] : {std::pair(".wav", "PCM_16"),
                                         {".flac", "PCM_16"},
                                         {".ogg", "VORBIS"},
                                         {".mp3", "MPEG_LAYER_III"},
                                         {".opus", "OPUS"}}) {
        SCOPED_TRACE(format);
        const std::string file = soundFile + ending;
        Channel channel("audiofile");
        channel.start(
            {{"FileName", file}, {"Mode", "write"}, {"Channels", 2}, {"SampleFormat", format}});
        if (channel.close() == 0) {
            EXPECT_EQ(channel.error(), unexpected + "No frames were written to " + soundFile +
                                           ".opus: an Opus file without any cannot be read.");
        } else {
            channel.start({{"FileName", file}});
            EXPECT_EQ(channel.property<double>("SampleRate", "double"), 48000);
            EXPECT_EQ(channel.property<int64_t>("Frames", "int64"), 0);
            channel.waitForEnd();
            EXPECT_EQ(channel.peek(), Numbers{});
            EXPECT_EQ(channel.error(coderChannelGetLastAsyncError), "|");
        }
        std::remove(file.c_str());
    }
}

TEST(AudioFileTest, SamplesOfManyTypesInAFileWithoutHeader)
{
    const std::string file = soundFile + ".raw";
    Channel channel("audiofile");
    channel.start( // an encoding that goes through a table
        {{"FileName", file}, {"Mode", "write"}, {"Channels", 2}, {"SampleFormat", "ULAW"}});
    const auto write = [&](const char* type, const auto& values) {
        double written = 0;
        coderOutputStreamWriteTypedDataOld(channel.output, &written, 1, type,
                                           CODER_BUFFER(values.size(), values.data()));
        EXPECT_EQ(written, values.size());
    };
    write("int64", std::vector<int64_t>{1, 2, 3});
    EXPECT_EQ(channel.asyncError().rfind("brenix:Device:wrongType|3 counts", 0), 0U);
    write("int16", std::vector<int16_t>{-32768, 16384});
    write("int64", std::vector<int64_t>{1});
    write("float", std::vector{0.25F});
    EXPECT_EQ(channel.write({1e6, -1e6, std::nan(""), 0}), 4);
    EXPECT_EQ(channel.close(), 1);
    EXPECT_EQ(channel.asyncError(), "brenix:Device:failed|The last frame for " + file +
                                        " has 1 of 2 samples and was not written. 4 counts were "
                                        "not written to " +
                                        file +
                                        ": samples must be double, float, int8, int16 or int32.");
    std::ofstream(file, std::ios::app) << "e";
    channel.start(
        {{"FileName", file}, {"SampleRate", 8000}, {"Channels", 2}, {"SampleFormat", "ULAW"}});
    EXPECT_EQ(channel.asyncError(),
              "brenix:Device:failed|The last frame of " + file + " has 1 of 2 bytes.");
    Numbers samples = channel.read(3, 1);
    for (double& sample : samples) {
        sample = std::round(sample * 20) / 20;
    }
    EXPECT_EQ(samples, (Numbers{-1, 0.5, 0.25, 1, -1, 0}));
    std::remove(file.c_str());
}

TEST(AudioFileTest, LostSamplesAreTold)
{
    Numbers noise(4000);
    for (std::size_t i = 1; i < noise.size(); ++i) {
        noise[i] = std::fmod(noise[i - 1] * 16807 + 0.123, 1);
    }
    rlimit before{};
    getrlimit(RLIMIT_FSIZE, &before);
    const rlimit full{4096, before.rlim_max}; // bytes that a file has room for
    std::signal(SIGXFSZ, SIG_IGN);
    const struct {
        const char *ending, *format;
        const char* lost; ///< on a full disk: samples that were not taken; null: all were
        const char* cut;  ///< or reading a file that was cut: the error
    } rows[] = {{".wav", "PCM_16", " 5974 samples were not taken.", nullptr},
                {".flac", "PCM_16", " 4000 samples were not taken.", nullptr},
                {".ogg", "VORBIS", nullptr, nullptr},
                {".mp3", "MPEG_LAYER_III", nullptr, " of 8000 frames."},
                {".wav", "PCM_16", nullptr, "it ends after 5326 of 8000 frames."},
                {".flac", "PCM_16", nullptr, "Error : flac decoder lost sync."}};
    for (const auto& [ending, format, lost, cut] : rows) {
        SCOPED_TRACE(ending);
        const std::string file = soundFile + ending;
        const std::string error = "Could not write " + file + ": File too large.";
        Channel channel("audiofile");
        channel.init({{"FileName", file}, {"Mode", "write"}, {"SampleFormat", format}});
        EXPECT_EQ(channel.write(noise) + channel.write(noise), 8000);
        setrlimit(RLIMIT_FSIZE, cut == nullptr ? &full : &before);
        channel.open();
        channel.close();
        setrlimit(RLIMIT_FSIZE, &before);
        EXPECT_EQ(channel.error(),
                  cut != nullptr ? "|" : unexpected + error + " The file is not complete.");
        EXPECT_EQ(channel.error(coderChannelGetLastAsyncError),
                  lost == nullptr ? "|" : "brenix:Device:failed|" + error + lost);
        if (cut != nullptr) {
            std::filesystem::resize_file(file, std::filesystem::file_size(file) * 2 / 3);
            channel.start({{"FileName", file}, {"BlockSize", 3000}});
            EXPECT_NE(channel.asyncError().find(cut), std::string::npos);
            const double arrived = channel.ask(coderStreamGetDataAvailable, channel.input);
            EXPECT_TRUE(arrived > 3000 && arrived != 6000) << arrived; // all that could be read
        }
        std::remove(file.c_str());
    }

    const std::string file = soundFile + ".caf"; // which is encoded into a temporary file
    Channel channel("audiofile");
    channel.start({{"FileName", file}, {"Mode", "write"}, {"SampleFormat", "ALAC_16"}});
    setenv("TMPDIR", "/proc", 1); // where there is no room
    EXPECT_EQ(channel.write(noise), 4000);
    EXPECT_NE(channel.asyncError().find("temporary file. 4000 samples"), std::string::npos);
    unsetenv("TMPDIR");
    std::remove(file.c_str());
}

TEST(OptionsTest, BadOnesAreNamed)
{
    const std::map<std::string, std::pair<Option, Option>> good = {
        {"audiofile", {{"FileName", "a.x"}, {"FileName", "a.x"}}},
        {"serial", {{"Port", "/no/such"}, {"BaudRate", 9600}}},
        {"tcp", {{"Host", "127.0.0.1"}, {"Port", 9}}},
        {"udp", {{"LocalHost", "127.0.0.1"}, {"LocalPort", 0}}},
    };
    const struct {
        const char* device;
        Option bad; ///< replaces a good one of the same name
        std::string error;
    } rows[] = {
        {"audiofile", {"FileName", ""}, "FileName: must name a sound file."},
        {"audiofile", {"Mode", "play"}, "Mode: must be read or write, not play."},
        {"audiofile", {"Mode", 0}, "Mode: must be a text."},
        {"audiofile",
         {"Mode", "write"},
         "FileName: has an ending that names no sound file format: a.x."},
        {"audiofile",
         {"SampleFormat", "PCM_16"},
         "SampleFormat: cannot be given: a.x tells it itself."},
        {"audiofile", {"FileName", "a.raw"}, "SampleRate: must be given: a.raw does not tell it."},
        {"audiofile", {"BlokSize", 1}, "BlokSize: is not known."},
        {"audiofile", {"BlockSize", 0}, "BlockSize: must be a whole number from 1 to 16777216."},
        {"audiofile", {"BlockSize", "1"}, "BlockSize: must be one number."},
        {"audiofile", {"Timeout", "1"}, "Timeout: must be one number."},
        {"tcp", {"Overflow", "x"}, "Overflow: must be wait, dropOldest or dropNewest, not x."},
        {"tcp", {"Overflow", 1.0}, "Overflow: must be a text."},
        {"tcp", {"Stamps", 2}, "Stamps: must be true or false."},
        {"tcp", {"Stamps", "true"}, "Stamps: must be true or false."},
        {"tcp", {"Host", ""}, "Host: must name a host."},
        {"tcp", {"Port", "x"}, "Port: must be one number."},
        {"tcp", {"Port", 65536}, "Port: must be a whole number from 1 to 65535."},
        {"tcp",
         {"ConnectTimeout", 0},
         "ConnectTimeout: must be more than 0 and at most 86400 seconds."},
        {"tcp", {"ElementType", "int24"}, "ElementType: is not a numeric type: int24."},
        {"tcp", {"ByteOrder", "pdp"}, "ByteOrder: must be little or big, not pdp."},
        {"tcp", {"BlockSize", 0.5}, "BlockSize: must be a whole number from 1 to 16777216."},
        {"tcp", {"Hots", "x"}, "Hots: is not known."},
        {"udp", {"LocalHost", "here"}, "LocalHost: must be an IP address, not here."},
        {"udp", {"LocalPort", -1}, "LocalPort: must be a whole number from 0 to 65535."},
        {"udp", {"Host", "::1"}, "Port: is missing: a peer has a host and a port."},
        {"udp", {"Port", 9}, "Host: is missing: a peer has a host and a port."},
        {"udp", {"BlockSize", 1}, "BlockSize: is not known."},
        {"udp", {"Group", "10.0.0.1"}, "Group: is not the address of a group: 10.0.0.1."},
        {"udp", {"Group", "ff15::1"}, "Group: is not of the IP version of LocalHost."},
        {"udp", {"LocalHost", "ff02::1"}, "Interface: is required: each link has its own ff02::1."},
        {"udp",
         {"Interface", "lo"},
         "Interface: is for multicast: neither Group nor Host is a group."},
        {"serial", {"Port", ""}, "Port: must name a serial port."},
        {"serial", {"BaudRate", 0}, "BaudRate: must be a whole number from 1 to 4000000."},
        {"serial", {"Parity", "mark"}, "Parity: must be none, even or odd, not mark."},
        {"serial", {"StopBits", 1.5}, "StopBits: must be a whole number from 1 to 2."},
        {"serial", {"FlowControl", "x"}, "FlowControl: must be none, software or hardware, not x."},
    };
    for (const auto& [device, bad, error] : rows) {
        SCOPED_TRACE(device + " "s + error);
        Channel channel(device);
        EXPECT_EQ(channel.init({good.at(device).first, good.at(device).second, bad}), 0);
        EXPECT_EQ(channel.error(), unexpected + "Option " + error);
    }
}

TEST(OpenTest, WhatIsNotThere)
{
    Channel file("audiofile");
    EXPECT_EQ(file.init({{"FileName", "/no/such.wav"}}), 0);
    EXPECT_EQ(file.error().find(unexpected + "Could not open /no/such.wav: "), 0);
    Channel serial("serial");
    const std::pair<const char*, const char*> ports[] = {
        {"/no/such", "No such file or directory"}, {"/dev/null", "Inappropriate ioctl for device"}};
    for (const auto& [port, reason] : ports) {
        ASSERT_EQ(serial.init({{"Port", port}}), 1);
        EXPECT_EQ(serial.open(), 0);
        EXPECT_EQ(serial.error(), unexpected + "Could not open " + port + ": " + reason);
    }
}
