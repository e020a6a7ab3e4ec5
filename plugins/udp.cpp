// Device `udp`: each datagram is a packet, both ways.

#include "ByteDevice.hpp"

namespace
{

using namespace bytes;
using asio::ip::udp;

/// Receives from anyone and sends to one peer.
class DatagramPort
{
public:
    explicit DatagramPort(asio::io_context& context) : socket(context) {}

    template <typename Handler>
    void async_read_some(const asio::mutable_buffer& buffer, Handler&& handler)
    {
        socket.async_receive(buffer, std::forward<Handler>(handler));
    }

    template <typename Handler>
    void async_write_some(const asio::const_buffer& buffer, Handler&& handler)
    {
        socket.async_send_to(buffer, peer, std::forward<Handler>(handler));
    }

    void cancel(asio::error_code& error) { socket.cancel(error); }
    int native_handle() { return socket.native_handle(); }

    udp::socket socket;
    udp::endpoint peer;
};

class Udp : public ByteDevice<DatagramPort>
{
public:
    Udp() : ByteDevice(Framing::Datagrams) {}

    DeviceInfo init(const PropertyMap& optionMap, PropertyMap& properties,
                    DeviceHost& deviceHost) override
    {
        Options options(optionMap);
        const std::string localHost = options.text("LocalHost").value_or("127.0.0.1");
        asio::error_code error;
        const auto address = asio::ip::make_address(localHost, error);
        if (error) {
            Options::fail("LocalHost", "must be an IP address, not " + localHost);
        }
        const long localPort = options.wholeNumber("LocalPort", 0, 65535).value_or(0);
        const udp::endpoint local(address, static_cast<unsigned short>(localPort));
        const auto peerHost = options.text("Host");
        const auto peerPort = options.wholeNumber("Port", 1, 65535);
        if (peerHost.has_value() != peerPort.has_value()) {
            Options::fail(peerHost ? "Port" : "Host", "is missing: a peer has a host and a port");
        }
        readOptions(options);
        options.requireAllKnown();

        host = &deviceHost;
        sends = peerHost.has_value();
        if (sends) {
            peer = *peerHost + ":" + std::to_string(*peerPort);
            const auto found = udp::resolver(context).resolve(local.protocol(), *peerHost,
                                                              std::to_string(*peerPort), error);
            if (error) {
                throw std::runtime_error("Could not find " + peer + ": " + error.message());
            }
            port.peer = *found.begin();
        }
        bind(local);
        source =
            "datagrams to " + localHost + ":" + std::to_string(port.socket.local_endpoint().port());
        publish(properties, "LocalPort", port.socket.local_endpoint().port());
        return {StreamInfo{}, sends ? std::optional(StreamInfo{}) : std::nullopt};
    }

    void open(const PropertyMap& options) override { Options(options).requireAllKnown(); }

    void term() override
    {
        asio::error_code ignored;
        port.socket.close(ignored);
    }

private:
    void bind(const udp::endpoint& local)
    {
        term();
        asio::error_code error;
        port.socket.open(local.protocol(), error);
        if (!error) {
            port.socket.bind(local, error);
        }
        if (error) {
            term();
            throw std::runtime_error("Could not bind " + local.address().to_string() + ":" +
                                     std::to_string(local.port()) + ": " + error.message());
        }
    }
};

constexpr OptionInfo optionTable[] = {
    {"LocalHost", "text", "", "127.0.0.1",
     "address to receive at; 0.0.0.0 for all of this machine"},
    {"LocalPort", "whole number", "", "0", "port to receive at; 0 for a free one"},
    {"Host", "text", "", "none",
     "where output goes; without it and Port there is no output stream"},
    {"Port", "whole number", "", "none", "the same"},
    elementTypeOption,
    byteOrderOption,
    {},
};

constexpr PropertyInfo propertyTable[] = {
    {"LocalPort", "uint16", "", "the port that it receives at"},
    {},
};

} // namespace

BRENIXCORE_EXPORT_DEVICE(Udp)
BRENIXCORE_DESCRIBE_OPTIONS(optionTable)
BRENIXCORE_DESCRIBE_PROPERTIES(propertyTable)
