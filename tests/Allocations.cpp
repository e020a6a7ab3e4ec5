#include "Allocations.hpp"

#include <cstdlib>
#include <new>

using namespace allocations;

static bool fails()
{
    std::atomic<long>& next = isHere ? failingHere : failingElsewhere;
    if (isExempt || next == 0 || --next > 0) {
        return false;
    }
    next = lasting ? 1 : 0;
    ++failed;
    return true;
}

// Not inline: GCC would see memory of operator new go to free.
[[gnu::noinline]] void* operator new(std::size_t size)
{
    void* const memory = fails() ? nullptr : std::malloc(size);
    if (memory == nullptr) {
        throw std::bad_alloc();
    }
    ++live;
    return memory;
}

[[gnu::noinline]] void operator delete(void* memory) noexcept
{
    live -= memory != nullptr;
    std::free(memory);
}

[[gnu::noinline]] void operator delete(void* memory, std::size_t) noexcept
{
    operator delete(memory);
}

// A sanitizer would bring its own.
[[gnu::noinline]] void* operator new[](std::size_t size)
{
    return operator new(size);
}

[[gnu::noinline]] void operator delete[](void* memory) noexcept
{
    operator delete(memory);
}

[[gnu::noinline]] void operator delete[](void* memory, std::size_t) noexcept
{
    operator delete(memory);
}
