// The property classes that the library exports: everything of the 34 that it makes, and the type
// information of the five text classes that it only recognises, which PropertyCopiers.hpp names.

#include "brenixplugin/Property.hpp"

namespace brenixplugin::kit
{

namespace device
{
template class TScalarProperty<std::u16string>;
}

#define BRENIX_INSTANTIATE(T)                                                                      \
    template class device::TScalarProperty<T>;                                                     \
    template class device::TVectorProperty<T>;                                                     \
    template class coderconverter::TPointerProperty<T>;

BRENIX_INSTANTIATE(double)
BRENIX_INSTANTIATE(float)
BRENIX_INSTANTIATE(unsigned long)
BRENIX_INSTANTIATE(long)
BRENIX_INSTANTIATE(unsigned int)
BRENIX_INSTANTIATE(int)
BRENIX_INSTANTIATE(unsigned short)
BRENIX_INSTANTIATE(short)
BRENIX_INSTANTIATE(unsigned char)
BRENIX_INSTANTIATE(signed char)
BRENIX_INSTANTIATE(bool)

} // namespace brenixplugin::kit
