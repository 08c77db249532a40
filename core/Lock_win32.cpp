#include "core/Lock.h"

#include "core/Log.h"

#include <cstring>
#include <windows.h>

namespace LbCore {

static CLogger s_cLogger = CLogManager::getLogger("CCriticalSection");

static_assert(sizeof(CRITICAL_SECTION) <= 64, "lock storage too small");

static CRITICAL_SECTION* sectionOf(unsigned char* storage)
{
    return reinterpret_cast<CRITICAL_SECTION*>(storage);
}

CCriticalSection::CCriticalSection() : m_aSection(), m_nDepth(0)
{
    std::memset(m_aSection, 0, sizeof m_aSection);
    InitializeCriticalSection(sectionOf(m_aSection));
}

CCriticalSection::~CCriticalSection()
{
    if (m_nDepth.load() > 0) {
        s_cLogger.error("LbCore::CCriticalSection::~CCriticalSection")
            << "Deleting a critical section when it's still blocking";
    }
    DeleteCriticalSection(sectionOf(m_aSection));
}

void CCriticalSection::enter()
{
    EnterCriticalSection(sectionOf(m_aSection));
    ++m_nDepth;
}

void CCriticalSection::leave()
{
    --m_nDepth;
    LeaveCriticalSection(sectionOf(m_aSection));
}

} // namespace LbCore
