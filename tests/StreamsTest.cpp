// Stream handles: queries, peeking, reading and writing.

#include "scripted/ChannelFixture.hpp"

#include <climits>
#include <cmath>
#include <limits>

using namespace scripted;

namespace
{

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
        Buffer destination(4);
        if (coderInputStreamReadBufferData(input, index, fieldIndex, name, type, capacity,
                                           destination.data()) == 1) {
            return std::to_string(*destination.as<int32_t>());
        }
        EXPECT_EQ(destination.written(), "");
        return lastError().substr(unexpected.size());
    }
};

} // namespace

TEST_F(StreamsTest, QueriesAskTheCore)
{
    using Query = int (*)(void*, double*) noexcept;
    const std::pair<Query, std::string> queries[] = {
        {coderStreamGetCountDimension, "getCountDimension()"},
        {coderStreamGetDataAvailable, "getDataAvailable()"},
        {coderStreamGetSpaceAvailable, "getSpaceAvailable()"}};
    for (const auto& [stream, side] : {std::pair{input, "input."s}, {output, "output."s}}) {
        for (const uint8_t answer : {uint8_t{1}, uint8_t{0}}) {
            core.flag = answer != 0;
            Buffer flags(2);
            EXPECT_EQ(coderStreamIsDeviceDone(stream, flags.as<uint8_t>()), 1);
            EXPECT_EQ(coderStreamIsOpen(stream, flags.as<uint8_t>() + 1), 1);
            EXPECT_EQ(flags.written(), bytesOf({answer, answer}));
        }
        for (const unsigned long count : {0UL, (1UL << 53) + 1, 1UL << 63, ULONG_MAX}) {
            core.number = count;
            for (const auto& [query, operation] : queries) {
                Buffer number(8);
                EXPECT_EQ(query(stream, number.as<double>()), 1);
                EXPECT_EQ(number.written(), bytesOf({std::ldexp(double(count >> 1), 1)}));
                EXPECT_EQ(takeLog().back(), side + operation);
            }
        }
        core.unlimited = true;
        double space = 0;
        EXPECT_EQ(coderStreamGetSpaceAvailable(stream, &space), 1);
        EXPECT_EQ(space, INFINITY);
        EXPECT_EQ(coderStreamFlush(stream), 1);
        EXPECT_EQ(coderStreamAddFilter(stream, "f", 1, CODER_OPTION("a", "char", 1, "b")), 1);
        EXPECT_EQ(coderStreamTuneFilters(stream, 0), 1);
        EXPECT_EQ(takeLog(), (Log{side + "isUnlimited()", side + "flush()",
                                  side + "addFilter(f, a=char b)", side + "tuneFilters()"}));
        core.unlimited = false;
    }
}

TEST_F(StreamsTest, OrderOfChecks)
{
    core.hasInput = core.hasOutput = false;
    init();
    double number = 0;
    EXPECT_EQ(coderStreamAddFilter(input, "f", 1, CODER_OPTION("o", "int24", 1, "")), 0);
    EXPECT_EQ(lastError(), "brenix:InputStream:notSupported|");
    EXPECT_EQ(coderStreamTuneFilters(output, 1, CODER_OPTION("o", "int24", 1, "")), 0);
    EXPECT_EQ(lastError(), "brenix:OutputStream:notSupported|");
    EXPECT_EQ(coderStreamAddFilter(input, nullptr, 0), 0);
    EXPECT_TRUE(lastError().starts_with(unexpected));
    EXPECT_EQ(coderOutputStreamWriteTypedDataOld(output, &number, 1, nullptr), 0);
    EXPECT_TRUE(lastError().starts_with(unexpected));
    EXPECT_EQ(field(1), "Data buffer index: 1 not found.");
    EXPECT_EQ(takeLog(), Log{});
}

