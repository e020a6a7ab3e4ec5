// What the library's own threads tell the device's thread.
#ifndef BRENIX_PLUGINS_NATS_MAILBOX_HPP
#define BRENIX_PLUGINS_NATS_MAILBOX_HPP

#include <nats/nats.h>

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <deque>
#include <memory>
#include <mutex>
#include <string>

namespace natsio
{

using Clock = std::chrono::steady_clock;
using Moment = Clock::time_point;

/// A library's function as a deleter.
template <auto destroy>
struct Destroy {
    template <typename T>
    void operator()(T* object) const noexcept
    {
        destroy(object);
    }
};

using MessagePointer = std::unique_ptr<natsMsg, Destroy<natsMsg_Destroy>>;

struct Event {
    enum class Kind {
        Message,      ///< has arrived
        Answer,       ///< to a question, with what the last token of its subject says
        Stored,       ///< `message` was
        NotStored,    ///< and why
        Disconnected, ///< and why
        Reconnected,
        Closed, ///< for ever, and why
        Error   ///< which one
    };
    Kind kind = Kind::Message;
    MessagePointer message;
    std::string text;
};

/// The library may call back when what it was given is gone. So it is given the number of a mailbox, and each
/// call looks whether that is still there.
class Mailbox
{
public:
    /// One that drops messages of data while so many bytes of them wait; 0: none.
    static std::shared_ptr<Mailbox> make(std::size_t limit);
    ~Mailbox();

    /// Null when it is gone.
    static std::shared_ptr<Mailbox> find(void* number);

    void* number() const { return place; }

    /// From any thread.
    void put(Event event) noexcept;

    /// Ends a wait.
    void wake() noexcept;

    /// What has come, as soon as there is something, or it was woken, or at that time. Of messages a few, or
    /// none where they are to wait.
    std::deque<Event> take(Moment until, bool withMessages = true);

private:
    explicit Mailbox(std::size_t mostBytes) : limit(mostBytes) {}

    bool isFullFor(const Event& event) const;

    void* place = nullptr;
    std::mutex mutex;
    std::condition_variable changed;
    std::deque<Event> events;   ///< all but messages
    std::deque<Event> messages; ///< that have arrived
    std::size_t bytes = 0;      ///< of them
    const std::size_t limit;
    bool woken = false;
};

} // namespace natsio

#endif
