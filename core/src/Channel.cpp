#include "Channel.hpp"

#include "Converter.hpp"
#include "brenixcore/plugin/Make.hpp"
#include "brenixcore/plugin/Options.hpp"

#include <exception>
#include <stdexcept>
#include <string_view>
#include <utility>

namespace brenixcore
{

using brenixplugin::PropertyMap;

namespace
{

Overflow overflowOf(const std::string& policy)
{
    constexpr std::pair<std::string_view, Overflow> policies[] = {
        {"wait", Overflow::Wait},
        {"dropOldest", Overflow::DropOldest},
        {"dropNewest", Overflow::DropNewest}};
    for (const auto& [name, overflow] : policies) {
        if (policy == name) {
            return overflow;
        }
    }
    plugin::Options::fail("Overflow", "must be wait, dropOldest or dropNewest, not " + policy);
}

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

CoreOptions::CoreOptions(PropertyMap& optionMap)
{
    plugin::Options options(optionMap);
    timeout = options.number("Timeout");
    if (timeout && *timeout < 0) {
        plugin::Options::fail("Timeout", "must be 0 or more seconds");
    }
    if (const auto policy = options.text("Overflow")) {
        overflow = overflowOf(*policy);
    }
    stamps = options.logical("Stamps");
    for (const char* const name : {"Timeout", "Overflow", "Stamps"}) {
        optionMap.erase(name);
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

template <typename Direction>
std::unique_ptr<Direction> Channel::Impl::makeStream(const std::optional<plugin::StreamInfo>& info,
                                                     std::uint64_t limit)
{
    if (!info) {
        return nullptr;
    }
    return std::make_unique<Direction>(std::make_unique<Stream::Impl>(
        *device.object, converter, filterLibraries, *this, limit, *info));
}

void Channel::Impl::init(const PropertyMap& options, PropertyMap& properties)
{
    require(state != State::Open, "init");
    PropertyMap deviceOptions = options;
    CoreOptions coreOptions(deviceOptions);
    coreOptions.timeout = coreOptions.timeout.value_or(10);
    if (state == State::Initialised || state == State::Closed) {
        terminateDevice();
    }
    {
        const std::lock_guard lock(handlerMutex);
        propertyNames.clear(); // no updates until the new ones are delivered
    }

    brenixplugin::OwnedPropertyMap delivered;
    std::set<std::string, std::less<>> names;
    const plugin::DeviceInfo info = device.object->init(deviceOptions, delivered.map, *this);
    try {
        auto newInput = makeStream<InputStream>(info.input, inputLimit);
        auto newOutput = makeStream<OwningOutputStream>(info.output, outputLimit);
        for (const auto& property : delivered.map) {
            names.insert(property.first);
        }
        // The core's, where they are none of the device's own.
        if (!names.contains(reasonName)) {
            plugin::publish(delivered.map, reasonName, std::string());
        }
        if (info.input && !names.contains(lostName)) {
            plugin::publish(delivered.map, lostName, std::uint64_t{0});
        }
        input = std::move(newInput);
        output = std::move(newOutput);
    } catch (...) {
        terminateDevice();
        throw;
    }
    useOptions(coreOptions);
    state = State::Initialised;
    keepsReason = !names.contains(reasonName);
    keepsLost = input && !names.contains(lostName);

    // From here on nothing fails. What takes the place of an earlier property goes into the
    // caller's map, and the earlier one out with the rest.
    properties.merge(delivered.map);
    for (auto& [name, property] : delivered.map) {
        std::swap(property, properties.find(name)->second);
    }
    const std::lock_guard lock(handlerMutex);
    propertyNames.swap(names); // updates may come
}

void Channel::Impl::useOptions(const CoreOptions& options)
{
    forEachStream([&](Stream::Impl& stream) {
        if (options.timeout) {
            stream.queue.setTimeout(*options.timeout);
        }
        if (options.overflow) {
            stream.queue.setOverflow(*options.overflow);
        }
        stream.stamps = options.stamps.value_or(stream.stamps);
    });
}

void Channel::Impl::open(const PropertyMap& options)
{
    require(state == State::Initialised || state == State::Closed, "open");
    PropertyMap deviceOptions = options;
    const CoreOptions coreOptions(deviceOptions);
    device.object->open(deviceOptions);
    useOptions(coreOptions);
    forEachStream([](Stream::Impl& stream) { stream.queue.setPhase(Phase::Open); });
    try {
        updateLostCounts();
        worker = std::thread([this] { runDevice(); });
    } catch (...) {
        forEachStream([](Stream::Impl& stream) { stream.queue.setPhase(Phase::Closed); });
        device.object->close();
        throw;
    }
    state = State::Open;
}

void Channel::Impl::stopDevice(Phase phase)
{
    closing = true;
    if (input) {
        input->impl->queue.setPhase(output ? phase
                                           : Phase::Stopping); // without output nothing drains
    }
    if (output) {
        output->impl->queue.setPhase(phase);
    }
    device.object->wake();
    worker.join();
    closing = false;
    forEachStream([](Stream::Impl& stream) { stream.queue.setPhase(Phase::Closed); });
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
    impl->explain([&] { impl->init(options, properties); });
}

void Channel::open(const PropertyMap& options)
{
    const OwnedOptions owned(options);
    impl->explain([&] { impl->open(options); });
}

void Channel::execute(const char* command, const PropertyMap& options)
{
    const OwnedOptions owned(options);
    impl->explain([&] {
        impl->require(impl->state != State::Created && impl->state != State::Terminated, "execute");
        if (command == nullptr) {
            throw std::invalid_argument("The command to execute must not be null.");
        }
        impl->device.object->execute(command, options);
    });
}

void Channel::close()
{
    impl->explain([&] {
        impl->require(impl->state == State::Open, "close");
        impl->stopDevice(Phase::Draining);
    });
}

void Channel::term()
{
    impl->explain([&] {
        impl->require(impl->state == State::Initialised || impl->state == State::Closed, "term");
        impl->terminateDevice();
    });
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
