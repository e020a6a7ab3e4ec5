#ifndef BRENIXCORE_SRC_TRACE_HPP
#define BRENIXCORE_SRC_TRACE_HPP

#include <string>

namespace brenixcore
{

/// Writes the events of a channel where the environment's BRENIX_TRACE says: to the standard error, for
/// "stderr", or to the end of a file of that name. Without it, nothing.
class Trace
{
public:
    /// A file that cannot be opened is told on the standard error, and nothing else is done.
    explicit Trace(std::string deviceName);
    Trace(const Trace&) = delete;
    Trace& operator=(const Trace&) = delete;
    ~Trace();

    /// One line, at once: time, device, thread and the three texts. No text is null. Without memory there is
    /// no line, which is no reason for the event not to arrive.
    void write(const char* event, const char* identifier, const char* message) const noexcept;

private:
    void writeLine(const char* event, const char* identifier, const char* message) const;

    std::string device;
    int file = -1;
};

} // namespace brenixcore

#endif
