// Data through the whole library, and through its peers, side by side. Run it on one processor and on
// two: what two threads on two processors take depends on where the machine has put them.

#include "Allocations.hpp"
#include "Echo.hpp"

#include <fstream>
#include <memory>

namespace
{

using namespace peers;
using benchmark::State;

void addPeers(const std::string& row, std::size_t elements, std::size_t inFlight)
{
    add<VectorQueue>(row + "/queue", elements, inFlight);
#ifdef BENCH_ZMQ
    add<Zmq>(row + "/zmq", elements, inFlight);
#endif
#ifdef BENCH_NNG
    add<Nng>(row + "/nng", elements, inFlight);
#endif
#ifdef BENCH_GSTREAMER
    add<Gstreamer>(row + "/gstreamer", elements, inFlight);
#endif
    add<SocketPair>(row + "/socketpair", elements, inFlight);
    add<Pipe>(row + "/pipe", elements, inFlight);
}

/// What the library and the core together allocate for a written buffer.
void writeAllocations(State& state)
{
    const OpenChannel channel;
    coderChannelClose(channel.handle); // so that nobody takes it
    void* const output = coderChannelGetOutputStream(channel.handle);
    const double element = 1;
    const auto write = [&] {
        double written = 0;
        require(coderOutputStreamWriteTypedDataOld(output, &written, 1, "double",
                                                   CODER_BUFFER(1, &element)) == 1,
                "loopback: no room");
    };
    write(); // makes room for some
    for (auto _ : state) {
        const std::size_t before = allocations;
        write();
        state.counters["allocations"] = static_cast<double>(allocations - before);
    }
}

/// Pages of the process that are in memory.
double residentBytes()
{
    std::size_t total = 0;
    std::size_t resident = 0;
    std::ifstream("/proc/self/statm") >> total >> resident;
    return static_cast<double>(resident) * static_cast<double>(sysconf(_SC_PAGESIZE));
}

/// From create to destroy.
void cycle(State& state)
{
    for (auto _ : state) {
        const OpenChannel channel;
    }
}

/// Memory of channels that are open and idle, with what their threads touch of their stacks.
void idle(State& state)
{
    constexpr std::size_t count = 1000;
    for (auto _ : state) {
        const double before = residentBytes();
        std::vector<std::unique_ptr<OpenChannel>> channels;
        for (std::size_t i = 0; i < count; ++i) {
            channels.push_back(std::make_unique<OpenChannel>());
        }
        state.counters["residentBytes"] = (residentBytes() - before) / count;
    }
}

} // namespace

int main(int argc, char** argv)
{
    add<Loopback<1>>("roundTrip/ours", 1, 1);
    addPeers("roundTrip", 1, 1);
    for (const std::size_t bytes : {64UL, 4UL << 10, 64UL << 10, 1UL << 20}) {
        const std::string row = "echo/" + std::to_string(bytes);
        add<Loopback<1>>(row + "/ours", bytes / sizeof(double), 16);
        addPeers(row, bytes / sizeof(double), 16);
    }
    // As many blocks on their way, which the peers take one by one.
    constexpr std::size_t batch = 64;
    add<Loopback<batch>>("echo/64x64/ours", 64 / sizeof(double), 16, batch);
    addPeers("echo/64x64", 64 / sizeof(double), 16 * batch);
    benchmark::RegisterBenchmark("write/allocations", writeAllocations)->Iterations(1);
    benchmark::RegisterBenchmark("channel/cycle", cycle)->UseRealTime();
    benchmark::RegisterBenchmark("channel/idle", idle)->UseRealTime()->Iterations(1);

    benchmark::Initialize(&argc, argv);
    if (benchmark::ReportUnrecognizedArguments(argc, argv)) {
        return 1;
    }
    benchmark::RunSpecifiedBenchmarks();
    return 0;
}
