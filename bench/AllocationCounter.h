#ifndef LBBENCH_ALLOCATIONCOUNTER_H
#define LBBENCH_ALLOCATIONCOUNTER_H
// Counts every heap allocation of the process (malloc, calloc, realloc and therefore operator
// new), on every thread: an operation's count includes what the library callback thread and
// the event worker allocate on its behalf.
#include <cstdint>

namespace LbBench {

std::uint64_t allocationCount();

} // namespace LbBench

#endif
