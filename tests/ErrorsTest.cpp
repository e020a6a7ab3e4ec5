// The three error records, the translation of exceptions, and the events that raiseEvent errors.

#include "channel/ErrorText.hpp"
#include "channel/Exceptions.hpp"
#include "scripted/ChannelFixture.hpp"

using namespace scripted;
using ErrorsTest = ChannelTest;

namespace
{

template <typename Exception>
void fail()
{
    throw Exception("text");
}

} // namespace

TEST_F(ErrorsTest, ExceptionsBecomeIdentifiers)
{
    using namespace brenixcore;
    const std::pair<std::function<void()>, std::string> rows[] = {
        {fail<brenixcoder::InputStreamNotSupported>, "InputStream:notSupported|"},
        {fail<brenixcoder::OutputStreamNotSupported>, "OutputStream:notSupported|"},
        {fail<CouldNotLoadDevice>, "Channel:couldNotLoadDevice|"},
        {fail<CouldNotLoadConverter>, "Channel:couldNotLoadConverter|"},
        {fail<CouldNotLoadFilter>, "Stream:couldNotLoadFilter|"},
        {fail<CouldNotCreateDevice>, "Channel:couldNotCreateDevice|"},
        {fail<CouldNotCreateConverter>, "Channel:couldNotCreateConverter|"},
        {fail<CouldNotCreateFilter>, "Stream:couldNotCreateFilter|"},
        {fail<SynchronousInputNotPossible>, "InputStream:synchronousInputNotPossible|"},
        {fail<SynchronousOutputNotPossible>, "OutputStream:synchronousOutputNotPossible|"},
        {fail<CouldNotConvertInputData>, "InputStream:couldNotConvertInputData|"},
        {fail<CouldNotConvertOutputData>, "OutputStream:couldNotConvertOutputData|"},
        {fail<CannotAddFilterWhileOpen>, "Stream:cannotAddFilterWhileOpen|"},
        {fail<std::logic_error>, "Channel:unexpectedException|text"},
        {[] { throw std::bad_alloc(); }, "Channel:unexpectedException|std::bad_alloc"},
        {[] { throw 1; }, "Channel:unexpectedException|Unrecognized error."},
        {fail<brenixcoder::PluginException>, ""},
    };
    for (const auto& [hook, text] : rows) {
        const std::string expected = text.empty() ? "|" : "brenix:" + text;
        core.on["close"] = core.on["Channel"] = hook;
        EXPECT_EQ(coderChannelClose(channel), 0);
        EXPECT_EQ(lastError(), expected);
        id = message = Buffer(CODER_ERROR_SIZE);
        EXPECT_EQ(coderChannelCreate("d", "c", id.data(), message.data(), 0, 0), nullptr);
        EXPECT_EQ(id.text() + "|" + message.text(), expected);
    }
}

TEST_F(ErrorsTest, LongTextsAreCut)
{
    for (const std::size_t length : {1022U, 1023U, 1024U, 5000U}) {
        const std::string i(length, 'i');
        const std::string m(length, 'm');
        const std::string expected = i.substr(0, 1023) + "|" + m.substr(0, 1023);
        std::thread(raiseEvent, "error", i, m).join();
        EXPECT_EQ(asyncError(), expected);
        EXPECT_ANY_THROW(raiseEvent("error", i, m));
        EXPECT_EQ(syncError(), expected);
        core.on["close"] = [&] { throw std::runtime_error(m); };
        EXPECT_EQ(coderChannelClose(channel), 0);
        EXPECT_EQ(lastError(), unexpected + m.substr(0, 1023));
    }
    Buffer buffer(8); // a NUL ends the text, and the rest of its length is filled with NUL
    brenixcoder::copyToBuffer({"a\0bc", 4}, buffer.data(), 8);
    EXPECT_EQ(buffer.written(), "a\0\0\0\0"s);
}

TEST_F(ErrorsTest, RecordsLiveTheirOwnLives)
{
    core.on["open"] = [] { raiseEvent("error", "id1", "m1"); };
    core.on["term"] = [] { raiseEvent("error", "id2", "m2"); };
    core.on["close"] = fail<std::runtime_error>;
    std::thread(raiseEvent, "error", "id3", "m3").join();
    std::thread(raiseEvent, "error", "id4", "m4").join();
    EXPECT_EQ(flagOf(coderChannelHasSyncError), "\0"s);
    EXPECT_EQ(coderChannelOpen(channel, 0), 0);
    EXPECT_EQ(coderChannelTerm(channel), 0);
    EXPECT_EQ(lastError(), "|");
    EXPECT_EQ(coderChannelClose(channel), 0);
    EXPECT_EQ(flagOf(coderChannelHasSyncError), "\1");
    EXPECT_EQ(syncError(), "id2|m2"); // the later one, once
    EXPECT_EQ(syncError(), "|");
    EXPECT_EQ(lastError(), unexpected + "text");
    EXPECT_EQ(flagOf(coderChannelHasAsyncError), "\1");
    EXPECT_EQ(lastError(), "|");
    EXPECT_EQ(coderChannelClose(channel), 0);
    EXPECT_EQ(asyncError(), "id4|m4");
    EXPECT_EQ(asyncError(), "|");
    EXPECT_EQ(lastError(), unexpected + "text");
    EXPECT_EQ(flagOf(coderChannelHasAsyncError), "\0"s);
}

TEST_F(ErrorsTest, EventsByName)
{
    const std::string fixed = "i|Array-based errors are not yet supported in Zelkor";
    const struct {
        std::string name, identifier, error;
        Log calls;
    } rows[] = {
        {"error", "i", "i|m", {"getMessage", "accept"}},
        {"error", "", "|m", {"getMessage", "accept"}},
        {"errorMessage", "i", fixed, {"accept"}},
        {"warning", "i", "|", {"accept"}},
        {"warningMessage", "i", "|", {"accept"}},
        {"trace", "i", "|", {"accept"}},
        {"traceMessage", "i", "|", {"accept"}},
        {"Error", "i", "|", {}},
        {"", "i", "|", {}},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.name);
        const std::string held = row.error.front() == '|' ? "\0"s : "\1"s;
        core.on["close"] = [&] { raiseEvent(row.name, row.identifier, "m"); };
        EXPECT_EQ(coderChannelClose(channel), row.error == "|");
        core.log.erase(core.log.begin());
        EXPECT_EQ(takeLog(), row.calls);
        EXPECT_EQ(flagOf(coderChannelHasSyncError), held);
        EXPECT_EQ(syncError() + asyncError(), row.error + "|");
        std::thread(raiseEvent, row.name, row.identifier, "m").join();
        EXPECT_EQ(takeLog(), row.calls);
        EXPECT_EQ(flagOf(coderChannelHasAsyncError), held);
        EXPECT_EQ(syncError() + asyncError(), "|" + row.error);
    }
}
