#ifndef BRENIXCODER_UTIL_PATH_HPP
#define BRENIXCODER_UTIL_PATH_HPP

#include <string>

namespace brenixcoder
{

/// UTF-8 to UTF-16 and back; both throw when the text is not valid.
std::u16string to_ustring(const char* text);
std::string to_string(const std::u16string& text);

/// The canonical absolute form of a path: no ".", "..", or symbolic link. A relative path starts at
/// `base`, or, when that is empty, at the current directory. Throws for a path that does not exist.
std::u16string canonical(const std::u16string& path, const std::u16string& base);

} // namespace brenixcoder

#endif
