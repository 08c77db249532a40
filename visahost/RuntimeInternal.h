// Helpers the runtime's source files share: the signatures of vector-table operations, text
// and value copies, the per-thread record of calls in progress, waiting on a condition variable
// under g_aRuntimeMutex, and the routing of an operation to a session's vector table.
#ifndef LBVISAHOST_RUNTIMEINTERNAL_H
#define LBVISAHOST_RUNTIMEINTERNAL_H

#include <chrono>
#include <condition_variable>
#include <cstring>
#include <mutex>
#include <string>

#include "visahost/Runtime.h"

namespace LbVisaHost {

using FFindRsrc = ViStatus(_VI_FUNC*)(ViSession, ViConstString, ViFindList*);
using FParseRsrc = ViStatus(_VI_FUNC*)(ViSession, ViConstRsrc, ViPUInt16, ViPUInt16);
using FParseRsrcEx = ViStatus(_VI_FUNC*)(ViSession, ViConstRsrc, ViPUInt16, ViPUInt16, ViChar*, ViChar*, ViChar*);
using FOpen = ViStatus(_VI_FUNC*)(ViSession, ViConstRsrc, ViAccessMode, ViUInt32, ViPSession);
using FSessionOnly = ViStatus(_VI_FUNC*)(ViSession); // viClose, viClear
using FGetAttribute = ViStatus(_VI_FUNC*)(ViSession, ViAttr, void*);
using FSetAttribute = ViStatus(_VI_FUNC*)(ViSession, ViAttr, ViAttrState);
using FTerminate = ViStatus(_VI_FUNC*)(ViSession, ViUInt16, ViJobId);
using FWrite = ViStatus(_VI_FUNC*)(ViSession, ViConstBuf, ViUInt32, ViPUInt32);
using FRead = ViStatus(_VI_FUNC*)(ViSession, ViPBuf, ViUInt32, ViPUInt32);
using FAssertTrigger = ViStatus(_VI_FUNC*)(ViSession, ViUInt16);
using FReadSTB = ViStatus(_VI_FUNC*)(ViSession, ViPUInt16);
using FEnableEvent = ViStatus(_VI_FUNC*)(ViSession, ViEventType, ViUInt16, ViEventFilter);
using FDisableEvent = ViStatus(_VI_FUNC*)(ViSession, ViEventType, ViUInt16);

// The table whose viFindRsrc runs on this thread (service 44 opens resources through it).
extern thread_local CTable* tl_pcFindTable;

// Copies text into a VISA string buffer of VI_FIND_BUFLEN bytes, cut to fit.
void copyText(ViChar* szDest, const std::string& strText);
std::string upper(std::string strText);

template <typename T> void store(void* pValue, T nValue)
{
    std::memcpy(pValue, &nValue, sizeof nValue);
}

// Marks a call through a session's vector table in progress on this thread for its lifetime,
// so that a viClose made from within such a call does not wait for itself. The marks of one
// thread form a chain on its stack: nesting has no limit.
class CInCall {
public:
    explicit CInCall(ViSession nVi);
    ~CInCall();
    CInCall(const CInCall&) = delete;
    CInCall& operator=(const CInCall&) = delete;
    // Calls on session nVi in progress on this thread.
    static unsigned count(ViSession nVi);

private:
    ViSession m_nVi;
    CInCall* m_pcOuter;
};

// Waits on cv until fReady() holds or nTimeout ms (VI_TMO_INFINITE: no limit) pass; answers
// fReady(). The caller holds g_aRuntimeMutex, and so does fReady when it runs.
template <typename F> bool waitUntil(std::condition_variable& cv, ViUInt32 nTimeout, F fReady) REQUIRES(g_aRuntimeMutex)
{
    std::unique_lock<std::mutex> aWait(g_aRuntimeMutex.native(), std::adopt_lock);
    auto tEnd = std::chrono::steady_clock::now() + std::chrono::milliseconds(nTimeout);
    bool bReady = fReady();
    while (!bReady) {
        if (nTimeout == VI_TMO_INFINITE) {
            cv.wait(aWait);
        } else if (cv.wait_until(aWait, tEnd) == std::cv_status::timeout) {
            bReady = fReady();
            break;
        }
        bReady = fReady();
    }
    aWait.release(); // the caller's guard still owns the mutex
    return bReady;
}

template <typename F, typename... A>
ViStatus CRuntime::route(ViSession nVi, const char* szOp, bool bNeedsAccess, A... args)
{
    PSession pc;
    F pf = nullptr;
    {
        LbCore::CMutexLock aGuard(g_aRuntimeMutex);
        ViStatus nStatus = VI_SUCCESS;
        pc = openSession(nVi, VI_ERROR_NSUP_OPER, nStatus);
        if (!pc)
            return nStatus;
        if (bNeedsAccess && !accessAllowed(*pc))
            return VI_ERROR_RSRC_LOCKED;
        pf = reinterpret_cast<F>(operation(pc->m_pcTable, szOp));
        if (!pf)
            return VI_ERROR_NSUP_OPER;
        ++pc->m_nCalls;
    }
    ViStatus nStatus;
    {
        CInCall cMark(nVi);
        nStatus = pf(nVi, args...);
    }
    {
        LbCore::CMutexLock aGuard(g_aRuntimeMutex);
        --pc->m_nCalls;
        pc->m_cvChanged.notify_all();
    }
    // An attribute the passport does not know may still be the runtime's (see getAttribute and
    // setAttribute, which report the failure they end with).
    bool bRuntimeMayAnswer = nStatus == VI_ERROR_NSUP_ATTR &&
        (std::strcmp(szOp, "viGetAttribute") == 0 || std::strcmp(szOp, "viSetAttribute") == 0);
    if (nStatus < VI_SUCCESS && !bRuntimeMayAnswer)
        operationFailed(nVi, nStatus, szOp);
    return nStatus;
}

} // namespace LbVisaHost

#endif
