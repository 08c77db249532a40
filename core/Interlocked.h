#ifndef LBCORE_INTERLOCKED_H
#define LBCORE_INTERLOCKED_H
// Interlocked compare-exchange of a 32-bit value: if *target equals comparand it becomes
// exchange; returns the value *target held before. Full barrier.
#include <cstdint>

namespace LbCore {

std::int32_t interlockedCompareExchange(volatile std::int32_t* target, std::int32_t exchange, std::int32_t comparand);

} // namespace LbCore

#endif
