#include "api/CallFrame.hpp"

#include <cstdarg>
#include <string>

using namespace brenixcoder;

int coderOutputStreamWriteTypedDataOld(void* stream, double* written, uint64_t numBuffers,
                                       const char* typeName, ...) noexcept
{
    if (written != nullptr) {
        *written = 0.0;
    }
    va_list buffers;
    va_start(buffers, typeName);
    const int result = callStream(stream, [&](Stream& s) {
        requireArgument(written, "written");
        const std::string type = typeName;
        *written = directed<OutputStream>(s).writeTypedData(numBuffers, type, &buffers);
    });
    va_end(buffers);
    return result;
}
