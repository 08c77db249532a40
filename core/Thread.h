#ifndef LBCORE_THREAD_H
#define LBCORE_THREAD_H
// CIRunnable: what a worker thread runs: init() once on the new thread (false skips the loop),
// run() again and again while the thread is running (false ends the loop), and cleanup(),
// called by stop() on the stopping thread to wake a run() that is blocked.
//
// CThread: one worker thread driving a runnable. start() returns only after init() has run on
// the new thread; stop() is cooperative and does not wait; join()/stopAndJoin() wait for the
// end. When the worker ends, the attached observers are called on it, in attachment order.
// Results: 0 done, 1 already running, 2 stopping, 3 not running, 4 could not be created,
// 6 the wait for the end timed out. On POSIX a worker reserves a 256 KiB stack (Windows: the
// default reservation).
#include "core/Command.h"
#include "core/Lock.h"
#include "core/MemoryPool.h"
#include "core/Semaphore.h"
#include "core/Subject.h"

#include <boost/noncopyable.hpp>
#include <cstdint>

namespace LbCore {

class CIRunnable {
public:
    virtual ~CIRunnable() { }
    virtual bool init() = 0;
    virtual bool run() = 0;
    virtual void cleanup() = 0;
};

class CThread : public CMemoryPool::CMemoryPoolManaged, private CIRunnable, private boost::noncopyable {
public:
    typedef CICommand<void(const CThread&), 0> CObserver;

    enum EState { STATE_IDLE = 0, STATE_RUNNING = 1, STATE_STOPPING = 2 };
    enum EResult {
        RESULT_DONE = 0,
        RESULT_RUNNING = 1,
        RESULT_STOPPING = 2,
        RESULT_NOT_RUNNING = 3,
        RESULT_NOT_CREATED = 4,
        RESULT_TIMEOUT = 6
    };

    CThread();
    explicit CThread(CIRunnable& runnable);
    ~CThread() override;

    int start();
    int stop();
    int join(unsigned timeoutMs);
    int stopAndJoin(unsigned timeoutMs);
    int getState() const;
    // Forced end, used only by the destructor. On POSIX there is no forced termination: the
    // thread is stopped cooperatively and waited for (see Thread_posix.cpp).
    bool terminate();

    bool attach(CObserver& observer);
    bool detach(CObserver& observer);

    // Entry of the new thread; the argument is the CThread.
    static unsigned threadMain(void* self);

private:
    bool init() override { return true; }
    bool run() override { return false; }
    void cleanup() override { }

    void work();
    void setState(int state);

    CIRunnable* m_pcRunnable;
    void* m_hThread;
    std::uint32_t m_nThreadId;
    int m_nState GUARDED_BY(m_cStateLock);
    CSemaphore m_cStarted;
    CSemaphore m_cFinished;
    CSemaphore m_cStopHandshake;
    CSubject<CObserver, void(const CThread&)> m_cObservers;
    mutable CCriticalSection m_cObserverLock;
    mutable CCriticalSection m_cStateLock;
};

} // namespace LbCore

#endif
