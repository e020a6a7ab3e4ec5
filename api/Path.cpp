#include "util/Path.hpp"

#include "api/CallFrame.hpp"

using namespace brenixcoder;

void coderComputeAbsolutePath(const char* path, char* absolutePath) noexcept
{
    if (absolutePath == nullptr) {
        return;
    }
    std::string result;
    guarded([&] { result = to_string(canonical(to_ustring(path), u"")); },
            [](const std::exception*) {});
    copyToBuffer(result, absolutePath, CODER_PATH_SIZE);
}
