// What ends the wait of another thread.
#ifndef BRENIX_PLUGINS_ZMQ_WAKEUP_HPP
#define BRENIX_PLUGINS_ZMQ_WAKEUP_HPP

#include <sys/eventfd.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <system_error>

namespace zeromq
{

/// An eventfd: any thread can signal it without waiting.
class WakeUp
{
public:
    WakeUp() : handle(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK))
    {
        if (handle == -1) {
            throw std::system_error(errno, std::generic_category(), "eventfd");
        }
    }
    WakeUp(const WakeUp&) = delete;
    WakeUp& operator=(const WakeUp&) = delete;
    ~WakeUp() { ::close(handle); }

    void signal() noexcept
    {
        if (!signalled.exchange(true)) { // or else it is on its way
            ::eventfd_write(handle, 1);
        }
    }

    void clear() noexcept
    {
        eventfd_t times = 0;
        ::eventfd_read(handle, &times);
        signalled = false; // before anybody looks at what has changed
    }

    int getHandle() const { return handle; }

private:
    const int handle;
    std::atomic<bool> signalled = false;
};

} // namespace zeromq

#endif
