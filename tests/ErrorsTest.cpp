// The three error records, the translation of exceptions, and the events that raise errors.

#include "channel/ErrorText.hpp"
#include "channel/Exceptions.hpp"
#include "scripted/ChannelFixture.hpp"

using namespace scripted;
using ErrorsTest = ChannelTest;

template <typename Exception>
static void fail()
{
    throw Exception("text");
}

TEST_F(ErrorsTest, ExceptionsBecomeIdentifiers)
{
    using namespace brenixcore;
    const std::pair<std::function<void()>, std::string> rows[] = {
        {fail<brenixcoder::InputStreamNotSupported>, "brenix:InputStream:notSupported|"},
        {fail<brenixcoder::OutputStreamNotSupported>, "brenix:OutputStream:notSupported|"},
        {fail<CouldNotLoadDevice>, "brenix:Channel:couldNotLoadDevice|"},
        {fail<CouldNotLoadConverter>, "brenix:Channel:couldNotLoadConverter|"},
        {fail<CouldNotLoadFilter>, "brenix:Stream:couldNotLoadFilter|"},
        {fail<CouldNotCreateDevice>, "brenix:Channel:couldNotCreateDevice|"},
        {fail<CouldNotCreateConverter>, "brenix:Channel:couldNotCreateConverter|"},
        {fail<CouldNotCreateFilter>, "brenix:Stream:couldNotCreateFilter|"},
        {fail<SynchronousInputNotPossible>, "brenix:InputStream:synchronousInputNotPossible|"},
        {fail<SynchronousOutputNotPossible>, "brenix:OutputStream:synchronousOutputNotPossible|"},
        {fail<CouldNotConvertInputData>, "brenix:InputStream:couldNotConvertInputData|"},
        {fail<CouldNotConvertOutputData>, "brenix:OutputStream:couldNotConvertOutputData|"},
        {fail<CannotAddFilterWhileOpen>, "brenix:Stream:cannotAddFilterWhileOpen|"},
        {fail<std::logic_error>, unexpected + "text"},
        {[] { throw 1; }, unexpected + "Unrecognized error."},
        {fail<brenixcoder::PluginException>, "|"},
    };
    for (const auto& [hook, text] : rows) {
        core.on["close"] = core.on["Channel"] = hook;
        EXPECT_EQ(coderChannelClose(channel), 0);
        EXPECT_EQ(lastError(), text);
        EXPECT_EQ(create(), nullptr);
        EXPECT_EQ(error(), text);
    }
}

TEST_F(ErrorsTest, LongTextsAreCut)
{
    for (const std::size_t length : {1022U, 1023U, 1024U, 5000U}) {
        const std::string i(length, 'i');
        const std::string m(length, 'm');
        const std::string cut = i.substr(0, 1023) + "|" + m.substr(0, 1023);
        std::thread(raiseEvent, "error", i, m).join();
        EXPECT_EQ(asyncError(), cut);
        EXPECT_ANY_THROW(raiseEvent("error", i, m));
        EXPECT_EQ(syncError(), cut);
    }
    Buffer buffer(8); // a NUL ends the text, and the rest of its length is filled with NUL
    brenixcoder::copyToBuffer({"a\0bc", 4}, buffer, 8);
    EXPECT_EQ(buffer.written(), "a\0\0\0\0"s);
    brenixcoder::copyToBuffer("12345678", buffer, 8);
    EXPECT_EQ(buffer.written(), "1234567\0"s);
}

TEST_F(ErrorsTest, RecordsLiveTheirOwnLives)
{
    const auto flagOf = [&](int (*query)(void*, uint8_t*) noexcept) {
        uint8_t flag = 2;
        return query(channel, &flag) == 1 ? flag : 3;
    };
    core.on["open"] = [] { raiseEvent("error", "id1", "m1"); };
    core.on["term"] = [] { raiseEvent("error", "id2", "m2"); };
    core.on["close"] = fail<std::runtime_error>;
    std::thread(raiseEvent, "error", "id3", "m3").join();
    std::thread(raiseEvent, "error", "id4", "m4").join();
    EXPECT_EQ(flagOf(coderChannelHasSyncError), 0);
    EXPECT_EQ(coderChannelOpen(channel, 0), 0);
    EXPECT_EQ(coderChannelTerm(channel), 0);
    EXPECT_EQ(lastError(), "|");
    EXPECT_EQ(coderChannelClose(channel), 0);
    EXPECT_EQ(flagOf(coderChannelHasSyncError), 1);
    EXPECT_EQ(syncError(), "id2|m2"); // the later one, once
    EXPECT_EQ(syncError(), "|");
    EXPECT_EQ(lastError(), unexpected + "text");
    EXPECT_EQ(flagOf(coderChannelHasAsyncError), 1);
    EXPECT_EQ(lastError(), "|");
    EXPECT_EQ(coderChannelClose(channel), 0);
    EXPECT_EQ(asyncError(), "id4|m4");
    EXPECT_EQ(asyncError(), "|");
    EXPECT_EQ(lastError(), unexpected + "text");
    EXPECT_EQ(flagOf(coderChannelHasAsyncError), 0);
}

TEST_F(ErrorsTest, EventsByName)
{
    const std::string fixed = "i|Array-based errors are not yet supported in Zelkor";
    const std::tuple<std::string, std::string, std::string, Log> rows[] = {
        {"error", "i", "i|m", {"getMessage()", "accept()"}},
        {"error", "", "|m", {"getMessage()", "accept()"}},
        {"errorMessage", "i", fixed, {"accept()"}},
        {"warning", "i", "|", {"accept()"}},
        {"warningMessage", "i", "|", {"accept()"}},
        {"trace", "i", "|", {"accept()"}},
        {"traceMessage", "i", "|", {"accept()"}},
        {"Error", "i", "|", {}},
        {"", "i", "|", {}},
    };
    for (const auto& [name, identifier, text, calls] : rows) {
        const std::string event[] = {name, identifier, "m"};
        core.on["close"] = [&] { takeLog(), raiseEvent(event[0], event[1], event[2]); };
        EXPECT_EQ(coderChannelClose(channel), text == "|") << name;
        EXPECT_EQ(takeLog(), calls);
        std::thread(raiseEvent, name, identifier, "m").join();
        EXPECT_EQ(takeLog(), calls);
        uint8_t flags[] = {2, 2};
        EXPECT_EQ(coderChannelHasSyncError(channel, flags), 1);
        EXPECT_EQ(coderChannelHasAsyncError(channel, flags + 1), 1);
        EXPECT_EQ(flags[0] + flags[1], text.front() == '|' ? 0 : 2); // an identifier makes an error
        EXPECT_EQ(syncError() + asyncError(), text + text);
    }
}
