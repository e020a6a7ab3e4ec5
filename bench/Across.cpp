// Blocks from one channel to another, over the devices zmq and nats, and over the libraries beneath them with the
// same copies in and out: from the caller's array, and into it. The environment's BENCH_NATS is the URL of a
// nats-server with JetStream; without it nats is left out.

#include "Echo.hpp"

#include <malloc.h>
#include <netinet/in.h>

#include <cstdlib>
#include <memory>
#include <thread>

#ifdef BENCH_ZMQ
#include <zmq.h>
#endif
#ifdef BENCH_NATS
#include <nats/nats.h>
#endif

namespace
{

using namespace peers;

/// A channel that stays open.
class Channel
{
public:
    template <typename... Options>
    Channel(std::size_t elements, const char* device, uint64_t count, Options... options)
    {
        const double limit = 16.0 * static_cast<double>(elements);
        char id[CODER_ERROR_SIZE] = "";
        char message[CODER_ERROR_SIZE] = "";
        handle = coderChannelCreate(device, "identity", id, message, limit, limit);
        require(handle != nullptr, message);
        if (coderChannelInit(handle, count, options...) != 1 || coderChannelOpen(handle, 0) != 1) {
            coderChannelGetLastError(handle, id, message);
            throw std::runtime_error(std::string(device) + ": " + id + ": " + message);
        }
    }
    Channel(const Channel&) = delete;
    Channel& operator=(const Channel&) = delete;
    ~Channel()
    {
        coderChannelClose(handle);
        coderChannelTerm(handle);
        coderChannelDestroy(handle);
    }

    void write(const double* data, std::size_t elements) const
    {
        double written = 0;
        require(coderOutputStreamWriteTypedDataOld(coderChannelGetOutputStream(handle), &written, 1,
                                                   "double", CODER_BUFFER(elements, data)) == 1,
                "not written");
    }

    void read(double* into, std::size_t elements) const
    {
        void* const input = coderChannelGetInputStream(handle);
        require(coderInputStreamReadBuffers(input, static_cast<double>(elements), 1) == 1 &&
                    coderInputStreamReadBufferData(input, 1, 0, "data", "double",
                                                   static_cast<int32_t>(elements), into) == 1,
                "nothing to read");
        coderInputStreamFreeBuffer(input, 1);
    }

private:
    void* handle;
};

#define TEXT(name, value) CODER_OPTION(name, "char", std::strlen(value), value)

/// Two channels, one that writes and one that reads.
class Channels : public Peer
{
public:
    Channels(std::size_t blockElements, std::unique_ptr<Channel> writing,
             std::unique_ptr<Channel> reading)
        : Peer(blockElements), writer(std::move(writing)), reader(std::move(reading))
    {
    }

    void send(const double* data) { writer->write(data, elements); }
    void receive(double* into) { reader->read(into, elements); }

protected:
    std::unique_ptr<Channel> writer;
    std::unique_ptr<Channel> reader;
};

#ifdef BENCH_ZMQ
/// An address of this machine that nobody uses.
std::string freeAddress()
{
    const int probe = socket(AF_INET, SOCK_STREAM, 0);
    sockaddr_in address{};
    address.sin_family = AF_INET;
    address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    socklen_t size = sizeof address;
    require(bind(probe, reinterpret_cast<sockaddr*>(&address), size) == 0 &&
                getsockname(probe, reinterpret_cast<sockaddr*>(&address), &size) == 0,
            "no free port");
    close(probe);
    return "tcp://127.0.0.1:" + std::to_string(ntohs(address.sin_port));
}

struct ZmqDevice : Channels {
    explicit ZmqDevice(std::size_t blockElements, const std::string& address = freeAddress())
        : Channels(
              blockElements,
              std::make_unique<Channel>(blockElements, "zmq", 2, TEXT("Endpoint", address.c_str()),
                                        TEXT("Pattern", "push")),
              std::make_unique<Channel>(blockElements, "zmq", 2, TEXT("Endpoint", address.c_str()),
                                        TEXT("Pattern", "pull")))
    {
    }
};

/// The library itself, each side with a context of its own, as in two programs.
class RawZmq : public Peer
{
public:
    explicit RawZmq(std::size_t blockElements) : Peer(blockElements)
    {
        const std::string address = freeAddress();
        require(zmq_bind(writer, address.c_str()) == 0 && zmq_connect(reader, address.c_str()) == 0,
                "zmq: no connection");
    }
    ~RawZmq()
    {
        for (void* const socket : {writer, reader}) {
            zmq_close(socket);
        }
        zmq_ctx_term(here);
        zmq_ctx_term(there);
    }

