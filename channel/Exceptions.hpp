#ifndef BRENIXCODER_CHANNEL_EXCEPTIONS_HPP
#define BRENIXCODER_CHANNEL_EXCEPTIONS_HPP

#include <stdexcept>

namespace brenixcoder
{

/// Ends a call in which a plug-in raised an error; the error itself is already stored.
class PluginException : public std::runtime_error
{
public:
    using std::runtime_error::runtime_error;
};

/// The channel has no input stream, or the handle is not one.
class InputStreamNotSupported : public std::runtime_error
{
public:
    using std::runtime_error::runtime_error;
};

/// The channel has no output stream, or the handle is not one.
class OutputStreamNotSupported : public std::runtime_error
{
public:
    using std::runtime_error::runtime_error;
};

} // namespace brenixcoder

#endif
