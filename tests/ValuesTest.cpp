// Typed values on their way in, as options and data, and out, as property values.

#include "scripted/ChannelFixture.hpp"

#include <limits>

using namespace scripted;

static constexpr const char* types[] = {"double", "logical", "uint8",  "int8",  "uint64", "int64",
                                        "uint32", "int32",   "uint16", "int16", "float",  "char"};

class ValuesTest : public ChannelTest
{
protected:
    /// The option "o" as the core receives it, which has to be of a class, or the error.
    template <typename Property>
    const Property& option(const std::string& type, int count, const void* data)
    {
        EXPECT_EQ(coderChannelOpen(channel, 1, CODER_OPTION("o", type.c_str(), count, data)), 1);
        return as<Property>(*core.options, "o");
    }
    std::string badOption(const char* type, int count, const void* data, const char* name = "o")
    {
        EXPECT_EQ(coderChannelOpen(channel, 1, CODER_OPTION(name, type, count, data)), 0);
        return unexpectedError();
    }

    /// "" when a property could be copied out, or the error.
    std::string copy(const char* type, int capacity, void* to, const char* name = "p")
    {
        const int result = coderChannelGetPropertyValue(channel, name, type, capacity, to);
        return result == 1 ? "" : unexpectedError();
    }

    /// A property of `count` elements reads as these bytes where they fit, as this type only.
    void expectCopies(IPropertyInfo* property, const std::string& type, int count,
                      const std::string& bytes)
    {
        init(property);
        for (const int capacity : {INT_MIN, -1, 0, count - 1, count, count + 1, INT_MAX}) {
            Buffer destination(bytes.size());
            const bool fits = count == 0 || capacity >= count;
            EXPECT_EQ(copy(type.c_str(), capacity, destination.data()),
                      fits ? "" : "Property value: p is too large for allocated space.");
            EXPECT_EQ(destination.written(), fits ? bytes : "") << type << count;
        }
        expectOtherTypesFail(type);
    }

    void expectOtherTypesFail(const std::string& type)
    {
        Buffer destination(64);
        for (const std::string other : types) {
            const std::string what =
                other == "char" ? "string or ustring scalar or vector." : other;
            if (other != type) {
                EXPECT_EQ(copy(other.c_str(), 64, destination.data()),
                          "Property: p is not of the expected type: " + what);
            }
        }
        EXPECT_EQ(destination.written(), "");
    }
};

TEST_F(ValuesTest, NumbersOfEveryTypeAndShape)
{
    const auto check = [&]<typename T>(const std::string& type, T) {
        const T least = std::numeric_limits<T>::lowest();
        const T most = std::numeric_limits<T>::max();
        const T data[] = {1, least, most};
        expectCopies(scalar("p", most), type, 1, bytesOf(data + 2, 1));
        expectCopies(vectorOf<T>({1, least, most}), type, 3, bytesOf(data, 3));
        expectCopies(arrayOf<T>({1, least, most}), type, 3, bytesOf(data, 3));
        EXPECT_EQ(option<TScalarProperty<T>>(type, 1, data + 2).value, most);
        EXPECT_EQ(option<TVectorProperty<T>>(type, 3, data).values, std::vector<T>(data, data + 3));
        double written = 0;
        coderOutputStreamWriteTypedDataOld(output, &written, 1, type.c_str(), 3, data);
        const auto& array = as<TPointerProperty<T>>(*core.written.at(0), "data");
        EXPECT_EQ(bytesOf(array.data, array.count), bytesOf(data, 3));
    };
    [&]<typename... T>(std::tuple<T...>) {
        const auto* type = types;
        (check(*type++, T()), ...);
    }(std::tuple<double, bool, unsigned char, signed char, unsigned long, long, unsigned int, int,
                 unsigned short, short, float>());
    expectCopies(vectorOf<int>({}), "int32", 0, "");
    expectCopies(arrayOf<int>({}), "int32", 0, "");
}

