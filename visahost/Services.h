// The service library's exports: the fourteen services a passport calls (by ordinal on
// Windows, by the names below elsewhere) and the entry through which the VISA C API library
// reaches the runtime. The argument lists are the binary contract with passports; visahost/
// README.md describes each service.
#ifndef LBVISAHOST_SERVICES_H
#define LBVISAHOST_SERVICES_H

#include "visahost/include/visa.h"

#if defined(_WIN32)
#define LBVISAHOST_EXPORT // exported through NiViSv64.def
#else
#define LBVISAHOST_EXPORT __attribute__((visibility("default")))
#endif

extern "C" {

typedef ViAddr ViSvcHandle;               // lock and vector-table handles (pointer-sized)
typedef void(_VI_FUNCH* ViSvcProc)(void); // an operation entry, cast to its VISA signature

// Comparison operators handed to a find callback for one condition of an attribute expression.
enum { LBVISA_OP_EQ = 1, LBVISA_OP_NE, LBVISA_OP_LT, LBVISA_OP_GT, LBVISA_OP_LE, LBVISA_OP_GE };

// Find callback of service 44: does the resource of session vi satisfy "attribute op value"?
// value holds a number, text a string value (one of both is used, the other is 0).
// VI_SUCCESS: yes; VI_ERROR_RSRC_NFOUND: no; anything else: the runtime asks viGetAttribute.
typedef ViStatus(_VI_FUNCH* ViSvcFindCallback)(ViSession vi, ViAttr attribute, ViUInt16 op, ViAttrState value,
                                               ViConstString text, ViUInt32 reserved);

LBVISAHOST_EXPORT ViStatus _VI_FUNC viSvc30(ViConstString name, ViUInt32 initial, ViUInt32 maximum, ViSvcHandle* lock);
LBVISAHOST_EXPORT ViStatus _VI_FUNC viSvc31(ViSvcHandle lock, ViUInt32 timeout, ViUInt32 reserved);
LBVISAHOST_EXPORT ViStatus _VI_FUNC viSvc32(ViSvcHandle lock, ViUInt32 reserved);
LBVISAHOST_EXPORT ViStatus _VI_FUNC viSvc40(ViConstString name, ViVersion version, ViUInt32 reserved,
                                            ViSvcHandle* table);
LBVISAHOST_EXPORT ViStatus _VI_FUNC viSvc41(ViSvcHandle table, ViConstString operation, ViSvcProc entry);
LBVISAHOST_EXPORT ViStatus _VI_FUNC viSvc43(ViSession rm, ViConstString expr, ViConstString rsrc, ViUInt16* attrFlag);
LBVISAHOST_EXPORT ViStatus _VI_FUNC viSvc44(ViSession rm, ViConstString expr, ViConstString rsrc,
                                            ViSvcFindCallback callback, ViUInt32 reserved);
LBVISAHOST_EXPORT ViStatus _VI_FUNC viSvc45(ViFindList list, ViConstString rsrc, ViUInt32 reserved);
LBVISAHOST_EXPORT ViStatus _VI_FUNC viSvc50(ViSession vi, ViUInt32 count, const ViEventType* types, ViUInt32 reserved);
LBVISAHOST_EXPORT ViStatus _VI_FUNC viSvc51(ViSession vi, ViEventType type, ViEvent* context, ViUInt32* mechanisms);
LBVISAHOST_EXPORT ViStatus _VI_FUNC viSvc52(ViSession vi, ViEvent context, ViUInt32 mechanisms);
LBVISAHOST_EXPORT ViStatus _VI_FUNC viSvc56(ViSession vi, ViSvcHandle table, ViUInt32 reserved, ViSession target,
                                            ViUInt32 reserved2);
LBVISAHOST_EXPORT ViAddr* _VI_FUNC viSvc57(ViSession vi);
LBVISAHOST_EXPORT ViStatus _VI_FUNC viSvc63(void);

// The VISA C API library's way into the runtime: one function pointer per VISA operation.
struct LbVisaHostApi {
    decltype(&::viOpenDefaultRM) openDefaultRM;
    decltype(&::viFindRsrc) findRsrc;
    decltype(&::viFindNext) findNext;
    decltype(&::viParseRsrc) parseRsrc;
    decltype(&::viParseRsrcEx) parseRsrcEx;
    decltype(&::viOpen) open;
    decltype(&::viClose) close;
    decltype(&::viRead) read;
    decltype(&::viWrite) write;
    decltype(&::viReadSTB) readSTB;
    decltype(&::viClear) clear;
    decltype(&::viAssertTrigger) assertTrigger;
    decltype(&::viTerminate) terminate;
    decltype(&::viGetAttribute) getAttribute;
    decltype(&::viSetAttribute) setAttribute;
    decltype(&::viEnableEvent) enableEvent;
    decltype(&::viDisableEvent) disableEvent;
    decltype(&::viDiscardEvents) discardEvents;
    decltype(&::viWaitOnEvent) waitOnEvent;
    decltype(&::viInstallHandler) installHandler;
    decltype(&::viUninstallHandler) uninstallHandler;
    decltype(&::viStatusDesc) statusDesc;
    decltype(&::viLock) lock;
    decltype(&::viUnlock) unlock;
    decltype(&::viReadAsync) readAsync;
    decltype(&::viWriteAsync) writeAsync;
};

LBVISAHOST_EXPORT const LbVisaHostApi* _VI_FUNC lbVisaHostApi(void);
}

#endif
