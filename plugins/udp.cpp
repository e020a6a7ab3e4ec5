// Device `udp`: each datagram is a packet, both ways.

#include "ByteDevice.hpp"
#include "DatagramPort.hpp"

#include <net/if.h>

#include <cstdint>
#include <optional>
#include <stdexcept>
#include <string>

namespace
{

using namespace bytes;
using asio::ip::address;
using asio::ip::udp;

std::optional<address> readAddress(Options& options, const std::string& name)
{
    const auto text = options.text(name);
    if (!text) {
        return std::nullopt;
    }
    asio::error_code error;
    const address result = asio::ip::make_address(*text, error);
    if (error) {
        Options::fail(name, "must be an IP address, not " + *text);
    }
    return result;
}

/// Where a peer can reach this machine; without one, only programs of this machine can.
address ownAddress(const address& peer)
{
    using asio::ip::address_v4, asio::ip::address_v6;
    const bool isHere = peer.is_loopback() || peer.is_unspecified();
    if (peer.is_v6()) {
        return isHere ? address_v6::loopback() : address_v6::any();
    }
    return isHere ? address_v4::loopback() : address_v4::any();
}

class Udp : public ByteDevice<DatagramPort>
{
public:
    Udp() : ByteDevice(Framing::Datagrams) {}

    DeviceInfo init(const PropertyMap& optionMap, PropertyMap& properties,
                    DeviceHost& deviceHost) override
    {
        Options options(optionMap);
        const auto localHost = readAddress(options, "LocalHost");
        const long localPort = options.wholeNumber("LocalPort", 0, 65535).value_or(0);
        const auto peerHost = options.text("Host");
        const auto peerPort = options.wholeNumber("Port", 1, 65535);
        DatagramPort::Settings settings;
        settings.group = readAddress(options, "Group");
        const auto interface = options.text("Interface");
        settings.receiveBuffer = options.wholeNumber("ReceiveBuffer", 1, 1L << 30);
        readOptions(options);
        options.requireAllKnown();
        if (peerHost.has_value() != peerPort.has_value()) {
            Options::fail(peerHost ? "Port" : "Host", "is missing: a peer has a host and a port");
        }
        if (settings.group && !settings.group->is_multicast()) {
            Options::fail("Group", "is not the address of a group: " + settings.group->to_string());
        }
        if (settings.group && localHost && settings.group->is_v6() != localHost->is_v6()) {
            Options::fail("Group", "is not of the IP version of LocalHost");
        }

        host = &deviceHost;
        sends = peerHost.has_value();
        port.peer = {};
        const auto own = localHost ? localHost : settings.group;
        if (sends) {
            peer = *peerHost + ":" + std::to_string(*peerPort);
            port.peer = findPeer(*peerHost, std::to_string(*peerPort), own);
        }
        settings.local = {own ? *own : ownAddress(port.peer.address()),
                          static_cast<unsigned short>(localPort)};
        if (interface) {
            if (!settings.group && !port.peer.address().is_multicast()) {
                Options::fail("Interface", "is for multicast: neither Group nor Host is a group");
            }
            settings.interface = findInterface(*interface);
        }
        if (const auto local = settings.local.address();
            local.is_v6() && local.to_v6().is_multicast_link_local()) {
            if (!interface) {
                Options::fail("Interface",
                              "is required: each link has its own " + local.to_string());
            }
            settings.local.address(
                asio::ip::address_v6(local.to_v6().to_bytes(), settings.interface));
        }
        port.open(settings);

        lost = lostEarlier = dropped = 0;
        count(0);
        const udp::endpoint endpoint = port.localEndpoint();
        source = "datagrams to " + nameOf(endpoint);
        publish(properties, "LocalPort", endpoint.port());
        publish(properties, "ReceiveBuffer", port.receiveBuffer());
        publish(properties, "LostDatagrams", lost);
        return {StreamInfo{}, sends ? std::optional(StreamInfo{}) : std::nullopt};
    }

    void open(const PropertyMap& options) override
    {
        Options(options).requireAllKnown();
        lostEarlier = lost;
    }

    /// What nobody has read is lost with the socket.
    void term() override
    {
        const std::uint64_t unread = port.discard() + (waiting ? 1 : 0);
        waiting.reset();
        count(unread);
        port.close();
    }

private:
    /// IPv4 where a name has both and the address of this side does not decide.
    udp::endpoint findPeer(const std::string& hostName, const std::string& portNumber,
                           const std::optional<address>& local)
    {
        asio::error_code error;
        for (const udp& protocol : {udp::v4(), udp::v6()}) {
            if (!local || local->is_v6() == (protocol == udp::v6())) {
                const auto found =
                    udp::resolver(context).resolve(protocol, hostName, portNumber, error);
                if (!error) {
                    return *found.begin();
                }
            }
        }
        throw std::runtime_error("Could not find " + peer + ": " + error.message());
    }

    static unsigned int findInterface(const std::string& name)
    {
        const unsigned int index = ::if_nametoindex(name.c_str());
        if (index == 0) {
            Options::fail("Interface", "there is no " + name);
        }
        return index;
    }

    /// Adds what the system has dropped since the last time, and others.
    void count(std::uint64_t others)
    {
        const std::uint64_t before = lost;
        const std::uint32_t now = port.dropped();
        lost += others + (now - dropped); // also when the system's number has begun anew
        dropped = now;
        if (lost != before) {
            host->updateProperty(makeScalar("LostDatagrams", lost));
        }
    }

    std::string lostBefore() override
    {
        count(0);
        return lost == lostEarlier
                   ? ""
                   : std::to_string(lost - lostEarlier) + " " + source + " found no room.";
    }

    std::uint64_t lost = 0;        ///< datagrams, since init
    std::uint64_t lostEarlier = 0; ///< before the last close
    std::uint32_t dropped = 0;     ///< as the system counts
};

constexpr OptionInfo optionTable[] = {
    {"LocalHost", "text", "", "by Group and Host",
     "address to receive at; 0.0.0.0 for all of this machine"},
    {"LocalPort", "whole number", "", "0", "port to receive at; 0 for a free one"},
    {"Host", "text", "", "none",
     "where output goes; without it and Port there is no output stream"},
    {"Port", "whole number", "", "none", "the same"},
    {"Group", "text", "", "none", "address of a multicast group to receive from"},
    {"Interface", "text", "", "the system's",
     "for multicast, both ways: name of a network interface, such as eth0"},
    {"ReceiveBuffer", "whole number", "bytes", "the system's",
     "for datagrams that wait to be received; the system may grant less"},
    elementTypeOption,
    byteOrderOption,
    {},
};

constexpr PropertyInfo propertyTable[] = {
    {"LocalPort", "uint16", "", "the port that it receives at"},
    {"ReceiveBuffer", "uint32", "bytes", "as the system grants it"},
    {"LostDatagrams", "uint64", "", "since init, for want of room; after term also those not read"},
    {},
};

} // namespace

BRENIXCORE_EXPORT_DEVICE(Udp)
BRENIXCORE_DESCRIBE_OPTIONS(optionTable)
BRENIXCORE_DESCRIBE_PROPERTIES(propertyTable)
BRENIXCORE_DESCRIBE_FIELDS(elementFields, elementFields)
