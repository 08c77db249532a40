// The exported services and the VISA C API entry of the service library: thin shells over
// CRuntime that keep exceptions from crossing the library boundary.
#include <new>

#include "visahost/Runtime.h"

using LbVisaHost::CRuntime;

namespace {

template <typename F> ViStatus guarded(F fCall)
{
    try {
        return fCall();
    } catch (const std::bad_alloc&) {
        return VI_ERROR_ALLOC;
    } catch (...) {
        return VI_ERROR_SYSTEM_ERROR;
    }
}

#define LB_RUNTIME_CALL(call) guarded([&] { return CRuntime::instance().call; })

ViStatus _VI_FUNC apiOpenDefaultRM(ViPSession vi)
{
    return LB_RUNTIME_CALL(openDefaultRM(vi));
}
ViStatus _VI_FUNC apiFindRsrc(ViSession sesn, ViConstString expr, ViPFindList vi, ViPUInt32 retCnt, ViChar desc[])
{
    return LB_RUNTIME_CALL(findRsrc(sesn, expr, vi, retCnt, desc));
}
ViStatus _VI_FUNC apiFindNext(ViFindList vi, ViChar desc[])
{
    return LB_RUNTIME_CALL(findNext(vi, desc));
}
ViStatus _VI_FUNC apiParseRsrc(ViSession rm, ViConstRsrc name, ViPUInt16 type, ViPUInt16 num)
{
    return LB_RUNTIME_CALL(parseRsrc(rm, name, type, num, nullptr, nullptr, nullptr, false));
}
ViStatus _VI_FUNC apiParseRsrcEx(ViSession rm, ViConstRsrc name, ViPUInt16 type, ViPUInt16 num, ViChar rsrcClass[],
                                 ViChar expanded[], ViChar alias[])
{
    return LB_RUNTIME_CALL(parseRsrc(rm, name, type, num, rsrcClass, expanded, alias, true));
}
ViStatus _VI_FUNC apiOpen(ViSession rm, ViConstRsrc name, ViAccessMode mode, ViUInt32 timeout, ViPSession vi)
{
    return LB_RUNTIME_CALL(open(rm, name, mode, timeout, vi));
}
ViStatus _VI_FUNC apiClose(ViObject vi)
{
    return LB_RUNTIME_CALL(close(vi));
}
ViStatus _VI_FUNC apiRead(ViSession vi, ViPBuf buf, ViUInt32 cnt, ViPUInt32 retCnt)
{
    return LB_RUNTIME_CALL(read(vi, buf, cnt, retCnt));
}
ViStatus _VI_FUNC apiWrite(ViSession vi, ViConstBuf buf, ViUInt32 cnt, ViPUInt32 retCnt)
{
    return LB_RUNTIME_CALL(write(vi, buf, cnt, retCnt));
}
ViStatus _VI_FUNC apiReadSTB(ViSession vi, ViPUInt16 status)
{
    return LB_RUNTIME_CALL(readSTB(vi, status));
}
ViStatus _VI_FUNC apiClear(ViSession vi)
{
    return LB_RUNTIME_CALL(clear(vi));
}
ViStatus _VI_FUNC apiAssertTrigger(ViSession vi, ViUInt16 protocol)
{
    return LB_RUNTIME_CALL(assertTrigger(vi, protocol));
}
ViStatus _VI_FUNC apiTerminate(ViObject vi, ViUInt16 degree, ViJobId jobId)
{
    return LB_RUNTIME_CALL(terminate(vi, degree, jobId));
}
ViStatus _VI_FUNC apiGetAttribute(ViObject vi, ViAttr attr, void* value)
{
    return LB_RUNTIME_CALL(getAttribute(vi, attr, value));
}
ViStatus _VI_FUNC apiSetAttribute(ViObject vi, ViAttr attr, ViAttrState value)
{
    return LB_RUNTIME_CALL(setAttribute(vi, attr, value));
}
ViStatus _VI_FUNC apiEnableEvent(ViSession vi, ViEventType type, ViUInt16 mech, ViEventFilter context)
{
    return LB_RUNTIME_CALL(enableEvent(vi, type, mech, context));
}
ViStatus _VI_FUNC apiDisableEvent(ViSession vi, ViEventType type, ViUInt16 mech)
{
    return LB_RUNTIME_CALL(disableEvent(vi, type, mech));
}
ViStatus _VI_FUNC apiDiscardEvents(ViSession vi, ViEventType type, ViUInt16 mech)
{
    return LB_RUNTIME_CALL(discardEvents(vi, type, mech));
}
ViStatus _VI_FUNC apiWaitOnEvent(ViSession vi, ViEventType type, ViUInt32 timeout, ViPEventType outType,
                                 ViPEvent outContext)
{
    return LB_RUNTIME_CALL(waitOnEvent(vi, type, timeout, outType, outContext));
}
ViStatus _VI_FUNC apiInstallHandler(ViSession vi, ViEventType type, ViHndlr handler, ViAddr user)
{
    return LB_RUNTIME_CALL(installHandler(vi, type, handler, user));
}
ViStatus _VI_FUNC apiUninstallHandler(ViSession vi, ViEventType type, ViHndlr handler, ViAddr user)
{
    return LB_RUNTIME_CALL(uninstallHandler(vi, type, handler, user));
}
ViStatus _VI_FUNC apiStatusDesc(ViObject vi, ViStatus status, ViChar desc[])
{
    return LB_RUNTIME_CALL(statusDesc(vi, status, desc));
}
ViStatus _VI_FUNC apiLock(ViSession vi, ViAccessMode type, ViUInt32 timeout, ViConstKeyId requested, ViChar accessKey[])
{
    return LB_RUNTIME_CALL(lock(vi, type, timeout, requested, accessKey));
}
ViStatus _VI_FUNC apiUnlock(ViSession vi)
{
    return LB_RUNTIME_CALL(unlock(vi));
}
ViStatus _VI_FUNC apiReadAsync(ViSession vi, ViPBuf buf, ViUInt32 cnt, ViPJobId job)
{
    return LB_RUNTIME_CALL(readAsync(vi, buf, cnt, job));
}
ViStatus _VI_FUNC apiWriteAsync(ViSession vi, ViConstBuf buf, ViUInt32 cnt, ViPJobId job)
{
    return LB_RUNTIME_CALL(writeAsync(vi, buf, cnt, job));
}

const LbVisaHostApi g_sApi = {
    apiOpenDefaultRM, apiFindRsrc,       apiFindNext,
    apiParseRsrc,     apiParseRsrcEx,    apiOpen,
    apiClose,         apiRead,           apiWrite,
    apiReadSTB,       apiClear,          apiAssertTrigger,
    apiTerminate,     apiGetAttribute,   apiSetAttribute,
    apiEnableEvent,   apiDisableEvent,   apiDiscardEvents,
    apiWaitOnEvent,   apiInstallHandler, apiUninstallHandler,
    apiStatusDesc,    apiLock,           apiUnlock,
    apiReadAsync,     apiWriteAsync,
};

} // namespace

