#include "core/Thread.h"

#include "core/Log.h"
#include "core/ThreadPlatform.h"

#include <algorithm>
#include <cerrno>
#include <new>
#include <pthread.h>
#include <unistd.h>

namespace LbCore {

static CLogger s_cLogger = CLogManager::getLogger("CThread");

namespace ThreadPlatform {

namespace {
// A worker's stack: the system's threads deliver events and log; none runs application code
// (VISA handlers run on the runtime's own thread). 256 KiB leaves ample room, also for the
// larger frames of sanitizer builds, where the platform default reserves 8 MiB per thread.
const std::size_t STACK_SIZE = 256 * 1024;

struct CStart {
    unsigned (*entry)(void*);
    void* argument;
};

void* trampoline(void* start)
{
    CStart copy = *static_cast<CStart*>(start);
    delete static_cast<CStart*>(start);
    copy.entry(copy.argument);
    return nullptr;
}
} // namespace

bool create(unsigned (*entry)(void*), void* argument, void*& handle, std::uint32_t& id)
{
    // Without memory for the start record no thread can be made: reported like any failed
    // creation, so start() returns to idle instead of throwing with the state left running.
    CStart* start = new (std::nothrow) CStart{entry, argument};
    if (start == nullptr) {
        return false;
    }
    pthread_t thread;
    pthread_attr_t attributes;
    bool initialised = pthread_attr_init(&attributes) == 0;
    long minimum = sysconf(_SC_THREAD_STACK_MIN);
    bool small = initialised &&
        pthread_attr_setstacksize(&attributes, std::max<std::size_t>(STACK_SIZE, minimum > 0 ? minimum : 0)) == 0;
    // A platform that refuses the small stack (for instance for a large static TLS block)
    // still gets its thread, with the default stack.
    int created = small ? pthread_create(&thread, &attributes, &trampoline, start) : EINVAL;
    if (created == EINVAL) {
        created = pthread_create(&thread, nullptr, &trampoline, start);
    }
    if (initialised) {
        pthread_attr_destroy(&attributes);
    }
    if (created != 0) {
        delete start;
        return false;
    }
    static_assert(sizeof(pthread_t) <= sizeof(void*), "pthread_t must fit a handle");
    handle = reinterpret_cast<void*>(thread);
    id = static_cast<std::uint32_t>(reinterpret_cast<std::uintptr_t>(handle));
    return true;
}

bool terminate(void*)
{
    return false;
}

bool close(void* handle)
{
    return pthread_join(reinterpret_cast<pthread_t>(handle), nullptr) == 0;
}

} // namespace ThreadPlatform

// POSIX has no safe forced termination, and letting the thread run on would leave it using
// a destroyed object. So the thread is stopped cooperatively (cleanup() wakes a blocked run())
// and waited for; this is logged at ERROR because the owner should have stopped it itself.
bool CThread::terminate()
{
    if (getState() == STATE_IDLE) {
        return false;
    }
    s_cLogger.error("LbCore::CThread::terminate")
        << "No forced termination on this platform; stopping the thread and waiting for its end";
    stop();
    m_cFinished.wait();
    return true;
}

} // namespace LbCore