TEST_F(StreamsTest, Peek)
{
    const double nan = std::nan("");
    const std::vector<unsigned long> four = {10, 10, 10, 5};
    const std::string all = bytesOf({10.0, 10.0, 10.0, 5.0});
    const std::string most = "18446744073709551615";
    const struct {
        std::vector<unsigned long> waiting;
        double capacity, maxCounts;
        std::string limit, written;
        double reported, total;
    } rows[] = {
        {four, 2.9, 2.9, "2", all.substr(0, 16), 2, 20},
        {four, 4, -1, "0", all, 4, 35},
        {four, INFINITY, INFINITY, most, all, 4, 35},
        {four, 0, nan, most, "", 0, 0},
        {four, -3, 1, "1", "", 0, 0},
        {four, nan, 1, "1", "", 0, 0},
        {{}, 4, 1, "1", "", 0, 0},
        {{ULONG_MAX, 3}, 4, 1, "1", bytesOf({0x1p64, 3.0}), 2, 2}, // the sum has 64 bits
    };
    core.number = 77; // the core's own total is not reported
    for (const auto& row : rows) {
        core.counts = row.waiting;
        Buffer total(8);
        Buffer counts(32);
        Buffer buffers(8);
        *buffers.as<double>() = row.capacity;
        EXPECT_EQ(coderInputStreamPeek(input, total.as<double>(), counts.as<double>(),
                                       buffers.as<double>(), row.maxCounts),
                  1);
        EXPECT_EQ(total.written() + buffers.written(), bytesOf({row.total, row.reported}));
        EXPECT_EQ(counts.written(), row.written);
        EXPECT_EQ(takeLog(), (Log{"input.peekCounts(" + row.limit + ")"}));
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
    core.on["read"] = [] { throw brenixcore::SynchronousInputNotPossible(""); };
    EXPECT_EQ(read({}, 1, 0), "brenix:InputStream:synchronousInputNotPossible|");
    core.on.clear();
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
    EXPECT_EQ(read({}, 0, 0), "|");
    EXPECT_EQ(takeLog(), (Log{"input.read(0)", "destroy(c)", "destroy(d)"}));
    EXPECT_EQ(field(1), "Data buffer index: 1 not found.");
}

TEST_F(StreamsTest, FieldsAreFoundByNameIndexOrFirst)
{
    read({dataBuffer({scalar("Data2", 2), scalar("data", 5), scalar("Data-1", 4), scalar("Time", 3),
                      scalar("Time1", 6), nullptr}),
          dataBuffer({})},
         2, 2);
    const struct {
        int32_t buffer, index;
        const char* name;
        const char* type;
        std::string expected;
    } rows[] = {
        {1, 2, "Data", "int32", "2"},
        {1, -1, "Data", "int32", "4"},
        {1, 1, "Time", "int32", "3"}, // the name itself comes first
        {1, 9, "", "int32", "4"},     // the first in byte order
        {1, 3, "Data", "int24", "Data buffer field: Data not found for index: 3"},
        {1, 2, "Data", "int24", "Data buffer field: Data is not a supported type: int24"},
        {1, 2, "Data", "double", "Property: Data is not of the expected type: double"},
        {1, 2, "", "int24", "Data buffer field:  is not a supported type: int24"},
        {1, 0, "null", "int32", "Property: null is not of the expected type: int32"},
        {2, 0, "", "int32", "No data found in the data buffer."},
        {2, INT_MIN, "D", "int32", "Data buffer field: D not found for index: -2147483648"},
    };
    for (const auto& row : rows) {
        for (int i = 0; i < 2; ++i) { // reading takes nothing away
            EXPECT_EQ(field(row.buffer, row.name, row.index, row.type), row.expected);
        }
    }
    EXPECT_EQ(field(1, "Time", 0, "int32", 0),
              "Property value: Time is too large for allocated space.");
    EXPECT_NE(field(1, nullptr).find("null"), std::string::npos);
    EXPECT_NE(field(1, "", 0, nullptr).find("null"), std::string::npos);
}

TEST_F(StreamsTest, Writes)
{
    const auto write = [&](uint64_t count, const char* type, int elements, const void* data,
                           int elements2 = 0, const void* data2 = nullptr) {
        Buffer written(8);
        const bool ok = coderOutputStreamWriteTypedDataOld(output, written.as<double>(), count,
                                                           type, CODER_BUFFER(elements, data),
                                                           CODER_BUFFER(elements2, data2)) == 1;
        EXPECT_EQ(written.written(), bytesOf({ok ? 0x1p64 : 0.0}));
        return ok ? takeLog().at(0) : lastError().substr(unexpected.size());
    };
    core.number = ULONG_MAX;
    forEachType([&](const std::string& type, auto zero) {
        const decltype(zero) data[] = {1, 0};
        EXPECT_EQ(write(2, type.c_str(), 2, data, 1, data),
                  "output.write(;data=" + type + "*[1,0];data=" + type + "*[1])");
    });
    const std::string length = "Unsupported length for data data. Length must be 1 or greater.";
    EXPECT_EQ(write(1, "logical", 4, "\2\1\3\xFF"), "output.write(;data=logical*[2,1,3,255])");
    EXPECT_EQ(write(2, "char", 8, "hi"), "output.write(;data=char hi;data=char )");
    EXPECT_EQ(write(0, "int24", 0, nullptr), "output.write()");
    EXPECT_EQ(write(UINT64_MAX, "int24", 0, nullptr),
              "Unsupported type: int24 for data being written.");
    EXPECT_EQ(write(3, "int8", 1, "x", 0, "y"), length);
    EXPECT_EQ(write(2, "int8", 1, "x", 1, nullptr), "No data for data.");
    EXPECT_EQ(write(2, "char", 1, "x", 1, nullptr), "No data for data.");
    EXPECT_EQ(takeLog(), Log{});
}
