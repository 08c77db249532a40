// Events: event contexts passports create and raise (services 51, 52), the application's
// viEnableEvent / viDisableEvent / viDiscardEvents / viWaitOnEvent, handler installation, and
// the runtime's handler thread, which calls handlers in the order events were raised.
#include "visahost/RuntimeInternal.h"

#include <algorithm>
#include <thread>

namespace LbVisaHost {

namespace {

bool validMechanism(ViUInt16 nMech, bool bForDisable)
{
    if (bForDisable && nMech == VI_ALL_MECH)
        return true;
    return nMech != 0 && (nMech & ~(VI_QUEUE | VI_HNDLR | VI_SUSPEND_HNDLR)) == 0;
}

// The mechanism and context an enable may name.
ViStatus enableArguments(ViUInt16 nMech, ViEventFilter nContext)
{
    if (!validMechanism(nMech, false))
        return VI_ERROR_INV_MECH;
    // Suspended handlers are not offered by this runtime.
    if (nMech & VI_SUSPEND_HNDLR)
        return VI_ERROR_NSUP_MECH;
    return nContext != VI_NULL ? VI_ERROR_INV_CONTEXT : VI_SUCCESS;
}

} // namespace

bool CRuntime::eventTypeKnown(const CSession& cSession, ViEventType nType) const
{
    // Every session can report failed operations and completed asynchronous jobs.
    return nType == VI_EVENT_IO_COMPLETION || nType == VI_EVENT_EXCEPTION || cSession.m_setDeclared.count(nType) > 0;
}

PSession CRuntime::eventSession(ViSession nVi, ViEventType nType, bool bAllTypes, ViStatus& nStatus) const
{
    PSession pc = openSession(nVi, VI_ERROR_INV_EVENT, nStatus);
    if (!pc)
        return nullptr;
    if ((bAllTypes && nType == VI_ALL_ENABLED_EVENTS) || eventTypeKnown(*pc, nType))
        return pc;
    nStatus = VI_ERROR_INV_EVENT;
    return nullptr;
}

ViStatus CRuntime::createEvent(ViSession nVi, ViEventType nType, ViEvent* pnContext, ViUInt32* pnMech)
{
    if (!pnContext || !pnMech)
        return VI_ERROR_INV_PARAMETER;
    {
        LbCore::CMutexLock aGuard(g_aRuntimeMutex);
        PSession pc = findSession(nVi);
        if (!pc || pc->m_bClosing)
            return VI_ERROR_INV_OBJECT;
        auto it = pc->m_mapEnabled.find(nType);
        *pnMech = it == pc->m_mapEnabled.end() ? 0 : (it->second & (VI_QUEUE | VI_HNDLR));
    }
    if (*pnMech == 0)
        return VI_ERROR_NENABLED;
    ViStatus nStatus = VI_SUCCESS;
    std::string strOper;
    if (nType == VI_EVENT_EXCEPTION) {
        // A passport raises exceptions for failures it sees on its own; the context names the
        // session's last failed operation, or VI_ERROR_IO without an operation when none failed.
        LbCore::CMutexLock aGuard(g_aRuntimeMutex);
        if (PSession pc = findSession(nVi)) {
            nStatus = pc->m_nLastError;
            strOper = pc->m_strLastErrorOp;
        }
    }
    auto pcEvent = std::make_shared<CEventContext>(nType, nVi, nStatus, strOper);
    publish(pcEvent);
    *pnContext = pcEvent->m_nHandle;
    return VI_SUCCESS;
}

ViStatus CRuntime::raiseEvent(ViSession nVi, ViEvent nContext, ViUInt32 nMech)
{
    ViEventType nType = 0;
    bool bHandlers = false;
    bool bQueued = false;
    ViStatus nResult = VI_SUCCESS;
    {
        LbCore::CMutexLock aGuard(g_aRuntimeMutex);
        PSession pc = findSession(nVi);
        if (!pc)
            return VI_ERROR_INV_OBJECT;
        PEventContext pcEvent = as<CEventContext>(find(nContext), EKind::Event);
        if (!pcEvent || pcEvent->m_nSource != nVi)
            return VI_ERROR_INV_CONTEXT;
        nType = pcEvent->m_nEventType;
        if (nMech & VI_HNDLR) {
            for (const SHandler& s : pc->m_vHandlers)
                bHandlers = bHandlers || s.m_nType == nType;
        }
        if ((nMech & VI_QUEUE) && !pc->m_bClosing) {
            if (pc->m_dqQueue.size() >= pc->m_nMaxQueue) {
                // A full queue keeps the events it holds; the new one is lost.
                nResult = VI_ERROR_QUEUE_OVERFLOW;
                pc->m_setOverflowed.insert(nType);
            } else {
                pc->m_dqQueue.push_back(nContext);
                pc->m_cvChanged.notify_all();
                bQueued = true;
            }
        }
        if (!bHandlers && !bQueued)
            erase(nContext);
    }
    if (bHandlers)
        postHandlers(SHandlerJob{nVi, nType, nContext, bQueued});
    return nResult;
}

void CRuntime::operationFailed(ViSession nVi, ViStatus nStatus, const char* szOp)
{
    ViUInt32 nMech = 0;
    {
        LbCore::CMutexLock aGuard(g_aRuntimeMutex);
        PSession pc = findSession(nVi);
        if (!pc)
            return;
        pc->m_nLastError = nStatus;
        pc->m_strLastErrorOp = szOp;
        auto it = pc->m_mapEnabled.find(VI_EVENT_EXCEPTION);
        if (pc->m_bClosing || it == pc->m_mapEnabled.end())
            return;
        nMech = it->second & (VI_QUEUE | VI_HNDLR);
    }
    if (nMech == 0)
        return;
    auto pcEvent = std::make_shared<CEventContext>(VI_EVENT_EXCEPTION, nVi, nStatus, szOp);
    publish(pcEvent);
    raiseEvent(nVi, pcEvent->m_nHandle, nMech);
}

void CRuntime::postHandlers(const SHandlerJob& sJob)
{
    LbCore::CMutexLock aGuard(m_aHandlerMutex);
    m_dqHandlerJobs.push_back(sJob);
    m_cvHandlerJobs.notify_one();
    if (!m_bHandlerThread) {
        // Lives as long as the runtime, which is never destroyed.
        m_bHandlerThread = true;
        std::thread([this] { runHandlers(); }).detach();
    }
}

void CRuntime::runHandlers()
{
    for (;;) {
        SHandlerJob sJob;
        {
            LbCore::CMutexLock aGuard(m_aHandlerMutex);
            std::unique_lock<std::mutex> aWait(m_aHandlerMutex.native(), std::adopt_lock);
            m_cvHandlerJobs.wait(aWait, [this]() REQUIRES(m_aHandlerMutex) { return !m_dqHandlerJobs.empty(); });
            aWait.release();
            sJob = m_dqHandlerJobs.front();
            m_dqHandlerJobs.pop_front();
        }
        // The handlers installed now, the most recently installed first.
        std::vector<SHandler> vHandlers;
        {
            LbCore::CMutexLock aGuard(g_aRuntimeMutex);
            PSession pc = findSession(sJob.m_nVi);
            if (pc && !pc->m_bClosing) {
                for (auto it = pc->m_vHandlers.rbegin(); it != pc->m_vHandlers.rend(); ++it)
                    if (it->m_nType == sJob.m_nType)
                        vHandlers.push_back(*it);
            }
        }
        for (const SHandler& sHandler : vHandlers)
            if (sHandler.m_pfHandler(sJob.m_nVi, sJob.m_nType, sJob.m_nContext, sHandler.m_pUser) == VI_SUCCESS_NCHAIN)
                break;
        if (!sJob.m_bQueued) {
            // Delivered to the handlers only: its context ends with them.
            LbCore::CMutexLock aGuard(g_aRuntimeMutex);
            if (find(sJob.m_nContext))
                erase(sJob.m_nContext);
        }
    }
}

ViStatus CRuntime::enableEvent(ViSession nVi, ViEventType nType, ViUInt16 nMech, ViEventFilter nContext)
{
    if (nType == VI_ALL_ENABLED_EVENTS)
        return enableEnabledEvents(nVi, nMech, nContext);
    bool bAsk = false;
    {
        LbCore::CMutexLock aGuard(g_aRuntimeMutex);
        ViStatus nStatus = VI_SUCCESS;
        PSession pc = eventSession(nVi, nType, false, nStatus);
        if (!pc)
            return nStatus;
        if ((nStatus = enableArguments(nMech, nContext)) != VI_SUCCESS)
            return nStatus;
        if (nMech & VI_HNDLR) {
            bool bInstalled = false;
            for (const SHandler& s : pc->m_vHandlers)
                bInstalled = bInstalled || s.m_nType == nType;
            if (!bInstalled)
                return VI_ERROR_HNDLR_NINSTALLED;
        }
        ViUInt16 nEnabled = pc->m_mapEnabled.count(nType) ? pc->m_mapEnabled[nType] : 0;
        // The passport hears only the first enable of a type, which starts its event source; an
        // enable of what is enabled, or of a further mechanism, is the runtime's own business.
        if ((nEnabled & nMech) == nMech)
            return VI_SUCCESS_EVENT_EN;
        bAsk = nEnabled == 0;
    }
    if (bAsk) {
        ViStatus nStatus = route<FEnableEvent>(nVi, "viEnableEvent", false, nType, nMech, nContext);
        if (nStatus < 0 && nStatus != VI_ERROR_NSUP_OPER)
            return nStatus;
    }
    LbCore::CMutexLock aGuard(g_aRuntimeMutex);
    PSession pc = findSession(nVi);
    if (!pc)
        return VI_ERROR_INV_OBJECT;
    ViUInt16 nEnabled = pc->m_mapEnabled.count(nType) ? pc->m_mapEnabled[nType] : 0;
    pc->m_mapEnabled[nType] = static_cast<ViUInt16>(nEnabled | nMech);
    pc->m_bQueueFixed = true;
    return (nEnabled & nMech) == nMech ? VI_SUCCESS_EVENT_EN : VI_SUCCESS;
}

// VI_ALL_ENABLED_EVENTS: every type the session has enabled is enabled for the mechanism too.
// VI_SUCCESS_EVENT_EN when each already was (or none is enabled).
ViStatus CRuntime::enableEnabledEvents(ViSession nVi, ViUInt16 nMech, ViEventFilter nContext)
{
    std::vector<ViEventType> vTypes;
    {
        LbCore::CMutexLock aGuard(g_aRuntimeMutex);
        ViStatus nStatus = VI_SUCCESS;
        PSession pc = eventSession(nVi, VI_ALL_ENABLED_EVENTS, true, nStatus);
        if (!pc)
            return nStatus;
        if ((nStatus = enableArguments(nMech, nContext)) != VI_SUCCESS)
            return nStatus;
        for (const auto& sEnabled : pc->m_mapEnabled)
            if (sEnabled.second != 0)
                vTypes.push_back(sEnabled.first);
    }
    ViStatus nResult = VI_SUCCESS_EVENT_EN;
    for (ViEventType nType : vTypes) {
        ViStatus nStatus = enableEvent(nVi, nType, nMech, nContext);
        if (nStatus < VI_SUCCESS)
            return nStatus;
        if (nStatus == VI_SUCCESS)
            nResult = VI_SUCCESS;
    }
    return nResult;
}

ViStatus CRuntime::disableEvent(ViSession nVi, ViEventType nType, ViUInt16 nMech)
{
    std::vector<ViEventType> vAsk;
    bool bAny = false;
    {
        LbCore::CMutexLock aGuard(g_aRuntimeMutex);
        ViStatus nStatus = VI_SUCCESS;
        PSession pc = eventSession(nVi, nType, true, nStatus);
        if (!pc)
            return nStatus;
        if (!validMechanism(nMech, true))
            return VI_ERROR_INV_MECH;
        // The passport hears only the disable that ends a type, which stops its event source;
        // disabling what is not enabled answers VI_SUCCESS_EVENT_DIS without it.
        for (auto it = pc->m_mapEnabled.begin(); it != pc->m_mapEnabled.end();) {
            if (nType != VI_ALL_ENABLED_EVENTS && it->first != nType) {
                ++it;
                continue;
            }
            bAny = bAny || (it->second & nMech) != 0;
            it->second = static_cast<ViUInt16>(it->second & ~nMech);
            if (it->second == 0) {
                vAsk.push_back(it->first);
                it = pc->m_mapEnabled.erase(it);
            } else {
                ++it;
            }
        }
    }
    ViStatus nResult = bAny ? VI_SUCCESS : VI_SUCCESS_EVENT_DIS;
    for (ViEventType nStopped : vAsk) {
        ViStatus nStatus = route<FDisableEvent>(nVi, "viDisableEvent", false, nStopped, nMech);
        if (nStatus < 0 && nStatus != VI_ERROR_NSUP_OPER)
            nResult = nStatus;
    }
    return nResult;
}

ViStatus CRuntime::discardEvents(ViSession nVi, ViEventType nType, ViUInt16 nMech)
{
    LbCore::CMutexLock aGuard(g_aRuntimeMutex);
    ViStatus nStatus = VI_SUCCESS;
    PSession pc = eventSession(nVi, nType, true, nStatus);
    if (!pc)
        return nStatus;
    if (!validMechanism(nMech, true))
        return VI_ERROR_INV_MECH;
    if (!(nMech & VI_QUEUE))
        return VI_SUCCESS_QUEUE_EMPTY;
    // The events lost to a full queue go with the discarded ones: no later wait reports them.
    if (nType == VI_ALL_ENABLED_EVENTS)
        pc->m_setOverflowed.clear();
    else
        pc->m_setOverflowed.erase(nType);
    std::vector<ViEvent> vDiscard;
    for (ViEvent nEvent : pc->m_dqQueue) {
        PEventContext pcEvent = as<CEventContext>(find(nEvent), EKind::Event);
        if (nType == VI_ALL_ENABLED_EVENTS || (pcEvent && pcEvent->m_nEventType == nType))
            vDiscard.push_back(nEvent);
    }
    for (ViEvent nEvent : vDiscard)
        closeEvent(nEvent);
    return vDiscard.empty() ? VI_SUCCESS_QUEUE_EMPTY : VI_SUCCESS;
}

ViStatus CRuntime::waitOnEvent(ViSession nVi, ViEventType nType, ViUInt32 nTimeout, ViPEventType pnOutType,
                               ViPEvent pnOutContext)
{
    LbCore::CMutexLock aGuard(g_aRuntimeMutex);
    ViStatus nStatus = VI_SUCCESS;
    PSession pc = eventSession(nVi, nType, true, nStatus);
    if (!pc)
        return nStatus;
    bool bEnabled = false;
    for (auto& sEntry : pc->m_mapEnabled)
        if ((nType == VI_ALL_ENABLED_EVENTS || sEntry.first == nType) && (sEntry.second & VI_QUEUE))
            bEnabled = true;
    if (!bEnabled)
        return VI_ERROR_NENABLED;
    auto fMatching = [&]() REQUIRES(g_aRuntimeMutex) {
        for (auto it = pc->m_dqQueue.begin(); it != pc->m_dqQueue.end(); ++it) {
            PEventContext pcEvent = as<CEventContext>(find(*it), EKind::Event);
            if (pcEvent && (nType == VI_ALL_ENABLED_EVENTS || pcEvent->m_nEventType == nType))
                return it;
        }
        return pc->m_dqQueue.end();
    };
    auto fReady = [&]() REQUIRES(g_aRuntimeMutex) { return pc->m_bClosing || fMatching() != pc->m_dqQueue.end(); };
    if (!waitUntil(pc->m_cvChanged, nTimeout, fReady))
        return VI_ERROR_TMO;
    if (pc->m_bClosing)
        return VI_ERROR_INV_OBJECT;
    auto it = fMatching();
    ViEvent nEvent = *it;
    pc->m_dqQueue.erase(it);
    PEventContext pcEvent = as<CEventContext>(find(nEvent), EKind::Event);
    if (pnOutType)
        *pnOutType = pcEvent->m_nEventType;
    // The first event of a type delivered after the full queue dropped one of that type says so.
    bool bOverflowed = pc->m_setOverflowed.erase(pcEvent->m_nEventType) > 0;
    if (pnOutContext)
        *pnOutContext = nEvent;
    else
        erase(nEvent); // nobody can close it later
    if (bOverflowed)
        return VI_WARN_QUEUE_OVERFLOW;
    return fMatching() != pc->m_dqQueue.end() ? VI_SUCCESS_QUEUE_NEMPTY : VI_SUCCESS;
}

ViStatus CRuntime::installHandler(ViSession nVi, ViEventType nType, ViHndlr pfHandler, ViAddr pUser)
{
    LbCore::CMutexLock aGuard(g_aRuntimeMutex);
    ViStatus nStatus = VI_SUCCESS;
    PSession pc = eventSession(nVi, nType, false, nStatus);
    if (!pc)
        return nStatus;
    if (!pfHandler)
        return VI_ERROR_INV_HNDLR_REF;
    pc->m_vHandlers.push_back(SHandler{nType, pfHandler, pUser});
    return VI_SUCCESS;
}

ViStatus CRuntime::uninstallHandler(ViSession nVi, ViEventType nType, ViHndlr pfHandler, ViAddr pUser)
{
    LbCore::CMutexLock aGuard(g_aRuntimeMutex);
    ViStatus nStatus = VI_SUCCESS;
    PSession pc = eventSession(nVi, nType, true, nStatus);
    if (!pc)
        return nStatus;
    auto& v = pc->m_vHandlers;
    size_t nBefore = v.size();
    v.erase(std::remove_if(v.begin(), v.end(),
                           [&](const SHandler& s) {
                               return (nType == VI_ALL_ENABLED_EVENTS || s.m_nType == nType) &&
                                   (pfHandler == VI_ANY_HNDLR || (s.m_pfHandler == pfHandler && s.m_pUser == pUser));
                           }),
            v.end());
    return v.size() == nBefore ? VI_ERROR_INV_HNDLR_REF : VI_SUCCESS;
}

} // namespace LbVisaHost
