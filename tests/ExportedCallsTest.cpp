// What holds for every exported function of a channel or stream: one table of calls, and for each
// the null handle, the last error, failures of the core, missing streams, wrong directions and
// failing allocations. A table of null pointers follows.

#include "scripted/ChannelFixture.hpp"

#include <filesystem>

using namespace scripted;

namespace
{

enum Target { Channels, Streams, Inputs, Outputs };

// A call with the handle h.
#define CALL(call) [&]([[maybe_unused]] void* h) { return call; }

struct Call {
    Target target;
    int clears;            ///< whether it clears the last error
    const char* operation; ///< the core's operation, if any
    std::function<bool(void*)> run;
};

class ExportedCallsTest : public ChannelTest
{
protected:
    ExportedCallsTest() { refresh(); }

    /// New handles, a property, a stored buffer and unwritten out-values.
    void refresh()
    {
        init(scalar<double>("p", 1));
        core.delivery = {dataBuffer({scalar<double>(text, 1)})};
        EXPECT_EQ(coderInputStreamReadBuffers(input, 1, 1), 1);
        flag = Buffer(1);
        number = Buffer(8);
        core.counts = {1};
        total = 1;
        core.on["read"] = [] {
            const AllocationsAllowed allowed;
            core.delivery = {dataBuffer({scalar<double>(text, 1)})};
        };
    }

    std::vector<void*> handles(Target target) const
    {
        const std::vector<void*> all[] = {{channel}, {input, output}, {input}, {output}};
        return all[target];
    }

    static constexpr const char* text = "a text that needs memory of its own";
    Buffer flag{1}, number{8};
    double total = 1, counts = 1, buffers = 1;
    uint8_t* f() { return flag.as<uint8_t>(); }
    double* n() { return number.as<double>(); }

    const std::vector<Call> calls = {
        {Channels, 1, "init", CALL(coderChannelInit(h, 1, text, "char", 9, text))},
        {Channels, 1, "open", CALL(coderChannelOpen(h, 1, text, "int8", 9, text))},
        {Channels, 1, "execute", CALL(coderChannelExecute(h, "c", 1, text, "int8", 1, text))},
        {Channels, 1, "close", coderChannelClose},
        {Channels, 1, "term", coderChannelTerm},
        {Channels, 1, "isOpen", CALL(coderChannelIsOpen(h, f()))},
        {Channels, 1, nullptr, coderChannelGetInputStream},
        {Channels, 1, nullptr, coderChannelGetOutputStream},
        {Channels, 1, nullptr, CALL(coderChannelGetPropertyValue(h, "p", "double", 1, n()))},
        {Channels, 0, nullptr, CALL(coderChannelGetLastError(h, id.data(), message.data()))},
        {Channels, 0, nullptr, CALL(coderChannelHasSyncError(h, f()))},
        {Channels, 0, nullptr, CALL(coderChannelGetLastSyncError(h, id.data(), message.data()))},
        {Channels, 1, nullptr, CALL(coderChannelHasAsyncError(h, f()))},
        {Channels, 0, nullptr, CALL(coderChannelGetLastAsyncError(h, id.data(), message.data()))},
        {Streams, 0, nullptr, coderStreamGetChannel},
        {Streams, 1, nullptr, CALL(coderStreamIsSupported(h, f()))},
        {Streams, 1, "isDeviceDone", CALL(coderStreamIsDeviceDone(h, f()))},
        {Streams, 1, "isOpen", CALL(coderStreamIsOpen(h, f()))},
        {Streams, 1, "getCountDimension", CALL(coderStreamGetCountDimension(h, n()))},
        {Streams, 1, "getDataAvailable", CALL(coderStreamGetDataAvailable(h, n()))},
        {Streams, 1, "getSpaceAvailable", CALL(coderStreamGetSpaceAvailable(h, n()))},
        {Streams, 1, "flush", coderStreamFlush},
        {Streams, 1, "addFilter", CALL(coderStreamAddFilter(h, text, 1, text, "int8", 1, text))},
        {Streams, 1, "tuneFilters", CALL(coderStreamTuneFilters(h, 1, text, "int8", 1, text))},
        {Inputs, 1, "peekCounts", CALL(coderInputStreamPeek(h, &total, &counts, &buffers, 1))},
        {Inputs, 1, "read", CALL(coderInputStreamReadBuffers(h, 1, 1))},
        {Inputs, 1, nullptr, CALL(coderInputStreamReadBufferData(h, 1, 0, text, "double", 1, n()))},
        {Outputs, 1, "write",
         CALL(coderOutputStreamWriteTypedDataOld(h, &total, 1, "int8", 9, text))},
    };
};

} // namespace

