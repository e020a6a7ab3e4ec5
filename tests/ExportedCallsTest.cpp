// What holds for every exported function of a channel or stream: one table of calls, and for each
// wrong handles, the last error, failures of the core, missing streams, wrong directions, null
// pointers and failing allocations, which SweepTest lets fail with the built core as well.

#include "Calls.hpp"
#include "scripted/ChannelFixture.hpp"

#include <filesystem>

using namespace scripted;

class ExportedCallsTest : public ChannelTest
{
protected:
    ExportedCallsTest() { refresh(); }

    /// New handles, a property, a stored buffer and an unwritten answer.
    void refresh()
    {
        init(scalar("p", 1.0));
        core.on["read"] = [] {
            const allocations::Allowed allowed;
            core.delivery = {dataBuffer({scalar(Calls::text, 1.0)})};
        };
        EXPECT_EQ(coderInputStreamReadBuffers(input, 1, 1), 1);
        core.counts = {1};
        answer = Buffer(8);
    }

    std::vector<void*> handles(const Call& call) const
    {
        return call.handles(channel, input, output);
    }

    /// The last error after a call that fails and answers nothing, or 0 where it resets first.
    std::string failure(const Call& call, void* handle)
    {
        answer = Buffer(8);
        EXPECT_FALSE(call.run(handle, answer.data())) << &call - calls.rows.data();
        EXPECT_EQ(answer.written(), call.resets() ? std::string(8, 0) : "");
        return lastError();
    }

    Buffer answer{8};
    Calls calls{"p", Calls::text, Calls::text, Calls::text};
};

TEST_F(ExportedCallsTest, FailuresAnswerNothingAndLastErrorIsClearedOrKept)
{
    coderChannelDestroy(nullptr);
    coderChannelDestroy(input);
    EXPECT_EQ(coderChannelIsOpen(channel, nullptr), 0);
    const std::string before = lastError();
    coderInputStreamFreeBuffer(nullptr, 1);
    coderInputStreamFreeBuffer(channel, 1);
    for (const Call& call : calls.rows) {
        EXPECT_EQ(failure(call, nullptr), before);
        EXPECT_EQ(failure(call, call.target == Channels ? input : channel), before);
    }
    for (const Call& call : calls.rows) {
        for (std::size_t i = 0; i < handles(call).size(); ++i) {
            refresh();
            EXPECT_EQ(coderChannelIsOpen(channel, nullptr), 0);
            EXPECT_TRUE(call.run(handles(call)[i], answer.data()));
            EXPECT_EQ(lastError() == "|", call.clears != 0) << &call - calls.rows.data();
            if (!call.operation.empty()) {
                core.on[call.operation] = [] { throw brenixcore::CouldNotLoadFilter(""); };
                EXPECT_EQ(failure(call, handles(call)[i]), "brenix:Stream:couldNotLoadFilter|");
            }
        }
    }
}

TEST_F(ExportedCallsTest, MissingStreamsAndWrongDirectionsAreNotSupported)
{
    for (const Call& call : calls.rows) {
        if (call.target == Inputs || call.target == Outputs) {
            const bool isInput = call.target == Inputs;
            EXPECT_EQ(failure(call, isInput ? output : input), notSupported(isInput));
        }
    }
    coderInputStreamFreeBuffer(output, 1);
    EXPECT_EQ(lastError(), "|");
    const auto expectNone = [&](void* noInput, void* noOutput) {
        for (const Call& call : calls.rows) {
            for (void* handle : call.handles(channel, noInput, noOutput)) {
                if (call.target != Channels && !call.operation.empty()) {
                    EXPECT_EQ(failure(call, handle), notSupported(handle == noInput));
                }
            }
        }
    };
    void* const old[] = {input, output};
    init();
    expectNone(old[0], old[1]);
    core.hasStreams = false;
    init();
    expectNone(old[0], old[1]);
    expectNone(input, output);
    // Nor are the options read.
    EXPECT_EQ(coderStreamAddFilter(input, "f", 1, "o", "int24", 1, ""), 0);
    EXPECT_EQ(lastError(), notSupported(true));
    EXPECT_EQ(coderStreamTuneFilters(output, 1, "o", "int24", 1, ""), 0);
    EXPECT_EQ(lastError(), notSupported(false));
    EXPECT_EQ(takeLog(), Log{});
    uint8_t supported = 2;
    EXPECT_EQ(coderStreamIsSupported(input, &supported), 1);
    EXPECT_EQ(supported, 0);
}

