// The values that a channel has: of its properties, and of the fields of its buffers.

#include "Channel.hpp"
#include "brenixcoder/coder.h"

#include <algorithm>
#include <cmath>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string_view>
#include <utility>

namespace brenix
{

namespace
{

/// What is there once for the whole buffer is there in each row.
void requireFixedNumber(Field& field, std::size_t rows)
{
    if (!field.type->isText && field.elements.size() == field.type->size && field.perCount < 2) {
        Bytes one = field.elements;
        std::int64_t first = 0;
        std::memcpy(&first, one.data(), std::min(one.size(), sizeof first));
        for (std::size_t row = 1; row < rows; ++row) {
            if (field.step > 0 && (first != 0 || field.name != "Time")) { // 0 is no time
                const std::int64_t value =
                    first + std::llround(static_cast<double>(row) * field.step);
                std::memcpy(one.data(), &value, one.size());
            }
            field.elements.insert(field.elements.end(), one.begin(), one.end());
        }
        field.isRepeated = field.isRepeated || rows > 1;
        field.perCount = 1;
    }
    if (field.type->isText || field.elements.size() != rows * field.perCount * field.type->size) {
        throw Failure("", "field " + field.name +
                              " has no fixed number of elements for each count" +
                              "; choose others with --field");
    }
}

} // namespace

/// Copies a value of which nobody tells how many elements it has: they are as many as the smallest
/// capacity that is enough. Returns false when there is no value of the type.
bool Channel::readAll(const ElementType& type, const Copy& copy, std::size_t guess, Bytes& elements)
{
    std::size_t enough = guess;
    elements.resize(enough * type.size);
    const auto last = elements.end() - static_cast<std::ptrdiff_t>(type.size);
    constexpr unsigned char mark = 0xA5;
    std::fill(last, elements.end(), mark);
    if (copy(guess, elements.data()) != 0 &&
        std::any_of(last, elements.end(), [](unsigned char byte) { return byte != mark; })) {
        return true; // mostly: not too small, and the last element was written
    }
    while (copy(enough, elements.data()) == 0) {
        if (std::string_view(lastError().what()).rfind("Property value: ", 0) != 0) {
            return false; // it is not that the capacity is too small
        }
        enough *= 2;
        elements.resize(enough * type.size);
    }
    std::size_t tooSmall = enough / 2;
    if (enough == guess) {
        tooSmall = copy(guess - 1, elements.data()) == 0 ? guess - 1 : 0;
    }
    while (enough - tooSmall > 1) {
        const std::size_t middle = tooSmall + (enough - tooSmall) / 2;
        (copy(middle, elements.data()) == 0 ? tooSmall : enough) = middle;
    }
    elements.resize(enough * type.size);
    return true;
}

std::optional<Bytes> Channel::property(const std::string& name, const ElementType& type)
{
    Bytes elements;
    const auto copy = [&](std::size_t capacity, void* destination) {
        return coderChannelGetPropertyValue(handle, name.c_str(), type.name,
                                            static_cast<int>(capacity), destination);
    };
    return readAll(type, copy, 1, elements) ? std::optional(elements) : std::nullopt;
}

std::optional<double> Channel::number(const std::string& name, const char* type)
{
    const auto value = property(name, elementType(type));
    return value ? std::optional(elementType(type).toDouble(value->data())) : std::nullopt;
}

Channel::Copy Channel::fieldCopier(const Field& field) const
{
    return [this, &field](std::size_t capacity, void* destination) {
        return coderInputStreamReadBufferData(input, 1, 0, field.name.c_str(), field.type->name,
                                              static_cast<int>(capacity), destination);
    };
}

std::optional<Field> Channel::findField(const std::string& name, double counts)
{
    Field field;
    field.name = name;
    const auto rows = static_cast<std::size_t>(counts);
    for (const ElementType& type : elementTypes()) {
        field.type = &type;
        if (readAll(type, fieldCopier(field), rows, field.elements)) {
            field.perCount = field.elements.size() / type.size / rows;
            requireFixedNumber(field, rows);
            return field;
        }
    }
    return std::nullopt;
}

/// For an error: what there is instead of a field.
std::string Channel::fieldsThere(double counts)
{
    std::string list;
    static_cast<void>(caught([&] {
        for (const Field& field : findFields({}, counts)) {
            list += field.name.empty() ? "" : (list.empty() ? "; it has " : ", ") + field.name;
        }
    }));
    return list;
}

std::vector<Field> Channel::findFields(const std::vector<std::string>& names, double counts)
{
    std::vector<Field> fields;
    const auto add = [&](const std::string& name) {
        auto field = findField(name, counts);
        if (!field) {
            return false;
        }
        fields.push_back(*std::move(field));
        return true;
    };
    const auto addAll = [&](const std::string& name) {
        const std::size_t mark = name.find('#');
        if (mark == std::string::npos) {
            add(name);
            return;
        }
        for (int number = 1; add(std::string(name).replace(mark, 1, std::to_string(number)));
             ++number) {
        }
    };
    for (const std::string& name : names) {
        if (!add(name)) {
            throw Failure("", "the data has no field " + name + fieldsThere(counts));
        }
    }
    if (names.empty()) {
        std::for_each(inputFields.begin(), inputFields.end(), addAll);
        for (const char* const guess : {"Data#", "data", ""}) {
            if (fields.empty()) {
                addAll(guess);
            }
        }
        if (fields.empty()) {
            throw Failure("", "the data has no field that can be read");
        }
    }
    return fields;
}

void Channel::readField(Field& field, double counts)
{
    const auto rows = static_cast<std::size_t>(counts);
    if (!readAll(*field.type, fieldCopier(field), rows * field.perCount, field.elements)) {
        throw lastError();
    }
    requireFixedNumber(field, rows);
}

} // namespace brenix
