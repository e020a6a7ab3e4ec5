// A device that does what its options and commands say.

#include "brenixcore/plugin/Find.hpp"
#include "brenixcore/plugin/Make.hpp"
#include "brenixcore/plugin/Options.hpp"
#include "brenixcore/plugin/Plugin.hpp"

#include <atomic>
#include <chrono>
#include <iterator>
#include <memory>
#include <sstream>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

namespace
{

using namespace brenixcore::plugin;
using namespace brenixplugin;
using namespace brenixplugin::kit;

/// No std::exception, and known to nobody else.
struct OwnException {
};

struct SilentException : std::exception {
    const char* what() const noexcept override { return nullptr; }
};

struct UnknownProperty : interfaces::IPropertyInfo {
    const char* getName() const override { return "unknown"; }
    void destroy() override { delete this; }
};

/// Options: Packets (counts of the packets to push, as a text or as int32; of those below 0 each is a mistake of
/// its own), Streams ("i", "o", "io", ""), FailIn and RaiseIn (an operation: init, open, run, execute,
/// close, term), FailAs (what is thrown: "", "int", "own", "silent", "long"; or "slow"), Threads (how
/// many report things from init to term), Vectors (1: packets of vectors).
class Probe : public Device
{
public:
    DeviceInfo init(const PropertyMap& optionMap, PropertyMap& properties,
                    DeviceHost& deviceHost) override
    {
        enter(isInitialised);
        host = &deviceHost;
        Options options(optionMap);
        failIn = options.text("FailIn").value_or("");
        failAs = options.text("FailAs").value_or("");
        raiseIn = options.text("RaiseIn").value_or("");
        const std::string streams = options.text("Streams").value_or("i");
        const auto given = optionMap.find("Packets");
        auto* const property = given == optionMap.end() ? nullptr : asProperty(given->second);
        if (const auto* list = dynamic_cast<device::TVectorProperty<int>*>(property)) {
            packets = list->values;
        } else {
            std::istringstream text(options.text("Packets").value_or(""));
            packets.assign(std::istream_iterator<int>(text), {});
        }
        reach("init");
        host->updateProperty(makeScalar("Level", 0.0)); // too early: there is no property yet
        publish(properties, "Level", 1.0);
        DeviceInfo info;
        if (streams.find('i') != std::string::npos) {
            info.input = StreamInfo{};
        }
        if (streams.find('o') != std::string::npos) {
            info.output = StreamInfo{2};
        }
        hasOutput = info.output.has_value();
        ending = false;
        pushesVectors = options.wholeNumber("Vectors", 0, 1) == 1;
        for (long left = options.wholeNumber("Threads", 0, 9).value_or(0); left > 0; --left) {
            threads.emplace_back([this] { report(); });
        }
        isInitialised = true;
        return info;
    }

    void open(const PropertyMap& /*options*/) override
    {
        enter(isOpen);
        reach("open");
        isOpen = true;
    }

    /// Pushes packets of running numbers in "data", with a "Stamp" and seven numbers "Odd"
    /// each; then takes all output.
    void run(DeviceStreams& streams) override
    {
        reach("run");
        lastStreams = &streams;
        double next = 0;
        for (const int counts : packets) {
            if (counts < 0) {
                pushMistake(counts);
                continue;
            }
            const auto size = static_cast<std::uint64_t>(counts);
            if (pushesVectors) {
                pushVectors(size, next);
                continue;
            }
            std::unique_ptr<double[]> values(new double[size]);
            for (std::uint64_t i = 0; i < size; ++i) {
                values[i] = next++;
            }
            Packet packet;
            packet.counts = size;
            setField(packet, makeArray(dataField, std::move(values), size));
            setField(packet, makeScalar("Stamp", next));
            setField(packet, makeArray("Odd", std::make_unique<double[]>(7), 7));
            if (!streams.push(std::move(packet))) {
                host->raise("error", "probe:push", "refused");
                return;
            }
        }
        while (hasOutput && streams.pull()) {
        }
    }