TEST_F(ExportedCallsTest, NullHandlesFailAndNothingElse)
{
    for (const Call& call : calls) {
        EXPECT_FALSE(call.run(nullptr));
    }
    coderInputStreamFreeBuffer(nullptr, 1);
    coderChannelDestroy(nullptr);
    EXPECT_EQ(flag.written() + number.written() + id.written() + message.written(), "");
    EXPECT_EQ(total, 0.0); // reset before all else
    EXPECT_EQ(counts, 1.0);
}

TEST_F(ExportedCallsTest, LastErrorIsClearedOrKeptAndFailuresWriteNothing)
{
    for (const Call& call : calls) {
        for (std::size_t i = 0; i < handles(call.target).size(); ++i) {
            SCOPED_TRACE(&call - calls.data());
            refresh();
            EXPECT_EQ(coderChannelIsOpen(channel, nullptr), 0);
            EXPECT_TRUE(call.run(handles(call.target)[i]));
            EXPECT_EQ(lastError() == "|", call.clears != 0);
            if (call.operation != nullptr) {
                refresh();
                core.on[call.operation] = [] { throw brenixcore::CouldNotLoadFilter(""); };
                EXPECT_FALSE(call.run(handles(call.target)[i]));
                EXPECT_EQ(lastError(), "brenix:Stream:couldNotLoadFilter|");
                EXPECT_EQ(flag.written() + number.written(), "");
                const bool resets = call.operation == "peekCounts"s || call.operation == "write"s;
                EXPECT_EQ(total, resets ? 0 : 1);
                core.on.clear();
            }
        }
    }
}

TEST_F(ExportedCallsTest, MissingStreamsAndWrongDirectionsAreNotSupported)
{
    const auto expectNotSupported = [&](const Call& call, void* handle, bool isInput) {
        SCOPED_TRACE(&call - calls.data());
        EXPECT_FALSE(call.run(handle));
        EXPECT_EQ(lastError(), "brenix:"s + (isInput ? "In" : "Out") + "putStream:notSupported|");
    };
    for (const Call& call : calls) {
        if (call.target == Inputs || call.target == Outputs) {
            const bool isInput = call.target == Inputs;
            expectNotSupported(call, isInput ? output : input, isInput);
        }
    }
    coderInputStreamFreeBuffer(output, 1);
    EXPECT_EQ(lastError(), "|");
    core.hasInput = core.hasOutput = false;
    init();
    for (const Call& call : calls) {
        for (void* handle : handles(call.target)) {
            if (call.target != Channels && call.operation != nullptr) {
                expectNotSupported(call, handle, handle == input);
            }
        }
    }
    EXPECT_EQ(takeLog(), Log{});
    EXPECT_EQ(coderStreamIsSupported(input, f()), 1);
    EXPECT_EQ(flag.written() + number.written(), "\0"s);
}

