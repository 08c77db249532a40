#ifndef LBCORE_LOCK_H
#define LBCORE_LOCK_H
// CCriticalSection: a recursive lock (a Win32 critical section, a recursive pthread mutex on
// POSIX). The owning thread may enter again; each enter needs its own leave. Destroying a
// section that is still held logs an ERROR and destroys it anyway.
// CLock<CCriticalSection>: scoped guard, enters at construction, leaves at destruction.
#include <atomic>
#include <boost/noncopyable.hpp>
#include "core/ThreadSafety.h"

namespace LbCore {

class CAPABILITY("critical section") CCriticalSection : private boost::noncopyable {
public:
    CCriticalSection();
    ~CCriticalSection();
    void enter() ACQUIRE();
    void leave() RELEASE();

private:
    // Storage for the platform lock object, so this header needs no platform header.
    alignas(16) unsigned char m_aSection[64];
    std::atomic<int> m_nDepth; // enters not yet left, to detect destruction while held
};

template <class T> class SCOPED_CAPABILITY CLock : private boost::noncopyable {
public:
    explicit CLock(T& section) ACQUIRE(section) : m_pcSection(&section) { m_pcSection->enter(); }
    virtual ~CLock() RELEASE() { m_pcSection->leave(); }

private:
    T* m_pcSection;
};

} // namespace LbCore

#endif
