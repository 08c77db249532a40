// CRuntime: the state of the VISA runtime stand-in, one per process, shared by the service
// library's services and the VISA C API.
//
// Contract:
// - Handles (resource managers, sessions, find lists, event contexts) are never reused, so a
//   closed handle answers VI_ERROR_INV_OBJECT for the life of the process.
// - Passports are loaded on the first viOpenDefaultRM; their entry runs during the load and
//   may call every service. Vector tables are routing targets in the order they were created.
// - Calls into passports and event handlers are made without holding the runtime's mutex, so
//   passports may call services (and handlers VISA operations) from within them. Handlers run
//   in order on one thread of the runtime's own, not on the thread that raised the event.
// - viClose of a session waits until calls on it from other threads have returned, so a
//   passport never sees an operation on a session it has already closed.
// - The object lives until the process ends (it is never destroyed), so passports may call
//   services from their unload code.
#ifndef LBVISAHOST_RUNTIME_H
#define LBVISAHOST_RUNTIME_H

#include <condition_variable>
#include <deque>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "core/ThreadSafety.h"
#include "visahost/RuntimeObjects.h"
#include "visahost/Services.h"

namespace LbVisaHost {

class CRuntime {
public:
    static CRuntime& instance();
    CRuntime(const CRuntime&) = delete;
    CRuntime& operator=(const CRuntime&) = delete;

    // Services (see Services.h and README.md).
    ViStatus createLock(ViConstString szName, ViUInt32 nInitial, ViUInt32 nMaximum, ViSvcHandle* phLock);
    ViStatus acquireLock(ViSvcHandle hLock, ViUInt32 nTimeout);
    ViStatus releaseLock(ViSvcHandle hLock);
    ViStatus createTable(ViConstString szName, ViVersion nVersion, ViSvcHandle* phTable);
    ViStatus addOperation(ViSvcHandle hTable, ViConstString szOperation, ViSvcProc pfEntry);
    ViStatus matchRsrc(ViSession nRm, ViConstString szExpr, ViConstString szRsrc, ViUInt16* pnFlag);
    ViStatus matchAttributes(ViSession nRm, ViConstString szExpr, ViConstString szRsrc, ViSvcFindCallback pfCallback);
    ViStatus appendFound(ViFindList nList, ViConstString szRsrc);
    ViStatus declareEvents(ViSession nVi, ViUInt32 nCount, const ViEventType* pnTypes);
    ViStatus createEvent(ViSession nVi, ViEventType nType, ViEvent* pnContext, ViUInt32* pnMech);
    ViStatus raiseEvent(ViSession nVi, ViEvent nContext, ViUInt32 nMech);
    ViStatus installTable(ViSession nVi, ViSvcHandle hTable);
    ViAddr* sessionRecord(ViSession nVi);
    ViStatus detach();

