// Stream handles: queries, peeking, reading and writing.

#include "scripted/ChannelFixture.hpp"

#include <gmock/gmock.h>

using namespace scripted;

class StreamsTest : public ChannelTest
{
protected:
    StreamsTest() { init(); }

    /// Reads buffers that the core delivers; the last error.
    std::string read(const std::vector<void*>& delivery, double counts, double expected)
    {
        core.delivery = delivery;
        coderInputStreamReadBuffers(input, counts, expected);
        return lastError();
    }

    /// The int32 value of a field of a stored buffer, or the error.
    std::string field(int32_t index, const char* name = "", int32_t fieldIndex = 0,
                      const char* type = "int32", int32_t capacity = 1)
    {
        int32_t value = 0;
        const int result =
            coderInputStreamReadBufferData(input, index, fieldIndex, name, type, capacity, &value);
        return result == 1 ? std::to_string(value) : unexpectedError();
    }
};

TEST_F(StreamsTest, QueriesAskTheCore)
{
    for (const auto& [stream, side] : {std::pair{input, "input."s}, {output, "output."s}}) {
        for (const uint8_t answer : {uint8_t{1}, uint8_t{0}}) {
            core.flag = answer == 1;
            uint8_t flags[] = {2, 2};
            EXPECT_EQ(coderStreamIsDeviceDone(stream, flags), 1);
            EXPECT_EQ(coderStreamIsOpen(stream, flags + 1), 1);
            EXPECT_EQ(flags[0] + 2 * flags[1], 3 * answer);
        }
        takeLog();
        double numbers[4] = {};
        core.number = (1UL << 53) + 1;
        EXPECT_EQ(coderStreamGetCountDimension(stream, numbers), 1);
        EXPECT_EQ(coderStreamGetDataAvailable(stream, numbers + 1), 1);
        EXPECT_EQ(coderStreamGetSpaceAvailable(stream, numbers + 2), 1);
        core.unlimited = true;
        EXPECT_EQ(coderStreamGetSpaceAvailable(stream, numbers + 3), 1);
        core.unlimited = false;
        EXPECT_THAT(numbers, testing::ElementsAre(0x1p53, 0x1p53, 0x1p53, INFINITY));
        EXPECT_EQ(coderStreamFlush(stream), 1);
        EXPECT_EQ(coderStreamAddFilter(stream, "f", 1, CODER_OPTION("a", "char", 1, "b")), 1);
        EXPECT_EQ(coderStreamTuneFilters(stream, 0), 1);
        EXPECT_THAT(core.log, testing::Each(testing::StartsWith(side)));
        EXPECT_EQ(takeLog()[6], side + "addFilter(f, [a])");
    }
}

TEST_F(StreamsTest, PeekReportsWhatFits)
{
    using Numbers = std::vector<double>;
    core.number = 77; // the core's own total is not reported
    // The counts that were written, their number and their sum.
    const auto peek = [&](std::vector<unsigned long> waiting, double capacity, double maxCounts) {
        core.counts = std::move(waiting);
        double total = -1;
        Buffer counts(32);
        auto* const numbers = reinterpret_cast<double*>(counts.data());
        EXPECT_EQ(coderInputStreamPeek(input, &total, numbers, &capacity, maxCounts), 1);
        Numbers all(numbers, numbers + counts.written().size() / sizeof(double));
        all.insert(all.end(), {capacity, total});
        return all;
    };
    EXPECT_EQ(peek({9, 9, 9, 5}, 2.9, 2.9), (Numbers{9, 9, 2, 18}));
    EXPECT_EQ(peek({9, 9, 9, 5}, 4, -1), (Numbers{9, 9, 9, 5, 4, 32}));
    EXPECT_EQ(takeLog(), (Log{"input.peekCounts(2)", "input.peekCounts(0)"}));
    EXPECT_EQ(peek({9, 9, 9, 5}, INFINITY, 1), (Numbers{9, 9, 9, 5, 4, 32}));
    EXPECT_EQ(peek({}, 4, 1), (Numbers{0, 0}));
    EXPECT_EQ(peek({ULONG_MAX, 3}, 4, 1), (Numbers{0x1p64, 3, 2, 2})); // the sum has 64 bits
    for (const double none : {0.0, -3.0, std::nan("")}) {
        EXPECT_EQ(peek({9, 9, 9, 5}, none, 1), (Numbers{0, 0}));
    }
}

