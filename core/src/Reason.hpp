#ifndef BRENIXCORE_SRC_REASON_HPP
#define BRENIXCORE_SRC_REASON_HPP

#include "Plugin.hpp"

#include <string>

namespace brenixcore
{

/// Keeps why the last operation failed, where the caller finds it.
class ReasonKeeper
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

protected:
    ~ReasonKeeper() = default;

private:
    virtual void keepReason(const std::string& reason) noexcept = 0;
};

} // namespace brenixcore

#endif
