#include "visahost/Runtime.h"

#include <algorithm>
#include <atomic>
#include <cctype>
#include <chrono>
#include <cstdio>
#include <cstring>
#include <thread>

#include "visahost/Module.h"
#include "visahost/PassportConfig.h"
#include "visahost/RsrcExpr.h"

namespace LbVisaHost {

namespace {

using FFindRsrc = ViStatus(_VI_FUNC *)(ViSession, ViConstString, ViFindList *);
using FParseRsrc = ViStatus(_VI_FUNC *)(ViSession, ViConstRsrc, ViPUInt16, ViPUInt16);
using FParseRsrcEx = ViStatus(_VI_FUNC *)(ViSession, ViConstRsrc, ViPUInt16, ViPUInt16, ViChar *,
                                          ViChar *, ViChar *);
using FOpen = ViStatus(_VI_FUNC *)(ViSession, ViConstRsrc, ViAccessMode, ViUInt32, ViPSession);
using FClose = ViStatus(_VI_FUNC *)(ViSession);
using FGetAttribute = ViStatus(_VI_FUNC *)(ViSession, ViAttr, void *);
using FSetAttribute = ViStatus(_VI_FUNC *)(ViSession, ViAttr, ViAttrState);
using FTerminate = ViStatus(_VI_FUNC *)(ViSession, ViUInt16, ViJobId);
using FWrite = ViStatus(_VI_FUNC *)(ViSession, ViConstBuf, ViUInt32, ViPUInt32);
using FRead = ViStatus(_VI_FUNC *)(ViSession, ViPBuf, ViUInt32, ViPUInt32);
using FAssertTrigger = ViStatus(_VI_FUNC *)(ViSession, ViUInt16);
using FReadSTB = ViStatus(_VI_FUNC *)(ViSession, ViPUInt16);
using FEnableEvent = ViStatus(_VI_FUNC *)(ViSession, ViEventType, ViUInt16, ViEventFilter);
using FDisableEvent = ViStatus(_VI_FUNC *)(ViSession, ViEventType, ViUInt16);

const char g_szManufacturer[] = "LB VISA host";
const ViUInt16 g_nManufacturerId = 0x0000;
const ViUInt32 g_nImplVersion = 0x00100000;

// The table whose viFindRsrc runs on this thread (service 44 opens resources through it).
thread_local void *tl_pFindTable = nullptr;
// Sessions whose vector-table calls are in progress on this thread, so that a viClose made
// from within such a call does not wait for itself.
thread_local ViSession tl_anInCall[16];
thread_local unsigned tl_nInCall = 0;
thread_local char tl_cThreadTag;

struct SInCall {
  explicit SInCall(ViSession nVi) {
    if (tl_nInCall < 16) tl_anInCall[tl_nInCall] = nVi;
    ++tl_nInCall;
  }
  ~SInCall() { --tl_nInCall; }
};

unsigned inCallCount(ViSession nVi) {
  unsigned nCount = 0;
  for (unsigned i = 0; i < tl_nInCall && i < 16; ++i) nCount += tl_anInCall[i] == nVi ? 1 : 0;
  return nCount;
}

void copyText(ViChar *szDest, const std::string &strText) {
  size_t nLen = std::min<size_t>(strText.size(), VI_FIND_BUFLEN - 1);
  std::memcpy(szDest, strText.data(), nLen);
  szDest[nLen] = '\0';
}

std::string upper(std::string strText) {
  for (char &c : strText) c = static_cast<char>(std::toupper(static_cast<unsigned char>(c)));
  return strText;
}

template <typename T>
void store(void *pValue, T nValue) {
  std::memcpy(pValue, &nValue, sizeof nValue);
}

bool validMechanism(ViUInt16 nMech, bool bForDisable) {
  if (bForDisable && nMech == VI_ALL_MECH) return true;
  return nMech != 0 && (nMech & ~(VI_QUEUE | VI_HNDLR | VI_SUSPEND_HNDLR)) == 0;
}

}  // namespace

CRuntime &CRuntime::instance() {
  // Never destroyed: passports call services while the process unloads them.
  static CRuntime *s_pcRuntime = new CRuntime();
  return *s_pcRuntime;
}

// ---------------------------------------------------------------------------------------------
// Objects

CRuntime::PObject CRuntime::find(ViObject nHandle) const {
  auto it = m_mapObjects.find(nHandle);
  return it == m_mapObjects.end() ? PObject() : it->second;
}

CRuntime::PObject CRuntime::add(EKind eKind, ViSession nRm, const std::string &strRsrc) {
  auto pc = std::make_shared<CObject>();
  pc->m_eKind = eKind;
  pc->m_nRm = nRm;
  pc->m_strRsrc = strRsrc;
  pc->m_apRecord[0] = pc.get();
  std::lock_guard<std::mutex> aGuard(m_aMutex);
  if (m_nNextHandle == VI_NULL) ++m_nNextHandle;
  pc->m_nHandle = m_nNextHandle++;
  m_mapObjects[pc->m_nHandle] = pc;
  return pc;
}

void CRuntime::erase(ViObject nHandle) { m_mapObjects.erase(nHandle); }

void CRuntime::closeEvent(ViEvent nContext) {
  PObject pc = find(nContext);
  if (!pc || pc->m_eKind != EKind::Event) return;
  if (PObject pcSession = find(pc->m_nSource)) {
    auto &dq = pcSession->m_dqQueue;
    dq.erase(std::remove(dq.begin(), dq.end(), nContext), dq.end());
  }
  erase(nContext);
}

std::vector<CRuntime::CTable *> CRuntime::tablesWith(const char *szOperation) {
  std::lock_guard<std::mutex> aGuard(m_aMutex);
  std::vector<CTable *> v;
  for (auto &pc : m_vTables)
    if (pc->m_mapOps.count(szOperation)) v.push_back(pc.get());
  return v;
}

template <typename F, typename... A>
ViStatus CRuntime::route(ViSession nVi, const char *szOp, bool bNeedsAccess, A... args) {
  PObject pc;
  F pf = nullptr;
  {
    std::lock_guard<std::mutex> aGuard(m_aMutex);
    pc = find(nVi);
    if (!pc || pc->m_bClosing) return VI_ERROR_INV_OBJECT;
    if (pc->m_eKind != EKind::Session) return VI_ERROR_NSUP_OPER;
    if (bNeedsAccess && !accessAllowed(*pc)) return VI_ERROR_RSRC_LOCKED;
    if (pc->m_pcTable) {
      auto it = pc->m_pcTable->m_mapOps.find(szOp);
      if (it != pc->m_pcTable->m_mapOps.end()) pf = reinterpret_cast<F>(it->second);
    }
    if (!pf) return VI_ERROR_NSUP_OPER;
    ++pc->m_nCalls;
  }
  ViStatus nStatus;
  {
    SInCall sMark(nVi);
    nStatus = pf(nVi, args...);
  }
  std::lock_guard<std::mutex> aGuard(m_aMutex);
  --pc->m_nCalls;
  pc->m_cvChanged.notify_all();
  return nStatus;
}

// ---------------------------------------------------------------------------------------------
// Services

ViStatus CRuntime::createLock(ViConstString szName, ViSvcHandle *phLock) {
  if (!szName || !phLock) return VI_ERROR_INV_PARAMETER;
  std::lock_guard<std::mutex> aGuard(m_aMutex);
  // Locks are named: creating a name again hands out the same lock.
  auto &pc = m_mapLocks[szName];
  if (!pc) pc.reset(new CSvcLock());
  *phLock = pc.get();
  return VI_SUCCESS;
}

CRuntime::CSvcLock *CRuntime::findLock(ViSvcHandle hLock) {
  std::lock_guard<std::mutex> aGuard(m_aMutex);
  for (auto &sEntry : m_mapLocks)
    if (sEntry.second.get() == hLock) return sEntry.second.get();
  return nullptr;
}

ViStatus CRuntime::acquireLock(ViSvcHandle hLock, ViUInt32 nTimeout) {
  CSvcLock *pc = findLock(hLock);
  if (!pc) return VI_ERROR_INV_OBJECT;
  std::unique_lock<std::mutex> aGuard(pc->m_aMutex);
  // Recursive per thread: a passport that re-enters its own locked code does not deadlock.
  if (pc->m_pOwner == &tl_cThreadTag) {
    ++pc->m_nDepth;
    return VI_SUCCESS;
  }
  auto bFree = [pc] { return pc->m_pOwner == nullptr; };
  if (nTimeout == VI_TMO_INFINITE) {
    pc->m_cvFree.wait(aGuard, bFree);
  } else if (!pc->m_cvFree.wait_for(aGuard, std::chrono::milliseconds(nTimeout), bFree)) {
    return VI_ERROR_TMO;
  }
  pc->m_pOwner = &tl_cThreadTag;
  pc->m_nDepth = 1;
  return VI_SUCCESS;
}

ViStatus CRuntime::releaseLock(ViSvcHandle hLock) {
  CSvcLock *pc = findLock(hLock);
  if (!pc) return VI_ERROR_INV_OBJECT;
  std::lock_guard<std::mutex> aGuard(pc->m_aMutex);
  if (pc->m_pOwner != &tl_cThreadTag) return VI_ERROR_SESN_NLOCKED;
  if (--pc->m_nDepth == 0) {
    pc->m_pOwner = nullptr;
    pc->m_cvFree.notify_one();
  }
  return VI_SUCCESS;
}

ViStatus CRuntime::createTable(ViConstString szName, ViVersion, ViSvcHandle *phTable) {
  if (!szName || !phTable) return VI_ERROR_INV_PARAMETER;
  std::lock_guard<std::mutex> aGuard(m_aMutex);
  m_vTables.emplace_back(new CTable());
  m_vTables.back()->m_strName = szName;
  *phTable = m_vTables.back().get();
  return VI_SUCCESS;
}

ViStatus CRuntime::addOperation(ViSvcHandle hTable, ViConstString szOperation, ViSvcProc pfEntry) {
  std::lock_guard<std::mutex> aGuard(m_aMutex);
  for (auto &pc : m_vTables) {
    if (pc.get() != hTable) continue;
    if (!szOperation || !pfEntry) return VI_ERROR_INV_PARAMETER;
    pc->m_mapOps[szOperation] = pfEntry;
    return VI_SUCCESS;
  }
  return VI_ERROR_INV_OBJECT;
}

ViStatus CRuntime::matchRsrc(ViSession nRm, ViConstString szExpr, ViConstString szRsrc,
                             ViUInt16 *pnFlag) {
  if (!szExpr) return VI_ERROR_INV_EXPR;
  if (!szRsrc || !pnFlag) return VI_ERROR_INV_PARAMETER;
  {
    std::lock_guard<std::mutex> aGuard(m_aMutex);
    PObject pc = find(nRm);
    if (!pc || pc->m_eKind != EKind::ResourceManager) return VI_ERROR_INV_OBJECT;
  }
  try {
    CRsrcExpr cExpr(szExpr);
    *pnFlag = 0;
    if (!cExpr.matches(szRsrc)) return VI_ERROR_RSRC_NFOUND;
    *pnFlag = cExpr.hasAttributes() ? 1 : 0;
    return VI_SUCCESS;
  } catch (const CRsrcExpr::CInvalidExpression &) {
    return VI_ERROR_INV_EXPR;
  }
}

ViStatus CRuntime::matchAttributes(ViSession nRm, ViConstString szExpr, ViConstString szRsrc,
                                   ViSvcFindCallback pfCallback) {
  if (!szExpr) return VI_ERROR_INV_EXPR;
  if (!szRsrc) return VI_ERROR_INV_PARAMETER;
  FOpen pfOpen = nullptr;
  {
    std::lock_guard<std::mutex> aGuard(m_aMutex);
    PObject pc = find(nRm);
    if (!pc || pc->m_eKind != EKind::ResourceManager) return VI_ERROR_INV_OBJECT;
    auto *pcTable = static_cast<CTable *>(tl_pFindTable);
    if (pcTable && pcTable->m_mapOps.count("viOpen"))
      pfOpen = reinterpret_cast<FOpen>(pcTable->m_mapOps["viOpen"]);
  }
  std::unique_ptr<CRsrcExpr> pcExpr;
  try {
    pcExpr.reset(new CRsrcExpr(szExpr));
  } catch (const CRsrcExpr::CInvalidExpression &) {
    return VI_ERROR_INV_EXPR;
  }
  if (!pcExpr->hasAttributes()) return VI_SUCCESS;
  // Attributes are those of an open session: open the resource for the time of the match.
  if (!tl_pFindTable) return VI_ERROR_INV_SETUP;
  if (!pfOpen) return VI_ERROR_RSRC_NFOUND;
  PObject pcSession = add(EKind::Session, nRm, szRsrc);
  ViSession nVi = pcSession->m_nHandle;
  if (pfOpen(nRm, szRsrc, VI_NULL, 0, &nVi) < 0) {
    std::lock_guard<std::mutex> aGuard(m_aMutex);
    erase(pcSession->m_nHandle);
    return VI_ERROR_RSRC_NFOUND;
  }
  nVi = pcSession->m_nHandle;
  auto fCondition = [&](const SAttrCondition &sCond) {
    if (pfCallback) {
      ViStatus nStatus = pfCallback(nVi, sCond.m_nAttr, sCond.m_nOp, sCond.m_nValue,
                                    sCond.m_bText ? sCond.m_strText.c_str() : nullptr, 0);
      if (nStatus == VI_SUCCESS) return true;
      if (nStatus == VI_ERROR_RSRC_NFOUND) return false;
    }
    union {
      ViAttrState m_nValue;
      ViChar m_szText[VI_FIND_BUFLEN];
    } uValue;
    std::memset(&uValue, 0, sizeof uValue);
    if (getAttribute(nVi, sCond.m_nAttr, &uValue) < 0) return false;
    if (sCond.m_bText) {
      uValue.m_szText[VI_FIND_BUFLEN - 1] = '\0';
      bool bEqual = std::regex_match(std::string(uValue.m_szText), CRsrcExpr::compile(sCond.m_strText));
      return sCond.m_nOp == LBVISA_OP_EQ ? bEqual : !bEqual;
    }
    ViAttrState a = uValue.m_nValue, b = sCond.m_nValue;
    switch (sCond.m_nOp) {
      case LBVISA_OP_EQ: return a == b;
      case LBVISA_OP_NE: return a != b;
      case LBVISA_OP_LT: return a < b;
      case LBVISA_OP_GT: return a > b;
      case LBVISA_OP_LE: return a <= b;
      default: return a >= b;
    }
  };
  bool bMatch = false;
  try {
    bMatch = pcExpr->matchesAttributes(fCondition);
  } catch (const std::exception &) {
    bMatch = false;
  }
  closeSession(pcSession);
  return bMatch ? VI_SUCCESS : VI_ERROR_RSRC_NFOUND;
}

ViStatus CRuntime::appendFound(ViFindList nList, ViConstString szRsrc) {
  if (!szRsrc) return VI_ERROR_INV_PARAMETER;
  std::lock_guard<std::mutex> aGuard(m_aMutex);
  PObject pc = find(nList);
  if (!pc || pc->m_eKind != EKind::FindList) return VI_ERROR_INV_OBJECT;
  // Two passports may report one resource; the list names it once.
  std::string strKey = upper(szRsrc);
  for (const std::string &str : pc->m_vFound)
    if (upper(str) == strKey) return VI_SUCCESS;
  pc->m_vFound.push_back(szRsrc);
  return VI_SUCCESS;
}

ViStatus CRuntime::declareEvents(ViSession nVi, ViUInt32 nCount, const ViEventType *pnTypes) {
  if (nCount > 0 && !pnTypes) return VI_ERROR_INV_PARAMETER;
  std::lock_guard<std::mutex> aGuard(m_aMutex);
  PObject pc = find(nVi);
  if (!pc || pc->m_eKind != EKind::Session) return VI_ERROR_INV_OBJECT;
  for (ViUInt32 i = 0; i < nCount; ++i) pc->m_setDeclared.insert(pnTypes[i]);
  return VI_SUCCESS;
}

ViStatus CRuntime::createEvent(ViSession nVi, ViEventType nType, ViEvent *pnContext,
                               ViUInt32 *pnMech) {
  if (!pnContext || !pnMech) return VI_ERROR_INV_PARAMETER;
  {
    std::lock_guard<std::mutex> aGuard(m_aMutex);
    PObject pc = find(nVi);
    if (!pc || pc->m_eKind != EKind::Session || pc->m_bClosing) return VI_ERROR_INV_OBJECT;
    auto it = pc->m_mapEnabled.find(nType);
    *pnMech = it == pc->m_mapEnabled.end() ? 0 : (it->second & (VI_QUEUE | VI_HNDLR));
  }
  if (*pnMech == 0) return VI_ERROR_NENABLED;
  PObject pcEvent = add(EKind::Event, 0, "");
  std::lock_guard<std::mutex> aGuard(m_aMutex);
  pcEvent->m_nEventType = nType;
  pcEvent->m_nSource = nVi;
  *pnContext = pcEvent->m_nHandle;
  return VI_SUCCESS;
}

ViStatus CRuntime::raiseEvent(ViSession nVi, ViEvent nContext, ViUInt32 nMech) {
  ViEventType nType = 0;
  bool bHandlers = false;
  bool bQueued = false;
  ViStatus nResult = VI_SUCCESS;
  {
    std::lock_guard<std::mutex> aGuard(m_aMutex);
    PObject pc = find(nVi);
    if (!pc || pc->m_eKind != EKind::Session) return VI_ERROR_INV_OBJECT;
    PObject pcEvent = find(nContext);
    if (!pcEvent || pcEvent->m_eKind != EKind::Event || pcEvent->m_nSource != nVi)
      return VI_ERROR_INV_CONTEXT;
    nType = pcEvent->m_nEventType;
    if (nMech & VI_HNDLR) {
      for (const SHandler &s : pc->m_vHandlers) bHandlers = bHandlers || s.m_nType == nType;
    }
    if ((nMech & VI_QUEUE) && !pc->m_bClosing) {
      if (pc->m_dqQueue.size() >= pc->m_nMaxQueue) {
        // A full queue keeps the events it holds; the new one is lost.
        nResult = VI_ERROR_QUEUE_OVERFLOW;
      } else {
        pc->m_dqQueue.push_back(nContext);
        pc->m_cvChanged.notify_all();
        bQueued = true;
      }
    }
    if (!bHandlers && !bQueued) erase(nContext);
  }
  if (bHandlers) postHandlers(SHandlerJob{nVi, nType, nContext, bQueued});
  return nResult;
}

void CRuntime::postHandlers(const SHandlerJob &sJob) {
  std::lock_guard<std::mutex> aGuard(m_aHandlerMutex);
  m_dqHandlerJobs.push_back(sJob);
  m_cvHandlerJobs.notify_one();
  if (!m_bHandlerThread) {
    // Lives as long as the runtime, which is never destroyed.
    m_bHandlerThread = true;
    std::thread([this] { runHandlers(); }).detach();
  }
}

void CRuntime::runHandlers() {
  for (;;) {
    SHandlerJob sJob;
    {
      std::unique_lock<std::mutex> aLock(m_aHandlerMutex);
      m_cvHandlerJobs.wait(aLock, [this] { return !m_dqHandlerJobs.empty(); });
      sJob = m_dqHandlerJobs.front();
      m_dqHandlerJobs.pop_front();
    }
    // The handlers installed now, the most recently installed first.
    std::vector<SHandler> vHandlers;
    {
      std::lock_guard<std::mutex> aGuard(m_aMutex);
      PObject pc = find(sJob.m_nVi);
      if (pc && !pc->m_bClosing) {
        for (auto it = pc->m_vHandlers.rbegin(); it != pc->m_vHandlers.rend(); ++it)
          if (it->m_nType == sJob.m_nType) vHandlers.push_back(*it);
      }
    }
    for (const SHandler &sHandler : vHandlers)
      if (sHandler.m_pfHandler(sJob.m_nVi, sJob.m_nType, sJob.m_nContext, sHandler.m_pUser) ==
          VI_SUCCESS_NCHAIN)
        break;
    if (!sJob.m_bQueued) {
      // Delivered to the handlers only: its context ends with them.
      std::lock_guard<std::mutex> aGuard(m_aMutex);
      if (find(sJob.m_nContext)) erase(sJob.m_nContext);
    }
  }
}

ViStatus CRuntime::installTable(ViSession nVi, ViSvcHandle hTable) {
  std::lock_guard<std::mutex> aGuard(m_aMutex);
  PObject pc = find(nVi);
  if (!pc || pc->m_eKind != EKind::Session) return VI_ERROR_INV_OBJECT;
  for (auto &pcTable : m_vTables) {
    if (pcTable.get() != hTable) continue;
    pc->m_pcTable = pcTable.get();
    pc->m_apRecord[1] = pcTable.get();
    return VI_SUCCESS;
  }
  return VI_ERROR_INV_OBJECT;
}

ViAddr *CRuntime::sessionRecord(ViSession nVi) {
  std::lock_guard<std::mutex> aGuard(m_aMutex);
  PObject pc = find(nVi);
  return pc && pc->m_eKind == EKind::Session ? pc->m_apRecord : nullptr;
}

ViStatus CRuntime::detach() {
  // Takes no lock: at process exit a lock may be held by a thread that no longer runs.
  static std::atomic<unsigned> s_nDetaches{0};
  ++s_nDetaches;
  return VI_SUCCESS;
}

// ---------------------------------------------------------------------------------------------
// Resource manager

void CRuntime::loadPassports() {
  std::lock_guard<std::mutex> aGuard(m_aLoadMutex);
  if (m_bLoaded) return;
  m_bLoaded = true;
  const PassportConfig::SPassports sPassports = PassportConfig::passports();
  const std::vector<std::string> &vPaths = sPassports.m_vPaths;
  const bool bConfigured = sPassports.m_bConfigured;
  for (const std::string &strPath : vPaths) {
    std::string strFull = Module::hasDirectory(strPath) ? strPath : Module::runtimeDirectory() + strPath;
    std::string strError;
    bool bLoaded = false, bReport = bConfigured;
    // A missing or broken passport must not stop the others, nor the resource manager; an
    // exception that escapes a module's entry counts as a failed load.
    try {
      bLoaded = Module::load(strFull, strError);
    } catch (const std::exception &cError) {
      strError = std::string("exception in the module entry: ") + cError.what();
      bReport = true;
    } catch (...) {
      strError = "exception in the module entry";
      bReport = true;
    }
    if (!bLoaded && bReport)
      std::fprintf(stderr, "visahost: cannot load passport %s: %s\n", strFull.c_str(),
                   strError.c_str());
  }
}

ViStatus CRuntime::openDefaultRM(ViPSession pnVi) {
  if (!pnVi) return VI_ERROR_INV_PARAMETER;
  loadPassports();
  *pnVi = add(EKind::ResourceManager, 0, "")->m_nHandle;
  return VI_SUCCESS;
}

ViStatus CRuntime::findRsrc(ViSession nRm, ViConstString szExpr, ViPFindList pnList,
                            ViPUInt32 pnCount, ViChar szDesc[]) {
  {
    std::lock_guard<std::mutex> aGuard(m_aMutex);
    PObject pc = find(nRm);
    if (!pc) return VI_ERROR_INV_OBJECT;
    if (pc->m_eKind != EKind::ResourceManager) return VI_ERROR_NSUP_OPER;
  }
  if (!szExpr) return VI_ERROR_INV_EXPR;
  try {
    CRsrcExpr cCheck(szExpr);
  } catch (const CRsrcExpr::CInvalidExpression &) {
    return VI_ERROR_INV_EXPR;
  }
  if (!szDesc) return VI_ERROR_USER_BUF;
  if (pnList) *pnList = VI_NULL;
  if (pnCount) *pnCount = 0;
  PObject pcList = add(EKind::FindList, nRm, "");
  for (CTable *pcTable : tablesWith("viFindRsrc")) {
    FFindRsrc pf;
    {
      std::lock_guard<std::mutex> aGuard(m_aMutex);
      pf = reinterpret_cast<FFindRsrc>(pcTable->m_mapOps["viFindRsrc"]);
    }
    ViFindList nList = pcList->m_nHandle;
    tl_pFindTable = pcTable;
    // A passport that fails keeps what it appended; the others are still asked.
    pf(nRm, szExpr, &nList);
    tl_pFindTable = nullptr;
  }
  std::lock_guard<std::mutex> aGuard(m_aMutex);
  if (pcList->m_vFound.empty()) {
    erase(pcList->m_nHandle);
    return VI_ERROR_RSRC_NFOUND;
  }
  copyText(szDesc, pcList->m_vFound[0]);
  pcList->m_nNext = 1;
  if (pnCount) *pnCount = static_cast<ViUInt32>(pcList->m_vFound.size());
  if (pnList) *pnList = pcList->m_nHandle;
  else erase(pcList->m_nHandle);
  return VI_SUCCESS;
}

ViStatus CRuntime::findNext(ViFindList nList, ViChar szDesc[]) {
  std::lock_guard<std::mutex> aGuard(m_aMutex);
  PObject pc = find(nList);
  if (!pc) return VI_ERROR_INV_OBJECT;
  if (pc->m_eKind != EKind::FindList) return VI_ERROR_NSUP_OPER;
  if (!szDesc) return VI_ERROR_USER_BUF;
  if (pc->m_nNext >= pc->m_vFound.size()) return VI_ERROR_RSRC_NFOUND;
  copyText(szDesc, pc->m_vFound[pc->m_nNext++]);
  return VI_SUCCESS;
}

ViStatus CRuntime::parseRsrc(ViSession nRm, ViConstRsrc szName, ViPUInt16 pnType, ViPUInt16 pnNum,
                             ViChar szClass[], ViChar szExpanded[], ViChar szAlias[],
                             bool bExtended) {
  {
    std::lock_guard<std::mutex> aGuard(m_aMutex);
    PObject pc = find(nRm);
    if (!pc) return VI_ERROR_INV_OBJECT;
    if (pc->m_eKind != EKind::ResourceManager) return VI_ERROR_NSUP_OPER;
  }
  if (!szName) return VI_ERROR_INV_RSRC_NAME;
  if (!pnType || !pnNum) return VI_ERROR_INV_PARAMETER;
  const char *szOp = bExtended ? "viParseRsrcEx" : "viParseRsrc";
  for (CTable *pcTable : tablesWith(szOp)) {
    ViSvcProc pf;
    {
      std::lock_guard<std::mutex> aGuard(m_aMutex);
      pf = pcTable->m_mapOps[szOp];
    }
    ViStatus nStatus =
        bExtended ? reinterpret_cast<FParseRsrcEx>(pf)(nRm, szName, pnType, pnNum, szClass,
                                                        szExpanded, szAlias)
                  : reinterpret_cast<FParseRsrc>(pf)(nRm, szName, pnType, pnNum);
    if (nStatus == VI_ERROR_RSRC_NFOUND || nStatus == VI_ERROR_INV_RSRC_NAME) continue;
    return nStatus;
  }
  return VI_ERROR_RSRC_NFOUND;
}

ViStatus CRuntime::open(ViSession nRm, ViConstRsrc szName, ViAccessMode nMode, ViUInt32 nTimeout,
                        ViPSession pnVi) {
  {
    std::lock_guard<std::mutex> aGuard(m_aMutex);
    PObject pc = find(nRm);
    if (!pc) return VI_ERROR_INV_OBJECT;
    if (pc->m_eKind != EKind::ResourceManager) return VI_ERROR_NSUP_OPER;
  }
  if (!pnVi) return VI_ERROR_INV_PARAMETER;
  *pnVi = VI_NULL;
  if (!szName) return VI_ERROR_INV_RSRC_NAME;
  if (nMode & ~static_cast<ViAccessMode>(VI_EXCLUSIVE_LOCK | VI_LOAD_CONFIG))
    return VI_ERROR_INV_ACC_MODE;
  for (CTable *pcTable : tablesWith("viOpen")) {
    FOpen pf;
    {
      std::lock_guard<std::mutex> aGuard(m_aMutex);
      pf = reinterpret_cast<FOpen>(pcTable->m_mapOps["viOpen"]);
    }
    PObject pcSession = add(EKind::Session, nRm, szName);
    ViSession nVi = pcSession->m_nHandle;
    ViStatus nStatus = pf(nRm, szName, nMode, nTimeout, &nVi);
    if (nStatus < 0) {
      {
        std::lock_guard<std::mutex> aGuard(m_aMutex);
        erase(pcSession->m_nHandle);
      }
      if (nStatus == VI_ERROR_RSRC_NFOUND || nStatus == VI_ERROR_INV_RSRC_NAME) continue;
      return nStatus;
    }
    if (nMode & VI_EXCLUSIVE_LOCK) {
      ViStatus nLock = lock(pcSession->m_nHandle, VI_EXCLUSIVE_LOCK, nTimeout, VI_NULL, VI_NULL);
      if (nLock < 0) {
        closeSession(pcSession);
        return nLock;
      }
    }
    *pnVi = pcSession->m_nHandle;
    return nStatus;
  }
  return VI_ERROR_RSRC_NFOUND;
}

// ---------------------------------------------------------------------------------------------
// Closing

ViStatus CRuntime::closeSession(const PObject &pc) {
  FClose pf = nullptr;
  {
    std::unique_lock<std::mutex> aGuard(m_aMutex);
    if (pc->m_bClosing) return VI_ERROR_INV_OBJECT;
    pc->m_bClosing = true;
    pc->m_cvChanged.notify_all();
    unsigned nOwn = inCallCount(pc->m_nHandle);
    pc->m_cvChanged.wait(aGuard, [&] { return pc->m_nCalls <= nOwn; });
    if (pc->m_pcTable && pc->m_pcTable->m_mapOps.count("viClose"))
      pf = reinterpret_cast<FClose>(pc->m_pcTable->m_mapOps["viClose"]);
  }
  ViStatus nStatus = pf ? pf(pc->m_nHandle) : VI_SUCCESS;
  std::lock_guard<std::mutex> aGuard(m_aMutex);
  auto it = m_mapRsrcLocks.find(upper(pc->m_strRsrc));
  if (it != m_mapRsrcLocks.end()) {
    if (it->second.m_nExclusive == pc->m_nHandle) {
      it->second.m_nExclusive = 0;
      it->second.m_nExclusiveDepth = 0;
    }
    it->second.m_mapShared.erase(pc->m_nHandle);
    if (it->second.m_nExclusive == 0 && it->second.m_mapShared.empty()) m_mapRsrcLocks.erase(it);
    m_cvLocks.notify_all();
  }
  for (auto itObj = m_mapObjects.begin(); itObj != m_mapObjects.end();) {
    if (itObj->second->m_eKind == EKind::Event && itObj->second->m_nSource == pc->m_nHandle)
      itObj = m_mapObjects.erase(itObj);
    else
      ++itObj;
  }
  erase(pc->m_nHandle);
  return nStatus < 0 ? nStatus : VI_SUCCESS;
}

ViStatus CRuntime::close(ViObject nVi) {
  if (nVi == VI_NULL) return VI_WARN_NULL_OBJECT;
  PObject pc;
  std::vector<PObject> vSessions;
  {
    std::lock_guard<std::mutex> aGuard(m_aMutex);
    pc = find(nVi);
    if (!pc) return VI_ERROR_INV_OBJECT;
    switch (pc->m_eKind) {
      case EKind::Event: closeEvent(nVi); return VI_SUCCESS;
      case EKind::FindList: erase(nVi); return VI_SUCCESS;
      case EKind::Session: break;
      case EKind::ResourceManager:
        // Closing a resource manager closes everything opened through it.
        for (auto &sEntry : m_mapObjects)
          if (sEntry.second->m_nRm == nVi && sEntry.second->m_eKind == EKind::Session)
            vSessions.push_back(sEntry.second);
        break;
    }
  }
  if (pc->m_eKind == EKind::Session) return closeSession(pc);
  for (const PObject &pcSession : vSessions) closeSession(pcSession);
  std::lock_guard<std::mutex> aGuard(m_aMutex);
  for (auto it = m_mapObjects.begin(); it != m_mapObjects.end();) {
    if (it->second->m_nRm == nVi && it->second->m_eKind == EKind::FindList)
      it = m_mapObjects.erase(it);
    else
      ++it;
  }
  erase(nVi);
  return VI_SUCCESS;
}

// ---------------------------------------------------------------------------------------------
// Basic I/O and attributes: through the session's vector table

ViStatus CRuntime::read(ViSession nVi, ViPBuf pBuf, ViUInt32 nCount, ViPUInt32 pnRet) {
  return route<FRead>(nVi, "viRead", true, pBuf, nCount, pnRet);
}

ViStatus CRuntime::write(ViSession nVi, ViConstBuf pBuf, ViUInt32 nCount, ViPUInt32 pnRet) {
  return route<FWrite>(nVi, "viWrite", true, pBuf, nCount, pnRet);
}

ViStatus CRuntime::readSTB(ViSession nVi, ViPUInt16 pnStatus) {
  return route<FReadSTB>(nVi, "viReadSTB", true, pnStatus);
}

ViStatus CRuntime::clear(ViSession nVi) { return route<FClose>(nVi, "viClear", true); }

ViStatus CRuntime::assertTrigger(ViSession nVi, ViUInt16 nProtocol) {
  return route<FAssertTrigger>(nVi, "viAssertTrigger", true, nProtocol);
}

ViStatus CRuntime::terminate(ViObject nVi, ViUInt16 nDegree, ViJobId nJob) {
  return route<FTerminate>(nVi, "viTerminate", false, nDegree, nJob);
}

ViStatus CRuntime::runtimeAttribute(const PObject &pc, ViAttr nAttr, void *pValue, bool &bDone) {
  std::lock_guard<std::mutex> aGuard(m_aMutex);
  bDone = true;
  switch (pc->m_eKind) {
    case EKind::Event:
      if (nAttr != VI_ATTR_EVENT_TYPE) return VI_ERROR_NSUP_ATTR;
      store<ViEventType>(pValue, pc->m_nEventType);
      return VI_SUCCESS;
    case EKind::FindList: return VI_ERROR_NSUP_ATTR;
    case EKind::ResourceManager:
    case EKind::Session: break;
  }
  switch (nAttr) {
    case VI_ATTR_MAX_QUEUE_LENGTH: store<ViUInt32>(pValue, pc->m_nMaxQueue); return VI_SUCCESS;
    case VI_ATTR_USER_DATA_64: store<ViUInt64>(pValue, pc->m_nUserData); return VI_SUCCESS;
    case VI_ATTR_USER_DATA_32:
      store<ViUInt32>(pValue, static_cast<ViUInt32>(pc->m_nUserData));
      return VI_SUCCESS;
    case VI_ATTR_RSRC_LOCK_STATE: {
      ViAccessMode nState = VI_NO_LOCK;
      auto it = m_mapRsrcLocks.find(upper(pc->m_strRsrc));
      if (pc->m_eKind == EKind::Session && it != m_mapRsrcLocks.end()) {
        if (it->second.m_nExclusive) nState = VI_EXCLUSIVE_LOCK;
        else if (!it->second.m_mapShared.empty()) nState = VI_SHARED_LOCK;
      }
      store<ViAccessMode>(pValue, nState);
      return VI_SUCCESS;
    }
    default: break;
  }
  if (pc->m_eKind == EKind::Session) {
    if (nAttr != VI_ATTR_RM_SESSION) {
      bDone = false;
      return VI_SUCCESS;
    }
    store<ViSession>(pValue, pc->m_nRm);
    return VI_SUCCESS;
  }
  switch (nAttr) {
    case VI_ATTR_RSRC_IMPL_VERSION: store<ViVersion>(pValue, g_nImplVersion); return VI_SUCCESS;
    case VI_ATTR_RSRC_SPEC_VERSION: store<ViVersion>(pValue, VI_SPEC_VERSION); return VI_SUCCESS;
    case VI_ATTR_RSRC_MANF_ID: store<ViUInt16>(pValue, g_nManufacturerId); return VI_SUCCESS;
    case VI_ATTR_RSRC_MANF_NAME: copyText(static_cast<ViChar *>(pValue), g_szManufacturer); return VI_SUCCESS;
    default: return VI_ERROR_NSUP_ATTR;
  }
}

ViStatus CRuntime::getAttribute(ViObject nVi, ViAttr nAttr, void *pValue) {
  PObject pc;
  {
    std::lock_guard<std::mutex> aGuard(m_aMutex);
    pc = find(nVi);
    if (!pc || pc->m_bClosing) return VI_ERROR_INV_OBJECT;
  }
  if (!pValue) return VI_ERROR_INV_PARAMETER;
  bool bDone = false;
  ViStatus nStatus = runtimeAttribute(pc, nAttr, pValue, bDone);
  if (bDone) return nStatus;
  return route<FGetAttribute>(nVi, "viGetAttribute", false, nAttr, pValue);
}

ViStatus CRuntime::setAttribute(ViObject nVi, ViAttr nAttr, ViAttrState nValue) {
  {
    std::lock_guard<std::mutex> aGuard(m_aMutex);
    PObject pc = find(nVi);
    if (!pc || pc->m_bClosing) return VI_ERROR_INV_OBJECT;
    if (pc->m_eKind == EKind::Event || pc->m_eKind == EKind::FindList)
      return nAttr == VI_ATTR_EVENT_TYPE ? VI_ERROR_ATTR_READONLY : VI_ERROR_NSUP_ATTR;
    switch (nAttr) {
      case VI_ATTR_MAX_QUEUE_LENGTH:
        if (nValue == 0 || nValue > 0xFFFFFFFFull) return VI_ERROR_NSUP_ATTR_STATE;
        pc->m_nMaxQueue = static_cast<ViUInt32>(nValue);
        return VI_SUCCESS;
      case VI_ATTR_USER_DATA_64: pc->m_nUserData = nValue; return VI_SUCCESS;
      case VI_ATTR_USER_DATA_32: pc->m_nUserData = static_cast<ViUInt32>(nValue); return VI_SUCCESS;
      case VI_ATTR_RSRC_LOCK_STATE:
      case VI_ATTR_RM_SESSION: return VI_ERROR_ATTR_READONLY;
      default: break;
    }
    if (pc->m_eKind == EKind::ResourceManager) {
      switch (nAttr) {
        case VI_ATTR_RSRC_IMPL_VERSION:
        case VI_ATTR_RSRC_SPEC_VERSION:
        case VI_ATTR_RSRC_MANF_ID:
        case VI_ATTR_RSRC_MANF_NAME: return VI_ERROR_ATTR_READONLY;
        default: return VI_ERROR_NSUP_ATTR;
      }
    }
  }
  return route<FSetAttribute>(nVi, "viSetAttribute", true, nAttr, nValue);
}

// ---------------------------------------------------------------------------------------------
// Events

bool CRuntime::eventTypeKnown(const CObject &cSession, ViEventType nType) const {
  return nType == VI_EVENT_IO_COMPLETION || cSession.m_setDeclared.count(nType) > 0;
}

ViStatus CRuntime::enableEvent(ViSession nVi, ViEventType nType, ViUInt16 nMech,
                               ViEventFilter nContext) {
  bool bAsk = false;
  {
    std::lock_guard<std::mutex> aGuard(m_aMutex);
    PObject pc = find(nVi);
    if (!pc || pc->m_bClosing) return VI_ERROR_INV_OBJECT;
    if (pc->m_eKind != EKind::Session || !eventTypeKnown(*pc, nType)) return VI_ERROR_INV_EVENT;
    if (!validMechanism(nMech, false)) return VI_ERROR_INV_MECH;
    // Suspended handlers are not offered by this runtime.
    if (nMech & VI_SUSPEND_HNDLR) return VI_ERROR_NSUP_MECH;
    if (nContext != VI_NULL) return VI_ERROR_INV_CONTEXT;
    if (nMech & VI_HNDLR) {
      bool bInstalled = false;
      for (const SHandler &s : pc->m_vHandlers) bInstalled = bInstalled || s.m_nType == nType;
      if (!bInstalled) return VI_ERROR_HNDLR_NINSTALLED;
    }
    ViUInt16 nEnabled = pc->m_mapEnabled.count(nType) ? pc->m_mapEnabled[nType] : 0;
    // The passport hears the first enable of a type, which starts its event source, and an
    // enable of what is already enabled, which it answers for itself; adding a further
    // mechanism to an enabled type is the runtime's own business.
    bAsk = nEnabled == 0 || (nEnabled & nMech) == nMech;
  }
  if (bAsk) {
    ViStatus nStatus = route<FEnableEvent>(nVi, "viEnableEvent", false, nType, nMech, nContext);
    if (nStatus < 0 && nStatus != VI_ERROR_NSUP_OPER) return nStatus;
  }
  std::lock_guard<std::mutex> aGuard(m_aMutex);
  PObject pc = find(nVi);
  if (!pc) return VI_ERROR_INV_OBJECT;
  ViUInt16 nEnabled = pc->m_mapEnabled.count(nType) ? pc->m_mapEnabled[nType] : 0;
  pc->m_mapEnabled[nType] = static_cast<ViUInt16>(nEnabled | nMech);
  return (nEnabled & nMech) == nMech ? VI_SUCCESS_EVENT_EN : VI_SUCCESS;
}

ViStatus CRuntime::disableEvent(ViSession nVi, ViEventType nType, ViUInt16 nMech) {
  std::vector<ViEventType> vAsk;
  bool bAny = false;
  {
    std::lock_guard<std::mutex> aGuard(m_aMutex);
    PObject pc = find(nVi);
    if (!pc || pc->m_bClosing) return VI_ERROR_INV_OBJECT;
    if (pc->m_eKind != EKind::Session) return VI_ERROR_INV_EVENT;
    if (nType != VI_ALL_ENABLED_EVENTS && !eventTypeKnown(*pc, nType)) return VI_ERROR_INV_EVENT;
    if (!validMechanism(nMech, true)) return VI_ERROR_INV_MECH;
    // The passport hears the disable that ends a type, which stops its event source, and the
    // disable of a type that is not enabled at all, which it answers for itself. A mechanism
    // that is not enabled on an enabled type leaves the passport's source running.
    if (nType != VI_ALL_ENABLED_EVENTS && !pc->m_mapEnabled.count(nType)) {
      vAsk.push_back(nType);
    }
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
    if (nStatus < 0 && nStatus != VI_ERROR_NSUP_OPER) nResult = nStatus;
  }
  return nResult;
}

ViStatus CRuntime::discardEvents(ViSession nVi, ViEventType nType, ViUInt16 nMech) {
  std::lock_guard<std::mutex> aGuard(m_aMutex);
  PObject pc = find(nVi);
  if (!pc || pc->m_bClosing) return VI_ERROR_INV_OBJECT;
  if (pc->m_eKind != EKind::Session) return VI_ERROR_INV_EVENT;
  if (nType != VI_ALL_ENABLED_EVENTS && !eventTypeKnown(*pc, nType)) return VI_ERROR_INV_EVENT;
  if (!validMechanism(nMech, true)) return VI_ERROR_INV_MECH;
  if (!(nMech & VI_QUEUE)) return VI_SUCCESS_QUEUE_EMPTY;
  std::vector<ViEvent> vDiscard;
  for (ViEvent nEvent : pc->m_dqQueue) {
    PObject pcEvent = find(nEvent);
    if (nType == VI_ALL_ENABLED_EVENTS || (pcEvent && pcEvent->m_nEventType == nType))
      vDiscard.push_back(nEvent);
  }
  for (ViEvent nEvent : vDiscard) closeEvent(nEvent);
  return vDiscard.empty() ? VI_SUCCESS_QUEUE_EMPTY : VI_SUCCESS;
}

ViStatus CRuntime::waitOnEvent(ViSession nVi, ViEventType nType, ViUInt32 nTimeout,
                               ViPEventType pnOutType, ViPEvent pnOutContext) {
  std::unique_lock<std::mutex> aGuard(m_aMutex);
  PObject pc = find(nVi);
  if (!pc || pc->m_bClosing) return VI_ERROR_INV_OBJECT;
  if (pc->m_eKind != EKind::Session) return VI_ERROR_INV_EVENT;
  if (nType != VI_ALL_ENABLED_EVENTS && !eventTypeKnown(*pc, nType)) return VI_ERROR_INV_EVENT;
  bool bEnabled = false;
  for (auto &sEntry : pc->m_mapEnabled)
    if ((nType == VI_ALL_ENABLED_EVENTS || sEntry.first == nType) && (sEntry.second & VI_QUEUE))
      bEnabled = true;
  if (!bEnabled) return VI_ERROR_NENABLED;
  auto fMatching = [&] {
    for (auto it = pc->m_dqQueue.begin(); it != pc->m_dqQueue.end(); ++it) {
      PObject pcEvent = find(*it);
      if (pcEvent && (nType == VI_ALL_ENABLED_EVENTS || pcEvent->m_nEventType == nType)) return it;
    }
    return pc->m_dqQueue.end();
  };
  auto fReady = [&] { return pc->m_bClosing || fMatching() != pc->m_dqQueue.end(); };
  if (nTimeout == VI_TMO_INFINITE) {
    pc->m_cvChanged.wait(aGuard, fReady);
  } else if (!pc->m_cvChanged.wait_for(aGuard, std::chrono::milliseconds(nTimeout), fReady)) {
    return VI_ERROR_TMO;
  }
  if (pc->m_bClosing) return VI_ERROR_INV_OBJECT;
  auto it = fMatching();
  ViEvent nEvent = *it;
  pc->m_dqQueue.erase(it);
  PObject pcEvent = find(nEvent);
  if (pnOutType) *pnOutType = pcEvent->m_nEventType;
  if (pnOutContext) *pnOutContext = nEvent;
  else erase(nEvent);  // nobody can close it later
  return fMatching() != pc->m_dqQueue.end() ? VI_SUCCESS_QUEUE_NEMPTY : VI_SUCCESS;
}

ViStatus CRuntime::installHandler(ViSession nVi, ViEventType nType, ViHndlr pfHandler,
                                  ViAddr pUser) {
  std::lock_guard<std::mutex> aGuard(m_aMutex);
  PObject pc = find(nVi);
  if (!pc || pc->m_bClosing) return VI_ERROR_INV_OBJECT;
  if (pc->m_eKind != EKind::Session || !eventTypeKnown(*pc, nType)) return VI_ERROR_INV_EVENT;
  if (!pfHandler) return VI_ERROR_INV_HNDLR_REF;
  pc->m_vHandlers.push_back(SHandler{nType, pfHandler, pUser});
  return VI_SUCCESS;
}

ViStatus CRuntime::uninstallHandler(ViSession nVi, ViEventType nType, ViHndlr pfHandler,
                                    ViAddr pUser) {
  std::lock_guard<std::mutex> aGuard(m_aMutex);
  PObject pc = find(nVi);
  if (!pc || pc->m_bClosing) return VI_ERROR_INV_OBJECT;
  if (pc->m_eKind != EKind::Session) return VI_ERROR_INV_EVENT;
  if (nType != VI_ALL_ENABLED_EVENTS && !eventTypeKnown(*pc, nType)) return VI_ERROR_INV_EVENT;
  auto &v = pc->m_vHandlers;
  size_t nBefore = v.size();
  v.erase(std::remove_if(v.begin(), v.end(),
                         [&](const SHandler &s) {
                           return (nType == VI_ALL_ENABLED_EVENTS || s.m_nType == nType) &&
                                  (pfHandler == VI_ANY_HNDLR ||
                                   (s.m_pfHandler == pfHandler && s.m_pUser == pUser));
                         }),
          v.end());
  return v.size() == nBefore ? VI_ERROR_INV_HNDLR_REF : VI_SUCCESS;
}

// ---------------------------------------------------------------------------------------------
// Status texts and resource locks

ViStatus CRuntime::statusDesc(ViObject, ViStatus nStatus, ViChar szDesc[]) {
  // Any handle is accepted: a description is most wanted after a session failed.
  if (!szDesc) return VI_ERROR_USER_BUF;
  std::string strText;
  bool bKnown = statusText(nStatus, strText);
  copyText(szDesc, strText);
  return bKnown ? VI_SUCCESS : VI_WARN_UNKNOWN_STATUS;
}

bool CRuntime::accessAllowed(const CObject &c) const {
  auto it = m_mapRsrcLocks.find(upper(c.m_strRsrc));
  if (it == m_mapRsrcLocks.end()) return true;
  const SRsrcLock &s = it->second;
  if (s.m_nExclusive) return s.m_nExclusive == c.m_nHandle;
  return s.m_mapShared.empty() || s.m_mapShared.count(c.m_nHandle) > 0;
}

ViStatus CRuntime::lock(ViSession nVi, ViAccessMode nType, ViUInt32 nTimeout,
                        ViConstKeyId szRequested, ViChar szAccessKey[]) {
  std::unique_lock<std::mutex> aGuard(m_aMutex);
  PObject pc = find(nVi);
  if (!pc || pc->m_bClosing) return VI_ERROR_INV_OBJECT;
  if (pc->m_eKind != EKind::Session) return VI_ERROR_NSUP_OPER;
  if (nType != VI_EXCLUSIVE_LOCK && nType != VI_SHARED_LOCK) return VI_ERROR_INV_LOCK_TYPE;
  if (nType == VI_SHARED_LOCK && !szAccessKey) return VI_ERROR_INV_PARAMETER;
  std::string strKey = upper(pc->m_strRsrc);
  SRsrcLock &s = m_mapRsrcLocks[strKey];
  if (nType == VI_EXCLUSIVE_LOCK && s.m_nExclusive == nVi) {
    ++s.m_nExclusiveDepth;
    return VI_SUCCESS_NESTED_EXCLUSIVE;
  }
  if (nType == VI_SHARED_LOCK && s.m_mapShared.count(nVi)) {
    ++s.m_mapShared[nVi];
    copyText(szAccessKey, s.m_strSharedKey);
    return VI_SUCCESS_NESTED_SHARED;
  }
  if (nType == VI_SHARED_LOCK && szRequested && !s.m_strSharedKey.empty() &&
      s.m_strSharedKey != szRequested)
    return VI_ERROR_INV_ACCESS_KEY;
  auto fFree = [&] {
    SRsrcLock &t = m_mapRsrcLocks[strKey];
    if (t.m_nExclusive && t.m_nExclusive != nVi) return false;
    if (nType == VI_SHARED_LOCK) return t.m_strSharedKey.empty() || !szRequested || t.m_strSharedKey == szRequested;
    for (auto &sEntry : t.m_mapShared)
      if (sEntry.first != nVi) return false;
    return true;
  };
  bool bFree = nTimeout == VI_TMO_INFINITE
                   ? (m_cvLocks.wait(aGuard, [&] { return fFree() || pc->m_bClosing; }), true)
                   : m_cvLocks.wait_for(aGuard, std::chrono::milliseconds(nTimeout),
                                        [&] { return fFree() || pc->m_bClosing; });
  if (pc->m_bClosing) return VI_ERROR_INV_OBJECT;
  if (!bFree || !fFree()) return VI_ERROR_TMO;
  SRsrcLock &t = m_mapRsrcLocks[strKey];
  if (nType == VI_EXCLUSIVE_LOCK) {
    t.m_nExclusive = nVi;
    t.m_nExclusiveDepth = 1;
    return VI_SUCCESS;
  }
  if (t.m_strSharedKey.empty())
    t.m_strSharedKey = szRequested ? std::string(szRequested) : "lbvisa-key-" + std::to_string(++m_nKeys);
  t.m_mapShared[nVi] = 1;
  copyText(szAccessKey, t.m_strSharedKey);
  return VI_SUCCESS;
}

ViStatus CRuntime::unlock(ViSession nVi) {
  std::lock_guard<std::mutex> aGuard(m_aMutex);
  PObject pc = find(nVi);
  if (!pc || pc->m_bClosing) return VI_ERROR_INV_OBJECT;
  if (pc->m_eKind != EKind::Session) return VI_ERROR_NSUP_OPER;
  auto it = m_mapRsrcLocks.find(upper(pc->m_strRsrc));
  if (it == m_mapRsrcLocks.end()) return VI_ERROR_SESN_NLOCKED;
  SRsrcLock &s = it->second;
  if (s.m_nExclusive == nVi) {
    if (--s.m_nExclusiveDepth == 0) s.m_nExclusive = 0;
  } else if (s.m_mapShared.count(nVi)) {
    if (--s.m_mapShared[nVi] == 0) s.m_mapShared.erase(nVi);
  } else {
    return VI_ERROR_SESN_NLOCKED;
  }
  if (s.m_mapShared.empty()) s.m_strSharedKey.clear();
  if (s.m_nExclusive == 0 && s.m_mapShared.empty()) m_mapRsrcLocks.erase(it);
  m_cvLocks.notify_all();
  return VI_SUCCESS;
}

}  // namespace LbVisaHost
