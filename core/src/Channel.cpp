#include "brenixcore/Channel.hpp"

#include "Converter.hpp"
#include "Packets.hpp"
#include "Plugin.hpp"
#include "Stream.hpp"
#include "brenixcore/plugin/Options.hpp"

#include <atomic>
#include <exception>
#include <functional>
#include <set>
#include <stdexcept>
#include <thread>
#include <utility>

namespace brenixcore
{

using brenixplugin::OwnedProperty;
using brenixplugin::PropertyMap;

namespace
{

/// An event for the time of one call to the handler.
class Event : public CustomEvent
{
public:
    Event(const char* eventName, const char* eventIdentifier, const char* eventMessage)
        : name(textOf(eventName)), identifier(textOf(eventIdentifier)),
          message(textOf(eventMessage))
    {
    }
    const char* getEventName() override { return name; }
    const char* getIdentifier() override { return identifier; }
    const char* getMessage() override { return message; }

private:
    static const char* textOf(const char* text) { return text == nullptr ? "" : text; }

    const char* name;
    const char* identifier;
    const char* message;
};

/// The core's own option: how long reads and writes wait, in seconds.
std::optional<double> readTimeout(const PropertyMap& optionMap)
{
    plugin::Options options(optionMap);
    const std::optional<double> seconds = options.number("Timeout");
    if (seconds && *seconds < 0) {
        plugin::Options::fail("Timeout", "must be 0 or more seconds");
    }
    return seconds;
}

enum class State { Created, Initialised, Open, Closed, Terminated };

const char* nameOf(State state)
{
    switch (state) {
    case State::Created:
        return "created";
    case State::Initialised:
        return "initialised";
    case State::Open:
        return "open";
    case State::Closed:
        return "closed";
    case State::Terminated:
        return "terminated";
    }
    return "";
}

} // namespace

struct BRENIXCORE_INTERNAL Channel::Impl final : plugin::DeviceHost, plugin::DeviceStreams {
    Impl(const std::string& devicePath, plugin::Converter& channelConverter,
         IEventHandler& eventHandler, unsigned long firstLimit, unsigned long secondLimit)
        : converter(channelConverter), inputLimit(firstLimit), outputLimit(secondLimit),
          device(loadPlugin<plugin::Device, CouldNotLoadDevice, CouldNotCreateDevice>(devicePath)),
          handler(&eventHandler)
    {
    }

    ~Impl();

    // What the device calls.
    void raise(const char* name, const char* identifier, const char* message) override;
    void updateProperty(OwnedProperty property) override;
    bool push(plugin::Packet packet) override;
    std::optional<plugin::Packet> pull() override;
    bool tryPush(plugin::Packet& packet) override;
    std::optional<plugin::Packet> tryPull() override;
    bool isClosing() const override;
    void refuseOutput() override;
    void endInput() override;

    bool enter(plugin::Packet& packet, bool waits);
    std::optional<plugin::Packet> leave(bool waits);

    /// Refuses an operation in a state in which it has no meaning.
    void require(bool allowed, const char* operation) const;

    template <typename Operation>
    void forEachStream(const Operation& operation);
    void runDevice();
    void stopDevice(Phase phase);
    void terminateDevice();

    // The libraries outlive everything that their code made.
    std::list<PluginLibrary> filterLibraries;
    plugin::Converter& converter;
    const std::uint64_t inputLimit;
    const std::uint64_t outputLimit;
    LoadedPlugin<plugin::Device> device;

    std::mutex handlerMutex; ///< held during each call of the handler; guards these two
    IEventHandler* handler;  ///< null once the channel is being destroyed
    std::set<std::string, std::less<>> propertyNames; ///< that init delivered