    // VISA C API.
    ViStatus openDefaultRM(ViPSession pnVi);
    ViStatus findRsrc(ViSession nRm, ViConstString szExpr, ViPFindList pnList, ViPUInt32 pnCount, ViChar szDesc[]);
    ViStatus findNext(ViFindList nList, ViChar szDesc[]);
    ViStatus parseRsrc(ViSession nRm, ViConstRsrc szName, ViPUInt16 pnType, ViPUInt16 pnNum, ViChar szClass[],
                       ViChar szExpanded[], ViChar szAlias[], bool bExtended);
    ViStatus open(ViSession nRm, ViConstRsrc szName, ViAccessMode nMode, ViUInt32 nTimeout, ViPSession pnVi);
    ViStatus close(ViObject nVi);
    ViStatus read(ViSession nVi, ViPBuf pBuf, ViUInt32 nCount, ViPUInt32 pnRet);
    ViStatus write(ViSession nVi, ViConstBuf pBuf, ViUInt32 nCount, ViPUInt32 pnRet);
    ViStatus readSTB(ViSession nVi, ViPUInt16 pnStatus);
    ViStatus clear(ViSession nVi);
    ViStatus assertTrigger(ViSession nVi, ViUInt16 nProtocol);
    ViStatus terminate(ViObject nVi, ViUInt16 nDegree, ViJobId nJob);
    ViStatus getAttribute(ViObject nVi, ViAttr nAttr, void* pValue);
    ViStatus setAttribute(ViObject nVi, ViAttr nAttr, ViAttrState nValue);
    ViStatus enableEvent(ViSession nVi, ViEventType nType, ViUInt16 nMech, ViEventFilter nContext);
    ViStatus disableEvent(ViSession nVi, ViEventType nType, ViUInt16 nMech);
    ViStatus discardEvents(ViSession nVi, ViEventType nType, ViUInt16 nMech);
    ViStatus waitOnEvent(ViSession nVi, ViEventType nType, ViUInt32 nTimeout, ViPEventType pnOutType,
                         ViPEvent pnOutContext);
    ViStatus installHandler(ViSession nVi, ViEventType nType, ViHndlr pfHandler, ViAddr pUser);
    ViStatus uninstallHandler(ViSession nVi, ViEventType nType, ViHndlr pfHandler, ViAddr pUser);
    ViStatus statusDesc(ViObject nVi, ViStatus nStatus, ViChar szDesc[]);
    ViStatus readAsync(ViSession nVi, ViPBuf pBuf, ViUInt32 nCount, ViPJobId pnJob);
    ViStatus writeAsync(ViSession nVi, ViConstBuf pBuf, ViUInt32 nCount, ViPJobId pnJob);
    ViStatus lock(ViSession nVi, ViAccessMode nType, ViUInt32 nTimeout, ViConstKeyId szRequested, ViChar szAccessKey[]);
    ViStatus unlock(ViSession nVi);

private:
    // A counting lock of service 30: acquiring takes one count, releasing gives one back. It
    // knows no owner and no recursion: a thread that acquires a (1, 1) lock twice waits for itself.
    struct CSvcLock {
        CSvcLock(ViUInt32 nInitial, ViUInt32 nMaximum) : m_nCount(nInitial), m_nMaximum(nMaximum) { }
        LbCore::CMutex m_aMutex;
        std::condition_variable m_cvFree;
        ViUInt32 m_nCount GUARDED_BY(m_aMutex);
        const ViUInt32 m_nMaximum;
    };
    struct SRsrcLock {
        ViSession m_nExclusive = 0;
        unsigned m_nExclusiveDepth = 0;
        std::string m_strSharedKey;
        std::map<ViSession, unsigned> m_mapShared;
    };

    CRuntime() = default;
    void loadPassports() EXCLUDES(m_aLoadMutex);
    PObject find(ViObject nHandle) const REQUIRES(g_aRuntimeMutex);
    PSession findSession(ViObject nHandle) const REQUIRES(g_aRuntimeMutex);
    // The open session nVi names, for an operation of the application. Null with nStatus
    // VI_ERROR_INV_OBJECT when nVi names nothing or a closing session, with nNotSession when it
    // names another kind of object.
    PSession openSession(ViObject nVi, ViStatus nNotSession, ViStatus& nStatus) const REQUIRES(g_aRuntimeMutex);
    // openSession for an operation on events of type nType (also VI_ALL_ENABLED_EVENTS where
    // bAllTypes): VI_ERROR_INV_EVENT for another kind of object or a type the session does not know.
    PSession eventSession(ViSession nVi, ViEventType nType, bool bAllTypes, ViStatus& nStatus) const
        REQUIRES(g_aRuntimeMutex);
    CSvcLock* findLock(ViSvcHandle hLock) EXCLUDES(g_aRuntimeMutex); // null for a foreign handle
    void publish(const PObject& pcObject) EXCLUDES(g_aRuntimeMutex); // gives it a handle
    void erase(ViObject nHandle) REQUIRES(g_aRuntimeMutex);
    ViSvcProc operation(const CTable* pcTable, const char* szOp) const REQUIRES(g_aRuntimeMutex);
    std::vector<CTable*> tablesWith(const char* szOperation) EXCLUDES(g_aRuntimeMutex);
    ViStatus checkRm(ViSession nRm) EXCLUDES(g_aRuntimeMutex);
    ViStatus closeSession(const PSession& pcSession) EXCLUDES(g_aRuntimeMutex);
    bool accessAllowed(const CSession& cSession) const REQUIRES(g_aRuntimeMutex);
    bool eventTypeKnown(const CSession& cSession, ViEventType nType) const REQUIRES(g_aRuntimeMutex);
    ViStatus runtimeAttribute(const PObject& pcObject, ViAttr nAttr, void* pValue, bool& bDone)
        EXCLUDES(g_aRuntimeMutex);
    static ViStatus parsedAttribute(const CSession& cSession, ViAttr nAttr, void* pValue);
    void closeEvent(ViEvent nContext) REQUIRES(g_aRuntimeMutex);
    ViStatus enableEnabledEvents(ViSession nVi, ViUInt16 nMech, ViEventFilter nContext) EXCLUDES(g_aRuntimeMutex);
    void releaseRsrcLocks(const CSession& cSession) REQUIRES(g_aRuntimeMutex);
    // A new session on resource szName, opened through pcTable: parses the name with the
    // table's viParseRsrcEx, publishes the session and calls the table's viOpen. Null (with
    // nStatus) when the open fails.
    PSession openWith(CTable* pcTable, ViSession nRm, ViConstRsrc szName, ViAccessMode nMode, ViUInt32 nTimeout,
                      ViStatus& nStatus) EXCLUDES(g_aRuntimeMutex);

