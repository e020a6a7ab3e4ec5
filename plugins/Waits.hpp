// What a device waits for besides its port: to be woken, and for time to pass.
#ifndef BRENIX_PLUGINS_WAITS_HPP
#define BRENIX_PLUGINS_WAITS_HPP

#include <asio.hpp>

#include <sys/eventfd.h>

#include <atomic>
#include <chrono>
#include <cstddef>
#include <optional>

namespace bytes
{

/// An eventfd: any thread can signal it without waiting.
class WakeUp
{
public:
    explicit WakeUp(asio::io_context& context)
        : event(context, ::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK))
    {
    }

    void signal() noexcept
    {
        if (!signalled.exchange(true)) { // or else it is on its way
            ::eventfd_write(event.native_handle(), 1);
        }
    }

    /// Calls the handler after the next signal, or when it is cancelled.
    template <typename Handler>
    void await(const Handler& handler)
    {
        event.async_wait(asio::posix::descriptor_base::wait_read,
                         [this, handler](const asio::error_code& /*error*/) {
                             eventfd_t times = 0;
                             ::eventfd_read(event.native_handle(), &times);
                             signalled = false; // before the handler looks at what has changed
                             handler();
                         });
    }

    void cancel() { event.cancel(); }

private:
    asio::posix::stream_descriptor event;
    std::atomic<bool> signalled = false;
};

/// A timer that is not started again while it runs.
class Ticker
{
public:
    explicit Ticker(asio::io_context& context) : timer(context) {}

    /// Calls the handler when the time has passed, or when it is cancelled.
    template <typename Handler>
    void start(std::chrono::milliseconds time, const Handler& handler)
    {
        if (!running) {
            running = true;
            timer.expires_after(time);
            timer.async_wait([this, handler](const asio::error_code& /*error*/) {
                running = false;
                handler();
            });
        }
    }

    void cancel() { timer.cancel(); }

private:
    asio::steady_timer timer;
    bool running = false;
};

/// Ends after a time in which a number of bytes has stayed the same.
class Patience
{
public:
    bool isOver(std::size_t bytes)
    {
        const auto now = std::chrono::steady_clock::now();
        if (!end || bytes != before) {
            before = bytes;
            end = now + std::chrono::seconds(3);
        }
        return now >= *end;
    }

    /// Begins anew.
    void reset() { end.reset(); }

private:
    std::optional<std::chrono::steady_clock::time_point> end;
    std::size_t before = 0;
};

} // namespace bytes

#endif
