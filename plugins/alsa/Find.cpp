#include <cstdarg>

extern "C" { // which the header forgets for its last function
#include <alsa/error.h>
}

#include "Find.hpp"

#include <alsa/asoundlib.h>

#include <cstdlib>
#include <memory>
#include <stdexcept>

namespace alsa
{

namespace
{

void printNothing(const char* /*file*/, int /*line*/, const char* /*function*/, int /*error*/,
                  const char* /*format*/, va_list /*values*/)
{
}

/// What a hint tells, on one line; empty where it does not.
std::string tell(const void* hint, const char* what)
{
    const std::unique_ptr<char, decltype(&std::free)> text(::snd_device_name_get_hint(hint, what),
                                                           &std::free);
    std::string line = text ? text.get() : "";
    for (std::size_t end = line.find('\n'); end != std::string::npos; end = line.find('\n')) {
        line.replace(end, 1, ", ");
    }
    return line;
}

} // namespace

void findCards(std::vector<brenixcore::plugin::Found>& found)
{
    void** hints = nullptr;
    const auto before = ::snd_lib_error_set_local(printNothing);
    const int result = ::snd_device_name_hint(-1, "pcm", &hints);
    ::snd_lib_error_set_local(before);
    if (result < 0) {
        throw std::runtime_error(std::string("libasound does not list its PCMs: ") +
                                 ::snd_strerror(result));
    }
    const std::unique_ptr<void*, decltype(&::snd_device_name_free_hint)> owner(
        hints, &::snd_device_name_free_hint);
    for (; *hints != nullptr; ++hints) {
        const std::string name = tell(*hints, "NAME");
        const std::string description = tell(*hints, "DESC");
        const std::string direction = tell(*hints, "IOID"); // empty for both
        const std::string what = description.empty() ? name : description;
        if (direction != "Output") {
            found.push_back({what + ": captures", {{"Card", name}}, ""});
        }
        if (direction != "Input") {
            found.push_back({what + ": plays", {{"Card", name}, {"Mode", "write"}}, ""});
        }
    }
    findForbidden(found);
}

} // namespace alsa
