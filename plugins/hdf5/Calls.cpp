#include "Calls.hpp"

#include <array>
#include <cstdio>

namespace hdf5
{

std::string lastError()
{
    struct Text {
        std::array<char, 256> characters;
    } text{};
    H5Ewalk2(
        H5E_DEFAULT, H5E_WALK_UPWARD,
        [](unsigned /*level*/, const H5E_error2_t* error, void* result) -> herr_t {
            auto& [characters] = *static_cast<Text*>(result);
            std::snprintf(characters.data(), characters.size(), "%s",
                          error->desc == nullptr ? "" : error->desc);
            return 1; // the innermost is the first
        },
        &text);
    const std::string why = text.characters.data();
    return why.empty() ? "the HDF5 library does not say why" : why;
}

Object makeSpace(const std::vector<hsize_t>& extents, bool grows)
{
    std::vector<hsize_t> most = extents;
    if (grows) {
        most.front() = H5S_UNLIMITED;
    }
    return {extents.empty()
                ? H5Screate(H5S_SCALAR)
                : H5Screate_simple(static_cast<int>(extents.size()), extents.data(), most.data()),
            H5Sclose, "Could not describe data"};
}

Object makeTextType()
{
    Object type(H5Tcopy(H5T_C_S1), H5Tclose, "Could not describe a text");
    require(H5Tset_size(type, H5T_VARIABLE), "Could not describe a text");
    require(H5Tset_cset(type, H5T_CSET_UTF8), "Could not describe a text");
    return type;
}

} // namespace hdf5