    void send(const double* data)
    {
        zmq_msg_t message;
        zmq_msg_init_size(&message, bytes);
        std::memcpy(zmq_msg_data(&message), data, bytes);
        require(zmq_msg_send(&message, writer, 0) >= 0, "zmq: not sent");
    }
    void receive(double* into)
    {
        zmq_msg_t message;
        zmq_msg_init(&message);
        require(zmq_msg_recv(&message, reader, 0) == static_cast<int>(bytes), "zmq: not received");
        std::memcpy(into, zmq_msg_data(&message), bytes);
        zmq_msg_close(&message);
    }

private:
    void* here = zmq_ctx_new();
    void* there = zmq_ctx_new();
    void* writer = zmq_socket(here, ZMQ_PUSH);
    void* reader = zmq_socket(there, ZMQ_PULL);
};
#endif

#ifdef BENCH_NATS
const char* server()
{
    return std::getenv("BENCH_NATS");
}

struct NatsDevice : Channels {
    explicit NatsDevice(std::size_t blockElements) : Channels(blockElements, nullptr, nullptr)
    {
        reader = std::make_unique<Channel>(blockElements, "nats", 2, TEXT("Servers", server()),
                                           TEXT("Subject", "bench.ours"));
        writer = std::make_unique<Channel>(blockElements, "nats", 3, TEXT("Servers", server()),
                                           TEXT("Subject", "bench.ours"), TEXT("Mode", "write"));
    }
};

/// A connection to the server.
struct Connection {
    Connection()
    {
        require(natsConnection_ConnectTo(&handle, server()) == NATS_OK, "nats: no connection");
    }
    Connection(const Connection&) = delete;
    Connection& operator=(const Connection&) = delete;
    ~Connection() { natsConnection_Destroy(handle); }
    natsConnection* handle = nullptr;
};

class RawNats : public Peer
{
public:
    explicit RawNats(std::size_t blockElements) : Peer(blockElements)
    {
        require(natsConnection_SubscribeSync(&subscription, reader.handle, "bench.raw") ==
                        NATS_OK &&
                    natsConnection_Flush(reader.handle) == NATS_OK,
                "nats: no subscription");
    }
    ~RawNats() { natsSubscription_Destroy(subscription); }

    void send(const double* data)
    {
        require(natsConnection_Publish(writer.handle, "bench.raw", data, static_cast<int>(bytes)) ==
                    NATS_OK,
                "nats: not sent");
    }
    void receive(double* into)
    {
        natsMsg* message = nullptr;
        require(natsSubscription_NextMsg(&message, subscription, 10000) == NATS_OK,
                "nats: not received");
        std::memcpy(into, natsMsg_GetData(message), bytes);
        natsMsg_Destroy(message);
    }

private:
    Connection writer;
    Connection reader;
    natsSubscription* subscription = nullptr;
};

/// Only writes, to a stream: what is on its way is not confirmed yet.
struct JetStreamDevice : Peer {
    explicit JetStreamDevice(std::size_t blockElements) : Peer(blockElements)
    {
        returns = false;
        const double most = 1 << 28;
        writer = std::make_unique<Channel>(blockElements, "nats", 5, TEXT("Servers", server()),
                                           TEXT("Subject", "bench.stream.ours"),
                                           TEXT("Mode", "write"), TEXT("Stream", "bench-ours"),
                                           CODER_OPTION("MaxBytes", "double", 1, &most));
    }
    void send(const double* data) { writer->write(data, elements); }
    void receive(double* /*into*/) {}
    std::unique_ptr<Channel> writer;
};

class RawJetStream : public Peer
{
public:
    explicit RawJetStream(std::size_t blockElements) : Peer(blockElements)
    {
        returns = false;
        jsOptions options;
        jsOptions_Init(&options);
        options.PublishAsync.MaxPending = 256; // as the device
        options.PublishAsync.StallWait = 10000;
        jsStreamConfig config;
        jsStreamConfig_Init(&config);
        const char* const subject = "bench.stream.raw";
        config.Name = "bench-raw";
        config.Subjects = &const_cast<const char*&>(subject);
        config.SubjectsLen = 1;
        config.MaxBytes = 1 << 28;
        require(natsConnection_JetStream(&stream, writer.handle, &options) == NATS_OK &&
                    js_AddStream(nullptr, stream, &config, nullptr, nullptr) == NATS_OK,
                "nats: no stream");
    }
    ~RawJetStream()
    {
        js_PublishAsyncComplete(stream, nullptr);
        jsCtx_Destroy(stream);
    }

