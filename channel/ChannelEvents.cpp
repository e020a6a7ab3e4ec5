// What a channel does with the events of its core channel, and the properties that they update.

#include "channel/Channel.hpp"
#include "channel/Exceptions.hpp"
#include "properties/CopyProperty.hpp"

namespace brenixcoder
{

void Channel::onCustomEvent(brenixcore::CustomEvent& event)
{
    // Copies, since a text of the event need not outlive the next question to it.
    ErrorText name;
    name = event.getEventName();
    ErrorText identifier;
    identifier = event.getIdentifier();

    if (name.view() == "error" || name.view() == "errorMessage") {
        ErrorText message;
        message = name.view() == "error" ? event.getMessage()
                                         : "Array-based errors are not yet supported in Zelkor";
        event.accept();
        if (std::this_thread::get_id() == ownerThread) {
            setSyncError(identifier, message);
            throw PluginException("A synchronous error occurred from a plug-in");
        }
        setAsyncError(identifier, message);
    } else if (name.view() == "warning" || name.view() == "warningMessage" ||
               name.view() == "trace" || name.view() == "traceMessage") {
        event.accept();
    }
}

void Channel::onPropertyUpdate(brenixplugin::interfaces::IPropertyInfo* property)
{
    if (property == nullptr) {
        return;
    }
    const std::lock_guard lock(propertyMutex);
    const auto stored = properties.find(property->getName());
    if (stored == properties.end() || stored->second == property) {
        return;
    }
    brenixplugin::OwnedProperty(brenixplugin::asProperty(stored->second)).reset();
    stored->second = property;
}

void* Channel::onDelegatedEvent(brenixcore::DelegatedEvent& event)
{
    return event.invoke();
}

void Channel::onIgnoredEvent1(void*) {}

void Channel::onIgnoredEvent2(void*) {}

void Channel::getPropertyValue(const std::string& name, const std::string& typeName, int capacity,
                               va_list* rest)
{
    const std::lock_guard lock(propertyMutex);
    copyCustomPropertyValue(properties, name, typeName, capacity, rest);
}

} // namespace brenixcoder
