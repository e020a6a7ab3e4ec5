#include "Mailbox.hpp"

#include <cstdint>
#include <unordered_map>
#include <utility>

namespace natsio
{

namespace
{

struct Registry {
    std::mutex mutex;
    std::unordered_map<void*, std::weak_ptr<Mailbox>> boxes;
    std::uintptr_t last = 0;
};

/// Stays to the end of the process, as the library's threads do.
Registry& registry()
{
    static Registry& all = *new Registry;
    return all;
}

std::size_t sizeOf(const Event& event)
{
    return event.message ? static_cast<std::size_t>(natsMsg_GetDataLength(event.message.get())) : 0;
}

/// Whether it is a short map: what a writer says of itself or of its end, which is never dropped.
bool isShort(const Event& event)
{
    const std::size_t size = sizeOf(event);
    return size > 0 && size < 4096 &&
           static_cast<unsigned char>(*natsMsg_GetData(event.message.get())) <= 0xA5;
}

} // namespace

std::shared_ptr<Mailbox> Mailbox::make(std::size_t limit)
{
    std::shared_ptr<Mailbox> box(new Mailbox(limit));
    Registry& all = registry();
    const std::lock_guard lock(all.mutex);
    auto* const place = reinterpret_cast<void*>(++all.last); // NOLINT(performance-no-int-to-ptr)
    all.boxes.emplace(place, box);
    box->place = place;
    return box;
}

Mailbox::~Mailbox()
{
    Registry& all = registry();
    const std::lock_guard lock(all.mutex);
    all.boxes.erase(place);
}

std::shared_ptr<Mailbox> Mailbox::find(void* number)
{
    Registry& all = registry();
    const std::lock_guard lock(all.mutex);
    const auto found = all.boxes.find(number);
    return found == all.boxes.end() ? nullptr : found->second.lock();
}

bool Mailbox::isFullFor(const Event& event) const
{
    constexpr std::size_t most = 65536; // messages
    return limit > 0 && !messages.empty() &&
           (isShort(event) ? messages.size() >= 2 * most
                           : messages.size() >= most || bytes + sizeOf(event) > limit);
}

void Mailbox::put(Event event) noexcept
{
    try {
        const std::lock_guard lock(mutex);
        if (event.kind != Event::Kind::Message) {
            events.push_back(std::move(event));
        } else if (!isFullFor(event)) {
            const std::size_t size = sizeOf(event);
            messages.push_back(std::move(event));
            bytes += size;
        }
        changed.notify_all();
    } catch (...) { // no memory: it is as if it had got lost on its way
    }
}

void Mailbox::wake() noexcept
{
    const std::lock_guard lock(mutex);
    woken = true;
    changed.notify_all();
}

std::deque<Event> Mailbox::take(Moment until, bool withMessages)
{
    constexpr std::size_t few = 1U << 20U; // bytes
    std::unique_lock lock(mutex);
    changed.wait_until(lock, until, [&] {
        return woken || !events.empty() || (withMessages && !messages.empty());
    });
    woken = false;
    std::deque<Event> taken = std::exchange(events, {});
    for (std::size_t size = 0; withMessages && !messages.empty() && size < few;) {
        size += sizeOf(messages.front());
        bytes -= sizeOf(messages.front());
        taken.push_back(std::move(messages.front()));
        messages.pop_front();
    }
    return taken;
}

} // namespace natsio
