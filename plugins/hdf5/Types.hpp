// Element types and those of the library.
#ifndef BRENIX_PLUGINS_HDF5_TYPES_HPP
#define BRENIX_PLUGINS_HDF5_TYPES_HPP

#include "Calls.hpp"
#include "ElementTypes.hpp"

#include <algorithm>
#include <string>

namespace hdf5
{

/// Of elements in memory.
inline hid_t nativeType(const bytes::ElementType& type)
{
    const bool isSigned = type.name.front() == 'i';
    switch (type.size) {
    case 1:
        return isSigned ? H5T_NATIVE_INT8 : H5T_NATIVE_UINT8;
    case 2:
        return isSigned ? H5T_NATIVE_INT16 : H5T_NATIVE_UINT16;
    case 4:
        return type.name == "float" ? H5T_NATIVE_FLOAT
               : isSigned           ? H5T_NATIVE_INT32
                                    : H5T_NATIVE_UINT32;
    default:
        return type.name == "double" ? H5T_NATIVE_DOUBLE
               : isSigned            ? H5T_NATIVE_INT64
                                     : H5T_NATIVE_UINT64;
    }
}

/// That holds all values of a type in a file; null when there is none.
inline const bytes::ElementType* elementTypeFor(hid_t fileType)
{
    const H5T_class_t kind = H5Tget_class(fileType);
    const std::size_t size = H5Tget_size(fileType);
    std::string name;
    if (kind == H5T_FLOAT) {
        name = size <= sizeof(float) ? "float" : size == sizeof(double) ? "double" : "";
    } else if (kind == H5T_INTEGER) {
        name = (H5Tget_sign(fileType) == H5T_SGN_NONE ? "uint" : "int") + std::to_string(size * 8);
    }
    const auto* const found =
        std::find_if(bytes::elementTypes.begin(), bytes::elementTypes.end(),
                     [&](const bytes::ElementType& type) { return type.name == name; });
    return found == bytes::elementTypes.end() ? nullptr : found;
}

} // namespace hdf5

#endif
