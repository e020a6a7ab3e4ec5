// The error records of a channel.

#include "channel/Channel.hpp"

namespace brenixcoder
{

void Channel::recordLastError(const std::exception* exception) noexcept
{
    translateException(exception, lastErrorId, lastErrorMessage);
}

void Channel::getLastError(ErrorText& id, ErrorText& message) const noexcept
{
    id = lastErrorId.view();
    message = lastErrorMessage.view();
}

bool Channel::hasSyncError() const noexcept
{
    return !syncErrorId.empty();
}

void Channel::getLastSyncError(ErrorText& id, ErrorText& message) noexcept
{
    id = syncErrorId.view();
    message = syncErrorMessage.view();
    syncErrorId.clear();
    syncErrorMessage.clear();
}

void Channel::setSyncError(const ErrorText& id, const ErrorText& message) noexcept
{
    syncErrorId = id;
    syncErrorMessage = message;
}

bool Channel::hasAsyncError() noexcept
{
    const std::lock_guard lock(asyncErrorMutex);
    return !asyncErrorId.empty();
}

void Channel::getLastAsyncError(ErrorText& id, ErrorText& message) noexcept
{
    const std::lock_guard lock(asyncErrorMutex);
    id = asyncErrorId.view();
    message = asyncErrorMessage.view();
    asyncErrorId.clear();
    asyncErrorMessage.clear();
}

void Channel::setAsyncError(const ErrorText& id, const ErrorText& message) noexcept
{
    const std::lock_guard lock(asyncErrorMutex);
    asyncErrorId = id;
    asyncErrorMessage = message;
}

} // namespace brenixcoder
