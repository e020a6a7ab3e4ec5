#include "channel/Channel.hpp"

#include "properties/OptionMap.hpp"

namespace brenixcoder
{

Channel::Channel(const std::string& devicePath, const std::string& converterPath,
                 uint64_t firstLimit, uint64_t secondLimit)
    : Marked(ownMark), converter(converterPath),
      coreChannel(devicePath, converter, *this, firstLimit, secondLimit),
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

    // The core's earlier streams may be gone now, and the old wrappers stay.
    InputStream* const oldInput = getInputStream();
    OutputStream* const oldOutput = getOutputStream();
    if (oldInput != nullptr) {
        oldInput->detach();
    }
    if (oldOutput != nullptr) {
        oldOutput->detach();
    }
    inputStreams.emplace_front(coreChannel.getInputStream(), *this);
    if (oldInput != nullptr) {
        oldInput->freeBuffers();
    }
    outputStreams.emplace_front(coreChannel.getOutputStream(), *this);
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
