// What holds for every exported function of a channel or stream: one table of calls, and for each
// the null handle, the last error, failures of the core, missing streams, wrong directions and
// failing allocations and null pointers.

#include "scripted/ChannelFixture.hpp"

#include <filesystem>

using namespace scripted;

// A call with a handle, whose answer is a flag, a number or an array.
#define CALL(function, ...)                                                                        \
    [&](void* handle, void* array) {                                                               \
        [[maybe_unused]] auto* const flag = static_cast<uint8_t*>(array);                          \
        [[maybe_unused]] auto* const number = static_cast<double*>(array);                         \
        return coder##function(handle __VA_OPT__(, ) __VA_ARGS__);                                 \
    }

class ExportedCallsTest : public ChannelTest
{
protected:
    enum Target { Channels, Streams, Inputs, Outputs };

    struct Call {
        Target target;
        int clears;            ///< whether it clears the last error
        std::string operation; ///< the core's operation, if any
        std::string argument;  ///< the argument that takes the answer, if any
        std::function<bool(void* handle, void* answer)> run;
    };

    ExportedCallsTest() { refresh(); }

    /// New handles, a property, a stored buffer and an unwritten answer.
    void refresh()
    {
        init(scalar("p", 1.0));
        core.on["read"] = [] {
            const AllocationsAllowed allowed;
            core.delivery = {dataBuffer({scalar(text, 1.0)})};
        };
        EXPECT_EQ(coderInputStreamReadBuffers(input, 1, 1), 1);
        core.counts = {1};
        answer = Buffer(8);
    }

    std::vector<void*> handles(const Call& call) const
    {
        const AllocationsAllowed allowed;
        const std::vector<void*> all[] = {{channel}, {input, output}, {input}, {output}};
        return all[call.target];
    }

    /// The last error after a call that fails and answers nothing, or 0 where it resets first.
    std::string failure(const Call& call, void* handle)
    {
        answer = Buffer(8);
        EXPECT_FALSE(call.run(handle, answer.data())) << &call - calls.data();
        const bool resets = call.argument == "totalCounts" || call.argument == "written";
        EXPECT_EQ(answer.written(), resets ? std::string(8, 0) : "");
        return lastError();
    }

    /// Lets each allocation of a call fail in turn. The call returns "|" or its error.
    void sweep(const std::function<std::string()>& run)
    {
        bool failed = true;
        for (long k = 1; failed; ++k) {
            ASSERT_LT(k, 100);
            refresh();
            failingAllocation = k;
            const std::string result = run();
            failed = std::exchange(failingAllocation, 0) == 0;
            EXPECT_EQ(result, failed ? unexpected + "std::bad_alloc" : "|");
        }
    }

    static constexpr const char* text = "a text that needs memory of its own";
    Buffer answer{8};
    double counts = 1, buffers = 1;

    const std::vector<Call> calls = {
        {Channels, 1, "init", "", CALL(ChannelInit, 1, text, "char", 9, text)},
        {Channels, 1, "open", "", CALL(ChannelOpen, 1, text, "int8", 9, text)},
        {Channels, 1, "execute", "", CALL(ChannelExecute, "", 1, text, "int8", 1, text)},
        {Channels, 1, "close", "", CALL(ChannelClose)},
        {Channels, 1, "term", "", CALL(ChannelTerm)},
        {Channels, 1, "isOpen", "open", CALL(ChannelIsOpen, flag)},
        {Channels, 1, "", "", CALL(ChannelGetInputStream)},
        {Channels, 1, "", "", CALL(ChannelGetOutputStream)},
        {Channels, 1, "", "destination", CALL(ChannelGetPropertyValue, "p", "double", 1, array)},
        {Channels, 0, "", "", CALL(ChannelGetLastError, id, message)},
        {Channels, 0, "", "hasError", CALL(ChannelHasSyncError, flag)},
        {Channels, 0, "", "", CALL(ChannelGetLastSyncError, id, message)},
        {Channels, 1, "", "hasError", CALL(ChannelHasAsyncError, flag)},
        {Channels, 0, "", "", CALL(ChannelGetLastAsyncError, id, message)},
        {Streams, 0, "", "", CALL(StreamGetChannel)},
        {Streams, 1, "", "supported", CALL(StreamIsSupported, flag)},
        {Streams, 1, "isDeviceDone", "done", CALL(StreamIsDeviceDone, flag)},
        {Streams, 1, "isOpen", "open", CALL(StreamIsOpen, flag)},
        {Streams, 1, "getCountDimension", "dimension", CALL(StreamGetCountDimension, number)},
        {Streams, 1, "getDataAvailable", "available", CALL(StreamGetDataAvailable, number)},
        {Streams, 1, "getSpaceAvailable", "space", CALL(StreamGetSpaceAvailable, number)},
        {Streams, 1, "flush", "", CALL(StreamFlush)},
        {Streams, 1, "addFilter", "", CALL(StreamAddFilter, text, 1, text, "int8", 1, text)},
        {Streams, 1, "tuneFilters", "", CALL(StreamTuneFilters, 1, text, "int8", 1, text)},
        {Inputs, 1, "peekCounts", "totalCounts",
         CALL(InputStreamPeek, number, &counts, &buffers, 1)},
        {Inputs, 1, "read", "", CALL(InputStreamReadBuffers, 1, 1)},
        {Inputs, 1, "", "destination",
         CALL(InputStreamReadBufferData, 1, 0, text, "double", 1, array)},
        {Outputs, 1, "write", "written",
         CALL(OutputStreamWriteTypedDataOld, number, 1, "int8", 9, text)},
    };
};

