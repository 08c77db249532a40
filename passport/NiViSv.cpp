#include "passport/NiViSv.h"

// The service library's exports; on Windows the import library maps each name to its ordinal.
extern "C" {
ViStatus _VI_FUNC viSvc30(ViConstString, ViUInt32, ViUInt32, ViAddr*);
ViStatus _VI_FUNC viSvc31(ViAddr, ViUInt32, ViUInt32);
ViStatus _VI_FUNC viSvc32(ViAddr, ViUInt32);
ViStatus _VI_FUNC viSvc40(ViConstString, ViVersion, ViUInt32, ViAddr*);
ViStatus _VI_FUNC viSvc41(ViAddr, ViConstString, LbPmxPassport::CNiViSv::TEntry);
ViStatus _VI_FUNC viSvc43(ViSession, ViConstString, ViConstString, ViUInt16*);
ViStatus _VI_FUNC viSvc44(ViSession, ViConstString, ViConstString, LbPmxPassport::CNiViSv::TFindCallback, ViUInt32);
ViStatus _VI_FUNC viSvc45(ViFindList, ViConstString, ViUInt32);
ViStatus _VI_FUNC viSvc50(ViSession, ViUInt32, const ViEventType*, ViUInt32);
ViStatus _VI_FUNC viSvc51(ViSession, ViEventType, ViEvent*, ViUInt32*);
ViStatus _VI_FUNC viSvc52(ViSession, ViEvent, ViUInt32);
ViStatus _VI_FUNC viSvc56(ViSession, ViAddr, ViUInt32, ViSession, ViUInt32);
ViAddr* _VI_FUNC viSvc57(ViSession);
ViStatus _VI_FUNC viSvc63(void);
}

namespace LbPmxPassport {

ViStatus CNiViSv::createLock(ViConstString szName, ViUInt32 nInitial, ViUInt32 nMaximum, THandle* phLock)
{
    return viSvc30(szName, nInitial, nMaximum, phLock);
}
ViStatus CNiViSv::acquireLock(THandle hLock, ViUInt32 nTimeout, ViUInt32 nReserved)
{
    return viSvc31(hLock, nTimeout, nReserved);
}
ViStatus CNiViSv::releaseLock(THandle hLock, ViUInt32 nReserved)
{
    return viSvc32(hLock, nReserved);
}
ViStatus CNiViSv::createTable(ViConstString szName, ViVersion nVersion, ViUInt32 nReserved, THandle* phTable)
{
    return viSvc40(szName, nVersion, nReserved, phTable);
}
ViStatus CNiViSv::addOperation(THandle hTable, ViConstString szOperation, TEntry pfEntry)
{
    return viSvc41(hTable, szOperation, pfEntry);
}
ViStatus CNiViSv::matchRsrc(ViSession nRm, ViConstString szExpr, ViConstString szRsrc, ViUInt16* pnAttrFlag)
{
    return viSvc43(nRm, szExpr, szRsrc, pnAttrFlag);
}
ViStatus CNiViSv::matchAttributes(ViSession nRm, ViConstString szExpr, ViConstString szRsrc, TFindCallback pfCallback,
                                  ViUInt32 nReserved)
{
    return viSvc44(nRm, szExpr, szRsrc, pfCallback, nReserved);
}
ViStatus CNiViSv::appendFound(ViFindList nList, ViConstString szRsrc, ViUInt32 nReserved)
{
    return viSvc45(nList, szRsrc, nReserved);
}
ViStatus CNiViSv::declareEvents(ViSession nVi, ViUInt32 nCount, const ViEventType* pnTypes, ViUInt32 nReserved)
{
    return viSvc50(nVi, nCount, pnTypes, nReserved);
}
ViStatus CNiViSv::createEvent(ViSession nVi, ViEventType nType, ViEvent* pnContext, ViUInt32* pnMechanisms)
{
    return viSvc51(nVi, nType, pnContext, pnMechanisms);
}
ViStatus CNiViSv::raiseEvent(ViSession nVi, ViEvent nContext, ViUInt32 nMechanisms)
{
    return viSvc52(nVi, nContext, nMechanisms);
}
ViStatus CNiViSv::installTable(ViSession nVi, THandle hTable, ViUInt32 nReserved, ViSession nTarget,
                               ViUInt32 nReserved2)
{
    return viSvc56(nVi, hTable, nReserved, nTarget, nReserved2);
}
ViAddr* CNiViSv::sessionRecord(ViSession nVi)
{
    return viSvc57(nVi);
}
ViStatus CNiViSv::detach()
{
    return viSvc63();
}

} // namespace LbPmxPassport
