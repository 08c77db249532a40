#include "core/Thread.h"

#include "core/Log.h"
#include "core/ThreadPlatform.h"

#include <exception>

namespace LbCore {

static CLogger s_cLogger = CLogManager::getLogger("CThread");

CThread::CThread()
    : m_pcRunnable(this), m_hThread(nullptr), m_nThreadId(0), m_nState(STATE_IDLE), m_cStarted(0), m_cFinished(0),
      m_cStopHandshake(0), m_cObservers(&CObserver::execute)
{
}

CThread::CThread(CIRunnable& runnable)
    : m_pcRunnable(&runnable), m_hThread(nullptr), m_nThreadId(0), m_nState(STATE_IDLE), m_cStarted(0), m_cFinished(0),
      m_cStopHandshake(1), m_cObservers(&CObserver::execute)
{
}

CThread::~CThread()
{
    if (getState() != STATE_IDLE) {
        s_cLogger.warn("LbCore::CThread::~CThread") << "Thread has been not stopped safely";
        terminate();
    }
    if (m_hThread != nullptr && !ThreadPlatform::close(m_hThread)) {
        s_cLogger.error("LbCore::CThread::~CThread") << "Could not close the handle for thread " << m_hThread;
    }
}

int CThread::start()
{
    {
        CLock<CCriticalSection> lock(m_cStateLock);
        if (m_nState == STATE_RUNNING) {
            return RESULT_RUNNING;
        }
        if (m_nState == STATE_STOPPING) {
            return RESULT_STOPPING;
        }
        m_nState = STATE_RUNNING;
    }
    if (m_hThread != nullptr) {
        // A thread of an earlier start has ended; release it before making the next one.
        ThreadPlatform::close(m_hThread);
        m_hThread = nullptr;
    }
    // That thread's end signal is left over when join() found it idle; it must not end a
    // join() of the new thread.
    while (m_cFinished.wait(0)) { }
    void* handle = nullptr;
    std::uint32_t id = 0;
    if (!ThreadPlatform::create(&CThread::threadMain, this, handle, id)) {
        s_cLogger.error("LbCore::CThread::start") << "Could not start thread!";
        setState(STATE_IDLE);
        m_hThread = nullptr;
        return RESULT_NOT_CREATED;
    }
    m_hThread = handle;
    m_nThreadId = id;
    m_cStarted.wait();
    return RESULT_DONE;
}

int CThread::stop()
{
    {
        CLock<CCriticalSection> lock(m_cStateLock);
        if (m_nState == STATE_IDLE) {
            return RESULT_NOT_RUNNING;
        }
        if (m_nState == STATE_STOPPING) {
            return RESULT_STOPPING;
        }
        m_nState = STATE_STOPPING;
    }
    m_pcRunnable->cleanup();
    m_cStopHandshake.release(1);
    return RESULT_DONE;
}

int CThread::join(unsigned timeoutMs)
{
    if (getState() == STATE_IDLE) {
        return RESULT_DONE;
    }
    return m_cFinished.wait(timeoutMs) ? RESULT_DONE : RESULT_TIMEOUT;
}

int CThread::stopAndJoin(unsigned timeoutMs)
{
    int result = stop();
    if (result != RESULT_DONE) {
        return result;
    }
    return m_cFinished.wait(timeoutMs) ? RESULT_DONE : RESULT_TIMEOUT;
}

int CThread::getState() const
{
    CLock<CCriticalSection> lock(m_cStateLock);
    return m_nState;
}

void CThread::setState(int state)
{
    CLock<CCriticalSection> lock(m_cStateLock);
    m_nState = state;
}

bool CThread::attach(CObserver& observer)
{
    CLock<CCriticalSection> lock(m_cObserverLock);
    return m_cObservers.attach(observer);
}

bool CThread::detach(CObserver& observer)
{
    CLock<CCriticalSection> lock(m_cObserverLock);
    return m_cObservers.detach(observer);
}

unsigned CThread::threadMain(void* self)
{
    static_cast<CThread*>(self)->work();
    return 0;
}

// A hook that lets an exception escape ends the loop as if run() had returned false; the
// exception is logged at ERROR so that nothing is lost silently and the process goes on.
namespace {
template <class F> bool guarded(const char* hook, F call)
{
    try {
        return call();
    } catch (const std::exception& e) {
        s_cLogger.error("LbCore::CThread::work") << "Exception in " << hook << ": " << e.what();
    } catch (...) {
        s_cLogger.error("LbCore::CThread::work") << "Unknown exception in " << hook;
    }
    return false;
}
} // namespace

void CThread::work()
{
    bool initialised = guarded("init()", [this] { return m_pcRunnable->init(); });
    m_cStarted.release(1);
    if (initialised) {
        while (getState() == STATE_RUNNING && guarded("run()", [this] { return m_pcRunnable->run(); })) { }
    }
    if (getState() == STATE_STOPPING) {
        m_cStopHandshake.wait();
    }
    guarded("an end-of-thread observer", [this] {
        CLock<CCriticalSection> lock(m_cObserverLock);
        m_cObservers.notify(*this);
        return true;
    });
    setState(STATE_IDLE);
    m_cFinished.release(1);
}

} // namespace LbCore
