// From a message to its bytes.

#include "Arrays.hpp"
#include "Message.hpp"
#include "Output.hpp"
#include "Texts.hpp"

#include "brenixcore/plugin/Visit.hpp"

#include <cbor.h>

#include <algorithm>
#include <array>
#include <cstring>
#include <string_view>

namespace messages
{

namespace
{

using namespace brenixplugin::kit;
using brenixcore::plugin::visitProperty;

/// How many elements a field has, and whether it is one value that describes the packet.
struct Shape {
    std::uint64_t elements = 0;
    bool isScalar = false;

    template <typename T>
    void operator()(const coderconverter::TPointerProperty<T>& array)
    {
        elements = array.count;
    }
    template <typename T>
    void operator()(const device::TVectorProperty<T>& vector)
    {
        elements = vector.values.size();
    }
    template <typename T>
    void operator()(const device::TScalarProperty<T>& /*one*/)
    {
        elements = 1;
        isScalar = std::is_arithmetic_v<T>;
    }
};

/// Writes some of the elements of a field.
struct Elements {
    Output& output;
    std::size_t begin;
    std::size_t count;

    template <typename T>
    void operator()(const coderconverter::TPointerProperty<T>& array) const
    {
        if constexpr (std::is_same_v<T, bool>) { // a caller's may be neither 0 nor 1
            each(reinterpret_cast<const unsigned char*>(array.data));
        } else {
            several(array.data);
        }
    }
    template <typename T>
    void operator()(const device::TVectorProperty<T>& vector) const
    {
        if constexpr (std::is_same_v<T, bool>) {
            each(vector.values.begin());
        } else {
            several(vector.values.data());
        }
    }
    template <typename T>
    void operator()(const device::TScalarProperty<T>& scalar) const
    {
        if constexpr (std::is_same_v<T, bool>) {
            each(&scalar.value);
        } else if constexpr (std::is_arithmetic_v<T>) {
            several(&scalar.value);
        } else {
            output.text(scalar.value);
        }
    }

private:
    template <typename T>
    void several(const T* elements) const
    {
        if constexpr (std::is_arithmetic_v<T>) {
            output.put(cbor_encode_tag, arrayTag<T>());
            output.array(elements + begin, count * sizeof(T));
        } else {
            output.put(cbor_encode_array_start, count);
            std::for_each_n(elements + begin, count, [&](const T& text) { output.text(text); });
        }
    }

    template <typename Flag>
    void each(Flag flags) const
    {
        output.put(cbor_encode_array_start, count);
        output.flags(flags + static_cast<std::ptrdiff_t>(begin), count);
    }
};

/// @throws Malformed for a field of no class that a packet may have
Shape shapeOf(const std::string& name, void* property)
{
    Shape shape;
    if (!visitProperty(brenixplugin::asProperty(property), shape)) {
        throw Malformed("Field " + name + " cannot be sent: its type is not known.");
    }
    return shape;
}

/// One message, its entries in the order of docs/messages.md.
class Writer
{
public:
    explicit Writer(unsigned char* place) : output(place) {}

    std::size_t getSize() const { return output.getSize(); }

    void operator()(const Hello& hello)
    {
        begin(hello.stream, hello.seq, 5);
        entry("first", hello.first);
        output.name("hello");
        output.put(cbor_encode_map_start, std::size_t{4});
        entry("name", hello.name);
        entry("unit", hello.unit);
        output.name("rate");
        output.put(cbor_encode_double, hello.rate);
        output.name("options");
        output.put(cbor_encode_map_start, hello.options.size());
        for (const auto& [name, value] : hello.options) {
            entry(name, value);
        }
    }

