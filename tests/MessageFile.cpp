// Writes messages for messages.py, or reads those that it made and writes them anew. Before each stand the
// four bytes of its size, least first.

#include "brenixcore/plugin/Make.hpp"
#include "messages/Message.hpp"

#include <cstdint>
#include <cstdio>
#include <cstring>
#include <exception>
#include <iostream>
#include <iterator>
#include <limits>
#include <memory>
#include <string>
#include <variant>

namespace
{

using namespace messages;
using namespace brenixcore::plugin;

template <typename Kind>
void put(const Kind& message)
{
    std::string bytes(sizeOf(message), '\0');
    write(message, reinterpret_cast<unsigned char*>(bytes.data()));
    const auto size = static_cast<std::uint32_t>(bytes.size());
    std::cout.write(reinterpret_cast<const char*>(&size), sizeof size);
    std::cout << bytes;
}

/// The least of T, 0, 1 and the largest.
template <typename T>
void addNumbers(Packet& packet, const char* type)
{
    using Limits = std::numeric_limits<T>;
    setField(packet,
             makeArray(type,
                       std::unique_ptr<T[]>(new T[4]{Limits::lowest(), T(0), T(1), Limits::max()}),
                       4));
    setField(packet, makeScalar(std::string("one ") + type, Limits::max()));
}

void writeAll()
{
    put(Hello{"s/1", 0, 0, "Gerät", "µV", 1000, {{"Topic", "a"}}});
    Data data{"s/1", 0, 3, {}, 1, 2};
    data.packet.counts = 4;
    data.packet.time = -1700000000000000000;
    data.packet.lost = 3;
    addNumbers<double>(data.packet, "double");
    addNumbers<float>(data.packet, "float");
    addNumbers<signed char>(data.packet, "int8");
    addNumbers<short>(data.packet, "int16");
    addNumbers<int>(data.packet, "int32");
    addNumbers<long>(data.packet, "int64");
    addNumbers<unsigned char>(data.packet, "uint8");
    addNumbers<unsigned short>(data.packet, "uint16");
    addNumbers<unsigned int>(data.packet, "uint32");
    addNumbers<unsigned long>(data.packet, "uint64");
    setField(
        data.packet,
        makeArray("logical", std::unique_ptr<bool[]>(new bool[4]{true, false, true, true}), 4));
    setField(data.packet, makeScalar("one logical", true));
    setField(data.packet, makeScalar("char", std::u16string(u"µ€\U0001F600")));
    setField(data.packet,
             makeArray("texts",
                       std::unique_ptr<std::string[]>(new std::string[4]{"a", "µ", "", "\xE9"}),
                       4));
    put(data); // of each array the second and the third element
    put(End{"s/1", 1, 5});
}

void copyAll()
{
    const std::string all(std::istreambuf_iterator<char>(std::cin), {});
    std::uint32_t size = 0;
    for (std::size_t at = 0; at < all.size(); at += size) {
        std::memcpy(&size, all.data() + at, sizeof size);
        at += sizeof size;
        const auto* const bytes = reinterpret_cast<const unsigned char*>(all.data() + at);
        std::visit([](const auto& message) { put(message); }, read(bytes, size, 1U << 20U));
    }
}

} // namespace

int main(int argc, char** /*argv*/)
{
    try {
        argc == 1 ? writeAll() : copyAll();
        return 0;
    } catch (const std::exception& error) {
        std::fprintf(stderr, "%s\n", error.what());
        return 1;
    }
}
