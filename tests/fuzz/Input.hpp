// What the fuzz targets share: the input, taken apart piece by piece, and their one check.
#ifndef BRENIXCODER_TESTS_FUZZ_INPUT_HPP
#define BRENIXCODER_TESTS_FUZZ_INPUT_HPP

#include <algorithm>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <string>

/// Ends the program when a property does not hold.
#define REQUIRE(condition)                                                                         \
    ((condition)                                                                                   \
         ? static_cast<void>(0)                                                                    \
         : (std::fprintf(stderr, "%s:%d: %s\n", __FILE__, __LINE__, #condition), std::abort()))

/// The input of a target. At its end it goes on with zeros and empty texts.
class Input
{
public:
    Input(const std::uint8_t* data, std::size_t size)
        : rest(reinterpret_cast<const char*>(data), size)
    {
    }

    unsigned int byte()
    {
        const std::string one = take(1);
        return one.empty() ? 0 : static_cast<unsigned char>(one[0]);
    }

    std::string take(std::size_t size)
    {
        const std::string taken = rest.substr(0, size);
        rest.erase(0, taken.size());
        return taken;
    }

    /// A byte for its length, and the text.
    std::string text() { return take(byte()); }

    std::string rest;
};

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size);

#endif
