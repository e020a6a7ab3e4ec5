// A channel as its device sees it.

#include "Channel.hpp"
#include "Packets.hpp"
#include "brenixcore/plugin/Make.hpp"

#include <stdexcept>
#include <utility>

namespace brenixcore
{

using brenixplugin::OwnedProperty;

namespace
{

/// An event for the time of one call to the handler.
class Event : public CustomEvent
{
public:
    Event(const char* eventName, const char* eventIdentifier, const char* eventMessage)
        : name(eventName), identifier(eventIdentifier), message(eventMessage)
    {
    }
    const char* getEventName() override { return name; }
    const char* getIdentifier() override { return identifier; }
    const char* getMessage() override { return message; }

private:
    const char* name;
    const char* identifier;
    const char* message;
};

} // namespace

// --- Events and properties ---

void Channel::Impl::raise(const char* name, const char* identifier, const char* message)
{
    name = name == nullptr ? "" : name;
    message = message == nullptr ? "" : message;
    // An error whose identifier is empty would pass for none.
    const bool isNamed = identifier != nullptr && *identifier != '\0';
    identifier = isNamed ? identifier : "brenix:Device:failed";
    try {
        const std::lock_guard lock(handlerMutex);
        if (handler != nullptr) {
            trace.write(name, identifier, message);
            Event event(name, identifier, message);
            handler->onCustomEvent(event);
        }
    } catch (...) { // it is to leave the operation that runs on this thread
        keepReason(message);
        const std::lock_guard lock(handlerMutex);
        raised = std::current_exception();
        throw;
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

template <typename Tell>
void Channel::Impl::tellLoss(const Tell& tell) noexcept
{
    try {
        try {
            tell();
        } catch (const std::bad_alloc&) {
            raise("error", "brenix:Stream:dataLost",
                  "Counts were lost, and there is no memory to tell how many.");
        }
    } catch (...) { // the handler threw
    }
}

void Channel::Impl::updateLostCounts()
{
    const std::lock_guard lock(handlerMutex); // also of the sum, or an older one could come later
    if (handler != nullptr && keepsLost) {
        auto property = plugin::makeScalar(lostName, input->impl->queue.getLost());
        handler->onPropertyUpdate(property.get());
        property.release();
    }
}

void Channel::Impl::keepReason(const std::string& reason) noexcept
{
    try {
        {
            const std::lock_guard lock(handlerMutex);
            if (std::exchange(raised, nullptr) == std::current_exception()) {
                return; // it is kept already
            }
        }
        if (!keepsReason) {
            return;
        }
        constexpr std::size_t most = 1023; // what a buffer for the message of an error takes
        auto property = plugin::makeScalar(reasonName, reason.substr(0, most));
        const std::lock_guard lock(handlerMutex);
        if (handler != nullptr) {
            handler->onPropertyUpdate(property.get());
            property.release();
        }
    } catch (...) { // memory is out, which needs no further reason
    }
}

// --- Data ---

bool Channel::Impl::push(plugin::Packet packet)
{
    const bool isTaken = enter(packet, true);
    if (!isTaken) {
        tellLost(packet.lost, lostByDevice); // of which the device can tell no more
    }
    return isTaken;
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
    return input->impl->push(packet, waits);
}

std::optional<plugin::Packet> Channel::Impl::pull()
{
    auto packet = leave(true);
    if (!packet && input) {
        input->impl->queue.endDraining(); // nothing will come that the device could answer
    }
    return packet;
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
    return output->impl->queue.pull(waits);
}

bool Channel::Impl::isClosing() const
{
    return closing;
}

void Channel::Impl::refuseOutput()
{
    if (output) {
        output->impl->queue.setDeviceDone();
    }
}

void Channel::Impl::endInput()
{
    if (input) {
        tellInputLosses();
        input->impl->queue.setDeviceDone();
    }
}

void Channel::Impl::tellLost(std::uint64_t counts, const char* reason)
{
    if (input && counts > 0) {
        input->impl->queue.lose(counts,
                                reason != nullptr && *reason == '\0' ? lostByDevice : reason);
        updateLostCounts();
    }
}

std::uint64_t Channel::Impl::takenCounts() const
{
    return input ? input->impl->queue.takenCounts() : 0;
}

std::uint64_t Channel::Impl::pushedCounts() const
{
    return input ? input->impl->queue.pushedCounts() : 0;
}

// --- The device's thread ---

void Channel::Impl::tellInputLosses() noexcept
{
    tellLoss([&] {
        if (input) {
            input->impl->tellLosses(true);
        }
    });
}

void Channel::Impl::runDevice() noexcept
{
    std::string failure;
    try {
        try {
            device.object->run(*this);
        } catch (...) {
            failure = currentExceptionText();
            tellInputLosses(); // before the failure, which is to be the last error
            raise("error", "brenix:Device:failed", failure.c_str());
        }
    } catch (...) { // the handler threw on a thread where it must not, or memory is out
    }
    endInput();
    refuseOutput();
    const std::uint64_t left = output ? output->impl->queue.discardRest() : 0;
    if (left > 0) {
        // cppcheck-suppress throwInNoexceptFunction ; tellLoss() catches it
        tellLoss([&] {
            const std::string message = "The device ended and did not take " +
                                        std::to_string(left) + " counts" +
                                        (failure.empty() ? "." : ": " + failure);
            raise("error", failure.empty() ? "brenix:Stream:dataLost" : "brenix:Device:failed",
                  message.c_str());
        });
    }
}

} // namespace brenixcore
