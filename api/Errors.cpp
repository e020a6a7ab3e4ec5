#include "api/CallFrame.hpp"

using namespace brenixcoder;

namespace
{

void requireBuffers(const char* errorId, const char* errorMessage)
{
    requireArgument(errorId, "errorId");
    requireArgument(errorMessage, "errorMessage");
}

void copyToBuffers(const ErrorText& id, const ErrorText& message, char* errorId,
                   char* errorMessage) noexcept
{
    copyToBuffer(id.view(), errorId, errorBufferSize);
    copyToBuffer(message.view(), errorMessage, errorBufferSize);
}

} // namespace

int coderChannelGetLastError(void* channel, char* errorId, char* errorMessage) noexcept
{
    auto* const object = fromHandle<Channel>(channel);
    if (object == nullptr || errorId == nullptr || errorMessage == nullptr) {
        return 0; // recording why would replace the error that is asked for
    }
    ErrorText id;
    ErrorText message;
    object->getLastError(id, message);
    copyToBuffers(id, message, errorId, errorMessage);
    return 1;
}

int coderChannelHasSyncError(void* channel, uint8_t* hasError) noexcept
{
    return callKeepingLastError(channel, [&](Channel& c) {
        requireArgument(hasError, "hasError");
        *hasError = c.hasSyncError();
    });
}

int coderChannelGetLastSyncError(void* channel, char* errorId, char* errorMessage) noexcept
{
    return callKeepingLastError(channel, [&](Channel& c) {
        requireBuffers(errorId, errorMessage);
        ErrorText id;
        ErrorText message;
        c.getLastSyncError(id, message);
        copyToBuffers(id, message, errorId, errorMessage);
    });
}

int coderChannelHasAsyncError(void* channel, uint8_t* hasError) noexcept
{
    return callChannel(channel, [&](Channel& c) {
        requireArgument(hasError, "hasError");
        *hasError = c.hasAsyncError();
    });
}

int coderChannelGetLastAsyncError(void* channel, char* errorId, char* errorMessage) noexcept
{
    return callKeepingLastError(channel, [&](Channel& c) {
        requireBuffers(errorId, errorMessage);
        ErrorText id;
        ErrorText message;
        c.getLastAsyncError(id, message);
        copyToBuffers(id, message, errorId, errorMessage);
    });
}
