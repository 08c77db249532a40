#include "core/MemoryPool.h"

#include "core/Log.h"

#include <cstdlib>

namespace LbCore {

static CLogger s_cLogger = CLogManager::getLogger("CMemoryPool");

CMemoryPool& CMemoryPool::getInstance()
{
    static CMemoryPool s_cPool;
    return s_cPool;
}

void* CMemoryPool::allocate(std::size_t size, int, int, int)
{
    void* pointer = std::malloc(size == 0 ? 1 : size);
    if (pointer == nullptr) {
        s_cLogger.error("LbCore::CMemoryPool::allocate")
            << "Could not allocate " << static_cast<unsigned long long>(size) << " bytes";
    }
    return pointer;
}

void CMemoryPool::free(void* pointer)
{
    std::free(pointer);
}

void* CMemoryPool::CMemoryPoolManaged::operator new(std::size_t size)
{
    void* pointer = CMemoryPool::getInstance().allocate(size, 0, 0, 0);
    if (pointer == nullptr) {
        throw std::bad_alloc();
    }
    return pointer;
}

void* CMemoryPool::CMemoryPoolManaged::operator new(std::size_t size, const std::nothrow_t&) noexcept
{
    return CMemoryPool::getInstance().allocate(size, 0, 0, 0);
}

void CMemoryPool::CMemoryPoolManaged::operator delete(void* pointer) noexcept
{
    CMemoryPool::getInstance().free(pointer);
}

void CMemoryPool::CMemoryPoolManaged::operator delete(void* pointer, const std::nothrow_t&) noexcept
{
    CMemoryPool::getInstance().free(pointer);
}

} // namespace LbCore
