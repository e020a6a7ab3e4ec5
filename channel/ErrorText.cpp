#include "channel/ErrorText.hpp"

#include "brenixcore/Exceptions.hpp"
#include "channel/Exceptions.hpp"

#include <algorithm>
#include <cstring>
#include <iterator>
#include <typeinfo>

namespace brenixcoder
{

namespace
{

/// The identifier of a class of exceptions, whose message is not passed on.
struct Translation {
    const std::type_info& type;
    bool (*isBaseOf)(const std::exception& exception);
    std::string_view id;
};

template <typename Exception>
constexpr Translation translated(std::string_view id)
{
    return {typeid(Exception),
            [](const std::exception& exception) {
                return dynamic_cast<const Exception*>(&exception) != nullptr;
            },
            id};
}

// A plug-in's own error is the channel's synchronous error.
constexpr Translation translations[] = {
    translated<PluginException>(""),
    translated<InputStreamNotSupported>("brenix:InputStream:notSupported"),
    translated<OutputStreamNotSupported>("brenix:OutputStream:notSupported"),
    translated<brenixcore::CouldNotLoadDevice>("brenix:Channel:couldNotLoadDevice"),
    translated<brenixcore::CouldNotLoadConverter>("brenix:Channel:couldNotLoadConverter"),
    translated<brenixcore::CouldNotLoadFilter>("brenix:Stream:couldNotLoadFilter"),
    translated<brenixcore::CouldNotCreateDevice>("brenix:Channel:couldNotCreateDevice"),
    translated<brenixcore::CouldNotCreateConverter>("brenix:Channel:couldNotCreateConverter"),
    translated<brenixcore::CouldNotCreateFilter>("brenix:Stream:couldNotCreateFilter"),
    translated<brenixcore::SynchronousInputNotPossible>(
        "brenix:InputStream:synchronousInputNotPossible"),
    translated<brenixcore::SynchronousOutputNotPossible>(
        "brenix:OutputStream:synchronousOutputNotPossible"),
    translated<brenixcore::CouldNotConvertInputData>("brenix:InputStream:couldNotConvertInputData"),
    translated<brenixcore::CouldNotConvertOutputData>(
        "brenix:OutputStream:couldNotConvertOutputData"),
    translated<brenixcore::CannotAddFilterWhileOpen>("brenix:Stream:cannotAddFilterWhileOpen"),
};

} // namespace

void copyToBuffer(std::string_view text, char* destination, std::size_t size) noexcept
{
    const std::size_t length = std::min(size - 1, text.size());
    std::strncpy(destination, text.data(), length);
    destination[length] = '\0';
}

void translateException(const std::exception* exception, ErrorText& id, ErrorText& message) noexcept
{
    id = "brenix:Channel:unexpectedException";
    if (exception == nullptr) {
        message = "Unrecognized error.";
        return;
    }
    // Nearly always it is of just one of these classes, and to compare is less than to cast.
    const auto* found = std::find_if(
        std::begin(translations), std::end(translations),
        [&](const Translation& translation) { return typeid(*exception) == translation.type; });
    if (found == std::end(translations)) {
        found = std::find_if(
            std::begin(translations), std::end(translations),
            [&](const Translation& translation) { return translation.isBaseOf(*exception); });
    }
    if (found == std::end(translations)) {
        message = exception->what();
    } else {
        id = found->id;
        message.clear();
    }
}

} // namespace brenixcoder
