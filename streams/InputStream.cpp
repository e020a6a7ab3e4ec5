#include "streams/InputStream.hpp"

#include "properties/CopyProperty.hpp"
#include "util/Numbers.hpp"

#include <algorithm>
#include <stdexcept>
#include <utility>

namespace brenixcoder
{

void InputStream::peek(double* totalCounts, double* bufferCounts, double* numBuffers,
                       double maxCounts)
{
    unsigned long coreTotal = 0;
    std::vector<unsigned long> counts;
    coreInput().peekCounts(toUint64Saturated(maxCounts), coreTotal, counts);

    // The comparison is false for NaN as well.
    const uint64_t capacity = *numBuffers > 0 ? toUint64Saturated(*numBuffers) : 0;
    const std::size_t reported = std::min<uint64_t>(counts.size(), capacity);
    uint64_t sum = 0;
    for (std::size_t i = 0; i < reported; ++i) {
        bufferCounts[i] = static_cast<double>(counts[i]);
        sum += counts[i];
    }
    *numBuffers = static_cast<double>(reported);
    *totalCounts = static_cast<double>(sum);
}

void InputStream::readBuffers(double countsToRead, double expectedBuffers)
{
    DataList delivered;
    {
        std::vector<void*> buffers; // the core's until read() returns
        unsigned long countRead = 0;
        coreInput().read(toUint64Saturated(countsToRead), buffers, countRead);
        delivered.buffers = std::move(buffers);
    }
    if (static_cast<double>(delivered.buffers.size()) != expectedBuffers) {
        throw std::runtime_error("The number of buffers read did not match the expected number.");
    }
    dataBuffers.buffers.swap(
        delivered.buffers); // needs no memory, with which the data would be lost
}

std::size_t InputStream::positionOf(int32_t bufferIndex) const
{
    const auto position = static_cast<std::size_t>(bufferIndex) - 1; // wraps below 1, to too large
    if (position >= dataBuffers.buffers.size() || dataBuffers.buffers[position] == nullptr) {
        throw std::runtime_error("Data buffer index: " + std::to_string(bufferIndex) +
                                 " not found.");
    }
    return position;
}

void InputStream::readBufferData(int32_t bufferIndex, int32_t fieldIndex,
                                 const std::string& fieldName, const std::string& typeName,
                                 int32_t capacity, void* destination) const
{
    const auto& buffer = *static_cast<const brenixplugin::PropertyMap*>(
        dataBuffers.buffers[positionOf(bufferIndex)]);
    auto field = buffer.begin();
    if (!fieldName.empty()) {
        field = buffer.find(fieldName);
        if (field == buffer.end()) {
            field = buffer.find(fieldName + std::to_string(fieldIndex));
        }
        if (field == buffer.end()) {
            throw std::runtime_error("Data buffer field: " + fieldName +
                                     " not found for index: " + std::to_string(fieldIndex));
        }
    } else if (buffer.empty()) {
        throw std::runtime_error("No data found in the data buffer.");
    }
    if (!copyPropertyValue(field->second, fieldName, typeName, capacity, destination)) {
        throw std::runtime_error("Data buffer field: " + fieldName +
                                 " is not a supported type: " + typeName);
    }
}

void InputStream::freeBuffer(int32_t bufferIndex)
{
    void* const buffer = std::exchange(dataBuffers.buffers[positionOf(bufferIndex)], nullptr);
    brenixplugin::OwnedDataBuffer released(static_cast<brenixplugin::PropertyMap*>(buffer));
}

} // namespace brenixcoder
