// A packet of doubles to a message and back, beside a copy of the same bytes.

#include "brenixcore/plugin/Make.hpp"
#include "messages/Message.hpp"

#include <benchmark/benchmark.h>

#include <cstdlib>
#include <cstring>
#include <iterator>
#include <memory>
#include <string>
#include <variant>
#include <vector>

namespace
{

using namespace brenixcore::plugin;
using benchmark::State;

messages::Data dataOf(std::size_t bytes)
{
    messages::Data data{"machine/0123456789abcdef", 1000, 1000000, {}, 0, bytes / sizeof(double)};
    auto elements = std::make_unique<double[]>(data.counts);
    setField(data.packet, makeArray(dataField, std::move(elements), data.counts));
    data.packet.counts = data.counts;
    data.packet.time = 1700000000000000000;
    return data;
}

std::vector<unsigned char> messageOf(const messages::Data& data)
{
    std::vector<unsigned char> message(messages::sizeOf(data));
    messages::write(data, message.data());
    return message;
}

void copying(State& state, std::size_t bytes)
{
    const std::vector<unsigned char> from(bytes);
    std::vector<unsigned char> to(bytes);
    for (auto _ : state) {
        std::memcpy(to.data(), from.data(), bytes);
        benchmark::DoNotOptimize(to.data());
        benchmark::ClobberMemory();
    }
}

void writing(State& state, std::size_t bytes)
{
    const messages::Data data = dataOf(bytes);
    std::vector<unsigned char> message = messageOf(data);
    for (auto _ : state) {
        if (messages::sizeOf(data) != message.size()) {
            std::abort();
        }
        messages::write(data, message.data());
        benchmark::ClobberMemory();
    }
}

void reading(State& state, std::size_t bytes)
{
    const std::vector<unsigned char> message = messageOf(dataOf(bytes));
    for (auto _ : state) {
        const auto read = messages::read(message.data(), message.size(), message.size());
        if (std::get<messages::Data>(read).counts != bytes / sizeof(double)) {
            std::abort();
        }
        benchmark::ClobberMemory();
    }
}

} // namespace

int main(int argc, char** argv)
{
    constexpr std::size_t sizes[] = {64, 4UL << 10, 64UL << 10, 1UL << 20};
    for (const std::size_t bytes : sizes) {
        const std::string row = "message/" + std::to_string(bytes);
        benchmark::RegisterBenchmark((row + "/copy").c_str(), copying, bytes);
        benchmark::RegisterBenchmark((row + "/write").c_str(), writing, bytes);
        benchmark::RegisterBenchmark((row + "/read").c_str(), reading, bytes);
    }
    benchmark::Initialize(&argc, argv);
    if (benchmark::ReportUnrecognizedArguments(argc, argv)) {
        return 1;
    }
    benchmark::RunSpecifiedBenchmarks();
    return 0;
}