    // Calls operation szOp of the vector table installed on session nVi; VI_ERROR_NSUP_OPER
    // when the table lacks it, VI_ERROR_RSRC_LOCKED when another session locked the resource.
    template <typename F, typename... A>
    ViStatus route(ViSession nVi, const char* szOp, bool bNeedsAccess, A... args) EXCLUDES(g_aRuntimeMutex);

    LbCore::CMutex m_aLoadMutex;
    bool m_bLoaded GUARDED_BY(m_aLoadMutex) = false;

    std::condition_variable m_cvLocks; // a resource lock was released
    std::map<ViObject, PObject> m_mapObjects GUARDED_BY(g_aRuntimeMutex);
    ViObject m_nNextHandle GUARDED_BY(g_aRuntimeMutex) = 0x10000;
    std::vector<std::unique_ptr<CTable>> m_vTables GUARDED_BY(g_aRuntimeMutex);
    std::map<std::string, std::unique_ptr<CSvcLock>> m_mapLocks GUARDED_BY(g_aRuntimeMutex);
    std::map<std::string, SRsrcLock> m_mapRsrcLocks GUARDED_BY(g_aRuntimeMutex);
    unsigned m_nKeys GUARDED_BY(g_aRuntimeMutex) = 0;
    ViJobId m_nLastJob GUARDED_BY(g_aRuntimeMutex) = 0;

    // Event handlers run on a thread of the runtime's own, never on the passport's thread that
    // raised the event: a handler may then call any VISA operation, viClose of its session included.
    struct SHandlerJob {
        ViSession m_nVi;
        ViEventType m_nType;
        ViEvent m_nContext;
        bool m_bQueued; // the context also went to the session's queue and outlives the handlers
    };
    void postHandlers(const SHandlerJob& sJob) EXCLUDES(m_aHandlerMutex);
    // Runs asynchronous job szOp on session nVi at once: fIo(ViUInt32 &nRet) performs its I/O,
    // then VI_EVENT_IO_COMPLETION reports the outcome. Answers VI_SUCCESS_SYNC once it ran, the
    // failure of the session's lookup (openSession) when it could not start.
    template <typename F>
    ViStatus runJob(ViSession nVi, const char* szOp, ViAddr pBuffer, ViPJobId pnJob, F fIo) EXCLUDES(g_aRuntimeMutex);
    // Raises VI_EVENT_IO_COMPLETION of a finished job when the session enabled it.
    void completeJob(ViSession nVi, const char* szOp, ViJobId nJob, ViStatus nStatus, ViUInt32 nRet, ViAddr pBuffer)
        EXCLUDES(g_aRuntimeMutex);
    // Records a failed operation of session nVi and raises VI_EVENT_EXCEPTION when enabled.
    void operationFailed(ViSession nVi, ViStatus nStatus, const char* szOp) EXCLUDES(g_aRuntimeMutex);
    void runHandlers() EXCLUDES(m_aHandlerMutex, g_aRuntimeMutex);
    LbCore::CMutex m_aHandlerMutex;
    std::condition_variable m_cvHandlerJobs;
    std::deque<SHandlerJob> m_dqHandlerJobs GUARDED_BY(m_aHandlerMutex);
    bool m_bHandlerThread GUARDED_BY(m_aHandlerMutex) = false;
};

// Text for a status; false when the status is unknown.
bool statusText(ViStatus nStatus, std::string& strText);

} // namespace LbVisaHost

#endif
