// What reading and writing answer to values at their extremes; RandomTest does the rest.

#include "scripted/ChannelFixture.hpp"

#include <numeric>

using namespace scripted;

class StreamsTest : public ChannelTest
{
protected:
    StreamsTest() { init(); }
};

TEST_F(StreamsTest, FieldsThatCannotBeRead)
{
    core.delivery = {dataBuffer({scalar("Data2", 2), nullptr}), dataBuffer({}), nullptr};
    EXPECT_EQ(coderInputStreamReadBuffers(input, INFINITY, 3), 1);
    EXPECT_EQ(takeLog(), (Log{"input.read(18446744073709551615)"}));
    const std::tuple<int32_t, const char*, int32_t, const char*, int32_t, std::string> rows[] = {
        {INT_MIN, "", 0, "int32", 1, "Data buffer index: -2147483648 not found."},
        {-1, "", 0, "int32", 1, "Data buffer index: -1 not found."},
        {0, "", 0, "int32", 1, "Data buffer index: 0 not found."},
        {3, "", 0, "int32", 1, "Data buffer index: 3 not found."},
        {INT_MAX, "", 0, "int32", 1, "Data buffer index: 2147483647 not found."},
        {2, "", 0, "int32", 1, "No data found in the data buffer."},
        {2, "D", INT_MIN, "", 1, "Data buffer field: D not found for index: -2147483648"},
        {1, "Data", INT_MAX, "", 1, "Data buffer field: Data not found for index: 2147483647"},
        {1, "Data", 2, "int24", 1, "Data buffer field: Data is not a supported type: int24"},
        {1, "", 2, "", 1, "Data buffer field:  is not a supported type: "},
        {1, "Data", 2, "int8", 1, "Property: Data is not of the expected type: int8"},
        {1, "null", 0, "int32", 1, "Property: null is not of the expected type: int32"},
        {1, "Data", 2, "int32", 0, "Property value: Data is too large for allocated space."},
        {1, "", 2, "int32", INT_MIN, "Property value:  is too large for allocated space."},
        {1, nullptr, 0, "int32", 1, "basic_string: construction from null is not valid"},
        {1, "", 0, nullptr, 1, "basic_string: construction from null is not valid"},
    };
    Buffer to(sizeof(int));
    for (const auto& [index, name, fieldIndex, type, capacity, text] : rows) {
        EXPECT_EQ(coderInputStreamReadBufferData(input, index, fieldIndex, name, type, capacity,
                                                 to.data()),
                  0);
        EXPECT_EQ(unexpectedError(), text);
    }
    EXPECT_EQ(to.written(), "");
    EXPECT_EQ(coderInputStreamReadBufferData(input, 1, 2, "Data", "int32", 1, to.data()), 1);
    EXPECT_EQ(to.written(), "\2\0\0\0"s);
}

TEST_F(StreamsTest, PeekFillsTheArrayThatThereIs)
{
    core.counts = {3, 4, 1};
    const std::tuple<double, double, double, std::string> rows[] = {
        // size of the array, most counts; total, as the core is to see it
        {NAN, 2.9, 0, "2"},
        {-1, -1, 0, "0"},
        {0.9, 0x1p64, 0, "18446744073709551615"},
        {1, 1e18, 3, "1000000000000000000"},
        {2.9, 0, 7, "0"},
        {INFINITY, 0.9, 8, "0"},
    };
    for (const auto& [size, most, sum, limit] : rows) {
        Buffer counts(3 * sizeof(double));
        auto* const array = size >= 1 ? reinterpret_cast<double*>(counts.data()) : nullptr;
        double total = -1;
        double buffers = size;
        ASSERT_EQ(coderInputStreamPeek(input, &total, array, &buffers, most), 1);
        const double all[] = {3, 4, 1};
        EXPECT_EQ(counts.written(), bytesOf(all, static_cast<std::size_t>(buffers)));
        EXPECT_EQ(std::accumulate(all, all + static_cast<int>(buffers), 0.0), sum);
        EXPECT_EQ(total, sum);
        EXPECT_EQ(takeLog(), Log{"input.peekCounts(" + limit + ")"});
    }
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