    void send(const double* data)
    {
        require(js_PublishAsync(stream, "bench.stream.raw", data, static_cast<int>(bytes),
                                nullptr) == NATS_OK,
                "nats: not sent");
    }
    void receive(double* /*into*/) {}

private:
    Connection writer;
    jsCtx* stream = nullptr;
};
#endif

/// Blocks from a thread that writes to one that reads, as from program to program.
template <typename Peer>
void move(const std::string& name, std::size_t elements)
{
    benchmark::RegisterBenchmark(name.c_str(),
                                 [=](benchmark::State& state) {
                                     std::vector<double> out(elements);
                                     std::iota(out.begin(), out.end(), 1.0);
                                     std::vector<double> in(elements);
                                     Peer peer(elements);
                                     constexpr benchmark::IterationCount before =
                                         500; // by when as many are on their way as may be
                                     std::thread writer([&, count = before + state.max_iterations] {
                                         for (benchmark::IterationCount i = 0; i < count; ++i) {
                                             peer.send(out.data());
                                         }
                                     });
                                     for (benchmark::IterationCount i = 0; i < before; ++i) {
                                         peer.receive(in.data());
                                     }
                                     for (auto _ : state) {
                                         peer.receive(in.data());
                                     }
                                     writer.join();
                                     require(in == out, "the blocks came changed");
                                     state.SetBytesProcessed(state.iterations() *
                                                             static_cast<int64_t>(peer.bytes));
                                 })
        ->UseRealTime()
        ->MinTime(0.3);
}

} // namespace

int main(int argc, char** argv)
{
    // Blocks are allocated in one thread and freed in another: what is free stays at hand, for the libraries too.
    mallopt(M_MMAP_THRESHOLD, 32 << 20);
    mallopt(M_TRIM_THRESHOLD, 256 << 20);
    for (const std::size_t bytes : {4UL << 10, 64UL << 10, 1UL << 20}) {
        const std::size_t elements = bytes / sizeof(double);
        const std::string size = std::to_string(bytes);
#ifdef BENCH_ZMQ
        move<ZmqDevice>("zmq/" + size + "/ours", elements);
        move<RawZmq>("zmq/" + size + "/raw", elements);
#endif
#ifdef BENCH_NATS
        if (bytes < 1UL << 20 && server() != nullptr) { // which is more than the server takes
            move<NatsDevice>("nats/" + size + "/ours", elements);
            move<RawNats>("nats/" + size + "/raw", elements);
            add<JetStreamDevice>("jetstream/" + size + "/ours", elements, 16);
            add<RawJetStream>("jetstream/" + size + "/raw", elements, 16);
        }
#endif
    }
    benchmark::Initialize(&argc, argv);
    if (benchmark::ReportUnrecognizedArguments(argc, argv)) {
        return 1;
    }
    benchmark::RunSpecifiedBenchmarks();
    return 0;
}
