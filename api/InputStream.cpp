#include "api/CallFrame.hpp"

#include <string>

using namespace brenixcoder;

int coderInputStreamPeek(void* stream, double* totalCounts, double* bufferCounts,
                         double* numBuffers, double maxCounts) noexcept
{
    if (totalCounts != nullptr) {
        *totalCounts = 0.0;
    }
    return callStream(stream, [&](Stream& s) {
        requireArgument(totalCounts, "totalCounts");
        requireArgument(numBuffers, "numBuffers");
        if (*numBuffers >= 1) {
            requireArgument(bufferCounts, "bufferCounts");
        }
        directed<InputStream>(s).peek(totalCounts, bufferCounts, numBuffers, maxCounts);
    });
}

int coderInputStreamReadBuffers(void* stream, double countsToRead, double expectedBuffers) noexcept
{
    return callStream(stream, [&](Stream& s) {
        directed<InputStream>(s).readBuffers(countsToRead, expectedBuffers);
    });
}

int coderInputStreamReadBufferData(void* stream, int32_t bufferIndex, int32_t fieldIndex,
                                   const char* fieldName, const char* typeName, int32_t capacity,
                                   void* destination) noexcept
{
    return callStream(stream, [&](Stream& s) {
        requireArgument(destination, "destination");
        const std::string type = typeName;
        const std::string field = fieldName;
        directed<InputStream>(s).readBufferData(bufferIndex, fieldIndex, field, type, capacity,
                                                destination);
    });
}

void coderInputStreamFreeBuffer(void* stream, int32_t bufferIndex) noexcept
{
    callStream(stream, [&](Stream& s) {
        guarded([&] { directed<InputStream>(s).freeBuffer(bufferIndex); },
                [](const std::exception*) {});
    });
}
