// A device that counts: it pushes running numbers as "uint32" in the field "data".
//
// Its option, property, field and command are described at the end.

#include <brenixcore/plugin/Describe.hpp>
#include <brenixcore/plugin/Make.hpp>
#include <brenixcore/plugin/Options.hpp>
#include <brenixcore/plugin/Plugin.hpp>

#include <atomic>
#include <memory>
#include <string>
#include <utility>

namespace
{

using namespace brenixcore::plugin;

class Counter : public Device
{
public:
    DeviceInfo init(const brenixplugin::PropertyMap& optionMap,
                    brenixplugin::PropertyMap& properties, DeviceHost& deviceHost) override
    {
        Options options(optionMap);
        blockSize = static_cast<unsigned>(options.wholeNumber("BlockSize", 1, 65536).value_or(4));
        options.requireAllKnown();
        host = &deviceHost;
        next = 0;
        publish(properties, "Next", next.load());
        return {StreamInfo{}, std::nullopt}; // an input stream, no output stream
    }

    // On a thread of the core. push() waits while there is no room, and is false when it is time to
    // stop.
    void run(DeviceStreams& streams) override
    {
        bool going = true;
        while (going) {
            std::unique_ptr<unsigned[]> numbers(new unsigned[blockSize]);
            for (unsigned i = 0; i < blockSize; ++i) {
                numbers[i] = next++;
            }
            Packet packet;
            packet.counts = blockSize;
            setField(packet, makeArray(dataField, std::move(numbers), blockSize));
            going = streams.push(std::move(packet));
            host->updateProperty(makeScalar("Next", next.load()));
        }
    }

    void execute(const std::string& command, const brenixplugin::PropertyMap& options) override
    {
        if (command != "restart") {
            Device::execute(command, options); // refuses it
        }
        Options(options).requireAllKnown();
        next = 0;
    }

private:
    DeviceHost* host = nullptr;
    unsigned blockSize = 4;
    std::atomic<unsigned> next = 0;
};

constexpr OptionInfo optionTable[] = {
    {"BlockSize", "whole number", "numbers", "4", "of one packet"},
    {},
};

constexpr PropertyInfo propertyTable[] = {
    {"Next", "uint32", "", "the number that comes next"},
    {},
};

constexpr FieldInfo fieldTable[] = {
    {"data", "uint32", "", "running numbers"},
    {},
};

constexpr CommandInfo commandTable[] = {
    {"restart", noOptions, "counts from 0 again"},
    {},
};

} // namespace

BRENIXCORE_EXPORT_DEVICE(Counter)
BRENIXCORE_DESCRIBE_OPTIONS(optionTable)
BRENIXCORE_DESCRIBE_PROPERTIES(propertyTable)
BRENIXCORE_DESCRIBE_FIELDS(fieldTable, brenixcore::plugin::noFields)
BRENIXCORE_DESCRIBE_COMMANDS(commandTable)
