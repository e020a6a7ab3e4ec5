// Who was not let in, and how that is told.
#ifndef BRENIX_PLUGINS_ZMQ_REFUSALS_HPP
#define BRENIX_PLUGINS_ZMQ_REFUSALS_HPP

#include "brenixcore/plugin/Plugin.hpp"

#include <chrono>
#include <cstdint>
#include <map>
#include <string>

namespace zeromq
{

using Clock = std::chrono::steady_clock;

/// Tells them once a second at most: who is refused mostly tries again at once.
class Refusals
{
public:
    /// Of a side that binds, or of one that was refused itself.
    Refusals(brenixcore::plugin::DeviceHost& deviceHost, bool isBound)
        : host(deviceHost), binds(isBound)
    {
    }

    void add(const std::string& what);

    bool isEmpty() const { return refusals.empty(); }
    Clock::time_point getNextTelling() const { return nextTelling; }

    /// Raises an error for those that were not told yet.
    void tell(const std::string& endpoint);

private:
    brenixcore::plugin::DeviceHost& host;
    const bool binds;
    std::map<std::string, std::uint64_t> refusals; ///< by what they were
    Clock::time_point nextTelling{};
};

} // namespace zeromq

#endif
