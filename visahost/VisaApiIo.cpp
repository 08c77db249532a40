// Buffered and formatted I/O of the VISA C library (viPrintf, viScanf and viQueryf families,
// viFlush, viSetBuf, viBufRead, viBufWrite) on top of the runtime's viRead / viWrite. File and
// asynchronous I/O are in VisaApiFileIo.cpp.
#include <cstring>
#include <new>

#include "visahost/BufferedIo.h"
#include "visahost/VisaApiInternal.h"

using LbVisaHost::CScanInput;
using LbVisaHost::CSessionIo;
using LbVisaHost::SArgs;

namespace {

// The bytes of a zero-terminated buffer (viSScanf).
class CStringInput : public CScanInput {
public:
    explicit CStringInput(const ViByte* p) : m_p(p) { }
    int peek() override { return *m_p ? *m_p : -1; }
    void next() override { ++m_p; }

private:
    const ViByte* m_p;
};

// Runs fCall on the session's buffers; exceptions stay inside the library.
template <typename F> ViStatus withSession(ViSession nVi, F fCall)
{
    try {
        ViStatus nStatus = VI_SUCCESS;
        std::shared_ptr<CSessionIo> pc = CSessionIo::of(nVi, nStatus);
        if (!pc)
            return nStatus;
        return fCall(*pc);
    } catch (const std::bad_alloc&) {
        return VI_ERROR_ALLOC;
    }
}

// Runs fCall on the session's buffers with a copy of the caller's argument list.
template <typename F> ViStatus withSessionArgs(ViSession nVi, va_list ap, F fCall)
{
    return withSession(nVi, [&](CSessionIo& c) {
        SArgs sArgs;
        va_copy(sArgs.m_ap, ap);
        ViStatus nStatus = fCall(c, sArgs);
        va_end(sArgs.m_ap);
        return nStatus;
    });
}

} // namespace

// A variadic entry point hands its arguments to its va_list twin CALL, which names the list AP.
// va_start and va_end must stand in the variadic function itself, hence a macro.
#define LB_FORWARD_VARARGS(LAST, AP, CALL)                                                                             \
    va_list AP;                                                                                                        \
    va_start(AP, LAST);                                                                                                \
    const ViStatus nStatus = CALL;                                                                                     \
    va_end(AP);                                                                                                        \
    return nStatus

extern "C" {

ViStatus _VI_FUNC viVPrintf(ViSession vi, ViConstString writeFmt, ViVAList params)
{
    return withSessionArgs(vi, params, [&](CSessionIo& c, SArgs& sArgs) { return c.print(writeFmt, sArgs); });
}

ViStatus _VI_FUNCC viPrintf(ViSession vi, ViConstString writeFmt, ...)
{
    LB_FORWARD_VARARGS(writeFmt, ap, viVPrintf(vi, writeFmt, ap));
}

ViStatus _VI_FUNC viVSPrintf(ViSession vi, ViPBuf buf, ViConstString writeFmt, ViVAList parms)
{
    if (!buf)
        return VI_ERROR_USER_BUF;
    return withSessionArgs(vi, parms, [&](CSessionIo&, SArgs& sArgs) -> ViStatus {
        std::string strOut;
        ViStatus nStatus = LbVisaHost::formatOutput(writeFmt, sArgs, strOut);
        if (nStatus < VI_SUCCESS)
            return nStatus;
        std::memcpy(buf, strOut.c_str(), strOut.size() + 1);
        return VI_SUCCESS;
    });
}

ViStatus _VI_FUNCC viSPrintf(ViSession vi, ViPBuf buf, ViConstString writeFmt, ...)
{
    LB_FORWARD_VARARGS(writeFmt, ap, viVSPrintf(vi, buf, writeFmt, ap));
}

ViStatus _VI_FUNC viVScanf(ViSession vi, ViConstString readFmt, ViVAList params)
{
    return withSessionArgs(vi, params, [&](CSessionIo& c, SArgs& sArgs) { return c.scan(readFmt, sArgs); });
}

ViStatus _VI_FUNCC viScanf(ViSession vi, ViConstString readFmt, ...)
{
    LB_FORWARD_VARARGS(readFmt, ap, viVScanf(vi, readFmt, ap));
}

ViStatus _VI_FUNC viVSScanf(ViSession vi, ViConstBuf buf, ViConstString readFmt, ViVAList parms)
{
    if (!buf)
        return VI_ERROR_USER_BUF;
    return withSessionArgs(vi, parms, [&](CSessionIo&, SArgs& sArgs) {
        CStringInput cInput(buf);
        return LbVisaHost::scanInput(readFmt, sArgs, cInput);
    });
}

ViStatus _VI_FUNCC viSScanf(ViSession vi, ViConstBuf buf, ViConstString readFmt, ...)
{
    LB_FORWARD_VARARGS(readFmt, ap, viVSScanf(vi, buf, readFmt, ap));
}

ViStatus _VI_FUNC viVQueryf(ViSession vi, ViConstString writeFmt, ViConstString readFmt, ViVAList params)
{
    return withSessionArgs(vi, params, [&](CSessionIo& c, SArgs& sArgs) { return c.query(writeFmt, readFmt, sArgs); });
}

ViStatus _VI_FUNCC viQueryf(ViSession vi, ViConstString writeFmt, ViConstString readFmt, ...)
{
    LB_FORWARD_VARARGS(readFmt, ap, viVQueryf(vi, writeFmt, readFmt, ap));
}

ViStatus _VI_FUNC viFlush(ViSession vi, ViUInt16 mask)
{
    return withSession(vi, [&](CSessionIo& c) { return c.flush(mask); });
}

ViStatus _VI_FUNC viSetBuf(ViSession vi, ViUInt16 mask, ViUInt32 size)
{
    return withSession(vi, [&](CSessionIo& c) { return c.setBuffer(mask, size); });
}

ViStatus _VI_FUNC viBufWrite(ViSession vi, ViConstBuf buf, ViUInt32 cnt, ViPUInt32 retCnt)
{
    if (retCnt)
        *retCnt = 0;
    if (!buf)
        return VI_ERROR_USER_BUF;
    return withSession(vi, [&](CSessionIo& c) {
        ViStatus nStatus = c.bufWrite(std::string(reinterpret_cast<const char*>(buf), cnt));
        if (nStatus >= VI_SUCCESS && retCnt)
            *retCnt = cnt;
        return nStatus;
    });
}

ViStatus _VI_FUNC viBufRead(ViSession vi, ViPBuf buf, ViUInt32 cnt, ViPUInt32 retCnt)
{
    return withSession(vi, [&](CSessionIo& c) { return c.bufRead(buf, cnt, retCnt); });
}

} // extern "C"
