// A core that returns at once: under it, what a call takes is what the library itself costs.
#ifndef BRENIXCODER_BENCH_NULLCORE_HPP
#define BRENIXCODER_BENCH_NULLCORE_HPP

#include "brenixcore/Channel.hpp"
#include "brenixplugin/Property.hpp"

#include <cstddef>
#include <memory>
#include <string>
#include <vector>

/// What the core answers with.
struct NullCore {
    std::size_t properties = 1;         ///< how many init() delivers: doubles "p0", "p1", ...
    std::vector<void*> stock;           ///< data buffers; read() of n counts hands over the last n
    std::vector<unsigned long> waiting; ///< what peekCounts() lists
    const double* lastElements = nullptr; ///< of the array that was made last
    bool fails = false;                   ///< whether flush() throws
    std::unique_ptr<brenixcore::InputStream> input;
    std::unique_ptr<brenixcore::OutputStream> output;
};

BRENIXCORE_API NullCore& nullCore();

/// "name12" for "name" and 12.
BRENIXCORE_API std::string numbered(const std::string& name, std::size_t number);

/// A data buffer of `fields` arrays "data0", "data1", ... of `elements` doubles each.
BRENIXCORE_API void* makeDataBuffer(std::size_t fields, std::size_t elements);

#endif
