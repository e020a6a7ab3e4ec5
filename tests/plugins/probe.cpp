// A device that does what its options and commands say.

#include "brenixcore/plugin/Make.hpp"
#include "brenixcore/plugin/Options.hpp"
#include "brenixcore/plugin/Plugin.hpp"

#include <memory>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

namespace
{

using namespace brenixcore::plugin;
using namespace brenixplugin;
using namespace brenixplugin::kit;

/// Options: Packets (counts of the packets to push, as int32), Streams ("i", "o", "io", ""), FailIn
/// and RaiseIn (an operation: init, open, run, execute, close, term).
class Probe : public Device
{
public:
    DeviceInfo init(const PropertyMap& optionMap, PropertyMap& properties,
                    DeviceHost& deviceHost) override
    {
        host = &deviceHost;
        Options options(optionMap);
        failIn = options.text("FailIn").value_or("");
        raiseIn = options.text("RaiseIn").value_or("");
        const std::string streams = options.text("Streams").value_or("i");
        packets.clear();
        if (const auto found = optionMap.find("Packets"); found != optionMap.end()) {
            auto* const property = asProperty(found->second);
            const auto* const one = dynamic_cast<device::TScalarProperty<int>*>(property);
            packets = one != nullptr
                          ? std::vector<int>{one->value}
                          : dynamic_cast<device::TVectorProperty<int>&>(*property).values;
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
        return info;
    }

    void open(const PropertyMap& /*options*/) override { reach("open"); }

    /// Pushes packets of running numbers in "data", with a "Stamp" and the "Address" of
    /// the numbers each; then takes all output.
    void run(DeviceStreams& streams) override
    {
        reach("run");
        double next = 0;
        for (const int counts : packets) {
            const auto size = static_cast<std::uint64_t>(counts);
            std::unique_ptr<double[]> values(new double[size]);
            for (std::uint64_t i = 0; i < size; ++i) {
                values[i] = next++;
            }
            Packet packet;
            packet.counts = size;
            setField(packet, makeScalar("Address", reinterpret_cast<std::uintptr_t>(values.get())));
            setField(packet, makeArray(dataField, std::move(values), size));
            setField(packet, makeScalar("Stamp", next));
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

    void close() override { reach("close"); }
    void term() override { reach("term"); }

private:
    void reach(const std::string& operation)
    {
        if (operation == raiseIn) {
            host->raise("error", "probe:raised", operation.c_str());
        }
        if (operation == failIn) {
            throw std::runtime_error("failed in " + operation);
        }
    }

    DeviceHost* host = nullptr;
    std::string failIn;
    std::string raiseIn;
    std::vector<int> packets;
    bool hasOutput = false;
};

} // namespace

BRENIXCORE_EXPORT_DEVICE(Probe)