TEST_F(ExportedCallsTest, EveryAllocationMayFail)
{
    for (const Call& call : calls) {
        bool failed = true;
        for (long k = 1; failed; ++k) {
            SCOPED_TRACE(&call - calls.data());
            ASSERT_LT(k, 100);
            refresh();
            void* const handle = handles(call.target)[0];
            failingAllocation = k;
            const bool succeeded = call.run(handle);
            failed = std::exchange(failingAllocation, 0) == 0;
            EXPECT_NE(succeeded, failed);
            EXPECT_EQ(lastError(), failed ? unexpected + "std::bad_alloc" : "|");
        }
    }
    const std::string path = std::filesystem::current_path();
    bool failed = true;
    for (long k = 1; failed; ++k) {
        ASSERT_LT(k, 100);
        id = message = Buffer(CODER_ERROR_SIZE);
        Buffer absolute(CODER_PATH_SIZE);
        failingAllocation = k;
        coderComputeAbsolutePath(path.c_str(), absolute.data());
        failed = std::exchange(failingAllocation, k) == 0;
        EXPECT_EQ(absolute.text(), failed ? "" : path);
        void* const created = coderChannelCreate(text, text, id.data(), message.data(), 0, 0);
        const bool createFailed = std::exchange(failingAllocation, 1) == 0;
        coderChannelDestroy(created); // needs no memory
        EXPECT_EQ(std::exchange(failingAllocation, 0), 1);
        EXPECT_EQ(created == nullptr, createFailed);
        EXPECT_EQ(id.written(), createFailed ? "brenix:Channel:unexpectedException\0"s : "");
        failed = failed || createFailed;
    }
}

TEST_F(ExportedCallsTest, NullPointersAreNamed)
{
    char* const m = message.data();
    const std::pair<std::string, std::function<int(void*)>> rows[] = {
        {"open", CALL(coderChannelIsOpen(channel, nullptr))},
        {"hasError", CALL(coderChannelHasSyncError(channel, nullptr))},
        {"hasError", CALL(coderChannelHasAsyncError(channel, nullptr))},
        {"errorId", CALL(coderChannelGetLastSyncError(channel, nullptr, m))},
        {"errorMessage", CALL(coderChannelGetLastSyncError(channel, m, nullptr))},
        {"errorId", CALL(coderChannelGetLastAsyncError(channel, nullptr, m))},
        {"errorMessage", CALL(coderChannelGetLastAsyncError(channel, m, nullptr))},
        {"supported", CALL(coderStreamIsSupported(input, nullptr))},
        {"done", CALL(coderStreamIsDeviceDone(input, nullptr))},
        {"open", CALL(coderStreamIsOpen(input, nullptr))},
        {"dimension", CALL(coderStreamGetCountDimension(input, nullptr))},
        {"available", CALL(coderStreamGetDataAvailable(input, nullptr))},
        {"space", CALL(coderStreamGetSpaceAvailable(input, nullptr))},
        {"totalCounts", CALL(coderInputStreamPeek(input, nullptr, n(), &buffers, 1))},
        {"bufferCounts", CALL(coderInputStreamPeek(input, &total, nullptr, n(), 1))},
        {"numBuffers", CALL(coderInputStreamPeek(input, &total, n(), nullptr, 1))},
        {"destination",
         CALL(coderInputStreamReadBufferData(input, 1, 0, text, "double", 1, nullptr))},
        {"written", CALL(coderOutputStreamWriteTypedDataOld(output, nullptr, 0, ""))},
    };
    EXPECT_ANY_THROW(raiseEvent("error", "id", "m"));
    std::thread(raiseEvent, "error", "id", "m").join();
    takeLog();
    for (const auto& [argument, run] : rows) {
        EXPECT_EQ(run(nullptr), 0);
        EXPECT_EQ(lastError(), unexpected + "Argument " + argument + " must not be null.");
    }
    EXPECT_EQ(coderChannelGetLastError(channel, nullptr, m), 0);
    EXPECT_EQ(coderChannelGetLastError(channel, m, nullptr), 0);
    EXPECT_EQ(lastError(), unexpected + "Argument written must not be null.");
    EXPECT_EQ(number.written(), "");
    EXPECT_EQ(takeLog(), Log{});
    EXPECT_EQ(syncError() + asyncError(), "id|mid|m"); // still there
}
