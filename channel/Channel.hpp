#ifndef BRENIXCODER_CHANNEL_CHANNEL_HPP
#define BRENIXCODER_CHANNEL_CHANNEL_HPP

#include "brenixcore/Channel.hpp"
#include "brenixcore/Converter.hpp"
#include "brenixplugin/Property.hpp"
#include "channel/ErrorText.hpp"
#include "streams/InputStream.hpp"
#include "streams/OutputStream.hpp"
#include "util/Handle.hpp"

#include <cstdarg>
#include <cstdint>
#include <exception>
#include <forward_list>
#include <mutex>
#include <string>
#include <thread>

namespace brenixcoder
{

/// The object behind a channel handle: a core channel with its converter, the three error records,
/// the device's properties and the two stream wrappers. Used on the thread that made it; the core
/// calls the handler operations on any thread.
class Channel : public brenixcore::Channel::IEventHandler, public Marked
{
public:
    static constexpr Mark ownMark = Mark::Channel;

    Channel(const std::string& devicePath, const std::string& converterPath, uint64_t firstLimit,
            uint64_t secondLimit);
    Channel(const Channel&) = delete;
    Channel& operator=(const Channel&) = delete;

    /// An error raised on the owner thread is stored and ends the running call with
    /// PluginException; one raised on another thread is stored as the asynchronous error.
    void onCustomEvent(brenixcore::CustomEvent& event) override;

    /// Replaces the stored property of that name and takes over the object. One of an unknown name
    /// stays the core's.
    void onPropertyUpdate(brenixplugin::interfaces::IPropertyInfo* property) override;

    void* onDelegatedEvent(brenixcore::DelegatedEvent& event) override;
    void onIgnoredEvent1(void* event) override;
    void onIgnoredEvent2(void* event) override;

    /// Releases properties, output stream and input stream, in this order, before the core goes.
    ~Channel() override;

    /// The options of these three are `optionCount` groups as buildOptionMap() reads them.
    void init(uint64_t optionCount, va_list* options);
    void open(uint64_t optionCount, va_list* options);
    void execute(const char* command, uint64_t optionCount, va_list* options);
    void close() { coreChannel.close(); }
    void term() { coreChannel.term(); }
    bool isOpen() const { return coreChannel.isOpen(); }

    /// Null before the first successful init; replaced by each.
    InputStream* getInputStream() noexcept
    {
        return inputStreams.empty() ? nullptr : &inputStreams.front();
    }
    OutputStream* getOutputStream() noexcept
    {
        return outputStreams.empty() ? nullptr : &outputStreams.front();
    }

    /// Copies a property's value to the destination that is next in `rest`.
    void getPropertyValue(const std::string& name, const std::string& typeName, int capacity,
                          va_list* rest);

    void clearLastError() noexcept
    {
        lastErrorId.clear();
        lastErrorMessage.clear();
    }
    /// Stores what ended a call; null stands for what is no std::exception.
    void recordLastError(const std::exception* exception) noexcept;
    void getLastError(ErrorText& id, ErrorText& message) const noexcept;

    bool hasSyncError() const noexcept;
    /// Empties the record.
    void getLastSyncError(ErrorText& id, ErrorText& message) noexcept;
    void setSyncError(const ErrorText& id, const ErrorText& message) noexcept;

    bool hasAsyncError() noexcept;
    /// Empties the record.
    void getLastAsyncError(ErrorText& id, ErrorText& message) noexcept;
    void setAsyncError(const ErrorText& id, const ErrorText& message) noexcept;

private:
    // The order matters: the core channel refers to the converter and is destroyed before it, and
    // everything that holds objects of plug-ins is destroyed before the core channel.
    brenixcore::Converter converter;
    brenixcore::Channel coreChannel;
    std::thread::id ownerThread;
    ErrorText lastErrorId;
    ErrorText lastErrorMessage;
    ErrorText syncErrorId;
    ErrorText syncErrorMessage;
    std::mutex asyncErrorMutex;
    ErrorText asyncErrorId;
    ErrorText asyncErrorMessage;
    std::mutex propertyMutex;
    brenixplugin::PropertyMap properties; ///< owns its objects
    // Behind the current one those that were replaced, whose handles the caller may still have.
    std::forward_list<InputStream> inputStreams;
    std::forward_list<OutputStream> outputStreams;
};

} // namespace brenixcoder

#endif