TEST_F(ExportedCallsTest, EveryAllocationMayFail)
{
    const allocations::PrintPoints print;
    const std::string outOfMemory = unexpected + "std::bad_alloc";
    for (const Call& call : calls.rows) {
        for (std::size_t i = 0; i < handles(call).size(); ++i) {
            allocations::sweep([&](long number, bool lasts) {
                refresh();
                void* const handle = handles(call)[i];
                const allocations::Failing failing(number, lasts);
                const bool result = call.run(handle, answer.data());
                const bool failed = failing.end();
                EXPECT_EQ(result, !failed);
                EXPECT_EQ(failed ? lastError() : "|", failed ? outOfMemory : "|");
                if (failed) {
                    EXPECT_EQ(answer.written(), call.resets() ? std::string(8, 0) : "");
                }
                return failed;
            });
        }
    }
    // A plug-in's error is kept, whatever becomes of the exception that tells the core.
    allocations::sweep([&](long number, bool lasts) {
        const allocations::Failing failing(number, lasts);
        EXPECT_ANY_THROW(raiseEvent("error", "id", "m"));
        const bool failed = failing.end();
        EXPECT_EQ(syncError(), "id|m");
        return failed;
    });
    allocations::sweep([&](long number, bool lasts) {
        const char* const text = Calls::text;
        id = message = Buffer(CODER_ERROR_SIZE);
        const allocations::Failing failing(number, lasts);
        void* const created = coderChannelCreate(text, text, id, message, 0, 0);
        const bool failed = failing.end();
        EXPECT_EQ(created == nullptr, failed);
        EXPECT_EQ(failed ? error() : "|", failed ? outOfMemory : "|");
        coderChannelDestroy(created);
        return failed;
    });
    const std::string path = std::filesystem::current_path();
    allocations::sweep([&](long number, bool lasts) {
        Buffer absolute(CODER_PATH_SIZE);
        const allocations::Failing failing(number, lasts);
        coderComputeAbsolutePath(path.c_str(), absolute);
        const bool failed = failing.end();
        EXPECT_EQ(absolute.text(), failed ? "" : path);
        return failed;
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
    for (const Call& call : calls.rows) {
        if (!call.argument.empty()) {
            expectNamed(call.run(handles(call)[0], nullptr), call.argument);
        }
    }
    double total = 0;
    double size = 1;
    char* const m = message;
    expectNamed(coderChannelGetLastSyncError(channel, nullptr, m), "errorId");
    expectNamed(coderChannelGetLastSyncError(channel, m, nullptr), "errorMessage");
    expectNamed(coderChannelGetLastAsyncError(channel, nullptr, m), "errorId");
    expectNamed(coderChannelGetLastAsyncError(channel, m, nullptr), "errorMessage");
    expectNamed(coderInputStreamPeek(input, &total, &total, nullptr, 1), "numBuffers");
    expectNamed(coderInputStreamPeek(input, &total, nullptr, &size, 1), "bufferCounts");
    expectNamed(coderChannelGetLastError(channel, nullptr, m), "bufferCounts"); // still this one
    expectNamed(coderChannelGetLastError(channel, m, nullptr), "bufferCounts");
    EXPECT_EQ(answer.written(), "");
    EXPECT_EQ(takeLog(), Log{});
    EXPECT_EQ(syncError() + asyncError(), "id|mid|m"); // still there
}
