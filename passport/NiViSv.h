// CNiViSv: the passport's calls into the VISA runtime's service library (NiViSv64), one
// static operation per service. On Windows the services are imported by ordinal only (import
// library built from NiViSv64.def); elsewhere by their names viSvc<ordinal>. No logic here:
// every operation passes its arguments through and returns the service's result.
#ifndef LBPMXPASSPORT_NIVISV_H
#define LBPMXPASSPORT_NIVISV_H

#include "visahost/include/visa.h"

namespace LbPmxPassport {

class CNiViSv {
public:
    typedef ViAddr THandle;                // lock and vector-table handles
    typedef void(_VI_FUNCH* TEntry)(void); // an operation entry, cast from its signature
    // Find callback handed to service 44 (session, attribute, operator, value, text, reserved).
    typedef ViStatus(_VI_FUNCH* TFindCallback)(ViSession, ViAttr, ViUInt16, ViAttrState, ViConstString, ViUInt32);

    // 30: creates (or finds) the named lock.
    static ViStatus createLock(ViConstString szName, ViUInt32 nInitial, ViUInt32 nMaximum, THandle* phLock);
    // 31: returns when the lock is held (0xFFFFFFFF waits without limit).
    static ViStatus acquireLock(THandle hLock, ViUInt32 nTimeout, ViUInt32 nReserved);
    // 32: releases the lock.
    static ViStatus releaseLock(THandle hLock, ViUInt32 nReserved);
    // 40: creates a vector table.
    static ViStatus createTable(ViConstString szName, ViVersion nVersion, ViUInt32 nReserved, THandle* phTable);
    // 41: adds an operation to a vector table.
    static ViStatus addOperation(THandle hTable, ViConstString szOperation, TEntry pfEntry);
    // 43: matches a resource string against a find expression; *pnAttrFlag asks for 44.
    static ViStatus matchRsrc(ViSession nRm, ViConstString szExpr, ViConstString szRsrc, ViUInt16* pnAttrFlag);
    // 44: matches the attribute part of a find expression; may call the find callback.
    static ViStatus matchAttributes(ViSession nRm, ViConstString szExpr, ViConstString szRsrc, TFindCallback pfCallback,
                                    ViUInt32 nReserved);
    // 45: appends a resource string to a find list.
    static ViStatus appendFound(ViFindList nList, ViConstString szRsrc, ViUInt32 nReserved);
    // 50: declares the event types a session can raise.
    static ViStatus declareEvents(ViSession nVi, ViUInt32 nCount, const ViEventType* pnTypes, ViUInt32 nReserved);
    // 51: creates an event when the application enabled its type on the session.
    static ViStatus createEvent(ViSession nVi, ViEventType nType, ViEvent* pnContext, ViUInt32* pnMechanisms);
    // 52: delivers an event created by 51.
    static ViStatus raiseEvent(ViSession nVi, ViEvent nContext, ViUInt32 nMechanisms);
    // 56: installs a vector table on a session.
    static ViStatus installTable(ViSession nVi, THandle hTable, ViUInt32 nReserved, ViSession nTarget,
                                 ViUInt32 nReserved2);
    // 57: the runtime's record of a session; its field RECORD_PASSPORT_SLOT is the passport's slot.
    static ViAddr* sessionRecord(ViSession nVi);
    static constexpr int RECORD_PASSPORT_SLOT = 2;
    // 63: announces the passport's detach.
    static ViStatus detach();
};

} // namespace LbPmxPassport

#endif
