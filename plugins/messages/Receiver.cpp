#include "Receiver.hpp"

#include "brenixcore/plugin/Make.hpp"

#include <string>
#include <utility>

namespace messages
{

using namespace brenixcore::plugin;

Receiver::Receiver(Options& options, brenixplugin::PropertyMap& properties, DeviceHost& deviceHost)
    : host(deviceHost), maxMessage(static_cast<std::size_t>(
                            options.wholeNumber("MaxMessage", 1024, 1L << 40).value_or(64L << 20))),
      writersWanted(
          static_cast<std::uint64_t>(options.wholeNumber("Writers", 0, 1L << 30).value_or(1)))
{
    publish(properties, "Writer", std::string());
    publish(properties, "Unit", std::string());
    publish(properties, "Rate", 0.0);
    publish(properties, "BadMessages", bad);
}

void Receiver::begin()
{
    writers.clear();
    ended = open = bad = 0;
}

bool Receiver::isDone() const
{
    return writersWanted > 0 && ended >= writersWanted && open == 0;
}

std::optional<Packet> Receiver::take(const unsigned char* bytes, std::size_t size,
                                     const std::string& origin, DeviceStreams& streams,
                                     std::shared_ptr<unsigned char> owner)
{
    try {
        Message message = read(bytes, size, maxMessage, std::move(owner));
        if (auto* const data = std::get_if<Data>(&message)) {
            return take(std::move(*data), streams);
        }
        if (const auto* const hello = std::get_if<Hello>(&message)) {
            take(*hello);
        } else {
            take(std::get<End>(message), streams);
        }
    } catch (const Malformed& problem) {
        skip(origin, problem.what());
    }
    return std::nullopt;
}

void Receiver::skip(const std::string& origin, const char* problem)
{
    ++bad;
    host.updateProperty(makeScalar("BadMessages", bad));
    const std::string text = "What arrived from " + origin + " was skipped: " + problem + ". " +
                             std::to_string(bad) + " messages were skipped since open.";
    host.raise("error", "brenix:Device:badMessage", text.c_str());
}

Receiver::Writer& Receiver::find(const std::string& stream, std::uint64_t seq, std::uint64_t first)
{
    constexpr std::size_t most = 1U << 20U; // more than the channels of the largest plant
    const auto found = writers.find(stream);
    if (found != writers.end()) {
        return found->second;
    }
    if (writers.size() >= most) {
        std::erase_if(writers, [](const auto& writer) { return writer.second.hasEnded; });
    }
    if (writers.size() >= most) {
        throw Malformed("stream: more than " + std::to_string(most) + " have not ended");
    }
    Writer& added = writers.emplace(stream, Writer{seq, first}).first->second;
    ++open;
    return added;
}

void Receiver::take(const Hello& hello)
{
    auto name = makeScalar("Writer", hello.name);
    auto unit = makeScalar("Unit", hello.unit);
    Writer& writer = find(hello.stream, hello.seq, hello.first);
    writer.period = hello.rate > 0 ? 1e9 / hello.rate : 0;
    host.updateProperty(std::move(name));
    host.updateProperty(std::move(unit));
    host.updateProperty(makeScalar("Rate", hello.rate));
}

std::optional<Packet> Receiver::take(Data&& data, DeviceStreams& streams)
{
    Packet& packet = data.packet;
    const auto contradicts = [&](std::uint64_t end) {
        throw Malformed("first: " + std::to_string(data.first) +
                        " contradicts the packet before, which ended at " + std::to_string(end));
    };
    if (data.seq == 0 && data.first != packet.lost) {
        contradicts(0);
    }
    // A reader that comes late misses nothing: for it, the stream begins here.
    Writer& writer = find(data.stream, data.seq, data.first - packet.lost);
    if (data.seq < writer.seq) {
        return std::nullopt; // it was there before
    }
    const std::uint64_t skipped = data.seq - writer.seq; // packets, of one count at least
    const std::uint64_t missing = data.first - writer.first;
    if (data.first < writer.first || missing < packet.lost || missing - packet.lost < skipped ||
        (skipped == 0 && missing != packet.lost) || writer.hasEnded) {
        contradicts(writer.first);
    }
    setField(packet, makeScalar("Source", data.stream));
    packet.index = data.first;
    packet.period = writer.period;
    const std::uint64_t lost = shares ? packet.lost : missing;
    packet.lost = 0;
    const std::string reason =
        (skipped > 0 ? "packets did not arrive from " : "they were lost at ") + data.stream;
    writer.seq = data.seq + 1;
    writer.first = data.first + data.counts;
    if (lost > 0) {
        streams.tellLost(lost, reason.c_str());
    }
    return {std::move(packet)};
}

void Receiver::take(const End& end, DeviceStreams& streams)
{
    Writer& writer = find(end.stream, end.seq, end.seq == 0 ? 0 : end.counts);
    if (writer.hasEnded) {
        return;
    }
    if (end.counts < writer.first || end.seq < writer.seq) {
        throw Malformed("end: " + std::to_string(end.counts) +
                        " contradicts the packet before, which ended at " +
                        std::to_string(writer.first));
    }
    const std::uint64_t missing = end.counts - writer.first;
    const std::string reason = "the last packets did not arrive from " + end.stream;
    writer = {end.seq, end.counts, writer.period, true};
    ++ended;
    --open;
    if (missing > 0 && !shares) {
        streams.tellLost(missing, reason.c_str());
    }
}

} // namespace messages
