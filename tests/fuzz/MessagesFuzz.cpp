// Messages: what is read is written and read again the same, takes no more memory than it brings, and a
// receiver numbers what it delivers.

#include "Input.hpp"
#include "brenixcore/plugin/Make.hpp"
#include "messages/Receiver.hpp"

#include <map>
#include <optional>
#include <string>
#include <variant>
#include <vector>

#if defined(__has_feature)
#if __has_feature(address_sanitizer)
#define COUNTS_MEMORY
#include <sanitizer/allocator_interface.h>
#endif
#endif

namespace
{

using namespace messages;
using namespace brenixcore::plugin;

constexpr std::size_t maxArray = 1024;
std::size_t taken = 0; ///< bytes of memory in all, where they can be counted

#ifdef COUNTS_MEMORY
const int hooks = __sanitizer_install_malloc_and_free_hooks(
    [](const volatile void* /*memory*/, std::size_t size) { taken += size; },
    [](const volatile void* /*memory*/) {});
#endif

std::optional<Message> readFrom(const std::string& bytes)
{
    // No byte more: the sanitizer sees the end.
    const std::vector<unsigned char> exact(bytes.begin(), bytes.end());
    const std::size_t before = taken;
    std::optional<Message> message;
    try {
        message = messages::read(exact.data(), exact.size(), maxArray);
    } catch (const Malformed& problem) {
        REQUIRE(problem.what()[0] != '\0');
    }
    // A field of few bytes is an object with a name in a map; a long name is in the error as well.
    REQUIRE(taken - before <= 4096 + maxArray + 128 * bytes.size());
    return message;
}

std::string bytesOf(const Message& message)
{
    return std::visit(
        [](const auto& kind) {
            std::vector<unsigned char> bytes(sizeOf(kind));
            write(kind, bytes.data());
            return std::string(bytes.begin(), bytes.end());
        },
        message);
}

/// What the receiver reports.
struct Host final : DeviceHost, DeviceStreams {
    void raise(const char* /*name*/, const char* /*id*/, const char* /*message*/) override
    {
        hasFailed = true;
    }
    void tellLost(std::uint64_t counts, const char* /*reason*/) override { lost += counts; }
    void updateProperty(brenixplugin::OwnedProperty /*property*/) override {}
    bool push(Packet /*packet*/) override { std::abort(); }
    std::optional<Packet> pull() override { std::abort(); }
    bool tryPush(Packet& /*packet*/) override { std::abort(); }
    std::optional<Packet> tryPull() override { std::abort(); }
    bool isClosing() const override { std::abort(); }
    void refuseOutput() override { std::abort(); }
    void endInput() override { std::abort(); }
    std::uint64_t takenCounts() const override { std::abort(); }
    std::uint64_t pushedCounts() const override { std::abort(); }

    std::uint64_t lost = 0;
    bool hasFailed = false;
};

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    Input input(data, size);
    Host host;
    brenixplugin::OwnedPropertyMap options;
    publish(options.map, "MaxMessage", static_cast<double>(maxArray));
    brenixplugin::OwnedPropertyMap properties;
    Options given(options.map);
    Receiver receiver(given, properties.map, host);
    receiver.shares = input.byte() % 2 == 1;
    std::map<std::string, std::uint64_t> places; ///< number of the next count of each stream
    while (!input.rest.empty()) {
        const std::size_t length = input.byte();
        const std::string bytes = input.take(length << 8U | input.byte());
        const std::optional<Message> message = readFrom(bytes);
        if (message) {
            const std::string written = bytesOf(*message);
            const std::optional<Message> again = readFrom(written);
            REQUIRE(again && again->index() == message->index());
            REQUIRE(bytesOf(*again) == written);
        }

        host.lost = 0;
        host.hasFailed = false;
        const auto packet = receiver.take(reinterpret_cast<const unsigned char*>(bytes.data()),
                                          bytes.size(), "here", host);
        REQUIRE(message || host.hasFailed);
        REQUIRE(!host.hasFailed || (!packet && host.lost == 0));
        if (packet) {
            const auto& of = std::get<Data>(*message);
            REQUIRE(packet->index == of.first && packet->counts == of.counts);
            REQUIRE(packet->fields->count("Source") == 1);
            const auto known = places.find(of.stream);
            REQUIRE(known == places.end() || receiver.shares ||
                    known->second + host.lost == of.first);
            places[of.stream] = of.first + of.counts;
        } else if (host.lost > 0) {
            const auto& end = std::get<End>(*message);
            REQUIRE(places[end.stream] + host.lost <= end.counts || receiver.shares);
            places[end.stream] = end.counts;
        }
    }
    return 0;
}
