// The runtime's core: the one instance, the object map (handles are never reused), vector-table
// lookups, and basic I/O routed to the session's vector table. The other concerns live beside:
//   RuntimeServices.cpp    services passports call: locks, tables, matching, find lists
//   RuntimeFindOpen.cpp    passport loading, resource manager, find, parse, open
//   RuntimeClose.cpp       closing sessions, find lists, event contexts and resource managers
//   RuntimeAttributes.cpp  attributes the runtime answers itself, the rest routed; status texts
//   RuntimeEvents.cpp      event enabling, queues, waiting, handlers and their thread
//   RuntimeLocks.cpp       viLock / viUnlock on resources
//   RuntimeAsync.cpp       asynchronous reads and writes, viTerminate
#include "visahost/RuntimeInternal.h"

#include <algorithm>
#include <cctype>

namespace LbVisaHost {

LbCore::CMutex g_aRuntimeMutex;

namespace {
// Innermost call in progress on this thread (see CInCall).
thread_local CInCall* tl_pcInCall = nullptr;
} // namespace

CInCall::CInCall(ViSession nVi) : m_nVi(nVi), m_pcOuter(tl_pcInCall)
{
    tl_pcInCall = this;
}

CInCall::~CInCall()
{
    tl_pcInCall = m_pcOuter;
}

unsigned CInCall::count(ViSession nVi)
{
    unsigned nCount = 0;
    for (const CInCall* pc = tl_pcInCall; pc; pc = pc->m_pcOuter)
        nCount += pc->m_nVi == nVi ? 1 : 0;
    return nCount;
}

void copyText(ViChar* szDest, const std::string& strText)
{
    size_t nLen = std::min<size_t>(strText.size(), VI_FIND_BUFLEN - 1);
    std::memcpy(szDest, strText.data(), nLen);
    szDest[nLen] = '\0';
}

std::string upper(std::string strText)
{
    for (char& c : strText)
        c = static_cast<char>(std::toupper(static_cast<unsigned char>(c)));
    return strText;
}

CRuntime& CRuntime::instance()
{
    // Never destroyed: passports call services while the process unloads them.
    static CRuntime* s_pcRuntime = new CRuntime();
    return *s_pcRuntime;
}

// ---------------------------------------------------------------------------------------------
// Objects and tables

PObject CRuntime::find(ViObject nHandle) const
{
    auto it = m_mapObjects.find(nHandle);
    return it == m_mapObjects.end() ? PObject() : it->second;
}

PSession CRuntime::findSession(ViObject nHandle) const
{
    return as<CSession>(find(nHandle), EKind::Session);
}

PSession CRuntime::openSession(ViObject nVi, ViStatus nNotSession, ViStatus& nStatus) const
{
    PObject pcObject = find(nVi);
    PSession pc = as<CSession>(pcObject, EKind::Session);
    if (!pcObject || (pc && pc->m_bClosing)) {
        nStatus = VI_ERROR_INV_OBJECT;
        return nullptr;
    }
    if (!pc)
        nStatus = nNotSession;
    return pc;
}

void CRuntime::publish(const PObject& pc)
{
    LbCore::CMutexLock aGuard(g_aRuntimeMutex);
    if (m_nNextHandle == VI_NULL)
        ++m_nNextHandle;
    pc->m_nHandle = m_nNextHandle++;
    if (pc->m_eKind == EKind::Session) {
        auto* pcSession = static_cast<CSession*>(pc.get());
        pcSession->m_apRecord[RECORD_SESSION] = pcSession;
    }
    m_mapObjects[pc->m_nHandle] = pc;
}

void CRuntime::erase(ViObject nHandle)
{
    m_mapObjects.erase(nHandle);
}

ViSvcProc CRuntime::operation(const CTable* pcTable, const char* szOp) const
{
    if (!pcTable)
        return nullptr;
    auto it = pcTable->m_mapOps.find(szOp);
    return it == pcTable->m_mapOps.end() ? nullptr : it->second;
}

std::vector<CTable*> CRuntime::tablesWith(const char* szOperation)
{
    LbCore::CMutexLock aGuard(g_aRuntimeMutex);
    std::vector<CTable*> v;
    for (auto& pc : m_vTables)
        if (pc->m_mapOps.count(szOperation))
            v.push_back(pc.get());
    return v;
}

ViStatus CRuntime::checkRm(ViSession nRm)
{
    LbCore::CMutexLock aGuard(g_aRuntimeMutex);
    PObject pc = find(nRm);
    if (!pc)
        return VI_ERROR_INV_OBJECT;
    return pc->m_eKind == EKind::ResourceManager ? VI_SUCCESS : VI_ERROR_NSUP_OPER;
}

// ---------------------------------------------------------------------------------------------
// Basic I/O: through the session's vector table

ViStatus CRuntime::read(ViSession nVi, ViPBuf pBuf, ViUInt32 nCount, ViPUInt32 pnRet)
{
    return route<FRead>(nVi, "viRead", true, pBuf, nCount, pnRet);
}

ViStatus CRuntime::write(ViSession nVi, ViConstBuf pBuf, ViUInt32 nCount, ViPUInt32 pnRet)
{
    return route<FWrite>(nVi, "viWrite", true, pBuf, nCount, pnRet);
}

ViStatus CRuntime::readSTB(ViSession nVi, ViPUInt16 pnStatus)
{
    return route<FReadSTB>(nVi, "viReadSTB", true, pnStatus);
}

ViStatus CRuntime::clear(ViSession nVi)
{
    return route<FSessionOnly>(nVi, "viClear", true);
}

ViStatus CRuntime::assertTrigger(ViSession nVi, ViUInt16 nProtocol)
{
    return route<FAssertTrigger>(nVi, "viAssertTrigger", true, nProtocol);
}

} // namespace LbVisaHost
