// Everything that can echo: each peer has a thread that returns blocks of doubles as they come, moved
// and not copied where the peer can. send() copies a block from the caller's array, receive() the next
// one that returns into it.
#ifndef BRENIXCODER_BENCH_PEERS_HPP
#define BRENIXCODER_BENCH_PEERS_HPP

#include "brenixcoder/coder.h"

#include <algorithm>
#include <condition_variable>
#include <cstdint>
#include <cstring>
#include <deque>
#include <limits>
#include <mutex>
#include <stdexcept>
#include <string>
#include <thread>
#include <tuple>
#include <utility>
#include <vector>

#include <fcntl.h>
#include <sys/socket.h>
#include <unistd.h>

#ifdef BENCH_ZMQ
#include <zmq.h>
#endif
#ifdef BENCH_NNG
#include <nng/nng.h>
#include <nng/protocol/pair0/pair.h>
#endif
#ifdef BENCH_GSTREAMER
#include <gst/app/gstappsink.h>
#include <gst/app/gstappsrc.h>
#include <gst/gst.h>
#endif

namespace peers
{

inline void require(bool fulfilled, const char* what)
{
    if (!fulfilled) {
        throw std::runtime_error(what);
    }
}

/// What the peers have in common: the size of a block, and how many of them may be on their way.
struct Peer {
    explicit Peer(std::size_t blockElements)
        : elements(blockElements), bytes(blockElements * sizeof(double))
    {
    }
    Peer(const Peer&) = delete;
    Peer& operator=(const Peer&) = delete;
    ~Peer() = default;

    const std::size_t elements;
    const std::size_t bytes;
    std::size_t capacity = std::numeric_limits<std::size_t>::max();
    bool returns = true; ///< the blocks
};

/// A channel of this library that returns what is written to it.
struct OpenChannel {
    OpenChannel()
    {
        char id[CODER_ERROR_SIZE];
        char message[CODER_ERROR_SIZE];
        constexpr double infinity = std::numeric_limits<double>::infinity();
        handle = coderChannelCreate("loopback", "identity", id, message, infinity, infinity);
        require(handle != nullptr && coderChannelInit(handle, 0) == 1 &&
                    coderChannelOpen(handle, 0) == 1,
                "the channel does not open");
    }
    OpenChannel(const OpenChannel&) = delete;
    OpenChannel& operator=(const OpenChannel&) = delete;
    ~OpenChannel()
    {
        coderChannelClose(handle);
        coderChannelTerm(handle);
        coderChannelDestroy(handle);
    }

    void* handle;
};

/// This library, with so many buffers in one call.
template <std::size_t batch>
class Loopback : public Peer
{
public:
    explicit Loopback(std::size_t blockElements)
        : Peer(blockElements), output(coderChannelGetOutputStream(channel.handle)),
          input(coderChannelGetInputStream(channel.handle))
    {
    }

    void send(const double* data) { write(data, std::make_index_sequence<batch>()); }

    void receive(double* into)
    {
        constexpr auto buffers = static_cast<int32_t>(batch);
        require(
            coderInputStreamReadBuffers(input, static_cast<double>(elements * batch), buffers) == 1,
            "loopback: nothing to read");
        for (int32_t i = 1; i <= buffers; ++i) {
            require(coderInputStreamReadBufferData(input, i, 0, "data", "double",
                                                   static_cast<int32_t>(elements), into) == 1,
                    "loopback: no data");
            coderInputStreamFreeBuffer(input, i); // so that the next one finds its memory warm
        }
    }

private:
    template <std::size_t... number>
    void write(const double* data, std::index_sequence<number...> /*numbers*/)
    {
        const auto buffer = [&](std::size_t) {
            return std::make_tuple(CODER_BUFFER(elements, data));
        };
        double written = 0;
        const int result = std::apply(
            [&](auto... arguments) {
                return coderOutputStreamWriteTypedDataOld(output, &written, batch, "double",
                                                          arguments...);
            },
            std::tuple_cat(buffer(number)...));
        require(result == 1, "loopback: not written");
    }

    OpenChannel channel;
    void* output;
    void* input;
};

/// Mutex, condition variable and a queue of vectors.
class VectorQueue : public Peer
{
public:
    using Peer::Peer;
    ~VectorQueue()
    {
        there.push({}); // the end
        echo.join();
    }

    void send(const double* data) { there.push(std::vector<double>(data, data + elements)); }

