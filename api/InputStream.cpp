#include "api/CallFrame.hpp"

#include <string>

using namespace brenixcoder;

namespace
{

InputStream& input(Stream& stream)
{
    return directed<InputStream, StreamDirection::Input>(stream);
}

} // namespace

int coderInputStreamPeek(void* stream, double* totalCounts, double* bufferCounts,
                         double* numBuffers, double maxCounts) noexcept
{
    if (totalCounts != nullptr) {
        *totalCounts = 0.0;
    }
    return callStream(stream, [&](Stream& s) {
        requireArgument(totalCounts, "totalCounts");
        requireArgument(bufferCounts, "bufferCounts");
        requireArgument(numBuffers, "numBuffers");
        input(s).peek(totalCounts, bufferCounts, numBuffers, maxCounts);
    });
}

int coderInputStreamReadBuffers(void* stream, double countsToRead, double expectedBuffers) noexcept
{
    return callStream(stream,
                      [&](Stream& s) { input(s).readBuffers(countsToRead, expectedBuffers); });
}

int coderInputStreamReadBufferData(void* stream, int32_t bufferIndex, int32_t fieldIndex,
                                   const char* fieldName, const char* typeName, int32_t capacity,
                                   void* destination) noexcept
{
    return callStream(stream, [&](Stream& s) {
        requireArgument(destination, "destination");
        const std::string type = typeName;
        const std::string field = fieldName;
        input(s).readBufferData(bufferIndex, fieldIndex, field, type, capacity, destination);
    });
}

void coderInputStreamFreeBuffer(void* stream, int32_t bufferIndex) noexcept
{
    callStream(stream, [&](Stream& s) {
        guarded([&] { input(s).freeBuffer(bufferIndex); }, [](const std::exception*) {});
    });
}
