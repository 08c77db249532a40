// viLock / viUnlock: exclusive and shared locks per resource (keyed by the canonical resource
// name the passport's viParseRsrcEx gives, so that every spelling shares one lock), and the
// access check that operations changing a resource make before reaching the passport.
#include "visahost/RuntimeInternal.h"

namespace LbVisaHost {

namespace {
// Prefix of the access keys the runtime makes up for shared locks.
const char g_szKeyPrefix[] = "lbvisa-key-";
} // namespace

bool CRuntime::accessAllowed(const CSession& c) const
{
    auto it = m_mapRsrcLocks.find(c.m_strLockKey);
    if (it == m_mapRsrcLocks.end())
        return true;
    const SRsrcLock& s = it->second;
    if (s.m_nExclusive)
        return s.m_nExclusive == c.m_nHandle;
    return s.m_mapShared.empty() || s.m_mapShared.count(c.m_nHandle) > 0;
}

void CRuntime::releaseRsrcLocks(const CSession& c)
{
    auto it = m_mapRsrcLocks.find(c.m_strLockKey);
    if (it == m_mapRsrcLocks.end())
        return;
    if (it->second.m_nExclusive == c.m_nHandle) {
        it->second.m_nExclusive = 0;
        it->second.m_nExclusiveDepth = 0;
    }
    it->second.m_mapShared.erase(c.m_nHandle);
    if (it->second.m_nExclusive == 0 && it->second.m_mapShared.empty())
        m_mapRsrcLocks.erase(it);
    m_cvLocks.notify_all();
}

ViStatus CRuntime::lock(ViSession nVi, ViAccessMode nType, ViUInt32 nTimeout, ViConstKeyId szRequested,
                        ViChar szAccessKey[])
{
    LbCore::CMutexLock aGuard(g_aRuntimeMutex);
    ViStatus nStatus = VI_SUCCESS;
    PSession pc = openSession(nVi, VI_ERROR_NSUP_OPER, nStatus);
    if (!pc)
        return nStatus;
    if (nType != VI_EXCLUSIVE_LOCK && nType != VI_SHARED_LOCK)
        return VI_ERROR_INV_LOCK_TYPE;
    if (nType == VI_SHARED_LOCK && !szAccessKey)
        return VI_ERROR_INV_PARAMETER;
    const std::string& strKey = pc->m_strLockKey;
    // Entries exist only while a session holds a lock: lookups here never create one.
    auto itHeld = m_mapRsrcLocks.find(strKey);
    if (itHeld != m_mapRsrcLocks.end()) {
        SRsrcLock& s = itHeld->second;
        if (nType == VI_EXCLUSIVE_LOCK && s.m_nExclusive == nVi) {
            ++s.m_nExclusiveDepth;
            return VI_SUCCESS_NESTED_EXCLUSIVE;
        }
        if (nType == VI_SHARED_LOCK && s.m_mapShared.count(nVi)) {
            ++s.m_mapShared[nVi];
            copyText(szAccessKey, s.m_strSharedKey);
            return VI_SUCCESS_NESTED_SHARED;
        }
        if (nType == VI_SHARED_LOCK && szRequested && !s.m_strSharedKey.empty() && s.m_strSharedKey != szRequested)
            return VI_ERROR_INV_ACCESS_KEY;
    }
    auto fFree = [&]() REQUIRES(g_aRuntimeMutex) {
        auto it = m_mapRsrcLocks.find(strKey);
        if (it == m_mapRsrcLocks.end())
            return true;
        const SRsrcLock& t = it->second;
        if (t.m_nExclusive && t.m_nExclusive != nVi)
            return false;
        if (nType == VI_SHARED_LOCK)
            return t.m_strSharedKey.empty() || !szRequested || t.m_strSharedKey == szRequested;
        for (auto& sEntry : t.m_mapShared)
            if (sEntry.first != nVi)
                return false;
        return true;
    };
    bool bFree = waitUntil(m_cvLocks, nTimeout, [&]() REQUIRES(g_aRuntimeMutex) { return fFree() || pc->m_bClosing; });
    if (pc->m_bClosing)
        return VI_ERROR_INV_OBJECT;
    if (!bFree || !fFree())
        return VI_ERROR_TMO;
    SRsrcLock& t = m_mapRsrcLocks[strKey];
    if (nType == VI_EXCLUSIVE_LOCK) {
        t.m_nExclusive = nVi;
        t.m_nExclusiveDepth = 1;
        return VI_SUCCESS;
    }
    if (t.m_strSharedKey.empty())
        t.m_strSharedKey = szRequested ? std::string(szRequested) : g_szKeyPrefix + std::to_string(++m_nKeys);
    t.m_mapShared[nVi] = 1;
    copyText(szAccessKey, t.m_strSharedKey);
    return VI_SUCCESS;
}

ViStatus CRuntime::unlock(ViSession nVi)
{
    LbCore::CMutexLock aGuard(g_aRuntimeMutex);
    ViStatus nStatus = VI_SUCCESS;
    PSession pc = openSession(nVi, VI_ERROR_NSUP_OPER, nStatus);
    if (!pc)
        return nStatus;
    auto it = m_mapRsrcLocks.find(pc->m_strLockKey);
    if (it == m_mapRsrcLocks.end())
        return VI_ERROR_SESN_NLOCKED;
    SRsrcLock& s = it->second;
    if (s.m_nExclusive == nVi) {
        if (--s.m_nExclusiveDepth == 0)
            s.m_nExclusive = 0;
    } else if (s.m_mapShared.count(nVi)) {
        if (--s.m_mapShared[nVi] == 0)
            s.m_mapShared.erase(nVi);
    } else {
        return VI_ERROR_SESN_NLOCKED;
    }
    if (s.m_mapShared.empty())
        s.m_strSharedKey.clear();
    if (s.m_nExclusive == 0 && s.m_mapShared.empty())
        m_mapRsrcLocks.erase(it);
    m_cvLocks.notify_all();
    return VI_SUCCESS;
}

} // namespace LbVisaHost