    void receive(double* into)
    {
        const std::vector<double> block = back.pop();
        std::memcpy(into, block.data(), bytes);
    }

private:
    struct Queue {
        void push(std::vector<double> block)
        {
            {
                const std::lock_guard lock(mutex);
                blocks.push_back(std::move(block));
            }
            filled.notify_one();
        }
        std::vector<double> pop()
        {
            std::unique_lock lock(mutex);
            filled.wait(lock, [&] { return !blocks.empty(); });
            std::vector<double> block = std::move(blocks.front());
            blocks.pop_front();
            return block;
        }
        std::mutex mutex;
        std::condition_variable filled;
        std::deque<std::vector<double>> blocks;
    };

    Queue there;
    Queue back;
    std::thread echo{[this] {
        for (std::vector<double> block = there.pop(); !block.empty(); block = there.pop()) {
            back.push(std::move(block));
        }
    }};
};

inline bool readAll(int file, void* data, std::size_t size)
{
    auto* next = static_cast<char*>(data);
    while (size > 0) {
        const ssize_t done = read(file, next, size);
        if (done <= 0) {
            return false;
        }
        next += done;
        size -= static_cast<std::size_t>(done);
    }
    return true;
}

inline bool writeAll(int file, const void* data, std::size_t size)
{
    const auto* next = static_cast<const char*>(data);
    while (size > 0) {
        const ssize_t done = write(file, next, size);
        if (done <= 0) {
            return false;
        }
        next += done;
        size -= static_cast<std::size_t>(done);
    }
    return true;
}

/// What the two peers of the kernel share: four descriptors, and a thread that copies.
class Descriptors : public Peer
{
public:
    Descriptors(const Descriptors&) = delete;
    Descriptors& operator=(const Descriptors&) = delete;

    void send(const double* data) { require(writeAll(out, data, bytes), "cannot write"); }
    void receive(double* into) { require(readAll(in, into, bytes), "cannot read"); }

protected:
    using Peer::Peer;
    ~Descriptors()
    {
        close(out); // the end
        echo.join();
        for (const int file : {in, echoIn, echoOut}) {
            if (file != out && !(file == echoOut && echoOut == echoIn)) {
                close(file);
            }
        }
    }

    void start()
    {
        echo = std::thread([this] {
            std::vector<double> block(elements);
            while (readAll(echoIn, block.data(), bytes) && writeAll(echoOut, block.data(), bytes)) {
            }
        });
    }

    int out = -1;
    int in = -1;
    int echoIn = -1;
    int echoOut = -1;

private:
    std::thread echo;
};

class Pipe : public Descriptors
{
public:
    explicit Pipe(std::size_t blockElements) : Descriptors(blockElements)
    {
        int there[2];
        int back[2];
        require(pipe(there) == 0 && pipe(back) == 0, "no pipe");
        std::tie(echoIn, out, in, echoOut) = std::tie(there[0], there[1], back[0], back[1]);
        for (const int file : {in, out}) {
            fcntl(file, F_SETPIPE_SZ, 1 << 20);
        }
        capacity = static_cast<std::size_t>(fcntl(in, F_GETPIPE_SZ)) / std::max(bytes, 64UL);
        start();
    }
};

class SocketPair : public Descriptors
{
public:
    explicit SocketPair(std::size_t blockElements) : Descriptors(blockElements)
    {
        int ends[2];
        require(socketpair(AF_UNIX, SOCK_STREAM, 0, ends) == 0, "no socket pair");
        in = out = ends[0];
        echoIn = echoOut = ends[1];
        int size = 4 << 20;
        for (const int end : ends) {
            setsockopt(end, SOL_SOCKET, SO_SNDBUF, &size, sizeof size);
        }
        socklen_t length = sizeof size;
        getsockopt(in, SOL_SOCKET, SO_SNDBUF, &size, &length);
        // The kernel counts what it needs beside the data as well.
        capacity = static_cast<std::size_t>(size) / (bytes + bytes / 4 + 1024);
        start();
    }
};

#ifdef BENCH_ZMQ
class Zmq : public Peer
{
public:
    explicit Zmq(std::size_t blockElements) : Peer(blockElements)
    {
        const int unlimited = 0;
        for (void* const socket : {caller, device}) {
            zmq_setsockopt(socket, ZMQ_SNDHWM, &unlimited, sizeof unlimited);
            zmq_setsockopt(socket, ZMQ_RCVHWM, &unlimited, sizeof unlimited);
        }
        require(zmq_bind(caller, "inproc://echo") == 0 && zmq_connect(device, "inproc://echo") == 0,
                "zmq: no connection");
        echo = std::thread([this] {
            zmq_msg_t message;
            zmq_msg_init(&message);
            while (zmq_msg_recv(&message, device, 0) > 0) { // the end is empty
                zmq_msg_send(&message, device, 0);
            }
            zmq_msg_close(&message);
        });
    }
    ~Zmq()
    {
        zmq_send(caller, nullptr, 0, 0);
        echo.join();
        zmq_close(caller);
        zmq_close(device);
        zmq_ctx_term(context);
    }

