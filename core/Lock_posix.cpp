#include "core/Lock.h"

#include "core/Log.h"

#include <pthread.h>

namespace LbCore {

static CLogger s_cLogger = CLogManager::getLogger("CCriticalSection");

static_assert(sizeof(pthread_mutex_t) <= 64, "lock storage too small");

static pthread_mutex_t* mutexOf(unsigned char* storage)
{
    return reinterpret_cast<pthread_mutex_t*>(storage);
}

CCriticalSection::CCriticalSection() : m_aSection(), m_nDepth(0)
{
    pthread_mutexattr_t attributes;
    pthread_mutexattr_init(&attributes);
    pthread_mutexattr_settype(&attributes, PTHREAD_MUTEX_RECURSIVE);
    pthread_mutex_init(new (m_aSection) pthread_mutex_t, &attributes);
    pthread_mutexattr_destroy(&attributes);
}

CCriticalSection::~CCriticalSection()
{
    if (m_nDepth.load() > 0) {
        s_cLogger.error("LbCore::CCriticalSection::~CCriticalSection")
            << "Deleting a critical section when it's still blocking";
    }
    pthread_mutex_destroy(mutexOf(m_aSection));
}

void CCriticalSection::enter()
{
    pthread_mutex_lock(mutexOf(m_aSection));
    ++m_nDepth;
}

void CCriticalSection::leave()
{
    --m_nDepth;
    pthread_mutex_unlock(mutexOf(m_aSection));
}

} // namespace LbCore
