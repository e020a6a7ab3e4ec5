// Typed values on their way in, as options, and out, as property values.

#include "scripted/ChannelFixture.hpp"

#include <climits>
#include <limits>
#include <sstream>

using namespace scripted;

namespace
{

class ValuesTest : public ChannelTest
{
protected:
    /// The options as the core receives them, or the error.
    std::string open(uint64_t count, const char* name, const char* type, int elements,
                     const void* data)
    {
        if (coderChannelOpen(channel, count, CODER_OPTION(name, type, elements, data)) == 0) {
            EXPECT_EQ(takeLog(), Log{});
            return lastError().substr(unexpected.size());
        }
        return takeLog().at(0);
    }

    /// "" when "p" could be copied out, or the error.
    std::string copy(const std::string& type, int capacity, Buffer& destination)
    {
        return coderChannelGetPropertyValue(channel, "p", type.c_str(), capacity,
                                            destination.data()) == 1
                   ? ""
                   : lastError().substr(unexpected.size());
    }

    static std::string wrongType(const std::string& type)
    {
        return "Property: p is not of the expected type: " +
               (type == "char" ? "string or ustring scalar or vector." : type);
    }

    /// A property of `count` elements reads as these bytes where they fit, as this type only.
    void expectCopies(IPropertyInfo* property, const std::string& type, int count,
                      const std::string& bytes)
    {
        SCOPED_TRACE(type + " with " + std::to_string(count));
        init(property);
        for (const int capacity : {INT_MIN, -1, 0, count - 1, count, count + 1, INT_MAX}) {
            Buffer destination(bytes.size());
            const bool fits = count == 0 || capacity >= count;
            EXPECT_EQ(copy(type, capacity, destination),
                      fits ? "" : "Property value: p is too large for allocated space.");
            EXPECT_EQ(destination.written(), fits ? bytes : "");
        }
        Buffer destination(64);
        const auto expectWrongType = [&](const std::string& other, auto) {
            EXPECT_EQ(other == type ? wrongType(other) : copy(other, 64, destination),
                      wrongType(other));
        };
        forEachType(expectWrongType);
        expectWrongType("char", 0);
        EXPECT_EQ(destination.written(), "");
    }
};

} // namespace

TEST_F(ValuesTest, NumbersOfEveryTypeAndShape)
{
    forEachType([&](const char* type, auto zero) {
        using T = decltype(zero);
        const T least = std::numeric_limits<T>::lowest();
        const T most = std::numeric_limits<T>::max();
        const T data[] = {least, most, 1};
        std::ostringstream text;
        text.precision(std::numeric_limits<double>::max_digits10);
        text << "open(o=" << type << '[' << +least << ',' << +most << ",1])";
        EXPECT_EQ(open(1, "o", type, 3, data), text.str());
        EXPECT_EQ(open(1, "o", type, 1, data + 2), "open(o="s + type + " 1)");

        expectCopies(scalar<T>("p", most), type, 1, bytesOf<T>({most}));
        expectCopies(vectorOf<T>("p", {1, least, most}), type, 3, bytesOf<T>({1, least, most}));
        expectCopies(arrayOf<T>("p", {1, least, most}), type, 3, bytesOf<T>({1, least, most}));
        expectCopies(vectorOf<T>("p", {}), type, 0, "");
        expectCopies(arrayOf<T>("p", {}), type, 0, "");
    });
}

TEST_F(ValuesTest, TextsOut)
{
    const std::u16string wide = u"Hi\u00E9\u0080\u0141";
    const std::string narrow = "Hi\x69\0\x41"s;
    const std::string end = "\0"s;
    const std::pair<IPropertyInfo*, std::string> rows[] = {
        {scalar("p", "Hi\0\xC3\xA9"s), "Hi\0\xC3\xA9\0"s},
        {scalar("p", wide), narrow + end},
        {vectorOf<std::string>("p", {"x", "", "y"}), "x,,y\0"s},
        {vectorOf<std::string>("p", {}), end},
        {arrayOf<std::string>("p", {"x", "", "y"}), "x,,y\0"s},
        {arrayOf<std::string>("p", {}), end},
        {vectorOf<std::u16string>("p", {u"x", wide}), "x," + narrow + end},
        {arrayOf<std::u16string>("p", {wide, u""}), narrow + "," + end},
        {arrayOf<std::u16string>("p", {}), end},
    };
    for (const auto& [property, bytes] : rows) {
        expectCopies(property, "char", static_cast<int>(bytes.size()), bytes);
    }
}

