// The allocation functions of the test program, which fail when a test says so.

#include "scripted/ScriptedCore.hpp"

#include <cstdlib>
#include <new>

using scripted::failingAllocation;

// The array forms end here as well, except under a sanitizer that brings its own.
void* operator new(std::size_t size)
{
    void* const memory =
        failingAllocation > 0 && --failingAllocation == 0 ? nullptr : std::malloc(size);
    return memory != nullptr ? memory : throw std::bad_alloc();
}

void operator delete(void* memory) noexcept
{
    std::free(memory);
}

void operator delete(void* memory, std::size_t) noexcept
{
    std::free(memory);
}
