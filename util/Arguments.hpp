#ifndef BRENIXCODER_UTIL_ARGUMENTS_HPP
#define BRENIXCODER_UTIL_ARGUMENTS_HPP

#include <stdexcept>
#include <string>

namespace brenixcoder
{

/// Throws, naming the argument, when a pointer of the caller is null.
inline void requireArgument(const void* pointer, const char* name)
{
    if (pointer == nullptr) {
        throw std::runtime_error(std::string("Argument ") + name + " must not be null.");
    }
}

} // namespace brenixcoder

#endif
