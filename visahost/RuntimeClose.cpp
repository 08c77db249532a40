// viClose of every kind of object. Closing a session wakes its waiters, waits a while for the
// calls on it that other threads have in progress, lets the passport close it, drops its
// resource locks and its event contexts. Closing a resource manager closes what was opened
// through it.
#include "visahost/RuntimeInternal.h"

#include <algorithm>

namespace LbVisaHost {

namespace {
// How long viClose waits for calls in progress on other threads before it closes the session
// in the passport anyway: a read that waits without a time limit must not hold viClose
// forever, and the passport's viClose is what ends such a wait.
const ViUInt32 g_nCloseWaitMs = 1000;
} // namespace

void CRuntime::closeEvent(ViEvent nContext)
{
    PEventContext pc = as<CEventContext>(find(nContext), EKind::Event);
    if (!pc)
        return;
    if (PSession pcSession = findSession(pc->m_nSource)) {
        auto& dq = pcSession->m_dqQueue;
        dq.erase(std::remove(dq.begin(), dq.end(), nContext), dq.end());
    }
    erase(nContext);
}

ViStatus CRuntime::closeSession(const PSession& pc)
{
    FSessionOnly pf = nullptr;
    {
        LbCore::CMutexLock aGuard(g_aRuntimeMutex);
        if (pc->m_bClosing)
            return VI_ERROR_INV_OBJECT;
        pc->m_bClosing = true;
        pc->m_cvChanged.notify_all();
        unsigned nOwn = CInCall::count(pc->m_nHandle);
        waitUntil(pc->m_cvChanged, g_nCloseWaitMs, [&]() REQUIRES(g_aRuntimeMutex) { return pc->m_nCalls <= nOwn; });
        pf = reinterpret_cast<FSessionOnly>(operation(pc->m_pcTable, "viClose"));
    }
    ViStatus nStatus = pf ? pf(pc->m_nHandle) : VI_SUCCESS;
    LbCore::CMutexLock aGuard(g_aRuntimeMutex);
    releaseRsrcLocks(*pc);
    for (auto itObj = m_mapObjects.begin(); itObj != m_mapObjects.end();) {
        PEventContext pcEvent = as<CEventContext>(itObj->second, EKind::Event);
        if (pcEvent && pcEvent->m_nSource == pc->m_nHandle)
            itObj = m_mapObjects.erase(itObj);
        else
            ++itObj;
    }
    erase(pc->m_nHandle);
    return nStatus < 0 ? nStatus : VI_SUCCESS;
}

ViStatus CRuntime::close(ViObject nVi)
{
    if (nVi == VI_NULL)
        return VI_WARN_NULL_OBJECT;
    PObject pc;
    std::vector<PSession> vSessions;
    {
        LbCore::CMutexLock aGuard(g_aRuntimeMutex);
        pc = find(nVi);
        if (!pc)
            return VI_ERROR_INV_OBJECT;
        switch (pc->m_eKind) {
        case EKind::Event:
            closeEvent(nVi);
            return VI_SUCCESS;
        case EKind::FindList:
            erase(nVi);
            return VI_SUCCESS;
        case EKind::Session:
            break;
        case EKind::ResourceManager:
            // Closing a resource manager closes everything opened through it.
            for (auto& sEntry : m_mapObjects) {
                PSession pcSession = as<CSession>(sEntry.second, EKind::Session);
                if (pcSession && pcSession->m_nRm == nVi)
                    vSessions.push_back(pcSession);
            }
            break;
        }
    }
    if (pc->m_eKind == EKind::Session)
        return closeSession(std::static_pointer_cast<CSession>(pc));
    for (const PSession& pcSession : vSessions)
        closeSession(pcSession);
    LbCore::CMutexLock aGuard(g_aRuntimeMutex);
    for (auto it = m_mapObjects.begin(); it != m_mapObjects.end();) {
        PFindList pcList = as<CFindList>(it->second, EKind::FindList);
        if (pcList && pcList->m_nRm == nVi)
            it = m_mapObjects.erase(it);
        else
            ++it;
    }
    erase(nVi);
    return VI_SUCCESS;
}

} // namespace LbVisaHost
