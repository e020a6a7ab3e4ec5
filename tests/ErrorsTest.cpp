// The error records, and the translation of exceptions. How the records live is in RandomTest.

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