TEST_F(ValuesTest, TextAndLogicalOptionsAndBadOnes)
{
    const std::vector<char> bytes = {'a', 'b', '\0', '\xE9', '\x80', '\x7F', 2};
    const std::string length = "Unsupported length for data o. Length must be 1 or greater.";
    const struct {
        const char* type;
        int count;
        const char* data;
        std::string expected;
    } rows[] = {
        {"char", 10, bytes.data(), "open(o=char ab)"},
        {"char", 1, bytes.data(), "open(o=char a)"},
        {"char", 0, nullptr, "open(o=char )"},
        {"char", INT_MIN, bytes.data(), "open(o=char )"},
        {"char", 4, &bytes[3], "open(o=char \\65513\\65408\x7F\x02)"}, // reads no further
        {"logical", 3, &bytes[1], "open(o=logical[1,0,1])"},
        {"logical", 1, &bytes[6], "open(o=logical 1)"},
        {"int32", 0, nullptr, length},
        {"logical", -5, bytes.data(), length},
        {"int8", 1, nullptr, "No data for o."},
        {"char", 1, nullptr, "No data for o."},
        {"Double", 1, bytes.data(), "Unsupported type: Double for option o."},
        {"", 0, nullptr, "Unsupported type:  for option o."},
    };
    for (const auto& row : rows) {
        EXPECT_EQ(open(1, "o", row.type, row.count, row.data), row.expected);
    }
    EXPECT_NE(open(1, nullptr, "int8", 1, bytes.data()).find("null"), std::string::npos);
    EXPECT_NE(open(1, "o", nullptr, 1, bytes.data()).find("null"), std::string::npos);
    // A list ends at its first bad option, however long it is said to be.
    EXPECT_EQ(coderChannelOpen(channel, UINT64_MAX, CODER_OPTION("o", "int8", 1, bytes.data()),
                               CODER_OPTION("bad", "int24", 1, bytes.data())),
              0);
    EXPECT_EQ(lastError(), unexpected + "Unsupported type: int24 for option bad.");
    EXPECT_EQ(coderChannelExecute(channel, "go!", 3, CODER_OPTION("z", "int8", 1, &bytes[6]),
                                  CODER_OPTION("a", "logical", 1, &bytes[6]),
                                  CODER_OPTION("a", "uint8", 1, &bytes[6])),
              1);
    EXPECT_EQ(coderChannelInit(channel, 1, CODER_OPTION("", "int8", 1, &bytes[6])), 1);
    EXPECT_EQ(takeLog(), (Log{"execute(go!, a=uint8 2, z=int8 2)", "init(=int8 2)",
                              "getInputStream()", "getOutputStream()"}));
}

TEST_F(ValuesTest, WhatCannotBeRead)
{
    Buffer destination(8);
    init(new Counted<coderconverter::TPointerProperty<int>>("p", nullptr, 2U));
    EXPECT_EQ(copy("int32", 2, destination), wrongType("int32"));
    EXPECT_EQ(copy("int24", 2, destination), "Custom property: p is not a supported type: int24");
    init(new Counted<coderconverter::TPointerProperty<std::string>>("p", nullptr, 2U));
    EXPECT_EQ(copy("char", 8, destination), wrongType("char"));
    init(nullptr);
    EXPECT_EQ(copy("char", 8, destination), wrongType("char"));
    EXPECT_EQ(copy("logical", 8, destination), wrongType("logical"));
    const auto expectError = [&](Names names, void* to, const std::string& text) {
        EXPECT_EQ(coderChannelGetPropertyValue(channel, names.first, names.second, 1, to), 0);
        EXPECT_NE(lastError().find(text), std::string::npos) << text;
    };
    expectError({"q", "int24"}, destination.data(), "|Custom property: q not found.");
    expectError({nullptr, "int32"}, destination.data(), "null");
    expectError({"p", nullptr}, destination.data(), "null");
    expectError({"p", "int32"}, nullptr, "|Argument destination must not be null.");
    EXPECT_EQ(destination.written(), "");
}