    void send(const double* data)
    {
        zmq_msg_t message;
        zmq_msg_init_size(&message, bytes);
        std::memcpy(zmq_msg_data(&message), data, bytes);
        require(zmq_msg_send(&message, caller, 0) >= 0, "zmq: not sent");
    }

    void receive(double* into)
    {
        zmq_msg_t message;
        zmq_msg_init(&message);
        require(zmq_msg_recv(&message, caller, 0) == static_cast<int>(bytes), "zmq: not received");
        std::memcpy(into, zmq_msg_data(&message), bytes);
        zmq_msg_close(&message);
    }

private:
    void* context = zmq_ctx_new();
    void* caller = zmq_socket(context, ZMQ_PAIR);
    void* device = zmq_socket(context, ZMQ_PAIR);
    std::thread echo;
};
#endif

#ifdef BENCH_NNG
class Nng : public Peer
{
public:
    explicit Nng(std::size_t blockElements) : Peer(blockElements)
    {
        require(nng_pair0_open(&caller) == 0 && nng_pair0_open(&device) == 0, "nng: no socket");
        for (const nng_socket socket : {caller, device}) {
            nng_socket_set_int(socket, NNG_OPT_SENDBUF, 2048);
            nng_socket_set_int(socket, NNG_OPT_RECVBUF, 2048);
        }
        require(nng_listen(caller, "inproc://echo", nullptr, 0) == 0 &&
                    nng_dial(device, "inproc://echo", nullptr, 0) == 0,
                "nng: no connection");
        echo = std::thread([this] {
            nng_msg* message = nullptr;
            while (nng_recvmsg(device, &message, 0) == 0) {
                if (nng_msg_len(message) == 0 || nng_sendmsg(device, message, 0) != 0) { // the end
                    nng_msg_free(message);
                    return;
                }
            }
        });
    }
    ~Nng()
    {
        nng_send(caller, nullptr, 0, 0);
        echo.join();
        nng_close(caller);
        nng_close(device);
    }

    void send(const double* data)
    {
        nng_msg* message = nullptr;
        require(nng_msg_alloc(&message, bytes) == 0, "nng: no message");
        std::memcpy(nng_msg_body(message), data, bytes);
        require(nng_sendmsg(caller, message, 0) == 0, "nng: not sent");
    }

    void receive(double* into)
    {
        nng_msg* message = nullptr;
        require(nng_recvmsg(caller, &message, 0) == 0 && nng_msg_len(message) == bytes,
                "nng: not received");
        std::memcpy(into, nng_msg_body(message), bytes);
        nng_msg_free(message);
    }

private:
    nng_socket caller{};
    nng_socket device{};
    std::thread echo;
};
#endif

#ifdef BENCH_GSTREAMER
/// The streaming thread of the source moves each buffer to the sink.
class Gstreamer : public Peer
{
public:
    explicit Gstreamer(std::size_t blockElements) : Peer(blockElements)
    {
        gst_init(nullptr, nullptr);
        pipeline = gst_parse_launch(
            "appsrc name=source max-bytes=0 ! appsink name=sink sync=false max-buffers=0", nullptr);
        require(pipeline != nullptr, "gstreamer: no pipeline");
        source = GST_APP_SRC(gst_bin_get_by_name(GST_BIN(pipeline), "source"));
        sink = GST_APP_SINK(gst_bin_get_by_name(GST_BIN(pipeline), "sink"));
        gst_element_set_state(pipeline, GST_STATE_PLAYING);
    }
    ~Gstreamer()
    {
        gst_element_set_state(pipeline, GST_STATE_NULL);
        gst_object_unref(source);
        gst_object_unref(sink);
        gst_object_unref(pipeline);
    }

    void send(const double* data)
    {
        GstBuffer* const buffer = gst_buffer_new_allocate(nullptr, bytes, nullptr);
        gst_buffer_fill(buffer, 0, data, bytes);
        require(gst_app_src_push_buffer(source, buffer) == GST_FLOW_OK, "gstreamer: not sent");
    }

    void receive(double* into)
    {
        GstSample* const sample = gst_app_sink_pull_sample(sink);
        require(sample != nullptr &&
                    gst_buffer_extract(gst_sample_get_buffer(sample), 0, into, bytes) == bytes,
                "gstreamer: not received");
        gst_sample_unref(sample);
    }

private:
    GstElement* pipeline;
    GstAppSrc* source;
    GstAppSink* sink;
};
#endif

} // namespace peers

#endif
