#include "bench/AllocationCounter.h"

#include <atomic>
#include <cstddef>
#include <sys/resource.h>

// glibc's allocator under its own names: the process's malloc family is replaced by counting
// wrappers around it (glibc supports replacing malloc in the executable), so free() of glibc
// stays the right partner.
extern "C" {
void* __libc_malloc(std::size_t size);
void* __libc_calloc(std::size_t count, std::size_t size);
void* __libc_realloc(void* memory, std::size_t size);
}

namespace {
std::atomic<std::uint64_t> s_nAllocations(0);
}

extern "C" void* malloc(std::size_t size)
{
    s_nAllocations.fetch_add(1, std::memory_order_relaxed);
    return __libc_malloc(size);
}

extern "C" void* calloc(std::size_t count, std::size_t size)
{
    s_nAllocations.fetch_add(1, std::memory_order_relaxed);
    return __libc_calloc(count, size);
}

extern "C" void* realloc(void* memory, std::size_t size)
{
    s_nAllocations.fetch_add(1, std::memory_order_relaxed);
    return __libc_realloc(memory, size);
}

namespace LbBench {

std::uint64_t allocationCount()
{
    return s_nAllocations.load(std::memory_order_relaxed);
}

std::uint64_t contextSwitchCount()
{
    struct rusage usage;
    if (getrusage(RUSAGE_SELF, &usage) != 0) {
        return 0;
    }
    return static_cast<std::uint64_t>(usage.ru_nvcsw) + static_cast<std::uint64_t>(usage.ru_nivcsw);
}

} // namespace LbBench
