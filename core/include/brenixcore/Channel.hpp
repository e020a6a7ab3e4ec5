/// @file
/// A channel of the core, and the events by which it reports.
#ifndef BRENIXCORE_CHANNEL_HPP
#define BRENIXCORE_CHANNEL_HPP

#include "brenixcore/Converter.hpp"
#include "brenixcore/Stream.hpp"
#include "brenixplugin/Property.hpp"

#include <map>
#include <memory>
#include <string>

namespace brenixcore
{

/// An event that a plug-in raised. The order of the operations is part of the contract; a handler
/// uses the first four.
class BRENIXCORE_API CustomEvent
{
public:
    /// "error", "errorMessage", "warning", "warningMessage", "trace", "traceMessage" or any other
    /// name. This text and the two below are NUL-terminated, never null, and valid during the call.
    virtual const char* getEventName() = 0;
    virtual const char* getIdentifier() = 0; ///< of the error or message
    virtual const char* getMessage() = 0;    ///< for people

    /// Called by the handler for every event whose name it recognises.
    virtual void accept() { onAccepted(); }

    /// For the core's own use.
    virtual bool isAccepted() const { return false; }

    /// What accept() forwards to.
    virtual void onAccepted() {}

    virtual ~CustomEvent() = default;
};

/// Work that the core hands to the handler to be done in its place.
class BRENIXCORE_API DelegatedEvent
{
public:
    virtual ~DelegatedEvent() = default;

    /// Does the work.
    virtual void* invoke() = 0;
};

/// A device under a converter. All operations are called on one thread and may throw; operations
/// that take options take over the objects in them, also when they throw.
class BRENIXCORE_API Channel
{
public:
    /// Receives a channel's events, on the thread that is inside an operation of the channel or on
    /// threads of the core. Not called while the channel is constructed, nor once its destructor
    /// runs.
    class BRENIXCORE_API IEventHandler
    {
    public:
        /// May throw when it is called on the thread that is inside an operation: the exception
        /// leaves that operation.
        virtual void onCustomEvent(CustomEvent& event) = 0;

        /// Takes over the object if its name was delivered by init(); otherwise, and when it
        /// throws, the object stays the core's. A different object in each call.
        virtual void onPropertyUpdate(brenixplugin::interfaces::IPropertyInfo* property) = 0;

        /// Calls event.invoke() and returns its result.
        virtual void* onDelegatedEvent(DelegatedEvent& event) = 0;

        virtual void onIgnoredEvent1(void* event) = 0; ///< does nothing
        virtual void onIgnoredEvent2(void* event) = 0; ///< does nothing
        virtual ~IEventHandler() = default;
    };

    /// Loads the device plug-in and creates its device. Keeps references to the converter and the
    /// handler. The first limit bounds the input stream, the second the output stream, in counts;
    /// 2^64 - 1 is unlimited.
    /// @throws CouldNotLoadDevice, CouldNotCreateDevice
    Channel(const std::string& devicePath, Converter& converter, IEventHandler& handler,
            unsigned long firstLimit, unsigned long secondLimit);
    Channel(const Channel&) = delete;
    Channel& operator=(const Channel&) = delete;

    /// Stops the device if it is open, and releases it. Called before the converter is released and
    /// after every data buffer and property that the channel delivered.
    ~Channel();

    /// Initialises the device. Adds its properties to `properties`, one object under each name,
    /// owned by the caller; the map may hold those of an earlier init.
    void init(const std::map<std::string, void*>& options,
              std::map<std::string, void*>& properties);

    /// Lets the device start to work.
    void open(const std::map<std::string, void*>& options);

    /// Runs a command of the device; the command is NUL-terminated.
    void execute(const char* command, const std::map<std::string, void*>& options);

    /// Hands the device what is queued for output, then stops it. Unread input stays.
    void close();

    /// Releases what init() prepared.
    void term();
    bool isOpen() const; ///< between open() and close()

    /// The streams, null where the device has none; valid until the next init() or the destructor.
    InputStream* getInputStream() const;
    OutputStream* getOutputStream() const; ///< as getInputStream()

private:
    struct Impl;
    std::unique_ptr<Impl> impl;
};

} // namespace brenixcore

#endif