    void operator()(const Data& data)
    {
        std::size_t fields = 0;
        std::size_t constants = 0;
        bool mayBeLarge = false;
        for (const auto& [name, property] : *data.packet.fields) {
            if (!hasLengthOfName(name) || !isUtf8(name)) {
                throw Malformed("Field " + name +
                                " cannot be sent: its name is not UTF-8 of 1 to " +
                                std::to_string(maxName) + " bytes.");
            }
            const Shape shape = shapeOf(name, property);
            mayBeLarge = mayBeLarge || shape.elements >= largeArray / sizeof(double);
            ++(isDivided(data, shape) ? fields : constants);
        }
        Writer ahead(nullptr);
        if (mayBeLarge) {
            ahead.writeFields(data, fields, constants);
        }
        const std::size_t large = ahead.output.getLarge();
        begin(data.stream, data.seq,
              std::size_t{8} + (constants > 0 ? 1 : 0) + (large > 0 ? 1 : 0));
        entry("first", data.first);
        entry("counts", data.counts);
        output.name("time");
        const std::int64_t time = data.packet.time;
        const auto magnitude = static_cast<std::uint64_t>(time < 0 ? -1 - time : time);
        output.put(time < 0 ? cbor_encode_negint : cbor_encode_uint, magnitude);
        entry("lost", data.packet.lost);
        if (large > 0) {
            pad(large);
        }
        writeFields(data, fields, constants);
    }

    void operator()(const End& end)
    {
        begin(end.stream, end.seq, 4);
        entry("end", end.counts);
    }

private:
    /// Whether the elements go with the counts.
    static bool isDivided(const Data& data, const Shape& shape)
    {
        return !shape.isScalar && shape.elements > 0 && shape.elements % data.packet.counts == 0;
    }

    void writeFields(const Data& data, std::size_t fields, std::size_t constants)
    {
        output.name("fields");
        writeMap(data, fields, true);
        if (constants > 0) {
            output.name("constants");
            writeMap(data, constants, false);
        }
    }

    /// So many bytes that what lies so far behind them begins at a multiple of 8.
    void pad(std::size_t distance)
    {
        constexpr std::array<unsigned char, 7> zeros{};
        output.name("pad");
        const std::size_t head = 1;
        const std::size_t length = (8 - (output.getSize() + head + distance) % 8) % 8;
        output.put(cbor_encode_bytestring_start, length);
        output.copy(zeros.data(), length);
    }

    /// The fields that are divided, or the others.
    void writeMap(const Data& data, std::size_t size, bool divided)
    {
        output.put(cbor_encode_map_start, size);
        for (const auto& [name, property] : *data.packet.fields) {
            const Shape shape = shapeOf(name, property);
            if (isDivided(data, shape) == divided) {
                const std::uint64_t each = divided ? shape.elements / data.packet.counts : 0;
                output.name(name);
                visitProperty(brenixplugin::asProperty(property),
                              Elements{output, each * data.begin,
                                       divided ? each * data.counts : shape.elements});
            }
        }
    }

    void begin(const std::string& stream, std::uint64_t seq, std::size_t entries)
    {
        output.put(cbor_encode_map_start, entries);
        entry("v", std::uint64_t{1});
        entry("stream", stream);
        entry("seq", seq);
    }

    void entry(std::string_view key, std::uint64_t value)
    {
        output.name(key);
        output.number(value);
    }
    void entry(std::string_view key, const std::string& value)
    {
        output.name(key);
        output.text(value);
    }

    Output output;
};

} // namespace

template <typename Kind>
std::size_t sizeOf(const Kind& message)
{
    Writer writer(nullptr);
    writer(message);
    return writer.getSize();
}

template <typename Kind>
void write(const Kind& message, unsigned char* bytes)
{
    Writer writer(bytes);
    writer(message);
}

template std::size_t sizeOf(const Hello& message);
template std::size_t sizeOf(const Data& message);
template std::size_t sizeOf(const End& message);
template void write(const Hello& message, unsigned char* bytes);
template void write(const Data& message, unsigned char* bytes);
template void write(const End& message, unsigned char* bytes);

} // namespace messages
