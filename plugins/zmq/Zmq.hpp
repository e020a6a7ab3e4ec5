// libzmq's objects, owned, and its errors as exceptions.
#ifndef BRENIX_PLUGINS_ZMQ_ZMQ_HPP
#define BRENIX_PLUGINS_ZMQ_ZMQ_HPP

#include <zmq.h>

#include <cstddef>
#include <cstdint>
#include <memory>
#include <stdexcept>
#include <string>

namespace zeromq
{

/// Throws "<what>: <why libzmq failed>".
[[noreturn]] inline void fail(const std::string& what)
{
    throw std::runtime_error(what + ": " + zmq_strerror(zmq_errno()));
}

struct End {
    void operator()(void* context) const noexcept
    {
        while (zmq_ctx_term(context) != 0 && zmq_errno() == EINTR) {
        }
    }
};
/// Its end waits until all sockets are closed, and as long as they linger.
using OwnedContext = std::unique_ptr<void, End>;

struct Close {
    void operator()(void* socket) const noexcept { zmq_close(socket); }
};
using OwnedSocket = std::unique_ptr<void, Close>;

inline void set(void* socket, int option, int value)
{
    if (zmq_setsockopt(socket, option, &value, sizeof value) != 0) {
        fail("Option " + std::to_string(option) + " of a socket");
    }
}

inline void set(void* socket, int option, const std::string& value)
{
    if (zmq_setsockopt(socket, option, value.data(), value.size()) != 0) {
        fail("Option " + std::to_string(option) + " of a socket");
    }
}

/// A socket that drops at close what it still has.
inline OwnedSocket makeSocket(void* context, int type)
{
    OwnedSocket socket(zmq_socket(context, type));
    if (!socket) {
        fail("Could not make a socket");
    }
    set(socket.get(), ZMQ_LINGER, 0);
    return socket;
}

/// What tells the system's poll that the socket may be ready for something else.
inline int handleOf(void* socket)
{
    int handle = -1;
    std::size_t size = sizeof handle;
    zmq_getsockopt(socket, ZMQ_FD, &handle, &size);
    return handle;
}

/// A frame of a message.
class Frame
{
public:
    Frame() { zmq_msg_init(&frame); }
    Frame(Frame&& other) noexcept : Frame() { zmq_msg_move(&frame, other.get()); }
    Frame(const Frame&) = delete;
    Frame& operator=(const Frame&) = delete;
    ~Frame() { zmq_msg_close(&frame); }

    /// Whether one was there.
    bool receive(void* socket) { return zmq_msg_recv(&frame, socket, ZMQ_DONTWAIT) >= 0; }

    zmq_msg_t* get() { return &frame; }
    unsigned char* data() { return static_cast<unsigned char*>(zmq_msg_data(&frame)); }
    std::size_t size() const { return zmq_msg_size(&frame); }
    bool hasMore() const { return zmq_msg_more(&frame) != 0; }
    std::string text() { return {reinterpret_cast<const char*>(data()), size()}; }

private:
    zmq_msg_t frame{};
};

} // namespace zeromq

#endif
