// The services passports call (see Services.h): named locks (30-32), vector tables (40, 41,
// 56), resource-expression matching during a find (43, 44), find lists (45), event types (50),
// the session record (57) and the detach acknowledgement (63). Event creation and raising
// (51, 52) live in RuntimeEvents.cpp.
#include "visahost/RuntimeInternal.h"

#include "visahost/RsrcExpr.h"

namespace LbVisaHost {

namespace {

bool compare(ViUInt16 nOp, ViAttrState a, ViAttrState b)
{
    switch (nOp) {
    case LBVISA_OP_EQ:
        return a == b;
    case LBVISA_OP_NE:
        return a != b;
    case LBVISA_OP_LT:
        return a < b;
    case LBVISA_OP_GT:
        return a > b;
    case LBVISA_OP_LE:
        return a <= b;
    default:
        return a >= b;
    }
}

} // namespace

thread_local CTable* tl_pcFindTable = nullptr;

ViStatus CRuntime::createLock(ViConstString szName, ViUInt32 nInitial, ViUInt32 nMaximum, ViSvcHandle* phLock)
{
    if (!szName || !phLock || nMaximum == 0 || nInitial > nMaximum)
        return VI_ERROR_INV_PARAMETER;
    LbCore::CMutexLock aGuard(g_aRuntimeMutex);
    // Locks are named: creating a name again hands out the same lock, with its first counts.
    auto& pc = m_mapLocks[szName];
    if (!pc)
        pc.reset(new CSvcLock(nInitial, nMaximum));
    *phLock = pc.get();
    return VI_SUCCESS;
}

CRuntime::CSvcLock* CRuntime::findLock(ViSvcHandle hLock)
{
    LbCore::CMutexLock aGuard(g_aRuntimeMutex);
    for (auto& sEntry : m_mapLocks)
        if (sEntry.second.get() == hLock)
            return sEntry.second.get();
    return nullptr;
}

ViStatus CRuntime::acquireLock(ViSvcHandle hLock, ViUInt32 nTimeout)
{
    CSvcLock* pc = findLock(hLock);
    if (!pc)
        return VI_ERROR_INV_OBJECT;
    LbCore::CMutexLock aGuard(pc->m_aMutex);
    std::unique_lock<std::mutex> aWait(pc->m_aMutex.native(), std::adopt_lock);
    auto bFree = [pc]() REQUIRES(pc->m_aMutex) { return pc->m_nCount > 0; };
    bool bAcquired = true;
    if (nTimeout == VI_TMO_INFINITE) {
        pc->m_cvFree.wait(aWait, bFree);
    } else {
        bAcquired = pc->m_cvFree.wait_for(aWait, std::chrono::milliseconds(nTimeout), bFree);
    }
    aWait.release();
    if (!bAcquired)
        return VI_ERROR_TMO;
    --pc->m_nCount;
    return VI_SUCCESS;
}

ViStatus CRuntime::releaseLock(ViSvcHandle hLock)
{
    CSvcLock* pc = findLock(hLock);
    if (!pc)
        return VI_ERROR_INV_OBJECT;
    LbCore::CMutexLock aGuard(pc->m_aMutex);
    // A release beyond the maximum has nothing to give back.
    if (pc->m_nCount >= pc->m_nMaximum)
        return VI_ERROR_SESN_NLOCKED;
    ++pc->m_nCount;
    pc->m_cvFree.notify_one();
    return VI_SUCCESS;
}

ViStatus CRuntime::createTable(ViConstString szName, ViVersion, ViSvcHandle* phTable)
{
    if (!szName || !phTable)
        return VI_ERROR_INV_PARAMETER;
    LbCore::CMutexLock aGuard(g_aRuntimeMutex);
    m_vTables.emplace_back(new CTable());
    m_vTables.back()->m_strName = szName;
    *phTable = m_vTables.back().get();
    return VI_SUCCESS;
}

ViStatus CRuntime::addOperation(ViSvcHandle hTable, ViConstString szOperation, ViSvcProc pfEntry)
{
    LbCore::CMutexLock aGuard(g_aRuntimeMutex);
    for (auto& pc : m_vTables) {
        if (pc.get() != hTable)
            continue;
        if (!szOperation || !pfEntry)
            return VI_ERROR_INV_PARAMETER;
        pc->m_mapOps[szOperation] = pfEntry;
        return VI_SUCCESS;
    }
    return VI_ERROR_INV_OBJECT;
}

ViStatus CRuntime::installTable(ViSession nVi, ViSvcHandle hTable)
{
    LbCore::CMutexLock aGuard(g_aRuntimeMutex);
    PSession pc = findSession(nVi);
    if (!pc)
        return VI_ERROR_INV_OBJECT;
    for (auto& pcTable : m_vTables) {
        if (pcTable.get() != hTable)
            continue;
        pc->m_pcTable = pcTable.get();
        pc->m_apRecord[RECORD_TABLE] = pcTable.get();
        return VI_SUCCESS;
    }
    return VI_ERROR_INV_OBJECT;
}

ViStatus CRuntime::matchRsrc(ViSession nRm, ViConstString szExpr, ViConstString szRsrc, ViUInt16* pnFlag)
{
    if (!szExpr)
        return VI_ERROR_INV_EXPR;
    if (!szRsrc || !pnFlag)
        return VI_ERROR_INV_PARAMETER;
    if (checkRm(nRm) != VI_SUCCESS)
        return VI_ERROR_INV_OBJECT;
    try {
        CRsrcExpr cExpr(szExpr);
        *pnFlag = 0;
        if (!cExpr.matches(szRsrc))
            return VI_ERROR_RSRC_NFOUND;
        *pnFlag = cExpr.hasAttributes() ? 1 : 0;
        return VI_SUCCESS;
    } catch (const CRsrcExpr::CInvalidExpression&) {
        return VI_ERROR_INV_EXPR;
    }
}

ViStatus CRuntime::matchAttributes(ViSession nRm, ViConstString szExpr, ViConstString szRsrc,
                                   ViSvcFindCallback pfCallback)
{
    if (!szExpr)
        return VI_ERROR_INV_EXPR;
    if (!szRsrc)
        return VI_ERROR_INV_PARAMETER;
    if (checkRm(nRm) != VI_SUCCESS)
        return VI_ERROR_INV_OBJECT;
    bool bCanOpen = false;
    {
        LbCore::CMutexLock aGuard(g_aRuntimeMutex);
        bCanOpen = operation(tl_pcFindTable, "viOpen") != nullptr;
    }
    std::unique_ptr<CRsrcExpr> pcExpr;
    try {
        pcExpr.reset(new CRsrcExpr(szExpr));
    } catch (const CRsrcExpr::CInvalidExpression&) {
        return VI_ERROR_INV_EXPR;
    }
    if (!pcExpr->hasAttributes())
        return VI_SUCCESS;
    // Attributes are those of an open session: open the resource for the time of the match.
    if (!tl_pcFindTable)
        return VI_ERROR_INV_SETUP;
    if (!bCanOpen)
        return VI_ERROR_RSRC_NFOUND;
    ViStatus nOpen = VI_SUCCESS;
    PSession pcSession = openWith(tl_pcFindTable, nRm, szRsrc, VI_NULL, 0, nOpen);
    if (!pcSession)
        return VI_ERROR_RSRC_NFOUND;
    ViSession nVi = pcSession->m_nHandle;
    auto fCondition = [&](const SAttrCondition& sCond) {
        if (pfCallback) {
            ViStatus nStatus = pfCallback(nVi, sCond.m_nAttr, sCond.m_nOp, sCond.m_nValue,
                                          sCond.m_bText ? sCond.m_strText.c_str() : nullptr, 0);
            if (nStatus == VI_SUCCESS)
                return true;
            if (nStatus == VI_ERROR_RSRC_NFOUND)
                return false;
        }
        union {
            ViAttrState m_nValue;
            ViChar m_szText[VI_FIND_BUFLEN];
        } uValue;
        std::memset(&uValue, 0, sizeof uValue);
        if (getAttribute(nVi, sCond.m_nAttr, &uValue) < 0)
            return false;
        if (sCond.m_bText) {
            uValue.m_szText[VI_FIND_BUFLEN - 1] = '\0';
            bool bEqual = CRsrcExpr::matchesRegex(sCond.m_strText, uValue.m_szText);
            return sCond.m_nOp == LBVISA_OP_EQ ? bEqual : !bEqual;
        }
        return compare(sCond.m_nOp, uValue.m_nValue, sCond.m_nValue);
    };
    bool bMatch = false;
    try {
        bMatch = pcExpr->matchesAttributes(fCondition);
    } catch (const std::exception&) {
        bMatch = false;
    }
    closeSession(pcSession);
    return bMatch ? VI_SUCCESS : VI_ERROR_RSRC_NFOUND;
}

ViStatus CRuntime::appendFound(ViFindList nList, ViConstString szRsrc)
{
    if (!szRsrc)
        return VI_ERROR_INV_PARAMETER;
    LbCore::CMutexLock aGuard(g_aRuntimeMutex);
    PFindList pc = as<CFindList>(find(nList), EKind::FindList);
    if (!pc)
        return VI_ERROR_INV_OBJECT;
    // Two passports may report one resource; the list names it once.
    std::string strKey = upper(szRsrc);
    for (const std::string& str : pc->m_vFound)
        if (upper(str) == strKey)
            return VI_SUCCESS;
    pc->m_vFound.push_back(szRsrc);
    return VI_SUCCESS;
}

ViStatus CRuntime::declareEvents(ViSession nVi, ViUInt32 nCount, const ViEventType* pnTypes)
{
    if (nCount > 0 && !pnTypes)
        return VI_ERROR_INV_PARAMETER;
    LbCore::CMutexLock aGuard(g_aRuntimeMutex);
    PSession pc = findSession(nVi);
    if (!pc)
        return VI_ERROR_INV_OBJECT;
    for (ViUInt32 i = 0; i < nCount; ++i)
        pc->m_setDeclared.insert(pnTypes[i]);
    return VI_SUCCESS;
}

ViAddr* CRuntime::sessionRecord(ViSession nVi)
{
    LbCore::CMutexLock aGuard(g_aRuntimeMutex);
    PSession pc = findSession(nVi);
    return pc ? pc->m_apRecord : nullptr;
}

ViStatus CRuntime::detach()
{
    // Takes no lock: at process exit a lock may be held by a thread that no longer runs.
    return VI_SUCCESS;
}

} // namespace LbVisaHost
