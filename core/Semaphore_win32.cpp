#include "core/Semaphore.h"

#include "core/Log.h"

#include <stdexcept>
#include <windows.h>

namespace LbCore {

static CLogger s_cLogger = CLogManager::getLogger("CSemaphore");

CSemaphore::CSemaphore(unsigned initialCount) : m_aSemaphore(0)
{
    m_aSemaphore = CreateSemaphoreA(0, static_cast<LONG>(initialCount), static_cast<LONG>(MAX_COUNT), 0);
    if (m_aSemaphore == 0) {
        throw std::runtime_error("m_aSemaphore == 0");
    }
}

CSemaphore::~CSemaphore()
{
    if (!CloseHandle(m_aSemaphore)) {
        s_cLogger.error("LbCore::CSemaphore::~CSemaphore") << "::CloseHandle failed";
    }
}

bool CSemaphore::wait(unsigned timeoutMs)
{
    return WaitForSingleObject(m_aSemaphore, timeoutMs) == WAIT_OBJECT_0;
}

void CSemaphore::wait()
{
    wait(INFINITE_WAIT);
}

void CSemaphore::release(unsigned count)
{
    if (count > MAX_COUNT || !ReleaseSemaphore(m_aSemaphore, static_cast<LONG>(count), 0)) {
        throw std::runtime_error("::ReleaseSemaphore failed");
    }
}

} // namespace LbCore
