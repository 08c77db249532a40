#ifndef LBBENCH_ALLOCATIONCOUNTER_H
#define LBBENCH_ALLOCATIONCOUNTER_H
// Counts every heap allocation of the process (malloc, calloc, realloc and therefore operator
// new), on every thread: an operation's count includes what the library callback thread and
// the event worker allocate on its behalf. Context switches are counted the same way: a
// hand-off between threads costs at least one, so their number per operation tells how many
// hops it takes, whatever the machine's load.
#include <benchmark/benchmark.h>

#include <cstdint>

namespace LbBench {

std::uint64_t allocationCount();
// Context switches of the process so far, voluntary and forced, on all its threads.
std::uint64_t contextSwitchCount();

// Reports "allocs" and "switches" per iteration, counted from construction until report().
class COperationCounters {
public:
    COperationCounters() : m_nAllocations(allocationCount()), m_nSwitches(contextSwitchCount()) { }
    void report(benchmark::State& state) const
    {
        state.counters["allocs"] = benchmark::Counter(static_cast<double>(allocationCount() - m_nAllocations),
                                                      benchmark::Counter::kAvgIterations);
        state.counters["switches"] = benchmark::Counter(static_cast<double>(contextSwitchCount() - m_nSwitches),
                                                        benchmark::Counter::kAvgIterations);
    }

private:
    std::uint64_t m_nAllocations;
    std::uint64_t m_nSwitches;
};

} // namespace LbBench

#endif
