// Asynchronous reads and writes. This runtime performs them at once, on the caller's thread,
// and answers VI_SUCCESS_SYNC, as the VISA standard allows; the outcome arrives as a
// VI_EVENT_IO_COMPLETION event (queue and/or handlers, as enabled) whose context names the
// status, the operation, the job, the count and the buffer. viTerminate of such a job finds it
// done: VI_ERROR_INV_JOB_ID.
#include "visahost/RuntimeInternal.h"

namespace LbVisaHost {

void CRuntime::completeJob(ViSession nVi, const char *szOp, ViJobId nJob, ViStatus nStatus,
                           ViUInt32 nRet, ViAddr pBuffer) {
  ViUInt32 nMech = 0;
  {
    LbCore::CMutexLock aGuard(g_aRuntimeMutex);
    PSession pc = findSession(nVi);
    if (!pc || pc->m_bClosing) return;
    auto it = pc->m_mapEnabled.find(VI_EVENT_IO_COMPLETION);
    if (it == pc->m_mapEnabled.end()) return;
    nMech = it->second & (VI_QUEUE | VI_HNDLR);
  }
  if (nMech == 0) return;
  auto pcEvent = std::make_shared<CEventContext>(VI_EVENT_IO_COMPLETION, nVi, nStatus, szOp);
  pcEvent->m_nJobId = nJob;
  pcEvent->m_nRetCount = nRet;
  pcEvent->m_pBuffer = pBuffer;
  publish(pcEvent);
  raiseEvent(nVi, pcEvent->m_nHandle, nMech);
}

ViStatus CRuntime::readAsync(ViSession nVi, ViPBuf pBuf, ViUInt32 nCount, ViPJobId pnJob) {
  ViJobId nJob;
  {
    LbCore::CMutexLock aGuard(g_aRuntimeMutex);
    PObject pcObject = find(nVi);
    PSession pc = as<CSession>(pcObject, EKind::Session);
    if (!pcObject || (pc && pc->m_bClosing)) return VI_ERROR_INV_OBJECT;
    if (!pc) return VI_ERROR_NSUP_OPER;
    nJob = ++m_nLastJob;
  }
  if (pnJob) *pnJob = nJob;
  ViUInt32 nRet = 0;
  ViStatus nStatus = read(nVi, pBuf, nCount, &nRet);
  completeJob(nVi, "viReadAsync", nJob, nStatus, nRet, pBuf);
  return VI_SUCCESS_SYNC;
}

ViStatus CRuntime::writeAsync(ViSession nVi, ViConstBuf pBuf, ViUInt32 nCount, ViPJobId pnJob) {
  ViJobId nJob;
  {
    LbCore::CMutexLock aGuard(g_aRuntimeMutex);
    PObject pcObject = find(nVi);
    PSession pc = as<CSession>(pcObject, EKind::Session);
    if (!pcObject || (pc && pc->m_bClosing)) return VI_ERROR_INV_OBJECT;
    if (!pc) return VI_ERROR_NSUP_OPER;
    nJob = ++m_nLastJob;
  }
  if (pnJob) *pnJob = nJob;
  ViUInt32 nRet = 0;
  ViStatus nStatus = write(nVi, pBuf, nCount, &nRet);
  completeJob(nVi, "viWriteAsync", nJob, nStatus, nRet, const_cast<ViByte *>(pBuf));
  return VI_SUCCESS_SYNC;
}

ViStatus CRuntime::terminate(ViObject nVi, ViUInt16 nDegree, ViJobId nJob) {
  {
    LbCore::CMutexLock aGuard(g_aRuntimeMutex);
    // Jobs of this runtime are over when their call returns.
    if (nJob != VI_NULL && nJob <= m_nLastJob && find(nVi)) return VI_ERROR_INV_JOB_ID;
  }
  return route<FTerminate>(nVi, "viTerminate", false, nDegree, nJob);
}

}  // namespace LbVisaHost
