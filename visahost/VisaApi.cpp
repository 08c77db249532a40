// The VISA C API library: the operations the runtime in the service library implements.
// VisaApiIo.cpp adds buffered and formatted I/O, VisaApiUnsupported.cpp the operations these
// resources do not offer.
#include "visahost/BufferedIo.h"
#include "visahost/VisaApiInternal.h"

using LbVisaHost::api;
using LbVisaHost::CSessionIo;

extern "C" {

ViStatus _VI_FUNC viOpenDefaultRM(ViPSession vi)
{
    return api().openDefaultRM(vi);
}
ViStatus _VI_FUNC viFindRsrc(ViSession sesn, ViConstString expr, ViPFindList vi, ViPUInt32 retCnt, ViChar desc[])
{
    return api().findRsrc(sesn, expr, vi, retCnt, desc);
}
ViStatus _VI_FUNC viFindNext(ViFindList vi, ViChar desc[])
{
    return api().findNext(vi, desc);
}
ViStatus _VI_FUNC viParseRsrc(ViSession rmSesn, ViConstRsrc rsrcName, ViPUInt16 intfType, ViPUInt16 intfNum)
{
    return api().parseRsrc(rmSesn, rsrcName, intfType, intfNum);
}
ViStatus _VI_FUNC viParseRsrcEx(ViSession rmSesn, ViConstRsrc rsrcName, ViPUInt16 intfType, ViPUInt16 intfNum,
                                ViChar rsrcClass[], ViChar expandedUnaliasedName[], ViChar aliasIfExists[])
{
    return api().parseRsrcEx(rmSesn, rsrcName, intfType, intfNum, rsrcClass, expandedUnaliasedName, aliasIfExists);
}
ViStatus _VI_FUNC viOpen(ViSession sesn, ViConstRsrc name, ViAccessMode mode, ViUInt32 timeout, ViPSession vi)
{
    return api().open(sesn, name, mode, timeout, vi);
}
ViStatus _VI_FUNC viClose(ViObject vi)
{
    // What a session's write buffer holds goes out before it closes, unless another thread's
    // operation holds it; its buffers end with it (and with every session a closed resource
    // manager took along).
    ViStatus nKind = VI_SUCCESS;
    if (std::shared_ptr<CSessionIo> pc = CSessionIo::of(vi, nKind))
        pc->flushIfIdle();
    ViStatus nStatus = api().close(vi);
    CSessionIo::forgetClosed();
    return nStatus;
}
ViStatus _VI_FUNC viSetAttribute(ViObject vi, ViAttr attrName, ViAttrState attrValue)
{
    if (LbVisaHost::isBufferAttribute(attrName)) {
        ViStatus nStatus = VI_SUCCESS;
        std::shared_ptr<CSessionIo> pc = CSessionIo::of(vi, nStatus);
        if (!pc)
            return nStatus == VI_ERROR_NSUP_OPER ? VI_ERROR_NSUP_ATTR : nStatus;
        return pc->setAttribute(attrName, attrValue);
    }
    return api().setAttribute(vi, attrName, attrValue);
}
ViStatus _VI_FUNC viGetAttribute(ViObject vi, ViAttr attrName, void* attrValue)
{
    if (LbVisaHost::isBufferAttribute(attrName)) {
        ViStatus nStatus = VI_SUCCESS;
        std::shared_ptr<CSessionIo> pc = CSessionIo::of(vi, nStatus);
        if (!pc)
            return nStatus == VI_ERROR_NSUP_OPER ? VI_ERROR_NSUP_ATTR : nStatus;
        if (!attrValue)
            return VI_ERROR_INV_PARAMETER;
        pc->getAttribute(attrName, attrValue);
        return VI_SUCCESS;
    }
    return api().getAttribute(vi, attrName, attrValue);
}
ViStatus _VI_FUNC viStatusDesc(ViObject vi, ViStatus status, ViChar desc[])
{
    return api().statusDesc(vi, status, desc);
}
ViStatus _VI_FUNC viTerminate(ViObject vi, ViUInt16 degree, ViJobId jobId)
{
    return api().terminate(vi, degree, jobId);
}
ViStatus _VI_FUNC viLock(ViSession vi, ViAccessMode lockType, ViUInt32 timeout, ViConstKeyId requestedKey,
                         ViChar accessKey[])
{
    return api().lock(vi, lockType, timeout, requestedKey, accessKey);
}
ViStatus _VI_FUNC viUnlock(ViSession vi)
{
    return api().unlock(vi);
}
ViStatus _VI_FUNC viEnableEvent(ViSession vi, ViEventType eventType, ViUInt16 mechanism, ViEventFilter context)
{
    return api().enableEvent(vi, eventType, mechanism, context);
}
ViStatus _VI_FUNC viDisableEvent(ViSession vi, ViEventType eventType, ViUInt16 mechanism)
{
    return api().disableEvent(vi, eventType, mechanism);
}
ViStatus _VI_FUNC viDiscardEvents(ViSession vi, ViEventType eventType, ViUInt16 mechanism)
{
    return api().discardEvents(vi, eventType, mechanism);
}
ViStatus _VI_FUNC viWaitOnEvent(ViSession vi, ViEventType inEventType, ViUInt32 timeout, ViPEventType outEventType,
                                ViPEvent outContext)
{
    return api().waitOnEvent(vi, inEventType, timeout, outEventType, outContext);
}
ViStatus _VI_FUNC viInstallHandler(ViSession vi, ViEventType eventType, ViHndlr handler, ViAddr userHandle)
{
    return api().installHandler(vi, eventType, handler, userHandle);
}
ViStatus _VI_FUNC viUninstallHandler(ViSession vi, ViEventType eventType, ViHndlr handler, ViAddr userHandle)
{
    return api().uninstallHandler(vi, eventType, handler, userHandle);
}
ViStatus _VI_FUNC viRead(ViSession vi, ViPBuf buf, ViUInt32 cnt, ViPUInt32 retCnt)
{
    return api().read(vi, buf, cnt, retCnt);
}
ViStatus _VI_FUNC viWrite(ViSession vi, ViConstBuf buf, ViUInt32 cnt, ViPUInt32 retCnt)
{
    return api().write(vi, buf, cnt, retCnt);
}
ViStatus _VI_FUNC viAssertTrigger(ViSession vi, ViUInt16 protocol)
{
    return api().assertTrigger(vi, protocol);
}
ViStatus _VI_FUNC viReadSTB(ViSession vi, ViPUInt16 status)
{
    return api().readSTB(vi, status);
}
ViStatus _VI_FUNC viClear(ViSession vi)
{
    return api().clear(vi);
}

} // extern "C"
