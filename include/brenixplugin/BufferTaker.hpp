/// @file
/// What a core's output stream may offer beside the contract: to take written buffers over instead of
/// copying them. The library looks for it by a dynamic_cast of the stream, once, and does without.
#ifndef BRENIXPLUGIN_BUFFERTAKER_HPP
#define BRENIXPLUGIN_BUFFERTAKER_HPP

#include "brenixplugin/Property.hpp"

#include <vector>

namespace brenixplugin::interfaces
{

/// A further base of an output stream.
class BRENIXPLUGIN_SHARED IBufferTaker
{
public:
    /// As the stream's write(), but of each buffer that it takes over, a PropertyMap made with new, it makes
    /// the element null. What is not null afterwards, also when it throws, stays the caller's.
    /// @return counts written
    virtual unsigned long takeBuffers(std::vector<void*>& dataList) = 0;

protected:
    virtual ~IBufferTaker() = default;
};

} // namespace brenixplugin::interfaces

#endif
