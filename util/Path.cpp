#include "util/Path.hpp"

#include <filesystem>

namespace brenixcoder
{

// On this platform a native path is a narrow text, which std::filesystem converts from and to
// UTF-16 as UTF-8.

std::u16string to_ustring(const char* text)
{
    return std::filesystem::path(std::string(text)).u16string(); // a null text throws
}

std::string to_string(const std::u16string& text)
{
    return std::filesystem::path(text).string();
}

std::u16string canonical(const std::u16string& path, const std::u16string& base)
{
    return std::filesystem::canonical(std::filesystem::path(base) / path).u16string();
}

} // namespace brenixcoder
