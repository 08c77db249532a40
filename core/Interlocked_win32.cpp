#include "core/Interlocked.h"

#include <windows.h>

namespace LbCore {

static_assert(sizeof(LONG) == sizeof(std::int32_t), "LONG is 32 bits on Windows");

std::int32_t interlockedCompareExchange(volatile std::int32_t* target, std::int32_t exchange, std::int32_t comparand)
{
    return InterlockedCompareExchange(reinterpret_cast<volatile LONG*>(target), exchange, comparand);
}

} // namespace LbCore
