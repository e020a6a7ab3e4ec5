// What one call of the library costs, on a core that returns at once. Each measurement has its
// reference beside it under the same name, so that the two run in turn.

#include "Allocations.hpp"
#include "NullCore.hpp"
#include "brenixcoder/coder.h"

#include <benchmark/benchmark.h>

#include <array>
#include <cstring>
#include <ctime>
#include <memory>
#include <numeric>
#include <stdexcept>
#include <string>
#include <tuple>
#include <utility>
#include <vector>

#ifdef BENCH_SOAPYSDR
#include <SoapySDR/Device.h>
#include <SoapySDR/Device.hpp>
#include <SoapySDR/Registry.hpp>
#endif

namespace
{

using benchmark::State;

void require(bool fulfilled, const char* what)
{
    if (!fulfilled) {
        throw std::runtime_error(what);
    }
}

/// A channel on the null core, initialised.
struct Channel {
    Channel()
    {
        char id[CODER_ERROR_SIZE];
        char message[CODER_ERROR_SIZE];
        handle = coderChannelCreate("device", "converter", id, message, 1, 1);
        require(handle != nullptr && coderChannelInit(handle, 0) == 1, "no channel");
        input = coderChannelGetInputStream(handle);
        output = coderChannelGetOutputStream(handle);
        coreInput = nullCore().input.get();
    }
    Channel(const Channel&) = delete;
    Channel& operator=(const Channel&) = delete;
    ~Channel() { coderChannelDestroy(handle); }

    /// Fills the store of the input stream.
    void store(std::size_t buffers, std::size_t fields, std::size_t elements) const
    {
        for (std::size_t i = 0; i < buffers; ++i) {
            nullCore().stock.push_back(makeDataBuffer(fields, elements));
        }
        const auto count = static_cast<double>(buffers);
        require(coderInputStreamReadBuffers(input, count, count) == 1, "nothing to read");
    }

