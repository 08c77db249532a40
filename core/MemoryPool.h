#ifndef LBCORE_MEMORYPOOL_H
#define LBCORE_MEMORYPOOL_H
// CMemoryPool: the single allocation point of the system's long-lived and frequently created
// objects. It forwards to the ordinary heap; it is a hook, not a pool with storage of its own.
// Every class derived from CMemoryPool::CMemoryPoolManaged is allocated and freed through it.
#include <cstddef>
#include <new>

namespace LbCore {

class CMemoryPool {
public:
    class CMemoryPoolManaged {
    public:
        virtual ~CMemoryPoolManaged() { }
        static void* operator new(std::size_t size);
        static void* operator new(std::size_t size, const std::nothrow_t&) noexcept;
        static void operator delete(void* pointer) noexcept;
        static void operator delete(void* pointer, const std::nothrow_t&) noexcept;
    };

    static CMemoryPool& getInstance();

    // The three further arguments are zero in the system and have no effect.
    void* allocate(std::size_t size, int reserved1 = 0, int reserved2 = 0, int reserved3 = 0);
    void free(void* pointer);

private:
    CMemoryPool() { }
};

} // namespace LbCore

#endif
