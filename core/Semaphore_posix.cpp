#include "core/Semaphore.h"

#include "core/Log.h"

#include <cerrno>
#include <semaphore.h>
#include <stdexcept>
#include <time.h>

#if defined(__SANITIZE_THREAD__)
// sem_clockwait is not intercepted by ThreadSanitizer; tell it about the hand-off.
extern "C" void __tsan_acquire(void* address);
#define LB_TSAN_ACQUIRE(address) __tsan_acquire(address)
#else
#define LB_TSAN_ACQUIRE(address) ((void)0)
#endif

namespace LbCore {

static CLogger s_cLogger = CLogManager::getLogger("CSemaphore");

static sem_t* semOf(void* handle)
{
    return static_cast<sem_t*>(handle);
}

CSemaphore::CSemaphore(unsigned initialCount) : m_aSemaphore(nullptr)
{
    sem_t* semaphore = new sem_t;
    if (initialCount > MAX_COUNT || sem_init(semaphore, 0, initialCount) != 0) {
        delete semaphore;
        throw std::runtime_error("m_aSemaphore == 0");
    }
    m_aSemaphore = semaphore;
}

CSemaphore::~CSemaphore()
{
    if (sem_destroy(semOf(m_aSemaphore)) != 0) {
        s_cLogger.error("LbCore::CSemaphore::~CSemaphore") << "::CloseHandle failed";
    }
    delete semOf(m_aSemaphore);
}

bool CSemaphore::wait(unsigned timeoutMs)
{
    sem_t* semaphore = semOf(m_aSemaphore);
    int result;
    if (timeoutMs == INFINITE_WAIT) {
        while ((result = sem_wait(semaphore)) != 0 && errno == EINTR) { }
    } else if (timeoutMs == 0) {
        result = sem_trywait(semaphore);
    } else {
        struct timespec deadline;
        clock_gettime(CLOCK_MONOTONIC, &deadline);
        deadline.tv_sec += timeoutMs / 1000;
        deadline.tv_nsec += static_cast<long>(timeoutMs % 1000) * 1000000L;
        if (deadline.tv_nsec >= 1000000000L) {
            deadline.tv_sec += 1;
            deadline.tv_nsec -= 1000000000L;
        }
        while ((result = sem_clockwait(semaphore, CLOCK_MONOTONIC, &deadline)) != 0 && errno == EINTR) { }
        if (result == 0) {
            LB_TSAN_ACQUIRE(semaphore);
        }
    }
    return result == 0;
}

void CSemaphore::wait()
{
    wait(INFINITE_WAIT);
}

void CSemaphore::release(unsigned count)
{
    sem_t* semaphore = semOf(m_aSemaphore);
    int value = 0;
    // The same limit as a Win32 semaphore of maximum 0x7FFFFFFF: nothing is added past it.
    if (sem_getvalue(semaphore, &value) != 0 || count > MAX_COUNT ||
        static_cast<unsigned long long>(value < 0 ? 0 : value) + count > MAX_COUNT) {
        throw std::runtime_error("::ReleaseSemaphore failed");
    }
    for (unsigned i = 0; i < count; ++i) {
        if (sem_post(semaphore) != 0) {
            throw std::runtime_error("::ReleaseSemaphore failed");
        }
    }
}

} // namespace LbCore
