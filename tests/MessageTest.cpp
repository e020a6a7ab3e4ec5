// Messages: written and read again, malformed, and what a receiver makes of their order.

#include "messages/Message.hpp"
#include "brenixcore/plugin/Make.hpp"
#include "brenixcore/plugin/Visit.hpp"
#include "messages/Receiver.hpp"
#include "messages/Sender.hpp"

#include <gtest/gtest.h>

#include <algorithm>
#include <memory>
#include <sstream>
#include <string>
#include <utility>

namespace
{

using namespace messages;
using namespace brenixcore::plugin;

constexpr std::size_t maxArray = 64;

template <typename Kind>
std::string bytesOf(const Kind& message)
{
    std::string bytes(sizeOf(message), '\0');
    write(message, reinterpret_cast<unsigned char*>(bytes.data()));
    return bytes;
}

Message readFrom(const std::string& bytes)
{
    return messages::read(reinterpret_cast<const unsigned char*>(bytes.data()), bytes.size(),
                          maxArray);
}

/// As bytesOf(Data), with a field of bytes.
Data dataOf(const std::string& stream, std::uint64_t seq, std::uint64_t first, std::uint64_t counts,
            std::uint64_t lost = 0)
{
    Data data{stream, seq, first, {}, 0, counts};
    std::unique_ptr<unsigned char[]> elements(new unsigned char[counts]());
    setField(data.packet, makeArray(dataField, std::move(elements), counts));
    data.packet.counts = counts;
    data.packet.lost = lost;
    data.packet.time = -5;
    return data;
}

// --- One message ---

TEST(MessageTest, APartOfAPacketHasItsElementsAndAllConstants)
{
    Data data = dataOf("s", 7, 100, 4);
    setField(data.packet,
             makeArray("pairs", std::unique_ptr<int[]>(new int[8]{0, 1, 2, 3, 4, 5, 6, 7}), 8));
    setField(data.packet,
             makeArray("flags", std::unique_ptr<bool[]>(new bool[4]{true, false, true, true}), 4));
    setField(data.packet, makeArray("other", std::unique_ptr<double[]>(new double[3]{1, 2, 3}), 3));
    setField(data.packet, makeScalar("gain", 0.5F));
    setField(data.packet, makeScalar("on", true));
    setField(data.packet, makeScalar("text", std::u16string(u"\u20AC \U0001F600")));
    setField(data.packet,
             makeScalar("bytes", std::u16string{u'\uFFC3', u'\uFFA9'})); // as a caller writes them
    setField(data.packet, makeScalar("latin", std::string("\xE9")));
    data.begin = 1;
    data.counts = 2;
    const Data part = std::get<Data>(readFrom(bytesOf(data)));
    EXPECT_EQ(part.packet.counts, 2U);
    EXPECT_EQ(part.packet.time, -5);
    std::ostringstream text;
    for (const auto& [name, property] : *part.packet.fields) {
        text << name << ":";
        visitProperty(brenixplugin::asProperty(property), [&](auto& field) {
            if constexpr (requires { 0 + field.data[0]; }) {
                for (std::uint64_t i = 0; i < field.count; ++i) {
                    text << 0 + field.data[i] << " ";
                }
            } else if constexpr (requires { text << field.value; }) {
                text << "=" << field.value << " ";
            }
        });
    }
    EXPECT_EQ(text.str(),
              "bytes:=\u00E9 data:0 0 flags:0 1 gain:=0.5 latin:=\xE9 on:=1 other:1 2 3 "
              "pairs:2 3 4 5 text:=\u20AC \U0001F600 ");
}

/// A message of an array of ones and some bytes more.
template <typename T>
void readInPlace(std::size_t more, std::size_t askew, bool stays)
{
    constexpr std::size_t elements = largeArray / sizeof(T);
    for (std::size_t letters = 1; letters <= 8; ++letters) { // for all that may be before it
        Data data{std::string(letters, 's'), 0, 0, {}, 0, elements};
        std::unique_ptr<T[]> ones(new T[elements]);
        std::fill_n(ones.get(), elements, T{1});
        setField(data.packet, makeArray(dataField, std::move(ones), elements));
        setField(data.packet, makeScalar("more", std::string(more, 'x')));
        data.packet.counts = elements;
        const std::size_t size = sizeOf(data);
        std::shared_ptr<unsigned char> owner(new unsigned char[size + askew],
                                             std::default_delete<unsigned char[]>());
        owner = {owner, owner.get() + askew};
        write(data, owner.get());
        const std::weak_ptr<unsigned char> memory = owner;
        const unsigned char* const begin = owner.get();
        auto arrived = std::get<Data>(messages::read(begin, size, size, std::move(owner)));
        auto& field = dynamic_cast<brenixplugin::kit::coderconverter::TPointerProperty<T>&>(
            *brenixplugin::asProperty(arrived.packet.fields->at(dataField)));
        const auto* const at = reinterpret_cast<unsigned char*>(field.data);
        EXPECT_EQ(at >= begin && at < begin + size, stays);
        EXPECT_EQ(field.data[elements - 1], T{1});
        EXPECT_EQ(memory.expired(), !stays) << letters;
        arrived = {};
        EXPECT_TRUE(memory.expired());
    }
}

TEST(MessageTest, ALargeArrayStaysWhereItArrivedUnlessItLiesAskewOrIsTheLesserPart)
{
    readInPlace<double>(0, 0, true);
    readInPlace<double>(largeArray / 2, 0, true);
    readInPlace<double>(0, 1, false);
    readInPlace<unsigned char>(0, 1, true);
    readInPlace<double>(2 * largeArray, 0, false);
}

std::string head(unsigned int major, std::uint64_t value)
{
    std::string bytes(1, static_cast<char>(major << 5U | 27U));
    for (int shift = 56; shift >= 0; shift -= 8) {
        bytes += static_cast<char>(value >> static_cast<unsigned int>(shift));
    }
    return bytes;
}
std::string number(std::uint64_t value)
{
    return head(0, value);
}
std::string text(const std::string& value)
{
    return head(3, value.size()) + value;
}
std::string array(std::uint64_t tag, const std::string& bytes)
{
    return head(6, tag) + head(2, bytes.size()) + bytes;
}
std::string mapOf(const std::map<std::string, std::string>& entries)
{
    std::string bytes = head(5, entries.size());
    for (const auto& [name, value] : entries) {
        bytes += text(name) + value;
    }
    return bytes;
}

TEST(MessageTest, WhatIsNoMessageIsRefusedWithWhatAndWhere)
{
    const std::map<std::string, std::string> sound = {
        {"v", number(1)},      {"stream", text("s")},
        {"seq", number(0)},    {"first", number(0)},
        {"counts", number(2)}, {"time", number(0)},
        {"lost", number(0)},   {"fields", mapOf({{"data", array(69, "1122")}})}};
    EXPECT_EQ(std::get<Data>(readFrom(mapOf(sound))).counts, 2U);
    for (std::size_t length = 0; length < mapOf(sound).size(); ++length) {
        EXPECT_THROW(readFrom(mapOf(sound).substr(0, length)), Malformed) << length;
    }

    const auto field = [](const std::string& value) { return mapOf({{"data", value}}); };
    std::map<std::string, std::string> many;
    for (int i = 0; i < 33; ++i) {
        many[std::to_string(i)] = number(0);
    }
    const std::string huge = number(1ULL << 60U).substr(1);
    const struct {
        const char* name;
        std::string value; ///< empty: the entry is not there
        const char* problem;
    } rows[] = {
        {"v", number(2), "v, byte 215: is version 2, known is 1"},
        {"v", "", "the message has no v"},
        {"stream", text(std::string(256, 's')), "stream, byte 173: must have 1 to 255 bytes"},
        {"stream", text(""), "must have 1 to 255 bytes"},
        {"stream", text("\xC0\x80"), "is not UTF-8"},
        {"seq", text("0"), "seq, byte 149: must be a whole number of 0 or more"},
        {"seq", head(1, 0), "must be a whole number of 0 or more"},
        {"counts", number(0), "must be 1 or more"},
        {"counts", number(3), "field data, byte 79: has 2 elements for 3 counts"},
        {"first", number(UINT64_MAX), "must be 1 or more, and fit in 64 bits"},
        {"lost", number(1), "is less than lost"},
        {"time", head(1, 1ULL << 63U), "must be a whole number of nanoseconds"},
        {"time", "\xFB" + std::string(8, '\0'), "must be a whole number of nanoseconds"},
        {"fields", "", "the message has no fields"},
        {"fields", number(1), "must be a map"},
        {"fields", field(array(64, std::string(65, 'x'))), "of this type at most 64 are taken"},
        {"fields", field(head(6, 64) + "\x5B" + huge),
         "claims 1152921504606846985 bytes, of which 141 are there"},
        {"fields", field(head(6, 64) + head(2, UINT64_MAX)), "claims 2^64 or more bytes, of which"},
        {"fields", field(head(6, 64) + "\x5F\xFF"), "must be of a given length"},
        {"fields", field(array(71, "12345678901")), "no whole number of elements of 8"},
        {"fields", field(array(76, "12")), "has tag 76"},
        {"fields", field(array(80, "1234")), "has tag 80"},
        {"fields", field(array(63, "12")), "has tag 63"},
        {"fields", field("\x9B" + huge), "claims 1152921504606846976 entries"},
        {"fields", field("\x82\xF5\x01"), "must be true or false, as the elements before it"},
        {"fields",
         field("\x82\x61"
               "a\xF5"),
         "must be a text"},
        {"fields", field("\x83" + text("a") + text("b") + text("c")),
         "of this type at most 2 are taken"},
        {"constants", mapOf({{"a", "\x81" + text("a")}, {"b", "\x81" + text("b")}}),
         "field b, byte 68: has 1 elements; of this type at most 0 are taken"},
        {"fields", field("\x81" + number(1)), "must be true or false, or a text"},
        {"fields", mapOf({{std::string("a\0b", 3), array(64, "12")}}),
         "1 to 255 bytes, none of them 0"},
        {"fields", field("\xF6"), "no simple value but true or false"},
        {"fields", field(number(1)), "must be a typed array"},
        {"fields", head(5, 2) + text("a") + array(64, "12") + text("a") + array(64, "12"),
         "field a, byte 106: is there twice"},
        {"constants", mapOf({{"data", array(64, "1")}}), "field data, byte 58: is there twice"},
        {"end", text("1"), "must be a whole number"},
        {"hello", mapOf({{"rate", "\xFB\x7F\xF0" + std::string(6, '\0')}}),
         "must be 0, or a number from 1e-6"},
        {"hello", mapOf(many), "has 33 entries, more than 32"},
        {"hello", mapOf({{"options", mapOf({{"Gain", number(1)}})}}), "must be a text"},
    };
    for (const auto& row : rows) {
        auto entries = sound;
        entries[row.name] = row.value;
        std::erase_if(entries, [](const auto& entry) { return entry.second.empty(); });
        try {
            readFrom(mapOf(entries));
            ADD_FAILURE() << row.problem;
        } catch (const Malformed& problem) {
            EXPECT_NE(std::string(problem.what()).find(row.problem), std::string::npos)
                << problem.what() << "\nwanted: " << row.problem;
        }
    }
    EXPECT_THROW(readFrom(mapOf(sound) + "x"), Malformed);
    EXPECT_THROW(readFrom(head(5, 2) + text("v") + number(1) + text("v") + number(1)), Malformed);
}

// --- Their order ---

TEST(MessageTest, AHelloIsBeforeWhatTheWriterLostBehindItsLastPacket)
{
    brenixplugin::OwnedPropertyMap options;
    Options given(options.map);
    Sender sender(given);
    sender.begin();
    Data data = dataOf("", 0, 0, 4);
    for (const std::uint64_t lost : {0U, 3U}) {
        sender.lose(lost);
        const Hello hello = sender.hello(); // a reader that comes now is told of them
        EXPECT_EQ(sender.end().counts, hello.first + lost);
        sender.number(data, 0, 4);
        EXPECT_EQ(data.first, hello.first + lost);
        EXPECT_EQ(data.packet.lost, lost);
        sender.sent(data);
    }
    EXPECT_EQ(sender.end().counts, 11U);
}

/// Notes what the receiver reports.
struct Notes final : DeviceHost, DeviceStreams {
    void raise(const char* /*name*/, const char* /*id*/, const char* message) override
    {
        log += std::string("!") + message;
    }
    void updateProperty(brenixplugin::OwnedProperty /*property*/) override {}
    bool push(Packet /*packet*/) override { return false; }
    std::optional<Packet> pull() override { return {}; }
    bool tryPush(Packet& /*packet*/) override { return false; }
    std::optional<Packet> tryPull() override { return {}; }
    bool isClosing() const override { return false; }
    void refuseOutput() override {}
    void endInput() override {}
    void tellLost(std::uint64_t counts, const char* reason) override
    {
        const bool isWriters = std::string(reason).rfind("they were lost at ", 0) == 0;
        log += "-" + std::to_string(counts) + (isWriters ? "(at the writer)" : "");
    }
    std::uint64_t takenCounts() const override { return 0; }
    std::uint64_t pushedCounts() const override { return 0; }

