#ifndef BRENIXCODER_STREAMS_DATALIST_HPP
#define BRENIXCODER_STREAMS_DATALIST_HPP

#include "brenixplugin/Property.hpp"

#include <vector>

namespace brenixcoder
{

/// Releases each data buffer of the list with its objects; null elements are nothing.
inline void releaseDataList(const std::vector<void*>& dataList) noexcept
{
    for (void* buffer : dataList) {
        brenixplugin::OwnedDataBuffer released(static_cast<brenixplugin::PropertyMap*>(buffer));
    }
}

/// Data buffers in the form in which the core takes and delivers them, owned.
struct DataList {
    DataList() = default;
    DataList(const DataList&) = delete;
    DataList& operator=(const DataList&) = delete;
    ~DataList() { releaseDataList(buffers); }

    std::vector<void*> buffers;
};

} // namespace brenixcoder

#endif
