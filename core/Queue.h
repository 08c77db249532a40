#ifndef LBCORE_QUEUE_H
#define LBCORE_QUEUE_H
// CQueue<T>: a queue of owned pointers, oldest first, for any number of producers and
// consumers. push() waits up to its time-out for a free slot but appends in any case, so a
// producer is never refused and, with a 0 ms wait, never blocked. pop() returns 0 with an
// item, 1 when nothing arrived in time, 2 when interrupted; each interrupt() ends exactly one
// pop (a waiting one or the next), ahead of any queued item. Items left at destruction are
// deleted exactly once.
#include "core/Lock.h"
#include "core/MemoryPool.h"
#include "core/Semaphore.h"

#include <cstdint>
#include <deque>

namespace LbCore {

template <class T> class CQueue : public CMemoryPool::CMemoryPoolManaged {
public:
    enum EResult { RESULT_ITEM = 0, RESULT_TIMEOUT = 1, RESULT_INTERRUPTED = 2 };

    explicit CQueue(unsigned capacity) : m_cFree(capacity), m_cItems(0), m_nCount(0), m_nInterrupts(0) { }

    ~CQueue() override
    {
        T* item = nullptr;
        int result;
        while ((result = pop(item, 0)) != RESULT_TIMEOUT) {
            if (result == RESULT_ITEM) {
                delete item;
            }
        }
    }

    int push(T* item, unsigned timeoutMs)
    {
        m_cFree.wait(timeoutMs); // the outcome does not matter: the item is appended in any case
        {
            CLock<CCriticalSection> lock(m_cLock);
            ++m_nCount;
            m_cEntries.push_back(item);
        }
        m_cItems.release(1);
        return 0;
    }

    int pop(T*& item, unsigned timeoutMs)
    {
        if (!m_cItems.wait(timeoutMs)) {
            return RESULT_TIMEOUT;
        }
        {
            CLock<CCriticalSection> lock(m_cLock);
            if (m_nInterrupts > 0) {
                --m_nInterrupts;
                return RESULT_INTERRUPTED;
            }
            item = m_cEntries.front();
            m_cEntries.pop_front();
            --m_nCount;
        }
        m_cFree.release(1);
        return RESULT_ITEM;
    }

    int interrupt()
    {
        {
            CLock<CCriticalSection> lock(m_cLock);
            ++m_nInterrupts;
        }
        m_cItems.release(1);
        return 0;
    }

    std::uint64_t size() const
    {
        CLock<CCriticalSection> lock(m_cLock);
        return m_nCount;
    }

private:
    std::deque<T*> m_cEntries GUARDED_BY(m_cLock);
    mutable CCriticalSection m_cLock;
    CSemaphore m_cFree;
    CSemaphore m_cItems;
    std::uint64_t m_nCount GUARDED_BY(m_cLock);
    std::uint64_t m_nInterrupts GUARDED_BY(m_cLock);
};

} // namespace LbCore

#endif
