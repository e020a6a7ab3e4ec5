// What ends the wait of another thread.
#ifndef BRENIX_PLUGINS_ZMQ_WAKEUP_HPP
#define BRENIX_PLUGINS_ZMQ_WAKEUP_HPP

#include <sched.h>
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

/// Asks again and again whether there is something, giving way to the others: while data flows there is seldom
/// long to wait, and to sleep and be woken takes longer than a packet does.
template <typename Condition>
bool isSoon(const Condition& condition)
{
    for (int times = 0; times < 10; ++times) {
        if (condition()) {
            return true;
        }
        ::sched_yield();
    }
    return condition();
}

} // namespace zeromq

#endif
