// A UDP socket as the port of a ByteDevice.
#ifndef BRENIX_PLUGINS_DATAGRAMPORT_HPP
#define BRENIX_PLUGINS_DATAGRAMPORT_HPP

#include "brenixcore/plugin/Options.hpp"

#include <asio.hpp>

#include <linux/sock_diag.h>
#include <netinet/in.h>
#include <sys/socket.h>

#include <array>
#include <cerrno>
#include <cstdint>
#include <cstring>
#include <optional>
#include <stdexcept>
#include <string>
#include <system_error>
#include <utility>

namespace bytes
{

inline std::string nameOf(const asio::ip::udp::endpoint& endpoint)
{
    const std::string host = endpoint.address().to_string();
    return (endpoint.address().is_v6() ? "[" + host + "]" : host) + ":" +
           std::to_string(endpoint.port());
}

/// Receives from anyone and sends to one peer.
class DatagramPort
{
public:
    using Udp = asio::ip::udp;

    struct Settings {
        Udp::endpoint local;
        std::optional<asio::ip::address> group; ///< to receive from
        unsigned int interface = 0;             ///< for multicast; 0 is the system's choice
        std::optional<int> receiveBuffer;       ///< bytes
    };

    explicit DatagramPort(asio::io_context& context) : socket(context) {}

    /// Opens the socket, anew if it is open.
    void open(const Settings& settings)
    {
        close();
        try {
            bind(settings);
            if (settings.interface != 0) {
                sendMulticastBy(settings.interface);
            }
            if (settings.group) {
                join(*settings.group, settings.interface);
            }
        } catch (...) {
            close();
            throw;
        }
    }

    void close()
    {
        asio::error_code ignored;
        socket.close(ignored);
    }

    Udp::endpoint localEndpoint() const { return socket.local_endpoint(); }

    /// Bytes, as one would ask for them: not as the system tells, which takes twice that for its own needs.
    unsigned int receiveBuffer() const
    {
        Udp::socket::receive_buffer_size granted;
        socket.get_option(granted); // halves it
        return static_cast<unsigned int>(granted.value());
    }

    /// Datagrams that the system has dropped for want of room since the socket was opened, modulo 2^32.
    std::uint32_t dropped() { return number(SK_MEMINFO_DROPS); }

    /// Discards what waits to be received. Returns the number of datagrams.
    std::uint64_t discard()
    {
        std::uint64_t discarded = 0;
        // Each takes more than a byte of this memory, which so bounds what arrives meanwhile.
        const std::uint32_t most = number(SK_MEMINFO_RMEM_ALLOC);
        while (discarded < most && ::recv(native_handle(), nullptr, 0, MSG_DONTWAIT) >= 0) {
            ++discarded;
        }
        return discarded;
    }

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

    Udp::endpoint peer;

private:
    void bind(const Settings& settings)
    {
        try {
            socket.open(settings.local.protocol());
            socket.set_option(Udp::socket::broadcast(true)); // to a peer of such an address
            socket.set_option(Udp::socket::reuse_address(settings.group.has_value()));
            if (settings.receiveBuffer) {
                socket.set_option(Udp::socket::receive_buffer_size(*settings.receiveBuffer));
            }
            socket.bind(settings.local);
        } catch (const asio::system_error& error) {
            throw std::runtime_error("Could not bind " + nameOf(settings.local) + ": " +
                                     error.code().message());
        }
    }

    void sendMulticastBy(unsigned int interface)
    {
        if (socket.local_endpoint().protocol() == Udp::v6()) {
            set("Interface", IPPROTO_IPV6, IPV6_MULTICAST_IF, interface);
        } else {
            ip_mreqn request{};
            request.imr_ifindex = static_cast<int>(interface);
            set("Interface", IPPROTO_IP, IP_MULTICAST_IF, request);
        }
    }

    void join(const asio::ip::address& group, unsigned int interface)
    {
        const Udp::endpoint endpoint(group, 0);
        group_req request{};
        request.gr_interface = interface;
        std::memcpy(&request.gr_group, endpoint.data(), endpoint.size());
        set("Group", group.is_v6() ? IPPROTO_IPV6 : IPPROTO_IP, MCAST_JOIN_GROUP, request);
    }

    template <typename Value>
    void set(const char* option, int level, int name, const Value& value)
    {
        if (::setsockopt(native_handle(), level, name, &value, sizeof value) != 0) {
            brenixcore::plugin::Options::fail(option, "is not possible: " +
                                                          std::generic_category().message(errno));
        }
    }

    /// One of the system's numbers of the socket.
    std::uint32_t number(std::size_t which)
    {
        std::array<std::uint32_t, SK_MEMINFO_VARS> numbers{};
        socklen_t size = sizeof numbers;
        if (::getsockopt(native_handle(), SOL_SOCKET, SO_MEMINFO, numbers.data(), &size) != 0) {
            throw std::system_error(errno, std::generic_category(),
                                    "Could not ask how many datagrams are lost");
        }
        return numbers.at(which);
    }

    Udp::socket socket;
};

} // namespace bytes

#endif