extern "C" {

const LbVisaHostApi* _VI_FUNC lbVisaHostApi(void)
{
    return &g_sApi;
}

ViStatus _VI_FUNC viSvc30(ViConstString name, ViUInt32 initial, ViUInt32 maximum, ViSvcHandle* lock)
{
    return LB_RUNTIME_CALL(createLock(name, initial, maximum, lock));
}
ViStatus _VI_FUNC viSvc31(ViSvcHandle lock, ViUInt32 timeout, ViUInt32)
{
    return LB_RUNTIME_CALL(acquireLock(lock, timeout));
}
ViStatus _VI_FUNC viSvc32(ViSvcHandle lock, ViUInt32)
{
    return LB_RUNTIME_CALL(releaseLock(lock));
}
ViStatus _VI_FUNC viSvc40(ViConstString name, ViVersion version, ViUInt32, ViSvcHandle* table)
{
    return LB_RUNTIME_CALL(createTable(name, version, table));
}
ViStatus _VI_FUNC viSvc41(ViSvcHandle table, ViConstString operation, ViSvcProc entry)
{
    return LB_RUNTIME_CALL(addOperation(table, operation, entry));
}
ViStatus _VI_FUNC viSvc43(ViSession rm, ViConstString expr, ViConstString rsrc, ViUInt16* attrFlag)
{
    return LB_RUNTIME_CALL(matchRsrc(rm, expr, rsrc, attrFlag));
}
ViStatus _VI_FUNC viSvc44(ViSession rm, ViConstString expr, ViConstString rsrc, ViSvcFindCallback callback, ViUInt32)
{
    return LB_RUNTIME_CALL(matchAttributes(rm, expr, rsrc, callback));
}
ViStatus _VI_FUNC viSvc45(ViFindList list, ViConstString rsrc, ViUInt32)
{
    return LB_RUNTIME_CALL(appendFound(list, rsrc));
}
ViStatus _VI_FUNC viSvc50(ViSession vi, ViUInt32 count, const ViEventType* types, ViUInt32)
{
    return LB_RUNTIME_CALL(declareEvents(vi, count, types));
}
ViStatus _VI_FUNC viSvc51(ViSession vi, ViEventType type, ViEvent* context, ViUInt32* mechanisms)
{
    return LB_RUNTIME_CALL(createEvent(vi, type, context, mechanisms));
}
ViStatus _VI_FUNC viSvc52(ViSession vi, ViEvent context, ViUInt32 mechanisms)
{
    return LB_RUNTIME_CALL(raiseEvent(vi, context, mechanisms));
}
ViStatus _VI_FUNC viSvc56(ViSession vi, ViSvcHandle table, ViUInt32, ViSession, ViUInt32)
{
    return LB_RUNTIME_CALL(installTable(vi, table));
}
ViAddr* _VI_FUNC viSvc57(ViSession vi)
{
    try {
        return CRuntime::instance().sessionRecord(vi);
    } catch (...) {
        return nullptr;
    }
}
ViStatus _VI_FUNC viSvc63(void)
{
    return CRuntime::instance().detach();
}

} // extern "C"