    void execute(const std::string& command, const PropertyMap& optionMap) override
    {
        reach("execute");
        if (command == "streamAfterClose") {
            Packet packet;
            packet.counts = 1;
            if (lastStreams->tryPush(packet) || lastStreams->push(std::move(packet)) ||
                lastStreams->pull()) {
                throw std::logic_error("the streams of a closed channel took part");
            }
            return;
        }
        if (command == "storm") {
            std::vector<std::thread> storm(4);
            for (std::thread& thread : storm) {
                thread = std::thread([&] {
                    for (int i = 0; i < 500; ++i) {
                        host->updateProperty(makeScalar("Level", 3.0));
                        host->updateProperty(makeScalar("Other", i));
                        host->raise("error", "", std::string(5000, 'x').c_str());
                    }
                });
            }
            for (std::thread& thread : storm) {
                thread.join();
            }
            return;
        }
        if (command != "updateFromThread") {
            Device::execute(command, optionMap);
        }
        std::thread([&] {
            host->updateProperty(makeScalar("Level", 2.0));
            host->updateProperty(makeScalar("Other", 1));
            host->updateProperty(nullptr);
            host->raise("warning", "probe:warning", "is dropped");
            host->raise(nullptr, nullptr, nullptr);
            host->raise("error", "probe:thread", "from a thread");
        }).join();
    }

    void close() override
    {
        isOpen = false;
        reach("close");
    }

    void term() override
    {
        isInitialised = false;
        ending = true;
        for (std::thread& thread : threads) {
            thread.join();
        }
        threads.clear();
        reach("term");
    }

private:
    static void enter(bool isThere)
    {
        if (isThere) {
            throw std::logic_error("init or open came twice");
        }
    }

    /// Reports property values, warnings, and errors with one text for both of their parts.
    void report()
    {
        while (!ending) {
            const int number = ++reports;
            const std::string text = std::to_string(number);
            host->updateProperty(makeScalar("Level", static_cast<double>(number)));
            host->raise("warning", text.c_str(), "is dropped");
            host->raise("error", text.c_str(), text.c_str());
        }
    }

    void reach(const std::string& operation)
    {
        if (operation == raiseIn) {
            host->raise("error", "probe:raised", operation.c_str());
        }
        if (operation == failIn) {
            if (failAs == "slow") {
                std::this_thread::sleep_for(std::chrono::milliseconds(300));
                return;
            }
            if (failAs == "int") {
                throw 5;
            }
            if (failAs == "own") {
                throw OwnException();
            }
            if (failAs == "silent") {
                throw SilentException();
            }
            throw std::runtime_error("failed in " + operation +
                                     std::string(failAs == "long" ? 5000 : 0, '!'));
        }
    }

    /// Of running numbers in "data", and whether they are even in "Even".
    void pushVectors(std::uint64_t size, double& next)
    {
        auto data = std::make_unique<device::TVectorProperty<double>>(dataField, size);
        auto even = std::make_unique<device::TVectorProperty<bool>>("Even", size);
        for (std::uint64_t i = 0; i < size; ++i) {
            even->values[i] = static_cast<int>(next) % 2 == 0;
            data->values[i] = next++;
        }
        Packet packet;
        packet.counts = size;
        setField(packet, OwnedProperty(data.release()));
        setField(packet, OwnedProperty(even.release()));
        lastStreams->push(std::move(packet));
    }

    void pushMistake(int mistake)
    {
        Packet packet;
        packet.counts = mistake == -1 ? 0 : 5;
        if (mistake == -2) {
            Fields(std::move(packet.fields)); // leaves none
        } else if (mistake == -3) {
            setField(packet, OwnedProperty(new UnknownProperty));
        } else if (mistake == -4) {
            setField(packet, makeArray<int>("none", nullptr, 5));
        } else if (mistake == -5) {
            packet.fields->emplace("null", nullptr);
        }
        lastStreams->push(std::move(packet));
    }

    DeviceHost* host = nullptr;
    DeviceStreams* lastStreams = nullptr;
    std::string failIn;
    std::string failAs;
    std::string raiseIn;
    std::vector<int> packets;
    bool hasOutput = false;
    bool pushesVectors = false;
    bool isInitialised = false;
    bool isOpen = false;
    std::atomic<bool> ending = false;
    std::atomic<int> reports = 0;
    std::vector<std::thread> threads;
};

/// Finds two things, and fails then.
void findThings(std::vector<Found>& found)
{
    found.push_back({"two packets", {{"Packets", "2 3"}, {"FailIn", "it's"}}, ""});
    found.push_back({"\x1b[31m", {}, "group none"});
    throw OwnException();
}

} // namespace

BRENIXCORE_EXPORT_DEVICE(Probe)
BRENIXCORE_EXPORT_FIND(findThings)
