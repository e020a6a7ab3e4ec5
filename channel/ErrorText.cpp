#include "channel/ErrorText.hpp"

#include "brenixcore/Exceptions.hpp"
#include "channel/Exceptions.hpp"

#include <algorithm>
#include <cstring>
#include <exception>

namespace brenixcoder
{

void copyToBuffer(std::string_view text, char* destination, std::size_t size) noexcept
{
    const std::size_t length = std::min(size - 1, text.size());
    std::strncpy(destination, text.data(), length);
    destination[length] = '\0';
}

void translateCurrentException(ErrorText& id, ErrorText& message) noexcept
{
    id.clear();
    message.clear();
    try {
        // cppcheck-suppress rethrowNoCurrentException ; called inside a handler
        throw;
    } catch (const PluginException&) {
        // The plug-in's own error is the channel's synchronous error.
    } catch (const InputStreamNotSupported&) {
        id = "brenix:InputStream:notSupported";
    } catch (const OutputStreamNotSupported&) {
        id = "brenix:OutputStream:notSupported";
    } catch (const brenixcore::CouldNotLoadDevice&) {
        id = "brenix:Channel:couldNotLoadDevice";
    } catch (const brenixcore::CouldNotLoadConverter&) {
        id = "brenix:Channel:couldNotLoadConverter";
    } catch (const brenixcore::CouldNotLoadFilter&) {
        id = "brenix:Stream:couldNotLoadFilter";
    } catch (const brenixcore::CouldNotCreateDevice&) {
        id = "brenix:Channel:couldNotCreateDevice";
    } catch (const brenixcore::CouldNotCreateConverter&) {
        id = "brenix:Channel:couldNotCreateConverter";
    } catch (const brenixcore::CouldNotCreateFilter&) {
        id = "brenix:Stream:couldNotCreateFilter";
    } catch (const brenixcore::SynchronousInputNotPossible&) {
        id = "brenix:InputStream:synchronousInputNotPossible";
    } catch (const brenixcore::SynchronousOutputNotPossible&) {
        id = "brenix:OutputStream:synchronousOutputNotPossible";
    } catch (const brenixcore::CouldNotConvertInputData&) {
        id = "brenix:InputStream:couldNotConvertInputData";
    } catch (const brenixcore::CouldNotConvertOutputData&) {
        id = "brenix:OutputStream:couldNotConvertOutputData";
    } catch (const brenixcore::CannotAddFilterWhileOpen&) {
        id = "brenix:Stream:cannotAddFilterWhileOpen";
    } catch (const std::exception& exception) {
        id = "brenix:Channel:unexpectedException";
        message = exception.what();
    } catch (...) {
        id = "brenix:Channel:unexpectedException";
        message = "Unrecognized error.";
    }
}

} // namespace brenixcoder
