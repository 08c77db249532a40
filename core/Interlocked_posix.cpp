#include "core/Interlocked.h"

namespace LbCore {

std::int32_t interlockedCompareExchange(volatile std::int32_t* target, std::int32_t exchange, std::int32_t comparand)
{
    __atomic_compare_exchange_n(target, &comparand, exchange, false, __ATOMIC_SEQ_CST, __ATOMIC_SEQ_CST);
    return comparand;
}

} // namespace LbCore