    void* handle;
    void* input;
    void* output;
    brenixcore::InputStream* coreInput;
};

/// Measures an operation that returns something.
template <typename Operation>
void measure(State& state, const Operation& operation)
{
    benchmark::DoNotOptimize(operation());
    const std::size_t before = allocations;
    for (auto _ : state) {
        benchmark::DoNotOptimize(operation());
    }
    state.counters["allocations"] = benchmark::Counter(static_cast<double>(allocations - before),
                                                       benchmark::Counter::kAvgIterations);
}

/// Registers a measurement of an operation of a channel.
template <typename Operation>
void add(const std::string& name, const Operation& operation)
{
    benchmark::RegisterBenchmark(name.c_str(), [operation](State& state) {
        const Channel channel;
        measure(state, [&] { return operation(channel); });
    });
}

// --- Queries ---

template <typename Face, typename Core>
void addQuery(const std::string& name, const Face& face, const Core& core)
{
    add("query/" + name + "/face", face);
    add("query/" + name + "/direct", core);
}

/// A query through the C function, which must succeed.
template <auto function, typename Answer>
Answer ask(void* handle)
{
    Answer answer;
    benchmark::DoNotOptimize(function(handle, &answer));
    return answer;
}

#ifdef BENCH_SOAPYSDR
struct NullDevice : SoapySDR::Device {
    [[gnu::noinline]] double getBandwidth(int /*direction*/, size_t /*channel*/) const override
    {
        return 1;
    }
};

void addSoapy()
{
    static const SoapySDR::Registry registry(
        "null", [](const SoapySDR::Kwargs&) { return SoapySDR::KwargsList(); },
        [](const SoapySDR::Kwargs&) -> SoapySDR::Device* { return new NullDevice; },
        SOAPY_SDR_ABI_VERSION);
    static SoapySDRDevice* const device = SoapySDRDevice_makeStrArgs("driver=null");
    require(device != nullptr, "no null driver");
    const auto face = [](const Channel&) {
        return SoapySDRDevice_getBandwidth(device, SOAPY_SDR_RX, 0);
    };
    const auto core = [](const Channel&) {
        auto* direct = reinterpret_cast<SoapySDR::Device*>(device);
        benchmark::DoNotOptimize(direct);
        return direct->getBandwidth(SOAPY_SDR_RX, 0);
    };
    addQuery("soapy", face, core);
}
#endif

void addQueries()
{
    using Core = const brenixcore::InputStream;
    addQuery(
        "StreamIsOpen", [](const Channel& c) { return ask<coderStreamIsOpen, uint8_t>(c.input); },
        [](const Channel& c) { return c.coreInput->isOpen(); });
    addQuery(
        "GetDataAvailable",
        [](const Channel& c) { return ask<coderStreamGetDataAvailable, double>(c.input); },
        [](const Channel& c) { return static_cast<double>(c.coreInput->getDataAvailable()); });
    addQuery(
        "GetSpaceAvailable",
        [](const Channel& c) { return ask<coderStreamGetSpaceAvailable, double>(c.input); },
        [](const Channel& c) {
            return c.coreInput->isUnlimited()
                       ? 0.0
                       : static_cast<double>(c.coreInput->getSpaceAvailable());
        });
    addQuery(
        "ChannelIsOpen",
        [](const Channel& c) { return ask<coderChannelIsOpen, uint8_t>(c.handle); },
        [](const Channel& /*channel*/) {
            static const brenixcore::Channel* const core = [] {
                struct Handler : brenixcore::Channel::IEventHandler {
                    void onCustomEvent(brenixcore::CustomEvent&) override {}
                    void onPropertyUpdate(brenixplugin::interfaces::IPropertyInfo*) override {}
                    void* onDelegatedEvent(brenixcore::DelegatedEvent&) override { return nullptr; }
                    void onIgnoredEvent1(void*) override {}
                    void onIgnoredEvent2(void*) override {}
                };
                static Handler handler;
                static brenixcore::Converter converter("");
                return new brenixcore::Channel("", converter, handler, 1, 1);
            }();
            return core->isOpen();
        });
#ifdef BENCH_SOAPYSDR
    addSoapy();
#endif
    const auto cast = [](const Channel& c) {
        brenixcore::Stream* stream = c.coreInput;
        benchmark::DoNotOptimize(stream);
        return dynamic_cast<Core*>(stream);
    };
    addQuery(
        "IsDeviceDone",
        [](const Channel& c) { return ask<coderStreamIsDeviceDone, uint8_t>(c.input); },
        [cast](const Channel& c) { return cast(c)->isDeviceDone(); });
    addQuery(
        "GetCountDimension",
        [](const Channel& c) { return ask<coderStreamGetCountDimension, double>(c.input); },
        [cast](const Channel& c) { return static_cast<double>(cast(c)->getCountDimension()); });
}

// --- Data ---

/// Copy-out from a store of so many buffers with so many fields, or memcpy of the very same bytes.
void copyOut(State& state, std::size_t elements, std::size_t buffers, std::size_t fields, bool face)
{
    const Channel channel;
    channel.store(buffers, fields, elements);
    std::vector<double> destination(elements);
    const std::string field = numbered("data", fields / 2);
    const auto buffer = static_cast<int32_t>(buffers);
    if (face) {
        measure(state, [&] {
            return coderInputStreamReadBufferData(channel.input, buffer, 0, field.c_str(), "double",
                                                  static_cast<int32_t>(elements),
                                                  destination.data());
        });
    } else {
        measure(state, [&] {
            std::memcpy(destination.data(), nullCore().lastElements, elements * sizeof(double));
            benchmark::ClobberMemory();
            return 0;
        });
    }
}

/// Seconds that this thread has run.
double processorTime()
{
    timespec now{};
    clock_gettime(CLOCK_THREAD_CPUTIME_ID, &now);
    return static_cast<double>(now.tv_sec) + static_cast<double>(now.tv_nsec) * 1e-9;
}

/// Peek, read, copy-out and free of a thousand buffers of one element, k at a time. The making of the buffers, which is the core's work, is not measured.
void readAll(State& state, std::size_t k)
{
    const Channel channel;
    const auto waiting = static_cast<double>(k);
    constexpr std::size_t all = 1000;
    nullCore().waiting.assign(k, 1);
    std::vector<double> counts(k);
    for (auto _ : state) {
        for (std::size_t i = 0; i < all; ++i) {
            nullCore().stock.push_back(makeDataBuffer(1, 1));
        }
        const double begin = processorTime();
        for (std::size_t done = 0; done < all; done += k) {
            double total = 0;
            double buffers = waiting;
            double element = 0;
            coderInputStreamPeek(channel.input, &total, counts.data(), &buffers, 1e9);
            coderInputStreamReadBuffers(channel.input, total, buffers);
            for (int32_t i = 1; i <= static_cast<int32_t>(k); ++i) {
                coderInputStreamReadBufferData(channel.input, i, 0, "data", "double", 1, &element);
                coderInputStreamFreeBuffer(channel.input, i);
            }
        }
        state.SetIterationTime(processorTime() - begin);
    }
}

/// An option list of as many scalars.
template <std::size_t... number>
int execute(void* channel, std::index_sequence<number...> /*numbers*/)
{
    static constexpr std::size_t count = sizeof...(number);
    static const std::array<std::string, count> names{(numbered("option", number))...};
    static constexpr double value = 1;
    const auto option = [](const std::string& name) {
        return std::make_tuple(CODER_OPTION(name.c_str(), "double", 1, &value));
    };
    return std::apply(
        [&](const auto&... arguments) {
            return coderChannelExecute(channel, "command", count, arguments...);
        },
        std::tuple_cat(option(names[number])...));
}

template <std::size_t count>
void addOptions()
{
    add(numbered("options/", count),
        [](const Channel& c) { return execute(c.handle, std::make_index_sequence<count>()); });
}

void addData()
{
    for (const std::size_t bytes : {8UL, 4UL << 10, 64UL << 10, 1UL << 20, 16UL << 20}) {
        const std::size_t elements = bytes / sizeof(double);
        const std::string size = std::to_string(bytes);
        for (const bool face : {true, false}) {
            benchmark::RegisterBenchmark(
                ("copyOut/" + size + (face ? "/face" : "/direct")).c_str(),
                [=](State& state) { copyOut(state, elements, 1, 1, face); });
        }
        const auto source = std::make_shared<std::vector<double>>(elements);
        add("write/" + size + "/face", [=](const Channel& c) {
            double written = 0;
            coderOutputStreamWriteTypedDataOld(c.output, &written, 1, "double",
                                               CODER_BUFFER(elements, source->data()));
            return written;
        });
        add("write/" + size + "/direct", [=](const Channel& /*channel*/) {
            auto* const copy = new double[elements];
            std::memcpy(copy, source->data(), bytes);
            benchmark::DoNotOptimize(copy[0]);
            benchmark::ClobberMemory();
            delete[] copy;
            return 0;
        });
    }
    for (const std::size_t fields : {1UL, 10UL, 100UL}) {
        benchmark::RegisterBenchmark((numbered("fields/", fields)).c_str(),
                                     [=](State& state) { copyOut(state, 1, 1, fields, true); });
    }
    for (const std::size_t buffers : {1UL, 100UL, 10000UL}) {
        benchmark::RegisterBenchmark((numbered("buffers/", buffers)).c_str(),
                                     [=](State& state) { copyOut(state, 1, buffers, 1, true); });
    }
    for (const std::size_t properties : {10UL, 1000UL, 100000UL}) {
        benchmark::RegisterBenchmark((numbered("properties/", properties)).c_str(),
                                     [=](State& state) {
                                         nullCore().properties = properties;
                                         const Channel channel;
                                         nullCore().properties = 1;
                                         const std::string name = numbered("p", properties / 2);
                                         double value = 0;
                                         measure(state, [&] {
                                             return coderChannelGetPropertyValue(
                                                 channel.handle, name.c_str(), "double", 1, &value);
                                         });
                                     });
    }
    for (const std::size_t k : {1UL, 10UL, 100UL, 1000UL}) {
        benchmark::RegisterBenchmark((numbered("readAll/", k)).c_str(), [=](State& state) {
            readAll(state, k);
        })->UseManualTime();
    }
    addOptions<1>();
    addOptions<10>();
    addOptions<32>();
}

// --- Failures ---

void addFailures()
{
    add("failure/face", [](const Channel& c) {
        nullCore().fails = true;
        char id[CODER_ERROR_SIZE];
        char message[CODER_ERROR_SIZE];
        coderStreamFlush(c.input);
        coderChannelGetLastError(c.handle, id, message);
        nullCore().fails = false;
        benchmark::DoNotOptimize(message[0]);
        return id[0];
    });
    add("failure/direct", [](const Channel& c) {
        nullCore().fails = true;
        char id[CODER_ERROR_SIZE];
        char message[CODER_ERROR_SIZE];
        try {
            c.coreInput->flush();
        } catch (const std::exception& exception) {
            std::strcpy(id, "brenix:InputStream:synchronousInputNotPossible");
            std::strcpy(message, exception.what());
        }
        nullCore().fails = false;
        benchmark::DoNotOptimize(message[0]);
        return id[0];
    });
}

} // namespace

int main(int argc, char** argv)
{
    addQueries();
    addData();
    addFailures();
    benchmark::Initialize(&argc, argv);
    if (benchmark::ReportUnrecognizedArguments(argc, argv)) {
        return 1;
    }
    benchmark::RunSpecifiedBenchmarks();
    return 0;
}
