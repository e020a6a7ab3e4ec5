// Life of a channel: creation, initialisation, stream handles, properties and destruction.

#include "scripted/ChannelFixture.hpp"

#include <cmath>

using namespace scripted;

TEST_F(ChannelTest, LimitsSaturateAndPluginsLoadInOrder)
{
    const std::string most = "18446744073709551615";
    const std::pair<double, std::string> rows[] = {
        {-1, "0"},
        {-INFINITY, "0"},
        {-0.0, "0"},
        {1.9, "1"},
        {1e19, "10000000000000000000"},
        {std::nextafter(0x1p64, 0), "18446744073709549568"},
        {0x1p64, most},
        {INFINITY, most},
        {std::nan(""), most},
    };
    for (const auto& [limit, text] : rows) {
        coderChannelDestroy(coderChannelCreate("d", "c", id.data(), message.data(), limit, 7));
        coderChannelDestroy(coderChannelCreate("d", "c", id.data(), message.data(), 7, limit));
        EXPECT_EQ(takeLog(), (Log{"Converter(c)", "Channel(d, " + text + ", 7)", "~Channel()",
                                  "~Converter()", "Converter(c)", "Channel(d, 7, " + text + ")",
                                  "~Channel()", "~Converter()"}));
    }
}

TEST_F(ChannelTest, FailedCreationReleasesWhatThereWas)
{
    const auto create = [&](const char* device, const char* converter) {
        id = message = Buffer(CODER_ERROR_SIZE);
        EXPECT_EQ(coderChannelCreate(device, converter, id.data(), message.data(), 1, 2), nullptr);
        EXPECT_EQ(id.text() + "|", unexpected);
        EXPECT_NE(message.text().find("null"), std::string::npos);
    };
    core.on["Channel"] = [] { throw std::runtime_error("null"); };
    create("d", "c");
    EXPECT_EQ(takeLog(), (Log{"Converter(c)", "Channel(d, 1, 2)", "~Converter()"}));
    core.on["Converter"] = core.on["Channel"];
    create("d", "c");
    EXPECT_EQ(takeLog(), (Log{"Converter(c)"}));
    create(nullptr, "c");
    create("d", nullptr);
    EXPECT_EQ(coderChannelCreate("d", "c", id.data(), nullptr, 1, 2), nullptr);
    EXPECT_EQ(coderChannelCreate("d", "c", nullptr, message.data(), 1, 2), nullptr);
    EXPECT_STREQ(message.data(), "Argument errorId must not be null.");
    EXPECT_EQ(takeLog(), Log{});
}

TEST_F(ChannelTest, InitReplacesHandlesAndDestructionGoesInOrder)
{
    EXPECT_EQ(coderChannelGetInputStream(channel), nullptr);
    init(scalar("p", 1));
    core.delivery = {dataBuffer({scalar("x", 1)})};
    EXPECT_EQ(coderInputStreamReadBuffers(input, 1, 1), 1);
    takeLog();
    core.on["init"] = [] {
        EXPECT_EQ(core.properties->count("p"), 1U);
        (*core.properties)["o"] = scalar("o", 1);
    };
    EXPECT_EQ(coderChannelInit(channel, 0), 1);
    EXPECT_EQ(takeLog(), (Log{"init()", "getInputStream()", "destroy(x)", "getOutputStream()"}));
    EXPECT_NE(std::exchange(input, coderChannelGetInputStream(channel)), input);
    EXPECT_NE(std::exchange(output, coderChannelGetOutputStream(channel)), output);
    core.delivery = {dataBuffer({scalar("b", 1), scalar("a", 1)}), nullptr,
                     dataBuffer({scalar("c", 1)})};
    EXPECT_EQ(coderInputStreamReadBuffers(input, 3, 3), 1);
    takeLog();
    coderChannelDestroy(std::exchange(channel, nullptr));
    EXPECT_EQ(takeLog(), (Log{"destroy(o)", "destroy(p)", "destroy(a)", "destroy(b)", "destroy(c)",
                              "~Channel()", "~Converter()"}));
}

TEST_F(ChannelTest, FailedInitLeavesUsableHandles)
{
    const auto failInit = [&](const char* operation) {
        core.on = {{operation, [] { throw std::runtime_error("no"); }}};
        EXPECT_EQ(coderChannelInit(channel, 0), 0);
        EXPECT_EQ(lastError(), unexpected + "no");
        core.on.clear();
        // Which handles are still there, and which of them can flush their core stream.
        void* const in = coderChannelGetInputStream(channel);
        void* const out = coderChannelGetOutputStream(channel);
        return std::to_string(in == input) + std::to_string(out == output) +
               std::to_string(coderStreamFlush(in)) + std::to_string(coderStreamFlush(out));
    };
    EXPECT_EQ(failInit("init"), "1100");
    EXPECT_EQ(failInit("getInputStream"), "1100");
    EXPECT_EQ(failInit("getOutputStream"), "0110");
    init();
    EXPECT_EQ(failInit("init"), "1111");
    EXPECT_EQ(failInit("getInputStream"), "1100");
    EXPECT_EQ(failInit("getOutputStream"), "0110");
}

TEST_F(ChannelTest, PropertyUpdatesReplaceKnownNames)
{
    init(scalar("p", 1));
    IPropertyInfo* const known = scalar("p", 2);
    IPropertyInfo* const unknown = scalar("P", 3);
    for (IPropertyInfo* update : {known, known, unknown, static_cast<IPropertyInfo*>(nullptr)}) {
        core.handler->onPropertyUpdate(update);
    }
    EXPECT_EQ(takeLog(), (Log{"destroy(p)"}));
    unknown->destroy();
    Buffer value(4);
    EXPECT_EQ(coderChannelGetPropertyValue(channel, "P", "int32", 1, value.data()), 0);
    EXPECT_EQ(coderChannelGetPropertyValue(channel, "p", "int32", 1, value.data()), 1);
    EXPECT_EQ(value.written(), bytesOf({2}));
}

TEST_F(ChannelTest, OtherThreadsTearNeitherPropertiesNorErrors)
{
    init(vectorOf("p", {0, 0, 0, 0}));
    std::thread other([] {
        for (int i = 1; i <= 500; ++i) {
            core.handler->onPropertyUpdate(vectorOf("p", {i, i, i, i}));
            raiseEvent("error", std::to_string(i), std::to_string(i));
        }
    });
    for (int i = 0; i < 500; ++i) {
        int values[4] = {-1, -2, -3, -4};
        EXPECT_EQ(coderChannelGetPropertyValue(channel, "p", "int32", 4, values), 1);
        EXPECT_TRUE(values[0] == values[1] && values[1] == values[2] && values[2] == values[3]);
        const std::string error = asyncError();
        EXPECT_EQ(error.substr(0, error.find('|')), error.substr(error.find('|') + 1));
    }
    other.join();
}

TEST_F(ChannelTest, DelegatedEventsAreInvoked)
{
    struct Delegated : brenixcore::DelegatedEvent {
        void* invoke() override { return this; }
    } event;
    EXPECT_EQ(core.handler->onDelegatedEvent(event), &event);
    core.handler->onIgnoredEvent1(nullptr);
    core.handler->onIgnoredEvent2(nullptr);
    EXPECT_EQ(takeLog(), Log{});
}
