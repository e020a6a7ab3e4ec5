// How the channel's thread reaches a device's that waits for its card.
#ifndef BRENIX_PLUGINS_ALSA_EVENT_HPP
#define BRENIX_PLUGINS_ALSA_EVENT_HPP

#include "brenixcore/plugin/Plugin.hpp"

#include <sys/eventfd.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <system_error>

namespace alsa
{

/// An eventfd. A caller who reads wakes the device each time: it is signalled where that matters.
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

    /// For the time of a run: whom to ask whether the channel is closing.
    class Use
    {
    public:
        Use(Event& used, const brenixcore::plugin::DeviceStreams& streams) : event(used)
        {
            event.streams = &streams;
        }
        Use(const Use&) = delete;
        Use& operator=(const Use&) = delete;
        ~Use()
        {
            event.streams = nullptr;
            event.awaitsStreams = false;
        }

    private:
        Event& event;
    };

    /// Whether the device waits for the streams, too; to be said before it looks at them.
    void awaitStreams(bool awaits) { awaitsStreams = awaits; }

    void wake() noexcept
    {
        const auto* const used = streams.load();
        if (awaitsStreams || (used != nullptr && used->isClosing())) {
            ::eventfd_write(descriptor, 1);
        }
    }

    int handle() const { return descriptor; }

private:
    const int descriptor;
    std::atomic<const brenixcore::plugin::DeviceStreams*> streams = nullptr;
    std::atomic<bool> awaitsStreams = false;
};

} // namespace alsa

#endif
