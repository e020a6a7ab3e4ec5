#include "streams/OutputStream.hpp"

#include "properties/CreateProperty.hpp"
#include "streams/DataList.hpp"

#include <stdexcept>

namespace brenixcoder
{

double OutputStream::writeTypedData(uint64_t numBuffers, const std::string& typeName,
                                    va_list* buffers)
{
    const std::string fieldName = "data";
    brenixcore::OutputStream& core = coreOutput();

    // Grows as buffers are made, for numBuffers may be too large for a list that is then never
    // filled.
    DataList dataList;
    for (uint64_t i = 0; i < numBuffers; ++i) {
        const int count = va_arg(*buffers, int);
        const void* const data = va_arg(*buffers, const void*);
        brenixplugin::OwnedProperty property(
            createProperty(false, fieldName, typeName, count, data));
        if (!property) {
            throw std::runtime_error("Unsupported type: " + typeName + " for data being written.");
        }
        brenixplugin::OwnedDataBuffer buffer(new brenixplugin::PropertyMap);
        brenixplugin::storeProperty(*buffer, fieldName, std::move(property));
        dataList.buffers.push_back(buffer.get());
        buffer.release();
    }
    return static_cast<double>(taker != nullptr ? taker->takeBuffers(dataList.buffers)
                                                : core.write(dataList.buffers));
}

} // namespace brenixcoder