TEST_F(ExportedCallsTest, FailuresAnswerNothingAndLastErrorIsClearedOrKept)
{
    coderInputStreamFreeBuffer(nullptr, 1);
    coderChannelDestroy(nullptr);
    for (const Call& call : calls) {
        failure(call, nullptr);
        for (std::size_t i = 0; i < handles(call).size(); ++i) {
            refresh();
            EXPECT_EQ(coderChannelIsOpen(channel, nullptr), 0);
            EXPECT_TRUE(call.run(handles(call)[i], answer.data()));
            EXPECT_EQ(lastError() == "|", call.clears != 0) << &call - calls.data();
            if (!call.operation.empty()) {
                core.on[call.operation] = [] { throw brenixcore::CouldNotLoadFilter(""); };
                EXPECT_EQ(failure(call, handles(call)[i]), "brenix:Stream:couldNotLoadFilter|");
            }
        }
    }
}

TEST_F(ExportedCallsTest, MissingStreamsAndWrongDirectionsAreNotSupported)
{
    const std::string noInput = "brenix:InputStream:notSupported|";
    const std::string noOutput = "brenix:OutputStream:notSupported|";
    for (const Call& call : calls) {
        if (call.target == Inputs || call.target == Outputs) {
            const bool isInput = call.target == Inputs;
            EXPECT_EQ(failure(call, isInput ? output : input), isInput ? noInput : noOutput);
        }
    }
    coderInputStreamFreeBuffer(output, 1);
    EXPECT_EQ(lastError(), "|");
    core.hasStreams = false;
    init();
    for (const Call& call : calls) {
        for (void* handle : handles(call)) {
            if (call.target != Channels && !call.operation.empty()) {
                EXPECT_EQ(failure(call, handle), handle == input ? noInput : noOutput);
            }
        }
    }
    // Nor are the options read.
    EXPECT_EQ(coderStreamAddFilter(input, "f", 1, "o", "int24", 1, ""), 0);
    EXPECT_EQ(lastError(), noInput);
    EXPECT_EQ(coderStreamTuneFilters(output, 1, "o", "int24", 1, ""), 0);
    EXPECT_EQ(lastError(), noOutput);
    EXPECT_EQ(takeLog(), Log{});
    uint8_t supported = 2;
    EXPECT_EQ(coderStreamIsSupported(input, &supported), 1);
    EXPECT_EQ(supported, 0);
}

TEST_F(ExportedCallsTest, EveryAllocationMayFail)
{
    for (const Call& call : calls) {
        sweep([&] { return call.run(handles(call)[0], answer.data()) ? "|" : lastError(); });
    }
    const std::string path = std::filesystem::current_path();
    Buffer absolute(CODER_PATH_SIZE);
    sweep([&] {
        coderComputeAbsolutePath(path.c_str(), absolute);
        const AllocationsAllowed allowed;
        return absolute.text() == path ? "|" : unexpected + "std::bad_alloc";
    });
    sweep([&] {
        void* const created = coderChannelCreate(text, text, id, message, 0, 0);
        const AllocationsAllowed allowed;
        failingAllocation = 1;
        coderChannelDestroy(created); // needs no memory
        EXPECT_EQ(std::exchange(failingAllocation, 0), 1);
        return created == nullptr ? error() : "|";
    });
}

TEST_F(ExportedCallsTest, NullPointersAreNamed)
{
    EXPECT_ANY_THROW(raiseEvent("error", "id", "m"));
    std::thread(raiseEvent, "error", "id", "m").join();
    takeLog();
    const auto expectNamed = [&](int result, const std::string& argument) {
        EXPECT_EQ(result, 0);
        EXPECT_EQ(lastError(), unexpected + "Argument " + argument + " must not be null.");
    };
    for (const Call& call : calls) {
        if (!call.argument.empty()) {
            expectNamed(call.run(handles(call)[0], nullptr), call.argument);
        }
    }
    double total = 0;
    char* const m = message;
    expectNamed(coderChannelGetLastSyncError(channel, nullptr, m), "errorId");
    expectNamed(coderChannelGetLastSyncError(channel, m, nullptr), "errorMessage");
    expectNamed(coderChannelGetLastAsyncError(channel, nullptr, m), "errorId");
    expectNamed(coderChannelGetLastAsyncError(channel, m, nullptr), "errorMessage");
    expectNamed(coderInputStreamPeek(input, &total, &counts, nullptr, 1), "numBuffers");
    expectNamed(coderInputStreamPeek(input, &total, nullptr, &buffers, 1), "bufferCounts");
    expectNamed(coderChannelGetLastError(channel, nullptr, m), "bufferCounts"); // still this one
    expectNamed(coderChannelGetLastError(channel, m, nullptr), "bufferCounts");
    EXPECT_EQ(answer.written(), "");
    EXPECT_EQ(takeLog(), Log{});
    EXPECT_EQ(syncError() + asyncError(), "id|mid|m"); // still there
}
