#ifndef BRENIXCORE_SRC_CHANNEL_HPP
#define BRENIXCORE_SRC_CHANNEL_HPP

#include "brenixcore/Channel.hpp"

#include "Plugin.hpp"
#include "Reporter.hpp"
#include "Stream.hpp"
#include "Trace.hpp"

#include <atomic>
#include <cstdint>
#include <exception>
#include <list>
#include <memory>
#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <thread>

namespace brenixcore
{

// The core's own properties.
constexpr const char* reasonName = "Reason";   ///< why the last operation that failed did so
constexpr const char* lostName = "LostCounts"; ///< of the input stream, since open

/// The core's own options; what is not given is nothing.
struct CoreOptions {
    /// Takes them out of the map.
    explicit CoreOptions(brenixplugin::PropertyMap& optionMap);

    std::optional<double> timeout; ///< of the caller's waits, in seconds
    std::optional<Overflow> overflow;
    std::optional<bool> stamps;
};

enum class State { Created, Initialised, Open, Closed, Terminated };

struct BRENIXCORE_INTERNAL Channel::Impl final : Reporter, plugin::DeviceStreams {
    Impl(const std::string& devicePath, plugin::Converter& channelConverter,
         IEventHandler& eventHandler, unsigned long firstLimit, unsigned long secondLimit)
        : converter(channelConverter), inputLimit(firstLimit), outputLimit(secondLimit),
          device(loadPlugin<plugin::Device, CouldNotLoadDevice, CouldNotCreateDevice>(devicePath)),
          trace(devicePath), handler(&eventHandler)
    {
    }

    ~Impl();

    // What the device calls.
    void raise(const char* name, const char* identifier, const char* message) override;
    void updateProperty(brenixplugin::OwnedProperty property) override;
    bool push(plugin::Packet packet) override;
    std::optional<plugin::Packet> pull() override;
    bool tryPush(plugin::Packet& packet) override;
    std::optional<plugin::Packet> tryPull() override;
    bool isClosing() const override;
    void refuseOutput() override;
    void endInput() override;
    void tellLost(std::uint64_t counts, const char* reason) override;
    std::uint64_t takenCounts() const override;
    std::uint64_t pushedCounts() const override;

    bool enter(plugin::Packet& packet, bool waits);
    std::optional<plugin::Packet> leave(bool waits);

    /// What the device's thread does.
    void runDevice() noexcept;
    template <typename Tell>
    void tellLoss(const Tell& tell) noexcept;
    void tellInputLosses() noexcept; ///< all of them, since no gap grows any more

    /// Refuses an operation in a state in which it has no meaning.
    void require(bool allowed, const char* operation) const;

    void init(const brenixplugin::PropertyMap& options, brenixplugin::PropertyMap& properties);
    void open(const brenixplugin::PropertyMap& options);
    template <typename Operation>
    void forEachStream(const Operation& operation)
    {
        if (input) {
            operation(*input->impl);
        }
        if (output) {
            operation(*output->impl);
        }
    }
    template <typename Direction>
    std::unique_ptr<Direction> makeStream(const std::optional<plugin::StreamInfo>& info,
                                          std::uint64_t limit);
    void useOptions(const CoreOptions& options);
    void stopDevice(Phase phase);
    void terminateDevice();

    void updateLostCounts() override;
    void keepReason(const std::string& reason) noexcept override;

    // The libraries outlive everything that their code made.
    std::list<PluginLibrary> filterLibraries;
    plugin::Converter& converter;
    const std::uint64_t inputLimit;
    const std::uint64_t outputLimit;
    LoadedPlugin<plugin::Device> device;
    const Trace trace;

    std::mutex handlerMutex; ///< held during each call of the handler; guards these three
    IEventHandler* handler;  ///< null once the channel is being destroyed
    std::set<std::string, std::less<>> propertyNames; ///< that init delivered
    std::exception_ptr raised; ///< by which the device's error leaves the operation that runs

    // Of the caller's thread; what the device's thread uses of it stays while the channel is open.
    bool keepsLost = false;   ///< once init has delivered the property of lost counts
    bool keepsReason = false; ///< and that of the reason
    State state = State::Created;
    std::unique_ptr<InputStream> input;
    std::unique_ptr<OutputStream> output;
    std::atomic<bool> closing = false; ///< while the channel waits for the device to stop
    std::thread worker;                ///< runs the device while the channel is open
};

} // namespace brenixcore

#endif
