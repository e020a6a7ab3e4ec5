#include "streams/Stream.hpp"

#include "channel/Exceptions.hpp"
#include "properties/OptionMap.hpp"

namespace brenixcoder
{

void throwNotSupported(StreamDirection direction)
{
    if (direction != StreamDirection::Input) {
        throw OutputStreamNotSupported("This channel does not support an output stream.");
    }
    throw InputStreamNotSupported("This channel does not support an input stream.");
}

brenixcore::InputStream& Stream::coreInput() const
{
    checkSupported();
    return dynamic_cast<brenixcore::InputStream&>(*coreStream);
}

brenixcore::OutputStream& Stream::coreOutput() const
{
    checkSupported();
    return dynamic_cast<brenixcore::OutputStream&>(*coreStream);
}

bool Stream::isDeviceDone() const
{
    return direction == StreamDirection::Input ? coreInput().isDeviceDone()
                                               : coreOutput().isDeviceDone();
}

double Stream::getCountDimension() const
{
    return static_cast<double>(direction == StreamDirection::Input
                                   ? coreInput().getCountDimension()
                                   : coreOutput().getCountDimension());
}

void Stream::flush()
{
    checkSupported();
    coreStream->flush();
}

void Stream::addFilter(const std::string& filterName, uint64_t optionCount, va_list* options)
{
    checkSupported();
    brenixplugin::PropertyMap optionMap;
    buildOptionMap(optionMap, optionCount, options);
    coreStream->addFilter(filterName, optionMap);
}

void Stream::tuneFilters(uint64_t optionCount, va_list* options)
{
    checkSupported();
    brenixplugin::PropertyMap optionMap;
    buildOptionMap(optionMap, optionCount, options);
    coreStream->tuneFilters(optionMap);
}

} // namespace brenixcoder
