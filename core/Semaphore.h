#ifndef LBCORE_SEMAPHORE_H
#define LBCORE_SEMAPHORE_H
// CSemaphore: a counting semaphore (Win32 semaphore object; sem_t waiting on the monotonic
// clock on POSIX, so a wall-clock jump never shortens or lengthens a time-out).
// The count never exceeds 0x7FFFFFFF: a release past it throws "::ReleaseSemaphore failed".
// wait(ms) is true only when a count was taken; 0xFFFFFFFF waits without limit.
#include <boost/noncopyable.hpp>

namespace LbCore {

class CSemaphore : private boost::noncopyable {
public:
    static const unsigned INFINITE_WAIT = 0xFFFFFFFFu;
    static const unsigned MAX_COUNT = 0x7FFFFFFFu;

    explicit CSemaphore(unsigned initialCount);
    // A failed close is logged at ERROR: a destructor must never throw.
    virtual ~CSemaphore();

    bool wait(unsigned timeoutMs);
    void wait();
    void release(unsigned count);

private:
    void* m_aSemaphore; // HANDLE on Windows, sem_t* on POSIX
};

} // namespace LbCore

#endif
