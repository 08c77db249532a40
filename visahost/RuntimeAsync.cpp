// Asynchronous reads and writes. This runtime performs them at once, on the caller's thread,
// and answers VI_SUCCESS_SYNC, as the VISA standard allows; the outcome arrives as a
// VI_EVENT_IO_COMPLETION event (queue and/or handlers, as enabled) whose context names the
// status, the operation, the job, the count and the buffer. viTerminate of such a job finds it
// done: VI_ERROR_INV_JOB_ID.
#include "visahost/RuntimeInternal.h"

namespace LbVisaHost {

void CRuntime::completeJob(ViSession nVi, const char* szOp, ViJobId nJob, ViStatus nStatus, ViUInt32 nRet,
                           ViAddr pBuffer)
{
    ViUInt32 nMech = 0;
    {
        LbCore::CMutexLock aGuard(g_aRuntimeMutex);
        PSession pc = findSession(nVi);
        if (!pc || pc->m_bClosing)
            return;
        auto it = pc->m_mapEnabled.find(VI_EVENT_IO_COMPLETION);
        if (it == pc->m_mapEnabled.end())
            return;
        nMech = it->second & (VI_QUEUE | VI_HNDLR);
    }
    if (nMech == 0)
        return;
    auto pcEvent = std::make_shared<CEventContext>(VI_EVENT_IO_COMPLETION, nVi, nStatus, szOp);
    pcEvent->m_nJobId = nJob;
    pcEvent->m_nRetCount = nRet;
    pcEvent->m_pBuffer = pBuffer;
    publish(pcEvent);
    raiseEvent(nVi, pcEvent->m_nHandle, nMech);
}

template <typename F> ViStatus CRuntime::runJob(ViSession nVi, const char* szOp, ViAddr pBuffer, ViPJobId pnJob, F fIo)
{
    ViJobId nJob;
    {
        LbCore::CMutexLock aGuard(g_aRuntimeMutex);
        ViStatus nStatus = VI_SUCCESS;
        if (!openSession(nVi, VI_ERROR_NSUP_OPER, nStatus))
            return nStatus;
        nJob = ++m_nLastJob;
    }
    if (pnJob)
        *pnJob = nJob;
    ViUInt32 nRet = 0;
    ViStatus nStatus = fIo(nRet);
    completeJob(nVi, szOp, nJob, nStatus, nRet, pBuffer);
    return VI_SUCCESS_SYNC;
}

ViStatus CRuntime::readAsync(ViSession nVi, ViPBuf pBuf, ViUInt32 nCount, ViPJobId pnJob)
{
    return runJob(nVi, "viReadAsync", pBuf, pnJob, [&](ViUInt32& nRet) { return read(nVi, pBuf, nCount, &nRet); });
}

ViStatus CRuntime::writeAsync(ViSession nVi, ViConstBuf pBuf, ViUInt32 nCount, ViPJobId pnJob)
{
    return runJob(nVi, "viWriteAsync", const_cast<ViByte*>(pBuf), pnJob,
                  [&](ViUInt32& nRet) { return write(nVi, pBuf, nCount, &nRet); });
}

ViStatus CRuntime::terminate(ViObject nVi, ViUInt16 nDegree, ViJobId nJob)
{
    {
        LbCore::CMutexLock aGuard(g_aRuntimeMutex);
        // Jobs of this runtime are over when their call returns.
        if (nJob != VI_NULL && nJob <= m_nLastJob && find(nVi))
            return VI_ERROR_INV_JOB_ID;
    }
    return route<FTerminate>(nVi, "viTerminate", false, nDegree, nJob);
}

} // namespace LbVisaHost
