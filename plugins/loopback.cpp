// Device `loopback`: what is written comes back.

#include "brenixcore/plugin/Describe.hpp"
#include "brenixcore/plugin/Options.hpp"
#include "brenixcore/plugin/Plugin.hpp"

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
        while (auto packet = streams.pull()) {
            if (!streams.push(std::move(*packet))) {
                deviceHost->raise("error", "brenix:Device:dataLost",
                                  "The channel closes and its input stream is full.");
            }
        }
    }

private:
    DeviceHost* deviceHost = nullptr;
};

} // namespace

BRENIXCORE_EXPORT_DEVICE(Loopback)
BRENIXCORE_DESCRIBE_OPTIONS(brenixcore::plugin::noOptions)
