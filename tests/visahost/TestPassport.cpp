// A passport for the runtime's tests, built and loaded like the real one and registered only
// through the service wrapper. Resources "TEST::1::INSTR" and "TEST::2::INSTR" (VI_ATTR_MANF_ID
// is the number); reads return what the last write left (VI_SUCCESS_MAX_CNT while some is
// left); after a write "WHOLE text" reads deliver "text" whole or fail with VI_ERROR_USER_BUF
// and keep it; a write "EVENT n" raises n service requests;
// after a write "HANG" a read raises one service request and waits until the session closes;
// viAssertTrigger, viClear, viTerminate and viSetAttribute are missing on purpose.
#include <cctype>
#include <condition_variable>
#include <cstdlib>
#include <cstring>
#include <mutex>
#include <set>
#include <stdexcept>
#include <string>

#include "passport/NiViSv.h"

#if defined(_WIN32)
#include <windows.h>
#endif

using LbPmxPassport::CNiViSv;

namespace {

CNiViSv::THandle g_hLock;
CNiViSv::THandle g_hTable;
const char* const g_aszRsrc[] = {"TEST::1::INSTR", "TEST::2::INSTR"};

struct SSession {
    int m_nNumber;
    std::string m_strData;
    std::set<ViEventType> m_setEnabled;
    std::mutex m_aMutex; // for hanging reads
    std::condition_variable m_cvChanged;
    bool m_bClosed = false;
    int m_nReaders = 0;
    bool m_bWhole = false; // the answer goes out whole or not at all
};

void raiseServiceRequest(ViSession vi)
{
    ViEvent nContext = 0;
    ViUInt32 nMech = 0;
    if (CNiViSv::createEvent(vi, VI_EVENT_SERVICE_REQ, &nContext, &nMech) == VI_SUCCESS)
        CNiViSv::raiseEvent(vi, nContext, nMech);
}

SSession* object(ViSession vi)
{
    return static_cast<SSession*>(CNiViSv::sessionRecord(vi)[2]);
}

// The resource's number; "TEST::n" names "TEST::n::INSTR" too.
int number(ViConstRsrc szName)
{
    for (int i = 0; i < 2; ++i) {
        size_t n = 0;
        while (szName[n] && std::toupper(static_cast<unsigned char>(szName[n])) == g_aszRsrc[i][n])
            ++n;
        if (szName[n] == '\0' && (g_aszRsrc[i][n] == '\0' || n == 7))
            return i + 1;
    }
    return 0;
}

ViStatus _VI_FUNCH findCallback(ViSession vi, ViAttr, ViUInt16, ViAttrState, ViConstString, ViUInt32)
{
    return object(vi) ? VI_ERROR_NSUP_ATTR : VI_ERROR_SYSTEM_ERROR;
}

ViStatus _VI_FUNC tpFindRsrc(ViSession rm, ViConstString expr, ViFindList* list)
{
    if (std::strcmp(expr, "THROW") == 0)
        throw std::runtime_error("find failed");
    for (const char* szRsrc : g_aszRsrc) {
        ViUInt16 nFlag = 0;
        ViStatus st = CNiViSv::matchRsrc(rm, expr, szRsrc, &nFlag);
        if (st == VI_SUCCESS && nFlag)
            st = CNiViSv::matchAttributes(rm, expr, szRsrc, findCallback, 0);
        if (st == VI_ERROR_RSRC_NFOUND)
            continue;
        if (st < 0 || (st = CNiViSv::appendFound(*list, szRsrc, 0)) < 0)
            return st;
    }
    return VI_SUCCESS;
}

ViStatus _VI_FUNC tpParseRsrcEx(ViSession, ViConstRsrc name, ViPUInt16 type, ViPUInt16 num, ViChar cls[],
                                ViChar expanded[], ViChar alias[])
{
    int n = number(name);
    if (!n)
        return VI_ERROR_RSRC_NFOUND;
    *type = 0x8101;
    *num = static_cast<ViUInt16>(n);
    if (cls)
        std::strcpy(cls, "INSTR");
    if (expanded)
        std::strcpy(expanded, g_aszRsrc[n - 1]);
    if (alias)
        alias[0] = '\0';
    return VI_SUCCESS;
}

ViStatus _VI_FUNC tpParseRsrc(ViSession rm, ViConstRsrc name, ViPUInt16 type, ViPUInt16 num)
{
    return tpParseRsrcEx(rm, name, type, num, nullptr, nullptr, nullptr);
}

ViStatus _VI_FUNC tpOpen(ViSession, ViConstRsrc name, ViAccessMode, ViUInt32, ViPSession vi)
{
    CNiViSv::acquireLock(g_hLock, 0xFFFFFFFF, 0);
    ViStatus st = VI_ERROR_RSRC_NFOUND;
    if (int n = number(name)) {
        CNiViSv::sessionRecord(*vi)[2] = new SSession{n, "", {}, {}, {}, false, 0, false};
        const ViEventType anTypes[] = {VI_EVENT_SERVICE_REQ};
        CNiViSv::declareEvents(*vi, 1, anTypes, 0);
        st = CNiViSv::installTable(*vi, g_hTable, 0, *vi, 0);
    }
    CNiViSv::releaseLock(g_hLock, 0);
    return st;
}

ViStatus _VI_FUNC tpClose(ViSession vi)
{
    SSession* ps = object(vi);
    {
        std::unique_lock<std::mutex> aLock(ps->m_aMutex);
        ps->m_bClosed = true;
        ps->m_cvChanged.notify_all();
        ps->m_cvChanged.wait(aLock, [&] { return ps->m_nReaders == 0; });
    }
    CNiViSv::acquireLock(g_hLock, 0xFFFFFFFF, 0);
    delete ps;
    CNiViSv::sessionRecord(vi)[2] = nullptr;
    CNiViSv::releaseLock(g_hLock, 0);
    return VI_SUCCESS;
}

ViStatus _VI_FUNC tpWrite(ViSession vi, ViConstBuf buf, ViUInt32 cnt, ViPUInt32 ret)
{
    if (!buf)
        return VI_ERROR_INV_PARAMETER;
    SSession* ps = object(vi);
    ps->m_strData.assign(reinterpret_cast<const char*>(buf), cnt);
    ps->m_bWhole = ps->m_strData.compare(0, 6, "WHOLE ") == 0;
    if (ps->m_bWhole)
        ps->m_strData.erase(0, 6);
    if (object(vi)->m_strData.compare(0, 6, "EVENT ") == 0) {
        for (int i = std::atoi(object(vi)->m_strData.c_str() + 6); i > 0; --i)
            raiseServiceRequest(vi);
    }
    if (ret)
        *ret = cnt;
    return VI_SUCCESS;
}

ViStatus _VI_FUNC tpRead(ViSession vi, ViPBuf buf, ViUInt32 cnt, ViPUInt32 ret)
{
    if (!buf)
        return VI_ERROR_INV_PARAMETER;
    SSession* ps = object(vi);
    if (ps->m_strData == "HANG") {
        raiseServiceRequest(vi);
        std::unique_lock<std::mutex> aLock(ps->m_aMutex);
        ++ps->m_nReaders;
        ps->m_cvChanged.wait(aLock, [&] { return ps->m_bClosed; });
        --ps->m_nReaders;
        ps->m_cvChanged.notify_all();
        return VI_ERROR_ABORT;
    }
    // A read takes what it reads: the rest waits for the next read (VI_SUCCESS_MAX_CNT).
    std::string& str = ps->m_strData;
    if (ps->m_bWhole && cnt < str.size()) {
        if (ret)
            *ret = 0;
        return VI_ERROR_USER_BUF;
    }
    ViUInt32 n = cnt < str.size() ? cnt : static_cast<ViUInt32>(str.size());
    std::memcpy(buf, str.data(), n);
    str.erase(0, n);
    if (ret)
        *ret = n;
    return str.empty() ? VI_SUCCESS : VI_SUCCESS_MAX_CNT;
}

ViStatus _VI_FUNC tpReadSTB(ViSession vi, ViPUInt16 stb)
{
    if (!stb)
        return VI_ERROR_INV_PARAMETER;
    *stb = static_cast<ViUInt16>(0x40 + object(vi)->m_nNumber);
    return VI_SUCCESS;
}

ViStatus _VI_FUNC tpGetAttribute(ViSession vi, ViAttr attr, void* value)
{
    if (attr != VI_ATTR_MANF_ID)
        return VI_ERROR_NSUP_ATTR;
    *static_cast<ViUInt16*>(value) = static_cast<ViUInt16>(object(vi)->m_nNumber);
    return VI_SUCCESS;
}

// Enabling twice or disabling when not enabled is an error here: the runtime must not ask.
ViStatus _VI_FUNC tpEnableEvent(ViSession vi, ViEventType type, ViUInt16, ViEventFilter)
{
    return object(vi)->m_setEnabled.insert(type).second ? VI_SUCCESS : VI_ERROR_SYSTEM_ERROR;
}

ViStatus _VI_FUNC tpDisableEvent(ViSession vi, ViEventType type, ViUInt16)
{
    return object(vi)->m_setEnabled.erase(type) ? VI_SUCCESS : VI_ERROR_SYSTEM_ERROR;
}

template <typename F> void add(const char* szName, F pfEntry)
{
    CNiViSv::addOperation(g_hTable, szName, reinterpret_cast<CNiViSv::TEntry>(pfEntry));
}

bool attach()
{
    if (CNiViSv::createLock("Test passport lock", 1, 1, &g_hLock) < 0)
        return false;
    if (CNiViSv::createTable("Test passport table", 0x00400000, 0, &g_hTable) < 0)
        return false;
    add("viFindRsrc", tpFindRsrc);
    add("viParseRsrc", tpParseRsrc);
    add("viParseRsrcEx", tpParseRsrcEx);
    add("viOpen", tpOpen);
    add("viClose", tpClose);
    add("viWrite", tpWrite);
    add("viRead", tpRead);
    add("viReadSTB", tpReadSTB);
    add("viGetAttribute", tpGetAttribute);
    add("viEnableEvent", tpEnableEvent);
    add("viDisableEvent", tpDisableEvent);
    return true;
}

} // namespace

#if defined(_WIN32)
BOOL WINAPI DllMain(HINSTANCE, DWORD nReason, LPVOID)
{
    if (nReason == DLL_PROCESS_ATTACH)
        return attach() ? TRUE : FALSE;
    if (nReason == DLL_PROCESS_DETACH)
        CNiViSv::detach();
    return TRUE;
}
#else
__attribute__((constructor)) static void onLoad()
{
    attach();
}
__attribute__((destructor)) static void onUnload()
{
    CNiViSv::detach();
}
#endif
