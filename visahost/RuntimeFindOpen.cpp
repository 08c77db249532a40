// Passport loading and the resource manager's operations: viOpenDefaultRM, viFindRsrc /
// viFindNext, viParseRsrc(Ex) and viOpen. Resource-manager calls go to the passports' tables in
// the order the tables were created.
#include "visahost/RuntimeInternal.h"

#include <cstdio>

#include "visahost/Module.h"
#include "visahost/PassportConfig.h"
#include "visahost/RsrcExpr.h"

namespace LbVisaHost {

void CRuntime::loadPassports()
{
    LbCore::CMutexLock aGuard(m_aLoadMutex);
    if (m_bLoaded)
        return;
    m_bLoaded = true;
    const PassportConfig::SPassports sPassports = PassportConfig::passports();
    const std::vector<std::string>& vPaths = sPassports.m_vPaths;
    const bool bConfigured = sPassports.m_bConfigured;
    for (const std::string& strPath : vPaths) {
        std::string strFull = Module::hasDirectory(strPath) ? strPath : Module::runtimeDirectory() + strPath;
        std::string strError;
        bool bLoaded = false, bReport = bConfigured;
        // A missing or broken passport must not stop the others, nor the resource manager; an
        // exception that escapes a module's entry counts as a failed load.
        try {
            bLoaded = Module::load(strFull, strError);
        } catch (const std::exception& cError) {
            strError = std::string("exception in the module entry: ") + cError.what();
            bReport = true;
        } catch (...) {
            strError = "exception in the module entry";
            bReport = true;
        }
        if (!bLoaded && bReport)
            std::fprintf(stderr, "visahost: cannot load passport %s: %s\n", strFull.c_str(), strError.c_str());
    }
}

ViStatus CRuntime::openDefaultRM(ViPSession pnVi)
{
    if (!pnVi)
        return VI_ERROR_INV_PARAMETER;
    loadPassports();
    auto pc = std::make_shared<CRsrcManager>();
    publish(pc);
    *pnVi = pc->m_nHandle;
    return VI_SUCCESS;
}

ViStatus CRuntime::findRsrc(ViSession nRm, ViConstString szExpr, ViPFindList pnList, ViPUInt32 pnCount, ViChar szDesc[])
{
    ViStatus nCheck = checkRm(nRm);
    if (nCheck != VI_SUCCESS)
        return nCheck;
    if (!szExpr)
        return VI_ERROR_INV_EXPR;
    try {
        CRsrcExpr cCheck(szExpr);
    } catch (const CRsrcExpr::CInvalidExpression&) {
        return VI_ERROR_INV_EXPR;
    }
    if (!szDesc)
        return VI_ERROR_USER_BUF;
    if (pnList)
        *pnList = VI_NULL;
    if (pnCount)
        *pnCount = 0;
    auto pcList = std::make_shared<CFindList>(nRm);
    publish(pcList);
    for (CTable* pcTable : tablesWith("viFindRsrc")) {
        FFindRsrc pf;
        {
            LbCore::CMutexLock aGuard(g_aRuntimeMutex);
            pf = reinterpret_cast<FFindRsrc>(operation(pcTable, "viFindRsrc"));
        }
        ViFindList nList = pcList->m_nHandle;
        // A passport that fails, even by throwing, keeps what it appended; the others are still
        // asked, and the marker of the running find ends with the call in every case.
        struct SFindMarker {
            explicit SFindMarker(CTable* pc) { tl_pcFindTable = pc; }
            ~SFindMarker() { tl_pcFindTable = nullptr; }
        } sMarker(pcTable);
        try {
            pf(nRm, szExpr, &nList);
        } catch (...) {
        }
    }
    LbCore::CMutexLock aGuard(g_aRuntimeMutex);
    if (pcList->m_vFound.empty()) {
        erase(pcList->m_nHandle);
        return VI_ERROR_RSRC_NFOUND;
    }
    copyText(szDesc, pcList->m_vFound[0]);
    pcList->m_nNext = 1;
    if (pnCount)
        *pnCount = static_cast<ViUInt32>(pcList->m_vFound.size());
    if (pnList)
        *pnList = pcList->m_nHandle;
    else
        erase(pcList->m_nHandle);
    return VI_SUCCESS;
}

ViStatus CRuntime::findNext(ViFindList nList, ViChar szDesc[])
{
    LbCore::CMutexLock aGuard(g_aRuntimeMutex);
    PObject pcObject = find(nList);
    if (!pcObject)
        return VI_ERROR_INV_OBJECT;
    PFindList pc = as<CFindList>(pcObject, EKind::FindList);
    if (!pc)
        return VI_ERROR_NSUP_OPER;
    if (!szDesc)
        return VI_ERROR_USER_BUF;
    if (pc->m_nNext >= pc->m_vFound.size())
        return VI_ERROR_RSRC_NFOUND;
    copyText(szDesc, pc->m_vFound[pc->m_nNext++]);
    return VI_SUCCESS;
}

ViStatus CRuntime::parseRsrc(ViSession nRm, ViConstRsrc szName, ViPUInt16 pnType, ViPUInt16 pnNum, ViChar szClass[],
                             ViChar szExpanded[], ViChar szAlias[], bool bExtended)
{
    ViStatus nCheck = checkRm(nRm);
    if (nCheck != VI_SUCCESS)
        return nCheck;
    if (!szName)
        return VI_ERROR_INV_RSRC_NAME;
    if (!pnType || !pnNum)
        return VI_ERROR_INV_PARAMETER;
    const char* szOp = bExtended ? "viParseRsrcEx" : "viParseRsrc";
    for (CTable* pcTable : tablesWith(szOp)) {
        ViSvcProc pf;
        {
            LbCore::CMutexLock aGuard(g_aRuntimeMutex);
            pf = operation(pcTable, szOp);
        }
        ViStatus nStatus = bExtended
            ? reinterpret_cast<FParseRsrcEx>(pf)(nRm, szName, pnType, pnNum, szClass, szExpanded, szAlias)
            : reinterpret_cast<FParseRsrc>(pf)(nRm, szName, pnType, pnNum);
        if (nStatus == VI_ERROR_RSRC_NFOUND || nStatus == VI_ERROR_INV_RSRC_NAME)
            continue;
        return nStatus;
    }
    return VI_ERROR_RSRC_NFOUND;
}

PSession CRuntime::openWith(CTable* pcTable, ViSession nRm, ViConstRsrc szName, ViAccessMode nMode, ViUInt32 nTimeout,
                            ViStatus& nStatus)
{
    FOpen pfOpen;
    FParseRsrcEx pfParse;
    FGetAttribute pfGet;
    {
        LbCore::CMutexLock aGuard(g_aRuntimeMutex);
        pfOpen = reinterpret_cast<FOpen>(operation(pcTable, "viOpen"));
        pfParse = reinterpret_cast<FParseRsrcEx>(operation(pcTable, "viParseRsrcEx"));
        pfGet = reinterpret_cast<FGetAttribute>(operation(pcTable, "viGetAttribute"));
    }
    SParsedRsrc sParsed;
    ViChar szClass[VI_FIND_BUFLEN] = {}, szExpanded[VI_FIND_BUFLEN] = {}, szAlias[VI_FIND_BUFLEN] = {};
    if (pfParse &&
        pfParse(nRm, szName, &sParsed.m_nIntfType, &sParsed.m_nIntfNum, szClass, szExpanded, szAlias) >= VI_SUCCESS) {
        sParsed.m_bParsed = true;
        sParsed.m_strClass = szClass;
        sParsed.m_strExpanded = szExpanded[0] ? szExpanded : szName;
    }
    auto pcSession = std::make_shared<CSession>(nRm, sParsed,
                                                upper(sParsed.m_bParsed ? sParsed.m_strExpanded : std::string(szName)));
    publish(pcSession);
    ViSession nVi = pcSession->m_nHandle;
    nStatus = pfOpen(nRm, szName, nMode, nTimeout, &nVi);
    if (nStatus < 0) {
        LbCore::CMutexLock aGuard(g_aRuntimeMutex);
        erase(pcSession->m_nHandle);
        return PSession();
    }
    // The resource's own name, when the passport tells it, is the most canonical spelling.
    ViChar szOwnName[VI_FIND_BUFLEN] = {};
    if (pfGet && pfGet(pcSession->m_nHandle, VI_ATTR_RSRC_NAME, szOwnName) >= VI_SUCCESS && szOwnName[0]) {
        szOwnName[VI_FIND_BUFLEN - 1] = '\0';
        LbCore::CMutexLock aGuard(g_aRuntimeMutex);
        pcSession->m_strLockKey = upper(szOwnName);
    }
    return pcSession;
}

ViStatus CRuntime::open(ViSession nRm, ViConstRsrc szName, ViAccessMode nMode, ViUInt32 nTimeout, ViPSession pnVi)
{
    ViStatus nCheck = checkRm(nRm);
    if (nCheck != VI_SUCCESS)
        return nCheck;
    if (!pnVi)
        return VI_ERROR_INV_PARAMETER;
    *pnVi = VI_NULL;
    if (!szName)
        return VI_ERROR_INV_RSRC_NAME;
    if (nMode & ~static_cast<ViAccessMode>(VI_EXCLUSIVE_LOCK | VI_LOAD_CONFIG))
        return VI_ERROR_INV_ACC_MODE;
    for (CTable* pcTable : tablesWith("viOpen")) {
        ViStatus nStatus = VI_SUCCESS;
        PSession pcSession = openWith(pcTable, nRm, szName, nMode, nTimeout, nStatus);
        if (!pcSession) {
            if (nStatus == VI_ERROR_RSRC_NFOUND || nStatus == VI_ERROR_INV_RSRC_NAME)
                continue;
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

} // namespace LbVisaHost
