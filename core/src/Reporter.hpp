#ifndef BRENIXCORE_SRC_REPORTER_HPP
#define BRENIXCORE_SRC_REPORTER_HPP

#include "Plugin.hpp"
#include "brenixcore/plugin/Plugin.hpp"

#include <string>

namespace brenixcore
{

/// By which the streams and the device's side report to the caller: events, and the core's own properties.
class Reporter : public plugin::DeviceHost
{
public:
    /// Runs an operation of the channel or of a stream, and keeps the text of what it throws.
    template <typename Operation>
    decltype(auto) explain(const Operation& operation)
    {
        try {
            return operation();
        } catch (...) {
            keepReason(currentExceptionText());
            throw;
        }
    }

    /// Gives the property of lost counts its value.
    virtual void updateLostCounts() = 0;

protected:
    ~Reporter() = default;

private:
    virtual void keepReason(const std::string& reason) noexcept = 0;
};

} // namespace brenixcore

#endif
