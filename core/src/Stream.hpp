#ifndef BRENIXCORE_SRC_STREAM_HPP
#define BRENIXCORE_SRC_STREAM_HPP

#include "FilterChain.hpp"
#include "Plugin.hpp"
#include "Queue.hpp"
#include "Reason.hpp"
#include "brenixcore/Stream.hpp"

#include <cstdint>
#include <list>
#include <optional>

namespace brenixcore
{

/// Releases the option objects that an operation of the core takes over.
struct OwnedOptions {
    explicit OwnedOptions(const brenixplugin::PropertyMap& optionMap) : options(optionMap) {}
    OwnedOptions(const OwnedOptions&) = delete;
    OwnedOptions& operator=(const OwnedOptions&) = delete;
    ~OwnedOptions() { brenixplugin::releaseProperties(options); }

    const brenixplugin::PropertyMap& options;
};

/// What both streams are: a queue, and what changes the packets on their way.
struct BRENIXCORE_INTERNAL Stream::Impl {
    Impl(plugin::Device& device, plugin::Converter& streamConverter,
         std::list<PluginLibrary>& libraries, ReasonKeeper& reasonKeeper, std::uint64_t limit,
         plugin::StreamInfo streamInfo)
        : converter(streamConverter), reasons(reasonKeeper), info(streamInfo), queue(device, limit),
          filters(libraries)
    {
    }

    /// For the device's thread; see plugin::DeviceStreams.
    bool push(plugin::Packet& packet, bool waits, plugin::DeviceHost& host);

    /// Runs an operation of the converter. Throws when it does, or leaves the packet as it must not.
    void convert(plugin::Packet& packet, void (plugin::Converter::*operation)(plugin::Packet&));

    /// Prepares what a write brings for the device. Throws CouldNotConvertOutputData.
    void convertAndFilter(Queue::Packets& outgoing);

    plugin::Converter& converter;
    ReasonKeeper& reasons;
    const plugin::StreamInfo info;
    Queue queue;
    FilterChain filters;
};

} // namespace brenixcore

#endif
