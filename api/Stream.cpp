#include "api/CallFrame.hpp"

#include <cstdarg>
#include <string>

using namespace brenixcoder;

void* coderStreamGetChannel(void* stream) noexcept
{
    return stream == nullptr ? nullptr : &static_cast<Stream*>(stream)->getChannel();
}

int coderStreamIsSupported(void* stream, uint8_t* supported) noexcept
{
    return queryStream(stream, supported, "supported", &Stream::isSupported);
}

int coderStreamIsDeviceDone(void* stream, uint8_t* done) noexcept
{
    return queryStream(stream, done, "done", &Stream::isDeviceDone);
}

int coderStreamIsOpen(void* stream, uint8_t* open) noexcept
{
    return queryStream(stream, open, "open", &Stream::isOpen);
}

int coderStreamGetCountDimension(void* stream, double* dimension) noexcept
{
    return queryStream(stream, dimension, "dimension", &Stream::getCountDimension);
}

int coderStreamGetDataAvailable(void* stream, double* available) noexcept
{
    return queryStream(stream, available, "available", &Stream::getDataAvailable);
}

int coderStreamGetSpaceAvailable(void* stream, double* space) noexcept
{
    return queryStream(stream, space, "space", &Stream::getSpaceAvailable);
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