TEST_F(StreamsTest, ReadsReplaceTheStoreOrLeaveIt)
{
    EXPECT_EQ(read({dataBuffer({scalar("a", 1)}), nullptr, dataBuffer({scalar("b", 2)})}, -1, 3),
              "|");
    EXPECT_EQ(takeLog(), (Log{"input.read(0)"}));
    for (const double expected : {3.0, std::nan(""), -1.0, 0.0}) {
        EXPECT_EQ(read({dataBuffer({scalar("x", 1)}), nullptr}, INFINITY, expected),
                  unexpected + "The number of buffers read did not match the expected number.");
        EXPECT_EQ(takeLog(), (Log{"input.read(18446744073709551615)", "destroy(x)"}));
    }
    EXPECT_EQ(field(1) + field(3), "12");
    coderInputStreamFreeBuffer(input, 1);
    takeLog();
    for (const int32_t index : {INT_MIN, -1, 0, 1, 2, 4, INT_MAX}) {
        coderInputStreamFreeBuffer(input, index);
        EXPECT_EQ(lastError(), "|");
        EXPECT_EQ(field(index), "Data buffer index: " + std::to_string(index) + " not found.");
    }
    EXPECT_EQ(field(3), "2");
    EXPECT_EQ(read({dataBuffer({scalar("c", 3), scalar("d", 4)})}, 2.9, 1), "|");
    EXPECT_EQ(takeLog(), (Log{"input.read(2)", "destroy(b)"}));
    EXPECT_EQ(read({dataBuffer({scalar("e", 5)}), dataBuffer({scalar("f", 6)})}, 0, 2), "|");
    EXPECT_EQ(takeLog(), (Log{"input.read(0)", "destroy(c)", "destroy(d)"}));
    EXPECT_EQ(read({}, 0, 0), "|");
    EXPECT_EQ(takeLog(), (Log{"input.read(0)", "destroy(e)", "destroy(f)"}));
    EXPECT_EQ(field(1), "Data buffer index: 1 not found.");
}

TEST_F(StreamsTest, FieldsAreFoundByNameIndexOrFirst)
{
    void* const fields = dataBuffer({scalar("Data2", 2), scalar("data", 5), scalar("Data-1", 4),
                                     scalar("Time", 3), scalar("Time1", 6), nullptr});
    EXPECT_EQ(read({fields, dataBuffer({})}, 2, 2), "|");
    EXPECT_EQ(field(1, "Data", 2) + field(1, "Data", -1), "24");
    EXPECT_EQ(field(1, "Time", 1) + field(1, "", 9), "34"); // itself, and the first in byte order
    const std::string unknown = " is not a supported type: int24";
    EXPECT_EQ(field(1, "Data", 3, "int24"), "Data buffer field: Data not found for index: 3");
    EXPECT_EQ(field(1, "Data", 2, "int24"), "Data buffer field: Data" + unknown);
    EXPECT_EQ(field(1, "", 2, "int24"), "Data buffer field: " + unknown);
    EXPECT_EQ(field(1, "Data", 2, "int8"), "Property: Data is not of the expected type: int8");
    EXPECT_EQ(field(1, "null"), "Property: null is not of the expected type: int32");
    EXPECT_EQ(field(2), "No data found in the data buffer.");
    EXPECT_EQ(field(2, "D", INT_MIN), "Data buffer field: D not found for index: -2147483648");
    EXPECT_EQ(field(1, "Time", 0, "int32", 0),
              "Property value: Time is too large for allocated space.");
    EXPECT_NE(field(1, nullptr).find("null"), std::string::npos);
    EXPECT_NE(field(1, "", 0, nullptr).find("null"), std::string::npos);
}

TEST_F(StreamsTest, Writes)
{
    const auto write = [&](uint64_t count, const char* type, int elements, const void* data,
                           int elements2 = 0, const void* data2 = nullptr) {
        double written = -1;
        const bool ok = coderOutputStreamWriteTypedDataOld(output, &written, count, type, elements,
                                                           data, elements2, data2);
        EXPECT_EQ(written, ok ? 0x1p64 : 0.0);
        return ok ? takeLog().at(0) : unexpectedError();
    };
    core.number = ULONG_MAX;
    EXPECT_EQ(write(2, "logical", 1, "", 4, "\2\1\3\xFF"), "output.write(2)");
    const auto& logical = as<TPointerProperty<bool>>(*core.written.at(1), "data");
    EXPECT_EQ(bytesOf(logical.data, logical.count), "\2\1\3\xFF");
    EXPECT_EQ(write(2, "char", 8, "hi"), "output.write(2)");
    EXPECT_EQ(as<TScalarProperty<std::u16string>>(*core.written.at(0), "data").value, u"hi");
    EXPECT_EQ(write(0, "int24", 0, nullptr), "output.write(0)");
    EXPECT_EQ(write(UINT64_MAX, "i", 0, nullptr), "Unsupported type: i for data being written.");
    EXPECT_EQ(write(2, "int8", 1, "x", 0, "y"),
              "Unsupported length for data data. Length must be 1 or greater.");
    EXPECT_EQ(write(2, "int8", 1, "x", 1, nullptr), "No data for data.");
    EXPECT_NE(write(1, nullptr, 1, "x").find("null"), std::string::npos);
    EXPECT_EQ(takeLog(), Log{});
}
