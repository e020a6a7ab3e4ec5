#include "api/CallFrame.hpp"

#include <cstdarg>
#include <string>

using namespace brenixcoder;

void* coderStreamGetChannel(void* stream) noexcept
{
    auto* const object = fromHandle<Stream>(stream);
    return object == nullptr ? nullptr : toHandle(&object->getChannel());
}

int coderStreamIsSupported(void* stream, uint8_t* supported) noexcept
{
    return queryStream<&Stream::isSupported>(stream, supported, "supported");
}

int coderStreamIsDeviceDone(void* stream, uint8_t* done) noexcept
{
    return queryStream<&Stream::isDeviceDone>(stream, done, "done");
}

int coderStreamIsOpen(void* stream, uint8_t* open) noexcept
{
    return queryStream<&Stream::isOpen>(stream, open, "open");
}

int coderStreamGetCountDimension(void* stream, double* dimension) noexcept
{
    return queryStream<&Stream::getCountDimension>(stream, dimension, "dimension");
}

int coderStreamGetDataAvailable(void* stream, double* available) noexcept
{
    return queryStream<&Stream::getDataAvailable>(stream, available, "available");
}

int coderStreamGetSpaceAvailable(void* stream, double* space) noexcept
{
    return queryStream<&Stream::getSpaceAvailable>(stream, space, "space");
}

int coderStreamFlush(void* stream) noexcept
{
    return callStream(stream, [](Stream& s) { s.flush(); });
}

int coderStreamAddFilter(void* stream, const char* filterName, uint64_t optionCount, ...) noexcept
{
    va_list options;
    va_start(options, optionCount);
    const int result =
        callStream(stream, [&](Stream& s) { s.addFilter(filterName, optionCount, &options); });
    va_end(options);
    return result;
}

int coderStreamTuneFilters(void* stream, uint64_t optionCount, ...) noexcept
{
    va_list options;
    va_start(options, optionCount);
    const int result = callStream(stream, [&](Stream& s) { s.tuneFilters(optionCount, &options); });
    va_end(options);
    return result;
}