TEST_F(ValuesTest, TextsOut)
{
    const std::u16string wide = u"Hi\u00E9\u0080\u0141";
    const std::string narrow = "Hi\x69\0\x41"s;
    const std::string end = "\0"s;
    const std::pair<IPropertyInfo*, std::string> rows[] = {
        {scalar("p", "Hi\0\xC3\xA9"s), "Hi\0\xC3\xA9\0"s},
        {scalar("p", wide), narrow + end},
        {vectorOf<std::string>({"x", "", "y"}), "x,,y\0"s},
        {vectorOf<std::string>({}), end},
        {arrayOf<std::string>({"x", "", "y"}), "x,,y\0"s},
        {vectorOf<std::u16string>({u"x", wide}), "x," + narrow + end},
        {arrayOf<std::u16string>({wide, u""}), narrow + "," + end},
        {arrayOf<std::u16string>({}), end},
    };
    for (const auto& [property, bytes] : rows) {
        expectCopies(property, "char", static_cast<int>(bytes.size()), bytes);
    }
}

TEST_F(ValuesTest, TextAndLogicalOptionsAndBadOnes)
{
    using Text = TScalarProperty<std::u16string>;
    using Logicals = TVectorProperty<bool>;
    const char bytes[] = {'a', 'b', '\0', '\xE9', '\x80', '\x7F', 2};
    EXPECT_EQ(option<Text>("char", 10, bytes).value, u"ab");
    EXPECT_EQ(option<Text>("char", 1, bytes).value, u"a");
    EXPECT_EQ(option<Text>("char", 0, nullptr).value, u"");
    EXPECT_EQ(option<Text>("char", INT_MIN, bytes).value, u"");
    EXPECT_EQ(option<Text>("char", 4, bytes + 3).value, u"\uFFE9\uFF80\x7F\x02"); // no further
    EXPECT_EQ(option<Logicals>("logical", 3, bytes + 1).values, std::vector({true, false, true}));
    EXPECT_EQ(option<TScalarProperty<bool>>("logical", 1, bytes + 6).value, true);
    const std::string length = "Unsupported length for data o. Length must be 1 or greater.";
    EXPECT_EQ(badOption("logical", 0, nullptr), length);
    EXPECT_EQ(badOption("logical", -5, nullptr), length);
    EXPECT_EQ(badOption("int8", 1, nullptr), "No data for o.");
    EXPECT_EQ(badOption("char", 1, nullptr), "No data for o.");
    EXPECT_EQ(badOption("Double", 1, bytes), "Unsupported type: Double for option o.");
    EXPECT_EQ(badOption("", 0, nullptr), "Unsupported type:  for option o.");
    EXPECT_NE(badOption("int8", 1, bytes, nullptr).find("null"), std::string::npos);
    EXPECT_NE(badOption(nullptr, 1, bytes).find("null"), std::string::npos);
    // A list ends at its first bad option, however long it is said to be.
    takeLog();
    EXPECT_EQ(coderChannelOpen(channel, UINT64_MAX, "o", "int8", 1, "", "bad", "int24", 1, ""), 0);
    EXPECT_EQ(unexpectedError(), "Unsupported type: int24 for option bad.");
    EXPECT_EQ(coderChannelInit(channel, 1, "", "int8", 1, ""), 1);
    // Of two options of one name the later counts.
    coderChannelExecute(channel, "go!", 2, "a", "int8", 1, "", "a", "uint8", 1, "\2");
    EXPECT_EQ(as<TScalarProperty<unsigned char>>(*core.options, "a").value, 2);
    EXPECT_EQ(takeLog(),
              (Log{"init([])", "getInputStream()", "getOutputStream()", "execute(go!, [a])"}));
}

TEST_F(ValuesTest, WhatCannotBeRead)
{
    int value = 0;
    IPropertyInfo* const noNumbers = new Counted<TPointerProperty<int>>("p", nullptr, 2U);
    IPropertyInfo* const noTexts = new Counted<TPointerProperty<std::string>>("p", nullptr, 2U);
    for (IPropertyInfo* property : std::vector<IPropertyInfo*>{noNumbers, noTexts, nullptr}) {
        init(property);
        expectOtherTypesFail("");
    }
    EXPECT_EQ(copy("int24", 2, &value), "Custom property: p is not a supported type: int24");
    EXPECT_EQ(copy("int24", 1, &value, "q"), "Custom property: q not found.");
    EXPECT_NE(copy("int32", 1, &value, nullptr).find("null"), std::string::npos);
    EXPECT_NE(copy(nullptr, 1, &value).find("null"), std::string::npos);
    EXPECT_EQ(value, 0);
}
