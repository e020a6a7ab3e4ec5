/// @file
/// The property objects in which typed values travel between the library, the core and the
/// plug-ins.
///
/// Every value is one heap object derived from IPropertyInfo. A receiver finds out what it holds
/// with a dynamic_cast to one exact class below and reads the fields in place. Namespaces, class
/// names, template arguments, field order and slot order are shared by all modules of a process:
/// change none of them. The header needs C++17 and nothing to link: each module instantiates what
/// it uses.
///
/// Element types T are spelled exactly so, because type identity follows from the spelling:
/// double, float, unsigned long, long, unsigned int, int, unsigned short, short, unsigned char,
/// signed char, bool, and for text std::u16string or std::string.
#ifndef BRENIXPLUGIN_PROPERTY_HPP
#define BRENIXPLUGIN_PROPERTY_HPP

#include <cstdint>
#include <map>
#include <memory>
#include <string>
#include <utility>
#include <vector>

/// Classes that pass between the modules of a process.
#define BRENIXPLUGIN_SHARED __attribute__((visibility("default")))

namespace brenixplugin
{

namespace interfaces
{

/// What every property object can do, whatever its value.
class BRENIXPLUGIN_SHARED IPropertyInfo
{
public:
    /// The property's name, NUL-terminated, never null; valid while the object lives.
    virtual const char* getName() const = 0;

    /// Releases the object. The last holder calls it, once; nobody deletes a property object
    /// in another way, so that the module that made it frees it.
    virtual void destroy() = 0;

    virtual ~IPropertyInfo() = default;
};

} // namespace interfaces

namespace kit
{

namespace device
{

/// One value of type T.
template <typename T>
class BRENIXPLUGIN_SHARED TScalarProperty : public interfaces::IPropertyInfo
{
public:
    /// Moves both in.
    TScalarProperty(std::string propertyName, T propertyValue)
        : name(std::move(propertyName)), value(std::move(propertyValue))
    {
    }
    TScalarProperty(const TScalarProperty&) = delete;
    TScalarProperty& operator=(const TScalarProperty&) = delete;
    ~TScalarProperty() override = default;

    const char* getName() const override { return name.c_str(); }
    void destroy() override { delete this; }

    std::string name; ///< what getName() returns
    T value;          ///< the value
};

/// A sequence of T. For bool the vector is the packed one, a bit per element.
template <typename T>
class BRENIXPLUGIN_SHARED TVectorProperty : public interfaces::IPropertyInfo
{
public:
    /// Starts with `count` zero-valued elements, which the maker overwrites.
    TVectorProperty(std::string propertyName, std::uint64_t count)
        : name(std::move(propertyName)), values(count)
    {
    }
    TVectorProperty(const TVectorProperty&) = delete;
    TVectorProperty& operator=(const TVectorProperty&) = delete;
    ~TVectorProperty() override = default;

    const char* getName() const override { return name.c_str(); }
    void destroy() override { delete this; }

    std::string name;      ///< what getName() returns
    std::vector<T> values; ///< the elements
};

} // namespace device

namespace coderconverter
{

/// A sequence of T in a plain array that the object owns. Who is handed one may change the elements, and make `count`
/// less, but must not replace `data`: a derived class may keep the array in another way.
template <typename T>
class BRENIXPLUGIN_SHARED TPointerProperty : public interfaces::IPropertyInfo
{
public:
    /// Takes over `elements`, made with array new and holding `elementCount` elements (or null
    /// with a count of 0). Does not throw: on a failure before the call the array is still the
    /// caller's, after it the object's.
    // cppcheck-suppress passedByValue ; it is moved
    TPointerProperty(std::string propertyName, T* elements, std::uint64_t elementCount) noexcept
        : name(std::move(propertyName)), data(elements), count(elementCount)
    {
    }
    TPointerProperty(const TPointerProperty&) = delete;
    TPointerProperty& operator=(const TPointerProperty&) = delete;
    ~TPointerProperty() override { delete[] data; }

    const char* getName() const override { return name.c_str(); }
    void destroy() override { delete this; }

    std::string name;    ///< what getName() returns
    T* data;             ///< the elements, or null
    std::uint64_t count; ///< of the elements
};

} // namespace coderconverter
} // namespace kit

/// Property objects by name, each held as a pointer to its IPropertyInfo. The map itself owns
/// nothing: who releases the objects is stated wherever a map is passed.
using PropertyMap = std::map<std::string, void*>;

/// Releases a property object through destroy().
struct PropertyReleaser {
    /// Not null.
    void operator()(interfaces::IPropertyInfo* property) const noexcept { property->destroy(); }
};

/// A property object with one owner.
using OwnedProperty = std::unique_ptr<interfaces::IPropertyInfo, PropertyReleaser>;

/// The object behind a value of a property map; may be null.
inline interfaces::IPropertyInfo* asProperty(void* value) noexcept
{
    return static_cast<interfaces::IPropertyInfo*>(value);
}

/// Releases every object of the map in key order, skipping null ones. The entries stay and dangle:
/// for maps that end here or that the holder may only read.
inline void releaseProperties(const PropertyMap& properties) noexcept
{
    for (const auto& entry : properties) {
        OwnedProperty released(asProperty(entry.second));
    }
}

/// A property map whose objects belong to it.
struct OwnedPropertyMap {
    OwnedPropertyMap() = default;
    OwnedPropertyMap(const OwnedPropertyMap&) = delete;
    OwnedPropertyMap& operator=(const OwnedPropertyMap&) = delete;
    ~OwnedPropertyMap() { releaseProperties(map); }

    PropertyMap map; ///< null objects are allowed
};

/// Releases a data buffer with its objects.
struct DataBufferReleaser {
    /// Not null.
    void operator()(PropertyMap* buffer) const noexcept
    {
        releaseProperties(*buffer);
        delete buffer;
    }
};

/// A heap-allocated property map whose objects belong to it: a data buffer, fields by name.
using OwnedDataBuffer = std::unique_ptr<PropertyMap, DataBufferReleaser>;

/// Stores a property under a name of the map, which owns its objects; an object that was there is
/// released. When memory runs out, the property is released and the map stays as it was.
inline void storeProperty(PropertyMap& properties, const std::string& name, OwnedProperty property)
{
    void*& slot = properties[name];
    OwnedProperty replaced(asProperty(std::exchange(slot, property.release())));
}

} // namespace brenixplugin

#endif