    std::string log;
};

/// "a0@0+4" is packet 0 of stream a, from count 0 on, with 4 counts; "/1" behind it, with 1 lost before it; "a?2@8" a hello, "a.3@9" an end.
std::string receive(const std::string& events, long writers, bool shares)
{
    brenixplugin::OwnedPropertyMap options;
    publish(options.map, "Writers", static_cast<double>(writers));
    brenixplugin::OwnedPropertyMap properties;
    Options given(options.map);
    Notes notes;
    Receiver receiver(given, properties.map, notes);
    receiver.shares = shares;
    std::istringstream stream(events);
    std::string event;
    while (stream >> event) {
        std::istringstream parts(event);
        char name = 0;
        char mark = 0;
        std::uint64_t seq = 0;
        std::uint64_t first = 0;
        std::uint64_t counts = 0;
        std::uint64_t lost = 0;
        parts >> name;
        const char kind = std::isdigit(parts.peek()) ? '+' : static_cast<char>(parts.get());
        parts >> seq >> mark >> first >> mark >> counts >> mark >> lost;
        const std::string source(1, name);
        const std::string bytes = kind == '?'
                                      ? bytesOf(Hello{source, seq, first, "n", "V", 1e9, {}})
                                  : kind == '.' ? bytesOf(End{source, seq, first})
                                                : bytesOf(dataOf(source, seq, first, counts, lost));
        const auto packet = receiver.take(reinterpret_cast<const unsigned char*>(bytes.data()),
                                          bytes.size(), "here", notes);
        if (packet) {
            const auto* const of =
                dynamic_cast<const brenixplugin::kit::device::TScalarProperty<std::string>*>(
                    brenixplugin::asProperty(packet->fields->at("Source")));
            notes.log += of->value + std::to_string(packet->index.value()) +
                         (packet->period == 1 ? "r" : "");
        }
        notes.log += receiver.isDone() ? "; " : " ";
    }
    return notes.log;
}

TEST(MessageTest, TheReceiverTellsWhatIsMissingOfEachWriter)
{
    const struct {
        const char* events;
        const char* log; ///< packets by their index, losses "-N", errors "!", ";" for done
        long writers = 1;
        bool shares = false;
    } rows[] = {
        {"a?0@0 a0@0+4 a1@4+4 a.2@8", " a0r a4r ; "},
        {"a0@0+4 a2@9+1 a.3@10", "a0 -5a9 ; "},
        {"a0@0+4 a0@0+4 a1@4+1 a0@0+4", "a0  a4  "}, // repeated
        {"a7@90+2 a8@92+2 a.9@94", "a90 a92 ; "},    // came late
        {"a?7@90 a9@95+2 a.10@97", " -5a95r ; "},    // hello tells where it began
        {"a0@3+2/3 a1@7+1/2", "-3(at the writer)a3 -2(at the writer)a7 "},
        {"a0@0+4 b5@7+1 a1@4+1 b6@8+1 a.2@5 b.7@9", "a0 b7 a4 b8  ; "},
        {"a0@0+4 a.1@4 b0@0+1 b.1@1", "a0 ; b0 ; ", 1},
        {"a0@0+4 a.1@4 b0@0+1 b.1@1", "a0  b0 ; ", 2},
        {"a0@0+4 a.1@4 a.1@4", "a0   ", 2}, // ends once
        {"a0@0+4 a.1@4", "a0  ", 0},
        {"a0@0+4 a.3@9", "a0 -5; "}, // the tail
        {"a.3@9", "; "},
        {"a0@0+4 a3@9+1/2 a.5@20", "a0 -2a9 ; ", 1, true}, // other readers have the rest
    };
    for (const auto& row : rows) {
        EXPECT_EQ(receive(row.events, row.writers, row.shares), row.log) << row.events;
    }
    // Numbers that contradict each other.
    for (const char* const events :
         {"a0@0+4 a1@3+1", "a0@0+4 a1@5+1", "a0@0+4 a1@6+1/1", "a0@0+4 a3@5+1", "a0@0+4 a2@6+1/2",
          "a0@0+4 a.1@3", "a0@1+4", "a0@0+4 a.1@4 a1@4+4", "a0@0+4 a.0@4"}) {
        EXPECT_NE(receive(events, 1, false).find("!What arrived from here was skipped: "),
                  std::string::npos)
            << events;
    }
}

} // namespace
