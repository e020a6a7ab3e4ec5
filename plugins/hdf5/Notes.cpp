#include "Notes.hpp"

#include <algorithm>
#include <cstddef>
#include <iterator>
#include <optional>
#include <stdexcept>
#include <utility>

namespace hdf5
{

namespace
{

constexpr const char* rateName = "sample_rate";
constexpr const char* unitName = "unit";
constexpr const char* startName = "start";
constexpr const char* namesName = "names";
constexpr const char* originName = "origin";
constexpr std::string_view ownNames[] = {rateName, unitName, startName, namesName, originName};

bool isOwn(std::string_view name)
{
    return std::any_of(std::begin(ownNames), std::end(ownNames),
                       [&](std::string_view own) { return name == own; });
}

void put(hid_t dataset, const char* name, hid_t fileType, hid_t memoryType, const Object& space,
         const void* values)
{
    const std::string what = std::string("Could not write attribute ") + name;
    const Object attribute(H5Acreate2(dataset, name, fileType, space, H5P_DEFAULT, H5P_DEFAULT),
                           H5Aclose, what);
    require(H5Awrite(attribute, memoryType, values), what);
}

void putText(hid_t dataset, const char* name, const std::string& text)
{
    const Object type = makeTextType();
    const char* const value = text.c_str();
    put(dataset, name, type, type, makeSpace({}), &value);
}

/// One number; nothing when the attribute is none.
template <typename T>
std::optional<T> number(hid_t attribute, hid_t memoryType)
{
    const Object type(H5Aget_type(attribute), H5Tclose, "Could not read an attribute");
    const Object space(H5Aget_space(attribute), H5Sclose, "Could not read an attribute");
    const H5T_class_t kind = H5Tget_class(type);
    T value{};
    if ((kind != H5T_INTEGER && kind != H5T_FLOAT) || H5Sget_simple_extent_npoints(space) != 1 ||
        H5Aread(attribute, memoryType, &value) < 0) {
        return std::nullopt;
    }
    return value;
}

/// All texts of an attribute; none when it has others or cannot be read.
std::vector<std::string> texts(hid_t attribute)
{
    const Object type(H5Aget_type(attribute), H5Tclose, "Could not read an attribute");
    const Object space(H5Aget_space(attribute), H5Sclose, "Could not read an attribute");
    const hssize_t count = H5Sget_simple_extent_npoints(space);
    std::vector<std::string> result;
    if (H5Tget_class(type) != H5T_STRING || count <= 0) {
        return result;
    }
    if (H5Tis_variable_str(type) > 0) {
        std::vector<char*> values(static_cast<std::size_t>(count));
        if (H5Aread(attribute, type, values.data()) >= 0) {
            for (const char* value : values) {
                result.emplace_back(value == nullptr ? "" : value);
            }
            H5Dvlen_reclaim(type, space, H5P_DEFAULT, values.data());
        }
        return result;
    }
    const std::size_t size = H5Tget_size(type);
    std::string values(size * static_cast<std::size_t>(count), '\0');
    if (H5Aread(attribute, type, values.data()) >= 0) {
        for (std::size_t at = 0; at < values.size(); at += size) {
            const std::string value = values.substr(at, size);
            const char pad = H5Tget_strpad(type) == H5T_STR_SPACEPAD ? ' ' : '\0';
            result.push_back(pad == ' ' ? value.substr(0, value.find_last_not_of(pad) + 1)
                                        : value.substr(0, value.find(pad)));
        }
    }
    return result;
}

/// Splits at a mark, as often as is asked for, and leaves backslashes where they are.
std::vector<std::string> split(std::string_view text, char mark)
{
    std::vector<std::string> parts(1);
    for (std::size_t i = 0; i < text.size(); ++i) {
        if (text[i] == mark) {
            parts.emplace_back();
            continue;
        }
        parts.back() += text[i];
        if (text[i] == '\\' && i + 1 < text.size()) {
            parts.back() += text[++i];
        }
    }
    return parts;
}

std::string unescaped(std::string_view text)
{
    std::string result;
    for (std::size_t i = 0; i < text.size(); ++i) {
        i += text[i] == '\\' && i + 1 < text.size() ? 1U : 0U;
        result += text[i];
    }
    return result;
}

std::string escaped(std::string_view text)
{
    std::string result;
    for (const char letter : text) {
        if (letter == ',' || letter == '=' || letter == '\\') {
            result += '\\';
        }
        result += letter;
    }
    return result;
}

} // namespace

Object makeGapType()
{
    constexpr const char* what = "Could not describe gaps";
    Object type(H5Tcreate(H5T_COMPOUND, sizeof(Gap)), H5Tclose, what);
    require(H5Tinsert(type, "index", offsetof(Gap, index), H5T_NATIVE_UINT64), what);
    require(H5Tinsert(type, "time", offsetof(Gap, time), H5T_NATIVE_INT64), what);
    require(H5Tinsert(type, "lost", offsetof(Gap, lost), H5T_NATIVE_UINT64), what);
    return type;
}

void Notes::write(hid_t dataset) const
{
    put(dataset, startName, H5T_STD_I64LE, H5T_NATIVE_INT64, makeSpace({}), &start);
    if (rate > 0) {
        put(dataset, rateName, H5T_IEEE_F64LE, H5T_NATIVE_DOUBLE, makeSpace({}), &rate);
    }
    if (!unit.empty()) {
        putText(dataset, unitName, unit);
    }
    if (!names.empty()) {
        std::vector<const char*> values;
        for (const std::string& name : names) {
            values.push_back(name.c_str());
        }
        const Object type = makeTextType();
        put(dataset, namesName, type, type, makeSpace({values.size()}), values.data());
    }
    if (!origin.empty()) {
        putText(dataset, originName, origin);
    }
    for (const auto& [name, value] : others) {
        putText(dataset, name.c_str(), value);
    }
}

void Notes::writeStart(hid_t dataset, std::int64_t start)
{
    constexpr const char* what = "Could not write attribute start";
    const Object attribute(H5Aopen(dataset, startName, H5P_DEFAULT), H5Aclose, what);
    require(H5Awrite(attribute, H5T_NATIVE_INT64, &start), what);
}

void Notes::read(hid_t dataset)
{
    constexpr const char* what = "Could not read an attribute";
    H5O_info_t info{};
    require(H5Oget_info2(dataset, &info, H5O_INFO_NUM_ATTRS), what);
    for (hsize_t i = 0; i < info.num_attrs; ++i) {
        const Object attribute(
            H5Aopen_by_idx(dataset, ".", H5_INDEX_NAME, H5_ITER_INC, i, H5P_DEFAULT, H5P_DEFAULT),
            H5Aclose, what);
        std::string name(
            static_cast<std::size_t>(require(H5Aget_name(attribute, 0, nullptr), what)), '\0');
        require(H5Aget_name(attribute, name.size() + 1, name.data()), what);
        const std::vector<std::string> values = texts(attribute);
        if (name == rateName) {
            rate = number<double>(attribute, H5T_NATIVE_DOUBLE).value_or(0);
        } else if (name == startName) {
            start = number<std::int64_t>(attribute, H5T_NATIVE_INT64).value_or(0);
        } else if (name == namesName) {
            names = values;
        } else if (values.size() == 1) {
            (name == unitName ? unit : name == originName ? origin : others[name]) = values.front();
        }
    }
}

std::vector<std::string> parseNames(std::string_view list)
{
    std::vector<std::string> names;
    for (const std::string& part : split(list, ',')) {
        names.push_back(unescaped(part));
    }
    return names;
}

std::map<std::string, std::string> parseAttributes(std::string_view list)
{
    std::map<std::string, std::string> attributes;
    for (const std::string& part : split(list, ',')) {
        const std::string before = split(part, '=').front();
        const std::string name = unescaped(before);
        if (name.empty() || before.size() == part.size()) {
            throw std::invalid_argument("must be of the form name=value,name=value, not " +
                                        std::string(list));
        }
        if (isOwn(name)) {
            throw std::invalid_argument("has the name of an attribute with its own option: " +
                                        name);
        }
        if (!attributes.try_emplace(name, unescaped(part.substr(before.size() + 1))).second) {
            throw std::invalid_argument("has two of the name " + name);
        }
    }
    return attributes;
}

std::string formatNames(const std::vector<std::string>& names)
{
    std::string list;
    for (const std::string& name : names) {
        list.append(&name == &names.front() ? "" : ",").append(escaped(name));
    }
    return list;
}

std::string formatAttributes(const std::map<std::string, std::string>& attributes)
{
    std::string list;
    for (const auto& [name, value] : attributes) {
        list.append(list.empty() ? "" : ",")
            .append(escaped(name))
            .append("=")
            .append(escaped(value));
    }
    return list;
}

} // namespace hdf5
