// Calls of the HDF5 library: what they return is owned, and what they fail with is an exception.
#ifndef BRENIX_PLUGINS_HDF5_CALLS_HPP
#define BRENIX_PLUGINS_HDF5_CALLS_HPP

#include <hdf5.h>

#include <stdexcept>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace hdf5
{

/// Keeps the library from printing errors on this thread, which is what it does by itself.
class Quiet
{
public:
    Quiet()
    {
        H5Eget_auto2(H5E_DEFAULT, &print, &data);
        H5Eset_auto2(H5E_DEFAULT, nullptr, nullptr);
    }
    Quiet(const Quiet&) = delete;
    Quiet& operator=(const Quiet&) = delete;
    ~Quiet() { H5Eset_auto2(H5E_DEFAULT, print, data); }

private:
    H5E_auto2_t print = nullptr;
    void* data = nullptr;
};

/// Why the last call on this thread failed: what the library's innermost function said.
std::string lastError();

/// Returns what a call returned, or throws "What: why it failed".
template <typename Result>
Result require(Result result, std::string_view what)
{
    if (result < 0) {
        throw std::runtime_error(std::string(what) + ": " + lastError());
    }
    return result;
}

/// An object of the library.
class Object
{
public:
    using Close = herr_t (*)(hid_t);

    Object() = default;
    /// Takes over what a call returned, or throws as above.
    Object(hid_t opened, Close closes, std::string_view what)
        : id(require(opened, what)), close(closes)
    {
    }
    Object(Object&& other) noexcept
        : id(std::exchange(other.id, H5I_INVALID_HID)), close(other.close)
    {
    }
    Object& operator=(Object&& other) noexcept
    {
        std::swap(id, other.id);
        std::swap(close, other.close);
        return *this;
    }
    ~Object() { reset(); }

    operator hid_t() const { return id; } // NOLINT(google-explicit-constructor)

    /// Closes it, if it is open. Returns less than 0 when that failed.
    herr_t reset() { return id < 0 ? 0 : close(std::exchange(id, H5I_INVALID_HID)); }

private:
    hid_t id = H5I_INVALID_HID;
    Close close = nullptr;
};

/// A space of these extents, each of which may grow where it is told to; a single value without extents.
Object makeSpace(const std::vector<hsize_t>& extents, bool grows = false);

/// The type of a text of any length, in UTF-8.
Object makeTextType();

} // namespace hdf5

#endif
