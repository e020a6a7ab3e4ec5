// The byte side of devices: how what arrives, as one stream or in datagrams, becomes packets, and the
// way back. The device runs on one end of a pair of sockets.

#include "../../plugins/ByteDevice.hpp"
#include "Input.hpp"

namespace
{

using namespace bytes;
using Base = ByteDevice<asio::posix::stream_descriptor>;

/// The device, and everything around it: the streams and the host, and the other end of the pair,
/// which sends a chunk and takes what is there whenever the device looks for its channel.
struct Bench : Base, DeviceStreams, DeviceHost {
    Bench(bool hasDatagrams, const ElementType& elements, bool isBig, std::uint64_t block)
        : Base(hasDatagrams ? Framing::Datagrams : Framing::None), element(elements), largest(block)
    {
        std::array<int, 2> ends{};
        const int kind = hasDatagrams ? SOCK_SEQPACKET : SOCK_STREAM;
        REQUIRE(::socketpair(AF_UNIX, kind | SOCK_NONBLOCK | SOCK_CLOEXEC, 0, ends.data()) == 0);
        port.assign(ends[0]);
        peerEnd.assign(ends[1]);
        brenixplugin::OwnedPropertyMap options;
        const auto add = [&](const char* name, auto value) {
            publish(options.map, name, std::move(value));
        };
        add("ElementType", std::u16string(element.name.begin(), element.name.end()));
        add("ByteOrder", std::u16string(isBig ? u"big" : u"little"));
        add("BlockSize", block);
        init(options.map, options.map, *this);
    }

    DeviceInfo init(const PropertyMap& optionMap, PropertyMap& /*properties*/,
                    DeviceHost& deviceHost) override
    {
        Options options(optionMap);
        readOptions(options);
        host = &deviceHost;
        peer = source = "peer";
        return {};
    }

    bool tryPush(Packet& packet) override
    {
        REQUIRE(!inputEnded);
        full = !full;
        if (full) { // and now there is room
            wake();
            return false;
        }
        const auto data = element.find(brenixplugin::asProperty(packet.fields->at(dataField)));
        REQUIRE(data && data->size() == packet.counts * element.size);
        REQUIRE(packet.counts > 0 && packet.counts <= largest);
        received.append(reinterpret_cast<const char*>(data->data()), data->size());
        return true;
    }

    std::optional<Packet> tryPull() override
    {
        if (output.empty()) {
            return std::nullopt;
        }
        Packet packet = std::move(output.back());
        output.pop_back();
        return packet;
    }

    void refuseOutput() override {}
    void endInput() override { inputEnded = true; }
    void tellLost(std::uint64_t /*counts*/, const char* /*reason*/) override {}
    std::uint64_t takenCounts() const override { return 0; }
    std::uint64_t pushedCounts() const override { return 0; }

    bool isClosing() const override
    {
        std::array<char, 4096> buffer{};
        for (ssize_t size = 1; size > 0;) {
            size = ::read(peerEnd.native_handle(), buffer.data(), buffer.size());
            sent.append(buffer.data(), static_cast<std::size_t>(std::max(size, ssize_t())));
        }
        if (chunks.empty()) {
            ::shutdown(peerEnd.native_handle(), SHUT_WR);
        } else {
            const std::string& chunk = chunks.back();
            REQUIRE(::write(peerEnd.native_handle(), chunk.data(), chunk.size()) ==
                    std::ssize(chunk));
            chunks.pop_back();
        }
        return false;
    }

    void raise(const char* /*name*/, const char* /*id*/, const char* message) override
    {
        error = message;
    }
    bool push(Packet /*packet*/) override { std::abort(); }
    std::optional<Packet> pull() override { std::abort(); }
    void updateProperty(OwnedProperty /*property*/) override { std::abort(); }

    const ElementType& element;
    const std::uint64_t largest;
    mutable asio::posix::stream_descriptor peerEnd{context};
    mutable std::vector<std::string> chunks; ///< to arrive; the last is the next, as in `output`
    mutable std::string sent;
    std::vector<Packet> output;
    std::string received;
    std::string error; ///< the last
    bool full = false;
    bool inputEnded = false;
};

/// The whole elements, with their bytes turned round if they have to be.
std::string whole(std::string data, std::size_t size, bool isBig)
{
    data.resize(data.size() / size * size);
    for (auto element = data.begin(); isBig && element != data.end();
         element += std::ptrdiff_t(size)) {
        std::reverse(element, element + std::ptrdiff_t(size));
    }
    return data;
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    Input input(data, size);
    const unsigned int flags = input.byte();
    const bool hasDatagrams = (flags & 1U) != 0;
    const bool isBig = (flags & 2U) != 0;
    const ElementType& type = elementTypes.at(input.byte() % elementTypes.size());
    Bench bench(hasDatagrams, type, isBig, hasDatagrams ? 65536 : 1 + input.byte());

    std::string toSend;
    bool hasWrongType = false;
    std::size_t refused = 0; // elements
    for (unsigned int i = input.byte() % 8; i > 0; --i) {
        const ElementType& other = elementTypes.at(input.byte() % elementTypes.size());
        const std::string text = whole(input.text(), other.size, false);
        Packet packet;
        const std::size_t elements = text.size() / other.size;
        packet.counts = elements;
        auto array = other.make(elements);
        std::memcpy(other.find(array.get())->data(), text.data(), elements * other.size);
        setField(packet, std::move(array));
        bench.output.insert(bench.output.begin(), std::move(packet));
        if (&other == &type) {
            toSend += whole(text, type.size, isBig);
        } else {
            hasWrongType = true;
            refused += elements;
        }
    }
    std::string toReceive;
    std::size_t partial = 0; // bytes
    while (!input.rest.empty()) {
        const std::string chunk = input.text();
        if (!chunk.empty()) {
            toReceive += hasDatagrams ? whole(chunk, type.size, isBig) : chunk;
            partial += hasDatagrams ? chunk.size() % type.size : 0;
            bench.chunks.insert(bench.chunks.begin(), chunk);
        }
    }
    partial += toReceive.size() % type.size;

    bench.run(bench);
    REQUIRE(bench.received == (hasDatagrams ? toReceive : whole(toReceive, type.size, isBig)));
    REQUIRE(bench.sent == toSend);
    std::string told;
    if (refused > 0) {
        told += std::to_string(refused) + " elements of another type were not sent to peer.";
    }
    if (partial > 0) {
        told += (told.empty() ? "" : " ") + std::to_string(partial) +
                " bytes from peer are no whole " + std::string(type.name) + ".";
    }
    REQUIRE(hasWrongType ? bench.error.ends_with(told) : bench.error == told);
    return 0;
}
