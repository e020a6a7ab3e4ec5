#include "api/CallFrame.hpp"
#include "util/Numbers.hpp"

#include <cstdarg>
#include <string>

using namespace brenixcoder;

void* coderChannelCreate(const char* devicePath, const char* converterPath, char* errorId,
                         char* errorMessage, double firstLimit, double secondLimit) noexcept
{
    Channel* channel = nullptr;
    guarded(
        [&] {
            requireArgument(errorId, "errorId");
            requireArgument(errorMessage, "errorMessage");
            const std::string device = devicePath;
            const std::string converter = converterPath;
            channel = new Channel(device, converter, toUint64Saturated(firstLimit),
                                  toUint64Saturated(secondLimit));
        },
        [&](const std::exception* exception) {
            ErrorText id;
            ErrorText message;
            translateException(exception, id, message);
            if (errorId != nullptr) {
                copyToBuffer(id.view(), errorId, errorBufferSize);
            }
            if (errorMessage != nullptr) {
                copyToBuffer(message.view(), errorMessage, errorBufferSize);
            }
        });
    return toHandle(channel);
}

int coderChannelInit(void* channel, uint64_t optionCount, ...) noexcept
{
    va_list options;
    va_start(options, optionCount);
    const int result = callChannel(channel, [&](Channel& c) { c.init(optionCount, &options); });
    va_end(options);
    return result;
}

int coderChannelOpen(void* channel, uint64_t optionCount, ...) noexcept
{
    va_list options;
    va_start(options, optionCount);
    const int result = callChannel(channel, [&](Channel& c) { c.open(optionCount, &options); });
    va_end(options);
    return result;
}

int coderChannelExecute(void* channel, const char* command, uint64_t optionCount, ...) noexcept
{
    va_list options;
    va_start(options, optionCount);
    const int result =
        callChannel(channel, [&](Channel& c) { c.execute(command, optionCount, &options); });
    va_end(options);
    return result;
}

int coderChannelClose(void* channel) noexcept
{
    return callChannel(channel, [](Channel& c) { c.close(); });
}

int coderChannelTerm(void* channel) noexcept
{
    return callChannel(channel, [](Channel& c) { c.term(); });
}

int coderChannelIsOpen(void* channel, uint8_t* open) noexcept
{
    return callChannel(channel, [&](Channel& c) {
        requireArgument(open, "open");
        *open = c.isOpen();
    });
}

void coderChannelDestroy(void* channel) noexcept
{
    delete fromHandle<Channel>(channel);
}

void* coderChannelGetInputStream(void* channel) noexcept
{
    void* stream = nullptr;
    callChannel(channel, [&](Channel& c) { stream = toHandle(c.getInputStream()); });
    return stream;
}

void* coderChannelGetOutputStream(void* channel) noexcept
{
    void* stream = nullptr;
    callChannel(channel, [&](Channel& c) { stream = toHandle(c.getOutputStream()); });
    return stream;
}

int coderChannelGetPropertyValue(void* channel, const char* name, const char* typeName,
                                 int capacity, ...) noexcept
{
    va_list rest;
    va_start(rest, capacity);
    const int result = callChannel(channel, [&](Channel& c) {
        const std::string type = typeName;
        c.getPropertyValue(name, type, capacity, &rest);
    });
    va_end(rest);
    return result;
}
