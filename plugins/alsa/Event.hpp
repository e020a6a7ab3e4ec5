// How the channel's thread reaches a device's that waits for its card.
#ifndef BRENIX_PLUGINS_ALSA_EVENT_HPP
#define BRENIX_PLUGINS_ALSA_EVENT_HPP

#include <sys/eventfd.h>
#include <unistd.h>

#include <cerrno>
#include <system_error>

namespace alsa
{

/// An eventfd.
class Event
{
public:
    Event() : descriptor(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK))
    {
        if (descriptor < 0) {
            throw std::system_error(errno, std::system_category(), "eventfd");
        }
    }
    Event(const Event&) = delete;
    Event& operator=(const Event&) = delete;
    ~Event() { ::close(descriptor); }

    void wake() noexcept { ::eventfd_write(descriptor, 1); }

    int handle() const { return descriptor; }

private:
    const int descriptor;
};

} // namespace alsa

#endif
