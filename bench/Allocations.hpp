// Counts what a program and its libraries allocate.
#ifndef BRENIXCODER_BENCH_ALLOCATIONS_HPP
#define BRENIXCODER_BENCH_ALLOCATIONS_HPP

#include <cstddef>

extern thread_local std::size_t allocations; ///< calls of operator new so far, of this thread

#endif
