// Addresses of ZeroMQ.
#ifndef BRENIX_PLUGINS_ZMQ_ENDPOINT_HPP
#define BRENIX_PLUGINS_ZMQ_ENDPOINT_HPP

#include "brenixcore/plugin/Options.hpp"

#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <string>
#include <string_view>

namespace zeromq
{

constexpr std::string_view ipcPrefix = "ipc://";

inline bool isIpc(const std::string& endpoint)
{
    return endpoint.rfind(ipcPrefix, 0) == 0;
}

/// libzmq takes any number as a port, and uses what is left of it in 16 bits.
inline void checkEndpoint(const std::string& endpoint, bool binds)
{
    using brenixcore::plugin::Options;
    if (endpoint.empty()) {
        Options::fail("Endpoint", "is required, such as tcp://127.0.0.1:5000");
    }
    if (isIpc(endpoint)) {
        return;
    }
    if (endpoint.rfind("tcp://", 0) != 0) {
        Options::fail("Endpoint", "must be tcp://... or ipc://..., not " + endpoint);
    }
    const std::string port = endpoint.substr(endpoint.rfind(':') + 1);
    const bool isNumber = !port.empty() && port.size() <= 5 &&
                          port.find_first_not_of("0123456789") == std::string::npos;
    const int number = isNumber ? std::stoi(port) : 0;
    if ((number < 1 || number > 65535) && !(binds && port == "*")) {
        Options::fail("Endpoint", "must end with a port from 1 to 65535" +
                                      std::string(binds ? ", or *" : "") + ", not as " + endpoint);
    }
}

/// Whether somebody listens at the file of an ipc endpoint: libzmq would take it away from him.
inline bool isTaken(const std::string& endpoint)
{
    if (!isIpc(endpoint)) {
        return false; // and the system tells
    }
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    const std::string path = endpoint.substr(ipcPrefix.size());
    if (path.size() >= sizeof address.sun_path) {
        return false; // libzmq refuses it
    }
    std::copy(path.begin(), path.end(), address.sun_path);
    const int handle = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
    const int result =
        ::connect(handle, reinterpret_cast<const sockaddr*>(&address), sizeof address);
    const bool taken = result == 0 || errno == EAGAIN; // so many wait for him
    ::close(handle);
    return taken;
}

} // namespace zeromq

#endif
