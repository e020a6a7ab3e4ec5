// Calls of a library that may not return: whoever waits for one leaves it behind after a while.
#ifndef BRENIX_PLUGINS_ALSA_WATCH_HPP
#define BRENIX_PLUGINS_ALSA_WATCH_HPP

#include <atomic>
#include <chrono>
#include <cstdint>
#include <functional>
#include <future>
#include <memory>
#include <optional>
#include <thread>
#include <utility>

namespace alsa
{

/// How long a card, or the sound server behind it, may take for what it should do at once.
constexpr std::chrono::seconds patience{3};

/// Nanoseconds, by the clock that cards go by.
std::int64_t steadyTime();

/// Makes one call on a thread of its own. Returns its result, or throws what it threw; nothing where it has not
/// returned within the patience. Then it goes on alone.
template <typename Result>
std::optional<Result> callWithPatience(std::function<Result()> call)
{
    std::packaged_task<Result()> task(std::move(call));
    std::future<Result> result = task.get_future();
    std::thread thread(std::move(task));
    if (result.wait_for(patience) == std::future_status::timeout) {
        thread.detach();
        return std::nullopt;
    }
    thread.join();
    return result.get();
}

/// For work of many calls, which has a thread of its own as a whole.
class Watch
{
public:
    /// Makes a call within the work. Does not come back where the work has been left behind meanwhile.
    template <typename Call>
    auto call(Call call, std::chrono::nanoseconds limit = patience)
    {
        const std::int64_t due = steadyTime() + std::chrono::nanoseconds(limit).count();
        latest = due;
        const auto result = call();
        std::int64_t expected = due;
        if (!latest.compare_exchange_strong(expected, notCalling)) {
            throw LeftBehind();
        }
        return result;
    }

    /// Runs the work and throws what it throws. Returns whether it has ended, or else was left behind, since a call
    /// took longer than its limit and a second. What it uses must then outlive it: it may still do what the call
    /// does, and throws as soon as that returns.
    bool run(const std::function<void()>& work);

private:
    struct LeftBehind {
    };
    static constexpr std::int64_t notCalling = 0;
    static constexpr std::int64_t leftBehind = -1;

    std::atomic<std::int64_t> latest = notCalling; ///< when the present call has to return
};

} // namespace alsa

#endif
