#include "channel/Channel.hpp"

#include "properties/OptionMap.hpp"

namespace brenixcoder
{

Channel::Channel(const std::string& devicePath, const std::string& converterPath,
                 uint64_t firstLimit, uint64_t secondLimit)
    : converter(converterPath), coreChannel(devicePath, converter, *this, firstLimit, secondLimit),
      ownerThread(std::this_thread::get_id())
{
}

Channel::~Channel()
{
    brenixplugin::releaseProperties(properties);
    // The members release the rest, last to first: output stream, input stream, ..., core channel,
    // converter.
}

void Channel::init(uint64_t optionCount, va_list* options)
{
    brenixplugin::PropertyMap optionMap;
    buildOptionMap(optionMap, optionCount, options);
    coreChannel.init(optionMap, properties);

    // The core's earlier streams may be gone now: an old wrapper that cannot be replaced below must
    // not refer to them.
    if (inputStream) {
        inputStream->detach();
    }
    if (outputStream) {
        outputStream->detach();
    }
    inputStream = std::make_unique<InputStream>(coreChannel.getInputStream(), *this);
    outputStream = std::make_unique<OutputStream>(coreChannel.getOutputStream(), *this);
}

void Channel::open(uint64_t optionCount, va_list* options)
{
    brenixplugin::PropertyMap optionMap;
    buildOptionMap(optionMap, optionCount, options);
    coreChannel.open(optionMap);
}

void Channel::execute(const char* command, uint64_t optionCount, va_list* options)
{
    brenixplugin::PropertyMap optionMap;
    buildOptionMap(optionMap, optionCount, options);
    coreChannel.execute(command, optionMap);
}

} // namespace brenixcoder
