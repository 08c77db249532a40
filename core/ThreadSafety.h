#ifndef LBCORE_THREADSAFETY_H
#define LBCORE_THREADSAFETY_H
// Lock annotations checked by Clang's -Wthread-safety (the `clang` preset); other compilers see
// nothing. GUARDED_BY names the lock a field needs, REQUIRES the lock a caller must hold.
// CMutex / CMutexLock: std::mutex and its scoped guard, annotated, for code that needs no
// recursion (std::mutex itself carries no annotations in libstdc++).
#include <mutex>

#if defined(__clang__)
#define LB_TS_ATTR(x) __attribute__((x))
#else
#define LB_TS_ATTR(x)
#endif

#define CAPABILITY(x) LB_TS_ATTR(capability(x))
#define SCOPED_CAPABILITY LB_TS_ATTR(scoped_lockable)
#define GUARDED_BY(x) LB_TS_ATTR(guarded_by(x))
#define PT_GUARDED_BY(x) LB_TS_ATTR(pt_guarded_by(x))
#define REQUIRES(...) LB_TS_ATTR(requires_capability(__VA_ARGS__))
#define EXCLUDES(...) LB_TS_ATTR(locks_excluded(__VA_ARGS__))
#define ACQUIRE(...) LB_TS_ATTR(acquire_capability(__VA_ARGS__))
#define RELEASE(...) LB_TS_ATTR(release_capability(__VA_ARGS__))
#define RETURN_CAPABILITY(x) LB_TS_ATTR(lock_returned(x))
#define NO_THREAD_SAFETY_ANALYSIS LB_TS_ATTR(no_thread_safety_analysis)

namespace LbCore {

class CAPABILITY("mutex") CMutex {
public:
    void lock() ACQUIRE() { m_aMutex.lock(); }
    void unlock() RELEASE() { m_aMutex.unlock(); }
    // For condition variables, which need the plain mutex.
    std::mutex& native() { return m_aMutex; }

private:
    std::mutex m_aMutex;
};

class SCOPED_CAPABILITY CMutexLock {
public:
    explicit CMutexLock(CMutex& mutex) ACQUIRE(mutex) : m_pcMutex(&mutex) { m_pcMutex->lock(); }
    ~CMutexLock() RELEASE() { m_pcMutex->unlock(); }
    CMutexLock(const CMutexLock&) = delete;
    CMutexLock& operator=(const CMutexLock&) = delete;

private:
    CMutex* m_pcMutex;
};

} // namespace LbCore

#endif
