// Paths, and names of plug-ins and files.

#include "Input.hpp"
#include "brenixcoder/coder.h"
#include "util/Path.hpp"

#include <filesystem>
#include <optional>
#include <vector>

#include <stdlib.h>

namespace
{

/// What the system makes of the path; nothing if it does not exist.
std::string realPath(const std::string& path)
{
    const std::unique_ptr<char, void (*)(void*)> real(::realpath(path.c_str(), nullptr), ::free);
    return real ? real.get() : "";
}

/// The text by way of UTF-16, if it is UTF-8.
std::optional<std::string> thereAndBack(const std::string& text)
{
    try {
        return brenixcoder::to_string(brenixcoder::to_ustring(text.c_str()));
    } catch (const std::filesystem::filesystem_error&) {
        return std::nullopt;
    }
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    const std::string text = std::string(reinterpret_cast<const char*>(data), size).c_str();
    const std::optional<std::string> converted = thereAndBack(text);
    REQUIRE(!converted || *converted == text);

    std::vector<char> path(CODER_PATH_SIZE, 'u');
    coderComputeAbsolutePath(text.c_str(), path.data());
    const std::string real = converted ? realPath(text) : "";
    const bool isText = thereAndBack(real).has_value();
    REQUIRE(path.data() == (isText ? real.substr(0, CODER_PATH_SIZE - 1) : ""));

    std::string name = text; // of no plug-in, and not the way out of the plug-in folder
    std::replace(name.begin(), name.end(), '/', '_');
    name += "_";
    std::vector<char> id(CODER_ERROR_SIZE);
    std::vector<char> message(CODER_ERROR_SIZE);
    REQUIRE(coderChannelCreate("loopback", name.c_str(), id.data(), message.data(), 1, 1) ==
            nullptr);
    REQUIRE(id.data() == std::string("brenix:Channel:couldNotLoadConverter") && message[0] == '\0');
    return 0;
}
