#include "Allocations.hpp"

#include <cstdlib>
#include <new>

thread_local std::size_t allocations = 0;

// NOLINTBEGIN(cppcoreguidelines-no-malloc): these are the allocation functions
// Not inline: GCC would see memory of operator new go to free.
[[gnu::noinline]] void* operator new(std::size_t size)
{
    ++allocations;
    void* const memory = std::malloc(size);
    return memory != nullptr ? memory : throw std::bad_alloc();
}

[[gnu::noinline]] void operator delete(void* memory) noexcept
{
    std::free(memory);
}

[[gnu::noinline]] void operator delete(void* memory, std::size_t /*size*/) noexcept
{
    std::free(memory);
}
// NOLINTEND(cppcoreguidelines-no-malloc)
