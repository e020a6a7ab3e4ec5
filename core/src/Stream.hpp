#ifndef BRENIXCORE_SRC_STREAM_HPP
#define BRENIXCORE_SRC_STREAM_HPP

#include "FilterChain.hpp"
#include "Plugin.hpp"
#include "Queue.hpp"
#include "Reporter.hpp"
#include "brenixcore/Stream.hpp"
#include "brenixplugin/BufferTaker.hpp"

#include <chrono>
#include <cstdint>
#include <list>
#include <optional>
#include <vector>

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
         std::list<PluginLibrary>& libraries, Reporter& channelReporter, std::uint64_t limit,
         plugin::StreamInfo streamInfo)
        : converter(streamConverter), reporter(channelReporter), info(streamInfo),
          queue(device, limit), filters(libraries)
    {
    }

    /// For the device's thread; see plugin::DeviceStreams.
    bool push(plugin::Packet& packet, bool waits);

    /// On the device's thread: tells the gaps that ended, by events, and the sum of what was lost. At the end
    /// of its input, all gaps.
    void tellLosses(bool atEnd);

    /// Runs an operation of the converter. Throws when it does, or leaves the packet as it must not.
    void convert(plugin::Packet& packet, void (plugin::Converter::*operation)(plugin::Packet&));

    /// Converts, filters and queues what a write brings, which has room. Throws CouldNotConvertOutputData.
    void send(Queue::Packets& outgoing, std::chrono::steady_clock::time_point begin);

    plugin::Converter& converter;
    Reporter& reporter;
    const plugin::StreamInfo info;
    bool stamps = false; ///< what is read has the fields Index and Time; for the caller's thread
    Queue queue;
    FilterChain filters;
};

/// The output stream of a channel, which takes buffers over from those who know that it does.
class BRENIXCORE_INTERNAL OwningOutputStream final : public OutputStream,
                                                     public brenixplugin::interfaces::IBufferTaker
{
public:
    using OutputStream::OutputStream;
    unsigned long takeBuffers(std::vector<void*>& dataList) override;
};

} // namespace brenixcore

#endif
