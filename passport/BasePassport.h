#ifndef LBPMXPASSPORT_BASEPASSPORT_H
#define LBPMXPASSPORT_BASEPASSPORT_H
// CBasePassport: the interface of every passport session class. The entry functions call these
// virtual operations on the object stored in the VISA session record; every operation answers
// VI_ERROR_NSUP_OPER here and does nothing else.
#include "visahost/include/visa.h"

namespace LbPmxPassport {

class CBasePassport {
public:
    virtual ~CBasePassport() { }
    // The five values of the runtime's find callback, passed through unchanged.
    virtual ViStatus findAttribute(ViAttr, ViUInt16, ViAttrState, ViConstString, ViUInt32)
    {
        return VI_ERROR_NSUP_OPER;
    }
    virtual ViStatus viClose() { return VI_ERROR_NSUP_OPER; }
    virtual ViStatus viGetAttribute(ViAttr, void*) { return VI_ERROR_NSUP_OPER; }
    virtual ViStatus viSetAttribute(ViAttr, ViAttrState) { return VI_ERROR_NSUP_OPER; }
    virtual ViStatus viTerminate(ViUInt16, ViJobId) { return VI_ERROR_NSUP_OPER; }
    virtual ViStatus viWrite(ViConstBuf, ViUInt32, ViPUInt32) { return VI_ERROR_NSUP_OPER; }
    virtual ViStatus viRead(ViPBuf, ViUInt32, ViPUInt32) { return VI_ERROR_NSUP_OPER; }
    virtual ViStatus viAssertTrigger(ViUInt16) { return VI_ERROR_NSUP_OPER; }
    virtual ViStatus viReadSTB(ViPUInt16) { return VI_ERROR_NSUP_OPER; }
    virtual ViStatus viClear() { return VI_ERROR_NSUP_OPER; }
    virtual ViStatus viEnableEvent(ViEventType, ViUInt16, ViEventFilter) { return VI_ERROR_NSUP_OPER; }
    virtual ViStatus viDisableEvent(ViEventType, ViUInt16) { return VI_ERROR_NSUP_OPER; }
};

} // namespace LbPmxPassport

#endif
