// The runtime's objects, one record per kind: resource managers, sessions, find lists and
// event contexts. Every handle names one record in CRuntime's object map; the records' mutable
// fields are guarded by g_aRuntimeMutex, the one mutex of the runtime's state.
#ifndef LBVISAHOST_RUNTIMEOBJECTS_H
#define LBVISAHOST_RUNTIMEOBJECTS_H

#include <condition_variable>
#include <deque>
#include <map>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "core/ThreadSafety.h"
#include "visahost/Services.h"

namespace LbVisaHost {

// Guards the object map and every record in it, the vector tables and the resource locks.
extern LbCore::CMutex g_aRuntimeMutex;

// Default of VI_ATTR_MAX_QUEUE_LENGTH.
const ViUInt32 g_nDefaultMaxQueue = 50;

// The session record handed to passports by service 57: three pointer-sized slots.
enum ERecordSlot { RECORD_SESSION = 0, RECORD_TABLE = 1, RECORD_PASSPORT = 2, RECORD_SLOTS = 3 };

enum class EKind { ResourceManager, Session, FindList, Event };

struct CTable {
    std::string m_strName;
    std::map<std::string, ViSvcProc> m_mapOps;
};

struct CObject {
    explicit CObject(EKind eKind) : m_eKind(eKind) { }
    virtual ~CObject() = default;
    const EKind m_eKind;
    ViObject m_nHandle = 0; // set once, before the record is published in the map
};
using PObject = std::shared_ptr<CObject>;

// Attributes that resource managers and sessions both keep.
struct CAttributeHolder : CObject {
    using CObject::CObject;
    ViAttrState m_nUserData GUARDED_BY(g_aRuntimeMutex) = 0;
    ViUInt32 m_nMaxQueue GUARDED_BY(g_aRuntimeMutex) = g_nDefaultMaxQueue;
    // VI_ATTR_MAX_QUEUE_LENGTH is read-only once the session has enabled an event.
    bool m_bQueueFixed GUARDED_BY(g_aRuntimeMutex) = false;
};

struct CRsrcManager : CAttributeHolder {
    CRsrcManager() : CAttributeHolder(EKind::ResourceManager) { }
};

struct SHandler {
    ViEventType m_nType;
    ViHndlr m_pfHandler;
    ViAddr m_pUser;
};

// What the viParseRsrcEx of the passport that opens a resource says of its name.
struct SParsedRsrc {
    bool m_bParsed = false;
    ViUInt16 m_nIntfType = 0;
    ViUInt16 m_nIntfNum = 0;
    std::string m_strClass;
    std::string m_strExpanded;
};

struct CSession : CAttributeHolder {
    CSession(ViSession nRm, const SParsedRsrc& sParsed, const std::string& strLockKey)
        : CAttributeHolder(EKind::Session), m_nRm(nRm), m_sParsed(sParsed), m_strLockKey(strLockKey)
    {
    }
    ViAddr m_apRecord[RECORD_SLOTS] = {};
    const ViSession m_nRm; // the resource manager that opened it
    const SParsedRsrc m_sParsed;
    // The resource's canonical name in upper case, which keys its resource locks.
    std::string m_strLockKey GUARDED_BY(g_aRuntimeMutex);
    CTable* m_pcTable GUARDED_BY(g_aRuntimeMutex) = nullptr;
    bool m_bClosing GUARDED_BY(g_aRuntimeMutex) = false;
    unsigned m_nCalls GUARDED_BY(g_aRuntimeMutex) = 0; // calls in progress through the table
    std::set<ViEventType> m_setDeclared GUARDED_BY(g_aRuntimeMutex);
    std::map<ViEventType, ViUInt16> m_mapEnabled GUARDED_BY(g_aRuntimeMutex);
    std::deque<ViEvent> m_dqQueue GUARDED_BY(g_aRuntimeMutex);
    // Types of which the full queue dropped an event since the last wait that delivered one.
    std::set<ViEventType> m_setOverflowed GUARDED_BY(g_aRuntimeMutex);
    std::vector<SHandler> m_vHandlers GUARDED_BY(g_aRuntimeMutex);
    // The last operation the passport failed, for exception events it raises itself.
    ViStatus m_nLastError GUARDED_BY(g_aRuntimeMutex) = VI_ERROR_IO;
    std::string m_strLastErrorOp GUARDED_BY(g_aRuntimeMutex);
    std::condition_variable m_cvChanged; // queue changed, a call returned, or closing
};
using PSession = std::shared_ptr<CSession>;

struct CFindList : CObject {
    explicit CFindList(ViSession nRm) : CObject(EKind::FindList), m_nRm(nRm) { }
    const ViSession m_nRm;
    std::vector<std::string> m_vFound GUARDED_BY(g_aRuntimeMutex);
    size_t m_nNext GUARDED_BY(g_aRuntimeMutex) = 0;
};
using PFindList = std::shared_ptr<CFindList>;

struct CEventContext : CObject {
    CEventContext(ViEventType nType, ViSession nSource, ViStatus nStatus, const std::string& strOper)
        : CObject(EKind::Event), m_nEventType(nType), m_nSource(nSource), m_nStatus(nStatus), m_strOperName(strOper)
    {
    }
    const ViEventType m_nEventType;
    const ViSession m_nSource; // the session that raised it
    // Exception and I/O completion events: the outcome (VI_ATTR_STATUS) and the operation
    // (VI_ATTR_OPER_NAME); completions also name the job, the count and the buffer.
    const ViStatus m_nStatus;
    const std::string m_strOperName;
    ViJobId m_nJobId = 0;
    ViUInt64 m_nRetCount = 0;
    ViAddr m_pBuffer = nullptr;
};
using PEventContext = std::shared_ptr<CEventContext>;

// The record of a kind, or null for another kind.
template <typename T> std::shared_ptr<T> as(const PObject& pc, EKind eKind)
{
    return pc && pc->m_eKind == eKind ? std::static_pointer_cast<T>(pc) : std::shared_ptr<T>();
}

} // namespace LbVisaHost

#endif
