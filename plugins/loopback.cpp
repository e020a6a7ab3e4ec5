// Device `loopback`: what is written comes back.

#include "brenixcore/plugin/Describe.hpp"
#include "brenixcore/plugin/Options.hpp"
#include "brenixcore/plugin/Plugin.hpp"

#include <cstdint>
#include <string>
#include <utility>

namespace
{

using namespace brenixcore::plugin;

class Loopback : public Device
{
public:
    DeviceInfo init(const brenixplugin::PropertyMap& options,
                    brenixplugin::PropertyMap& /*properties*/, DeviceHost& host) override
    {
        Options(options).requireAllKnown();
        deviceHost = &host;
        return {StreamInfo{}, StreamInfo{}};
    }

    void open(const brenixplugin::PropertyMap& options) override
    {
        Options(options).requireAllKnown();
    }

    void run(DeviceStreams& streams) override
    {
        std::uint64_t lost = 0;
        while (auto packet = streams.pull()) {
            const std::uint64_t counts = packet->counts;
            if (!streams.push(std::move(*packet))) {
                lost += counts;
            }
        }
        if (lost > 0) {
            streams.tellLost(lost, nullptr); // which the error below tells
            const std::string message = std::to_string(lost) +
                                        " counts were lost: the channel closed and its input "
                                        "stream was full.";
            deviceHost->raise("error", "brenix:Device:dataLost", message.c_str());
        }
    }

private:
    DeviceHost* deviceHost = nullptr;
};

constexpr FieldInfo fields[] = {
    {dataField, "", "", "the elements of a written buffer"},
    {},
};

} // namespace

BRENIXCORE_EXPORT_DEVICE(Loopback)
BRENIXCORE_DESCRIBE_OPTIONS(brenixcore::plugin::noOptions)
BRENIXCORE_DESCRIBE_FIELDS(fields, fields)
