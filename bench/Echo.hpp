// Blocks there and back, as many on their way as wanted or as the peer holds.
#ifndef BRENIXCODER_BENCH_ECHO_HPP
#define BRENIXCODER_BENCH_ECHO_HPP

#include "Peers.hpp"

#include <benchmark/benchmark.h>

#include <algorithm>
#include <numeric>
#include <string>
#include <vector>

namespace peers
{

template <typename Peer>
void echo(benchmark::State& state, std::size_t elements, std::size_t inFlight, std::size_t batch)
{
    std::vector<double> out(elements);
    std::iota(out.begin(), out.end(), 1.0);
    std::vector<double> in(elements);
    Peer peer(elements);
    const std::size_t most = std::clamp(peer.capacity, 1UL, inFlight);
    std::size_t flying = 0;
    const auto step = [&] {
        peer.send(out.data());
        if (++flying == most) {
            peer.receive(in.data());
            --flying;
        }
    };
    for (std::size_t i = 0; i < 4 * most; ++i) { // until the memory that moves has been used before
        step();
    }
    for (auto _ : state) {
        step();
    }
    for (; flying > 0; --flying) {
        peer.receive(in.data());
    }
    require(in == out || !peer.returns, "the blocks came back changed");
    state.SetBytesProcessed(state.iterations() * static_cast<int64_t>(peer.bytes * batch));
}

template <typename Peer>
void add(const std::string& name, std::size_t elements, std::size_t inFlight, std::size_t batch = 1)
{
    benchmark::RegisterBenchmark(name.c_str(), [=](benchmark::State& state) {
        echo<Peer>(state, elements, inFlight, batch);
    })->UseRealTime();
}

} // namespace peers

#endif
