// The one shape of the exported functions: no exception passes, and each is recorded where its
// function says.
#ifndef BRENIXCODER_API_CALLFRAME_HPP
#define BRENIXCODER_API_CALLFRAME_HPP

#include "brenixcoder/coder.h"
#include "channel/Channel.hpp"
#include "channel/Exceptions.hpp"
#include "util/Arguments.hpp"
#include "util/Handle.hpp"

#include <exception>

namespace brenixcoder
{

/// Runs the body and returns 1. On an exception runs `onFailure` with it, or with null if it is no
/// std::exception, and returns 0.
template <typename Body, typename OnFailure>
int guarded(Body&& body, OnFailure&& onFailure) noexcept
{
    try {
        body();
        return 1;
    } catch (const std::exception& exception) {
        onFailure(&exception);
    } catch (...) {
        onFailure(nullptr);
    }
    return 0;
}

/// Runs the body and records an exception as the channel's last error. A null channel fails and
/// nothing else.
template <typename Body>
int recorded(Channel* channel, Body&& body) noexcept
{
    if (channel == nullptr) {
        return 0;
    }
    return guarded(body,
                   [&](const std::exception* exception) { channel->recordLastError(exception); });
}

/// The call frame without its first step.
template <typename Body>
int callKeepingLastError(void* handle, Body&& body) noexcept
{
    auto* const channel = fromHandle<Channel>(handle);
    return recorded(channel, [&] { body(*channel); });
}

/// The call frame: clears the channel's last error, then runs the body with the channel.
template <typename Body>
int callChannel(void* handle, Body&& body) noexcept
{
    return callKeepingLastError(handle, [&](Channel& channel) {
        channel.clearLastError();
        body(channel);
    });
}

/// The call frame on the channel that owns a stream.
template <typename Body>
int callStream(void* handle, Body&& body) noexcept
{
    auto* const stream = fromHandle<Stream>(handle);
    auto* const channel = stream == nullptr ? nullptr : &stream->getChannel();
    return recorded(channel, [&] {
        channel->clearLastError();
        body(*stream);
    });
}

/// The call frame for a query, whose answer is written only when there is one.
template <auto query, typename Value>
int queryStream(void* handle, Value* answer, const char* argument) noexcept
{
    // cppcheck-suppress throwInNoexceptFunction ; the frame catches what the body throws
    return callStream(handle, [&](Stream& stream) {
        requireArgument(answer, argument);
        *answer = static_cast<Value>((stream.*query)());
    });
}

/// A stream handle as one of the direction that the function needs. Without a dynamic_cast: a copy-out
/// of much data would find what that reads gone from the cache.
template <typename Directed>
Directed& directed(Stream& stream)
{
    if (stream.getDirection() != Directed::ownDirection) {
        throwNotSupported(Directed::ownDirection);
    }
    return static_cast<Directed&>(stream);
}

} // namespace brenixcoder

#endif