    State state = State::Created;
    std::unique_ptr<InputStream> input;
    std::unique_ptr<OutputStream> output;
    std::atomic<bool> closing = false; ///< while the channel waits for the device to stop
    std::thread worker;                ///< runs the device while the channel is open
};

// --- What the device calls ---

void Channel::Impl::raise(const char* name, const char* identifier, const char* message)
{
    const std::lock_guard lock(handlerMutex);
    if (handler != nullptr) {
        // An error whose identifier is empty would pass for none.
        const bool isNamed = identifier != nullptr && *identifier != '\0';
        Event event(name, isNamed ? identifier : "brenix:Device:failed", message);
        handler->onCustomEvent(event);
    }
}

void Channel::Impl::updateProperty(OwnedProperty property)
{
    const std::lock_guard lock(handlerMutex);
    if (handler != nullptr && property && propertyNames.contains(property->getName())) {
        handler->onPropertyUpdate(property.get());
        property.release();
    }
}

bool Channel::Impl::push(plugin::Packet packet)
{
    return enter(packet, true);
}

bool Channel::Impl::tryPush(plugin::Packet& packet)
{
    const bool isTaken = enter(packet, false);
    if (!isTaken) {
        packet.fields.setChecked(false); // it is in the device's hands again
    }
    return isTaken;
}

bool Channel::Impl::enter(plugin::Packet& packet, bool waits)
{
    if (!input) {
        throw std::logic_error("The device pushed a packet but has no input stream.");
    }
    if (packet.counts == 0) {
        throw std::invalid_argument("The device pushed a packet without counts.");
    }
    requireWhole(packet);
    return input->impl->push(packet, waits, *this);
}

std::optional<plugin::Packet> Channel::Impl::pull()
{
    return leave(true);
}

std::optional<plugin::Packet> Channel::Impl::tryPull()
{
    return leave(false);
}

std::optional<plugin::Packet> Channel::Impl::leave(bool waits)
{
    if (!output) {
        throw std::logic_error("The device pulled a packet but has no output stream.");
    }
    auto packet = output->impl->pull(waits);
    if (!packet && input) {
        input->impl->endDraining(); // nothing more will come of the output
    }
    return packet;
}

bool Channel::Impl::isClosing() const
{
    return closing;
}

void Channel::Impl::refuseOutput()
{
    if (output) {
        output->impl->setDeviceDone();
    }
}

void Channel::Impl::endInput()
{
    if (input) {
        input->impl->setDeviceDone();
    }
}

// --- The device's life ---

void Channel::Impl::require(bool allowed, const char* operation) const
{
    if (!allowed) {
        throw std::runtime_error(std::string("Operation ") + operation +
                                 " is not possible: the channel is " + nameOf(state) + ".");
    }
}

template <typename Operation>
void Channel::Impl::forEachStream(const Operation& operation)
{
    if (input) {
        operation(*input->impl);
    }
    if (output) {
        operation(*output->impl);
    }
}

void Channel::Impl::runDevice()
{
    constexpr const char* identifier = "brenix:Device:failed";
    try {
        try {
            device.object->run(*this);
        } catch (const std::exception& exception) {
            raise("error", identifier, exception.what());
        } catch (...) {
            raise("error", identifier, "Unrecognized error.");
        }
    } catch (...) { // the handler threw on a thread where it must not
    }
    forEachStream([](Stream::Impl& stream) { stream.setDeviceDone(); });
}

void Channel::Impl::stopDevice(Phase phase)
{
    closing = true;
    if (input) {
        input->impl->setPhase(output ? phase : Phase::Stopping); // without output nothing drains
    }
    if (output) {
        output->impl->setPhase(phase);
    }
    device.object->wake();
    worker.join();
    closing = false;
    forEachStream([](Stream::Impl& stream) { stream.setPhase(Phase::Closed); });
    state = State::Closed;
    device.object->close();
}

void Channel::Impl::terminateDevice()
{
    state = State::Terminated;
    device.object->term();
}

Channel::Impl::~Impl()
{
    {
        const std::lock_guard lock(handlerMutex);
        handler = nullptr;
    }
    try {
        if (state == State::Open) {
            stopDevice(Phase::Stopping);
        }
    } catch (...) { // the device failed to close; nobody is left to hear of it
    }
    try {
        if (state == State::Initialised || state == State::Closed) {
            terminateDevice();
        }
    } catch (...) { // nor of this
    }
}

// --- The channel ---

Channel::Channel(const std::string& devicePath, Converter& converter, IEventHandler& handler,
                 unsigned long firstLimit, unsigned long secondLimit)
    : impl(new Impl(devicePath, *converter.impl->plugin.object, handler, firstLimit, secondLimit))
{
}

Channel::~Channel() = default;

void Channel::init(const PropertyMap& options, PropertyMap& properties)
{
    const OwnedOptions owned(options);
    impl->require(impl->state != State::Open, "init");
    const double timeout = readTimeout(options).value_or(10);
    if (impl->state == State::Initialised || impl->state == State::Closed) {
        impl->terminateDevice();
    }
    {
        const std::lock_guard lock(impl->handlerMutex);
        impl->propertyNames.clear(); // no updates until the new ones are delivered
    }

    brenixplugin::OwnedPropertyMap delivered;
    std::set<std::string, std::less<>> names;
    const plugin::DeviceInfo info = impl->device.object->init(options, delivered.map, *impl);
    try {
        std::unique_ptr<InputStream> input;
        std::unique_ptr<OutputStream> output;
        if (info.input) {
            input = std::make_unique<InputStream>(std::make_unique<Stream::Impl>(
                *impl->device.object, impl->converter, impl->filterLibraries, impl->inputLimit,
                *info.input));
        }
        if (info.output) {
            output = std::make_unique<OutputStream>(std::make_unique<Stream::Impl>(
                *impl->device.object, impl->converter, impl->filterLibraries, impl->outputLimit,
                *info.output));
        }
        for (const auto& property : delivered.map) {
            names.insert(property.first);
        }
        impl->input = std::move(input);
        impl->output = std::move(output);
    } catch (...) {
        impl->terminateDevice();
        throw;
    }
    impl->forEachStream([&](Stream::Impl& stream) { stream.setTimeout(timeout); });
    impl->state = State::Initialised;

    // From here on nothing fails. What takes the place of an earlier property goes into the
    // caller's map, and the earlier one out with the rest.
    properties.merge(delivered.map);
    for (auto& [name, property] : delivered.map) {
        std::swap(property, properties.find(name)->second);
    }
    const std::lock_guard lock(impl->handlerMutex);
    impl->propertyNames.swap(names); // updates may come
}

void Channel::open(const PropertyMap& options)
{
    const OwnedOptions owned(options);
    impl->require(impl->state == State::Initialised || impl->state == State::Closed, "open");
    const std::optional<double> timeout = readTimeout(options);
    impl->device.object->open(options);
    impl->forEachStream([&](Stream::Impl& stream) {
        stream.setPhase(Phase::Open);
        if (timeout) {
            stream.setTimeout(*timeout);
        }
    });
    try {
        impl->worker = std::thread([this] { impl->runDevice(); });
    } catch (...) {
        impl->forEachStream([](Stream::Impl& stream) { stream.setPhase(Phase::Closed); });
        impl->device.object->close();
        throw;
    }
    impl->state = State::Open;
}

void Channel::execute(const char* command, const PropertyMap& options)
{
    const OwnedOptions owned(options);
    impl->require(impl->state != State::Created && impl->state != State::Terminated, "execute");
    if (command == nullptr) {
        throw std::invalid_argument("The command to execute must not be null.");
    }
    impl->device.object->execute(command, options);
}

void Channel::close()
{
    impl->require(impl->state == State::Open, "close");
    impl->stopDevice(Phase::Draining);
}

void Channel::term()
{
    impl->require(impl->state == State::Initialised || impl->state == State::Closed, "term");
    impl->terminateDevice();
}

bool Channel::isOpen() const
{
    return impl->state == State::Open;
}

InputStream* Channel::getInputStream() const
{
    return impl->input.get();
}

OutputStream* Channel::getOutputStream() const
{
    return impl->output.get();
}

} // namespace brenixcore
