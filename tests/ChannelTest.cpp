// Creation of a channel, and the events of its plug-ins; RandomTest has the rest of its life.

#include "scripted/ChannelFixture.hpp"

using namespace scripted;

TEST_F(ChannelTest, LimitsSaturate)
{
    const auto limits = [&](double in, double out) {
        coderChannelDestroy(create(in, out));
        return takeLog().at(1);
    };
    const std::string most = "18446744073709551615";
    EXPECT_EQ(limits(-1, 1.9), "Channel(d, 0, 1)");
    EXPECT_EQ(limits(1.9, -INFINITY), "Channel(d, 1, 0)");
    EXPECT_EQ(limits(0x1p64, std::nextafter(0x1p64, 0)),
              "Channel(d, " + most + ", 18446744073709549568)");
    EXPECT_EQ(limits(std::nan(""), INFINITY), "Channel(d, " + most + ", " + most + ")");
}

TEST_F(ChannelTest, FailedCreationReleasesWhatThereWas)
{
    const auto fail = [&](const char* device, const char* converter) {
        EXPECT_EQ(create(1, 2, device, converter), nullptr);
        EXPECT_NE(error().find("null", error().find(unexpected)), std::string::npos);
        return takeLog();
    };
    core.on["Channel"] = [] { throw std::runtime_error("null"); };
    EXPECT_EQ(fail("d", "c"), (Log{"Converter(c)", "Channel(d, 1, 2)", "~Converter()"}));
    core.on["Converter"] = core.on["Channel"];
    EXPECT_EQ(fail("d", "c"), (Log{"Converter(c)"}));
    EXPECT_EQ(fail(nullptr, "c"), Log{});
    EXPECT_EQ(fail("d", nullptr), Log{});
    EXPECT_EQ(coderChannelCreate("d", "c", id, nullptr, 1, 2), nullptr);
    EXPECT_EQ(coderChannelCreate("d", "c", nullptr, message, 1, 2), nullptr);
    EXPECT_STREQ(message, "Argument errorId must not be null.");
    EXPECT_EQ(takeLog(), Log{});
}

TEST_F(ChannelTest, UpdatesReplaceKnownPropertiesAndDelegatedEventsAreInvoked)
{
    init(scalar("p", 1));
    IPropertyInfo* const known = scalar("p", 2);
    IPropertyInfo* const unknown = scalar("P", 3);
    for (IPropertyInfo* update : std::vector<IPropertyInfo*>{known, known, unknown, nullptr}) {
        core.handler->onPropertyUpdate(update);
    }
    EXPECT_EQ(takeLog(), (Log{"destroy(p)"}));
    unknown->destroy();
    int value = 0;
    EXPECT_EQ(coderChannelGetPropertyValue(channel, "P", "int32", 1, &value), 0);
    EXPECT_EQ(coderChannelGetPropertyValue(channel, "p", "int32", 1, &value), 1);
    EXPECT_EQ(value, 2);

    struct Delegated : brenixcore::DelegatedEvent {
        void* invoke() override { return this; }
    } event;
    EXPECT_EQ(core.handler->onDelegatedEvent(event), &event);
    core.handler->onIgnoredEvent1(nullptr);
    core.handler->onIgnoredEvent2(nullptr);
}

TEST_F(ChannelTest, OtherThreadsTearNeitherPropertiesNorErrors)
{
    init(vectorOf({0, 0, 0, 0}));
    std::thread other([] {
        for (int i = 1; i <= 500; ++i) {
            core.handler->onPropertyUpdate(vectorOf({i, i, i, i}));
            raiseEvent("error", std::to_string(i), std::to_string(i));
        }
    });
    for (int i = 0; i < 500; ++i) {
        int values[4] = {-1, -2, -3, -4};
        EXPECT_EQ(coderChannelGetPropertyValue(channel, "p", "int32", 4, values), 1);
        EXPECT_EQ(std::count(values, values + 4, values[0]), 4);
        const std::string text = asyncError();
        EXPECT_EQ(text.substr(0, text.find('|')), text.substr(text.find('|') + 1));
    }
    other.join();
}
