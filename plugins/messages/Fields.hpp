// Fields in messages: from what they are in CBOR to property objects.
#ifndef BRENIX_PLUGINS_MESSAGES_FIELDS_HPP
#define BRENIX_PLUGINS_MESSAGES_FIELDS_HPP

#include "Item.hpp"

#include "brenixplugin/Property.hpp"

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <string_view>
#include <utility>

namespace messages
{

/// A field on its way from the message.
struct Field {
    std::string name;
    brenixplugin::OwnedProperty property;
    std::uint64_t elements;
};

/// Reads fields, each with its name before it. Its operations throw Malformed.
class FieldReader
{
public:
    /// `messageOwner` is empty, or where the message lies, which a large array is to keep.
    FieldReader(Items& messageItems, std::size_t mostOfArrays,
                std::shared_ptr<unsigned char> messageOwner)
        : items(messageItems), left(mostOfArrays), owner(std::move(messageOwner))
    {
    }

    /// Of the constants a single element is a scalar.
    Field read(bool ofConstants);

private:
    std::string textOf(const Item& item) const;
    void takeSize(std::uint64_t elements, std::size_t each);
    void readNumbers(Field& field, std::uint64_t tag);
    void readEach(Field& field, std::uint64_t count);
    template <typename T>
    void takeArray(Field& field, std::string_view bytes, bool isOfOtherOrder);
    template <typename T>
    T* placeOf(std::string_view bytes) const;
    template <typename T>
    void take(Field& field, std::unique_ptr<T[]> elements) const;

    Items& items;
    std::size_t left; ///< bytes that may still be taken for arrays
    const std::shared_ptr<unsigned char> owner;
    bool areConstants = false;
};

} // namespace messages

#endif
