#include "core/Thread.h"

#include "core/ThreadPlatform.h"

#include <new>
#include <process.h>
#include <windows.h>

namespace LbCore {

namespace ThreadPlatform {

namespace {
struct CStart {
    unsigned (*entry)(void*);
    void* argument;
};

unsigned __stdcall trampoline(void* start)
{
    CStart copy = *static_cast<CStart*>(start);
    delete static_cast<CStart*>(start);
    return copy.entry(copy.argument);
}
} // namespace

bool create(unsigned (*entry)(void*), void* argument, void*& handle, std::uint32_t& id)
{
    // Without memory for the start record no thread can be made: reported like any failed
    // creation, so start() returns to idle instead of throwing with the state left running.
    CStart* start = new (std::nothrow) CStart{entry, argument};
    if (start == 0) {
        return false;
    }
    unsigned threadId = 0;
    uintptr_t result = _beginthreadex(0, 0, &trampoline, start, 0, &threadId);
    if (result == 0) {
        delete start;
        return false;
    }
    handle = reinterpret_cast<void*>(result);
    id = threadId;
    return true;
}

bool terminate(void* handle)
{
    return TerminateThread(static_cast<HANDLE>(handle), 0) != 0;
}

// Waits for the thread's very end first, as pthread_join does on POSIX: a thread that turned
// idle may still be releasing its end signal, so its object must not go away before that.
bool close(void* handle)
{
    if (GetThreadId(static_cast<HANDLE>(handle)) != GetCurrentThreadId()) {
        WaitForSingleObject(static_cast<HANDLE>(handle), INFINITE);
    }
    return CloseHandle(static_cast<HANDLE>(handle)) != 0;
}

} // namespace ThreadPlatform

bool CThread::terminate()
{
    if (getState() == STATE_IDLE) {
        return false;
    }
    bool ended = ThreadPlatform::terminate(m_hThread);
    if (ended) {
        setState(STATE_IDLE);
    }
    m_cFinished.release(1);
    return ended;
}

} // namespace LbCore
