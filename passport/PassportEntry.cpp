// The passport's boundary with the VISA runtime: the entry functions registered in the vector
// table, the find callback, process attach/detach and the logging configuration.
#include "core/Log.h"
#include "core/ThreadSafety.h"
#include "passport/LbPmxInstrSesn.h"
#include "passport/Passport.h"
#include "sensor/PmxControl.h"
#include "sensor/PmxDataSerializer.h"
#include "sensor/PmxScpiCommandParser.h"
#include "sensor/PmxSessionDispatcher.h"
#include "sensor/PmxSessionState.h"

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstring>
#include <memory>
#include <new>
#include <set>
#include <vector>

namespace LbPmxPassport {

namespace {

CNiViSv::THandle s_hPassportLock = nullptr;
CNiViSv::THandle s_hVectorTable = nullptr;
// Set at process detach. The module's static objects go right after it, so an operation that
// arrives later (an exit handler of the application closing its sessions) must not reach them.
std::atomic<bool> s_bDetached(false);
// The objects of the open sessions, under the passport lock, so that a detach can close what the
// application left open.
std::set<CBasePassport*> s_cOpenObjects;

LbCore::CLogger s_cLogger = LbCore::CLogManager::getLogger("CLbPmxInstrSesn");

// Closed objects that wait for their last call to leave, so that a process detach lets the
// calls its closes abandoned leave (and destroy their objects) before the driver and the
// module's objects go.
std::atomic<unsigned> s_nClosedInUse(0);
LbCore::CMutex s_cClosedLock;
std::condition_variable s_cClosedGone;
// Bounds that wait: a call stuck in the sensor library must not hold the process's exit.
const std::chrono::seconds CALLS_LEAVE_WAIT(5);

// The object the runtime's record of a session holds in the passport's slot, or null.
CBasePassport* objectOf(ViSession session)
{
    ViAddr* record = CNiViSv::sessionRecord(session);
    return record == nullptr ? nullptr : static_cast<CBasePassport*>(record[CNiViSv::RECORD_PASSPORT_SLOT]);
}

// Each entry function forwards to the session's object. A handle without an object (never
// opened, or already closed) answers VI_ERROR_INV_OBJECT instead of touching a null pointer.
// After detach: VI_ERROR_SYSTEM_ERROR.
template <class F> ViStatus forward(ViSession session, F call)
{
    if (s_bDetached) {
        return VI_ERROR_SYSTEM_ERROR;
    }
    CBasePassport* object = objectOf(session);
    if (object == nullptr) {
        return VI_ERROR_INV_OBJECT;
    }
    CBasePassport::CCall inProgress(*object);
    return call(*object);
}

ViStatus _VI_FUNC entryFindRsrc(ViSession rm, ViConstString expression, ViPFindList findList)
{
    if (s_bDetached) {
        return VI_ERROR_SYSTEM_ERROR;
    }
    return CLbPmxInstrSesn::viFindRsrc(rm, expression, findList);
}

ViStatus _VI_FUNC entryParseRsrc(ViSession rm, ViConstRsrc name, ViPUInt16 type, ViPUInt16 number)
{
    if (s_bDetached) {
        return VI_ERROR_SYSTEM_ERROR;
    }
    return CLbPmxInstrSesn::viParseRsrc(rm, name, type, number);
}

ViStatus _VI_FUNC entryParseRsrcEx(ViSession rm, ViConstRsrc name, ViPUInt16 type, ViPUInt16 number,
                                   ViChar resourceClass[], ViChar expandedName[], ViChar alias[])
{
    if (s_bDetached) {
        return VI_ERROR_SYSTEM_ERROR;
    }
    return CLbPmxInstrSesn::viParseRsrcEx(rm, name, type, number, resourceClass, expandedName, alias);
}

ViStatus _VI_FUNC entryOpen(ViSession, ViConstRsrc name, ViAccessMode mode, ViUInt32 timeout, ViPSession session)
{
    if (session == nullptr) {
        return VI_ERROR_INV_PARAMETER;
    }
    if (s_bDetached) {
        return VI_ERROR_SYSTEM_ERROR;
    }
    // Without the runtime's record the object could never be reached again (nor closed, nor
    // counted out of the open sensor sessions): the open fails before anything is opened.
    ViAddr* record = CNiViSv::sessionRecord(*session);
    if (record == nullptr) {
        s_cLogger.error("LbPmxPassport::CLbPmxInstrSesn::viOpen") << "No session record for session " << *session;
        return VI_ERROR_SYSTEM_ERROR;
    }
    CLbPmxInstrSesn* object = new (std::nothrow) CLbPmxInstrSesn();
    if (object == nullptr) {
        return VI_ERROR_ALLOC;
    }
    object->setVisaSession(*session, record);
    ViStatus status = object->viOpen(name, mode, timeout);
    if (status < VI_SUCCESS) {
        // The object may hold the last reference to a sensor session that it just created, whose
        // release may close the driver: viClose releases it, like every release, under the
        // passport lock (which is not re-entrant, so it is not held here).
        object->viClose();
    } else {
        CPassportLock lock;
        s_cOpenObjects.insert(object);
    }
    return status;
}

ViStatus _VI_FUNC entryClose(ViObject session)
{
    // After detach the object stays: what it would release is already gone.
    if (s_bDetached) {
        return VI_SUCCESS;
    }
    CBasePassport* object = objectOf(session);
    if (object == nullptr) {
        return VI_SUCCESS;
    }
    {
        // Closed once: a process detach may be closing the same object right now.
        CPassportLock lock;
        if (s_cOpenObjects.erase(object) == 0) {
            return VI_SUCCESS;
        }
    }
    return object->viClose();
}

ViStatus _VI_FUNC entryGetAttribute(ViObject session, ViAttr attribute, void* value)
{
    return forward(session, [&](CBasePassport& o) { return o.viGetAttribute(attribute, value); });
}

ViStatus _VI_FUNC entrySetAttribute(ViObject session, ViAttr attribute, ViAttrState value)
{
    return forward(session, [&](CBasePassport& o) { return o.viSetAttribute(attribute, value); });
}

ViStatus _VI_FUNC entryTerminate(ViObject session, ViUInt16 degree, ViJobId jobId)
{
    return forward(session, [&](CBasePassport& o) { return o.viTerminate(degree, jobId); });
}

ViStatus _VI_FUNC entryWrite(ViSession session, ViConstBuf buffer, ViUInt32 count, ViPUInt32 returnCount)
{
    return forward(session, [&](CBasePassport& o) { return o.viWrite(buffer, count, returnCount); });
}

ViStatus _VI_FUNC entryRead(ViSession session, ViPBuf buffer, ViUInt32 count, ViPUInt32 returnCount)
{
    return forward(session, [&](CBasePassport& o) { return o.viRead(buffer, count, returnCount); });
}

ViStatus _VI_FUNC entryAssertTrigger(ViSession session, ViUInt16 protocol)
{
    return forward(session, [&](CBasePassport& o) { return o.viAssertTrigger(protocol); });
}

ViStatus _VI_FUNC entryReadSTB(ViSession session, ViPUInt16 status)
{
    return forward(session, [&](CBasePassport& o) { return o.viReadSTB(status); });
}

ViStatus _VI_FUNC entryClear(ViSession session)
{
    return forward(session, [&](CBasePassport& o) { return o.viClear(); });
}

ViStatus _VI_FUNC entryEnableEvent(ViSession session, ViEventType type, ViUInt16 mechanism, ViEventFilter context)
{
    return forward(session, [&](CBasePassport& o) { return o.viEnableEvent(type, mechanism, context); });
}

ViStatus _VI_FUNC entryDisableEvent(ViSession session, ViEventType type, ViUInt16 mechanism)
{
    return forward(session, [&](CBasePassport& o) { return o.viDisableEvent(type, mechanism); });
}

template <class F> CNiViSv::TEntry proc(F function)
{
    return reinterpret_cast<CNiViSv::TEntry>(reinterpret_cast<void*>(function));
}

ViStatus registerVectorTable()
{
    ViStatus status =
        CNiViSv::createTable("LbPmxPassport C++ LbPmxInstrSesn Vector Table", 0x00400000, 0, &s_hVectorTable);
    if (status < VI_SUCCESS) {
        return status;
    }
    const struct {
        const char* name;
        CNiViSv::TEntry entry;
    } operations[] = {
        {"viFindRsrc", proc(&entryFindRsrc)},
        {"viParseRsrc", proc(&entryParseRsrc)},
        {"viParseRsrcEx", proc(&entryParseRsrcEx)},
        {"viOpen", proc(&entryOpen)},
        {"viClose", proc(&entryClose)},
        {"viGetAttribute", proc(&entryGetAttribute)},
        {"viSetAttribute", proc(&entrySetAttribute)},
        {"viTerminate", proc(&entryTerminate)},
        {"viWrite", proc(&entryWrite)},
        {"viRead", proc(&entryRead)},
        {"viAssertTrigger", proc(&entryAssertTrigger)},
        {"viReadSTB", proc(&entryReadSTB)},
        {"viClear", proc(&entryClear)},
        {"viEnableEvent", proc(&entryEnableEvent)},
        {"viDisableEvent", proc(&entryDisableEvent)},
    };
    for (std::size_t i = 0; i < sizeof operations / sizeof operations[0]; ++i) {
        CNiViSv::addOperation(s_hVectorTable, operations[i].name, operations[i].entry);
    }
    return VI_SUCCESS;
}

} // namespace

ViStatus _VI_FUNCH findCallback(ViSession session, ViAttr attribute, ViUInt16 op, ViAttrState value, ViConstString text,
                                ViUInt32 reserved)
{
    return forward(session, [&](CBasePassport& o) { return o.findAttribute(attribute, op, value, text, reserved); });
}

CNiViSv::THandle getVectorTable()
{
    return s_hVectorTable;
}

void closedObjectPending()
{
    ++s_nClosedInUse;
}

void closedObjectDestroyed()
{
    if (--s_nClosedInUse == 0) {
        LbCore::CMutexLock guard(s_cClosedLock);
        s_cClosedGone.notify_all();
    }
}

CPassportLock::CPassportLock()
{
    CNiViSv::acquireLock(s_hPassportLock, 0xFFFFFFFFu, 0);
}

CPassportLock::~CPassportLock()
{
    CNiViSv::releaseLock(s_hPassportLock, 0);
}

LbPmxVisa::CPmxControl& getAdapter()
{
    static LbPmxVisa::CPmxControl s_cAdapter;
    return s_cAdapter;
}

namespace {
// Process-wide objects that sessions use on their worker threads are built here, before the
// module entry's own static object, so that at process exit they are destroyed only after the
// detach has stopped those threads.
void buildProcessWideObjects()
{
    using LbPmxVisa::CIPmxSessionState;
    CIPmxSessionState::noData();
    CIPmxSessionState::waitingForData();
    CIPmxSessionState::dataAvailable();
    CIPmxSessionState::errorQueueToNoData();
    CIPmxSessionState::errorQueueToPmxDataAvailable();
    CIPmxSessionState::opStatusToNoData();
    CIPmxSessionState::opStatusToPmxDataAvailable();
    LbPmxVisa::CPmxScpiCommandParser::getInstance();
    LbPmxVisa::CPmxDataSerializerFactory::getInstance();
}
} // namespace

bool attachProcess()
{
    if (CNiViSv::createLock("LbPmxPassport C++ Passport Semaphore", 1, 1, &s_hPassportLock) < VI_SUCCESS) {
        return false;
    }
    if (registerVectorTable() < VI_SUCCESS) {
        return false;
    }
    readConfiguration();
    buildProcessWideObjects();
    LbPmxVisa::CPmxSessionDispatcher::attach(&getAdapter());
    return true;
}

void detachProcess(EDetach kind)
{
    CNiViSv::detach();
    s_bDetached = true;
    switch (kind) {
    case DETACH_THREADS_RUNNING: {
        // Nothing may run in the module once its static objects go: the sessions the application
        // left open are closed as by viClose, which stops their event threads and closes their
        // sensors and, with the last one, the driver (joining the library's thread). A driver
        // that would not close keeps no callback. viClose takes the passport lock itself, which
        // is not re-entrant, so it is held only around the list.
        std::vector<CBasePassport*> objects;
        {
            CPassportLock lock;
            objects.assign(s_cOpenObjects.begin(), s_cOpenObjects.end());
            s_cOpenObjects.clear();
        }
        for (std::size_t i = 0; i < objects.size(); ++i) {
            objects[i]->viClose();
        }
        {
            std::unique_lock<std::mutex> guard(s_cClosedLock.native());
            s_cClosedGone.wait_for(guard, CALLS_LEAVE_WAIT, [] { return s_nClosedInUse == 0; });
        }
        CPassportLock lock;
        if (getAdapter().isDriverOpen()) {
            getAdapter().closeDriver();
        }
        getAdapter().removeCallbacks();
        LbPmxVisa::CPmxSessionDispatcher::detach(&getAdapter());
        break;
    }
    case DETACH_UNDER_LOADER_LOCK:
        // A thread cannot end while this thread holds the loader lock, so none is joined here;
        // the callbacks are removed (that waits only for a running callback).
        getAdapter().removeCallbacks();
        LbPmxVisa::CPmxSessionDispatcher::forget(&getAdapter());
        break;
    case DETACH_THREADS_STOPPED:
        LbPmxVisa::CPmxSessionDispatcher::forget(&getAdapter());
        break;
    }
}

// ---- configuration

namespace {
// The text of a value, never read past its buffer: a value without a terminating zero within
// its bytes ends at the buffer's end.
std::string textOf(const char (&buffer)[CONFIGURATION_VALUE_SIZE], unsigned size)
{
    std::size_t length = 0;
    while (length < size && length < sizeof buffer && buffer[length] != '\0') {
        ++length;
    }
    return std::string(buffer, length);
}

void readLogFile()
{
    static std::unique_ptr<LbCore::CLogFileAppender> s_pcAppender;
    char buffer[CONFIGURATION_VALUE_SIZE] = {0};
    unsigned size = 0;
    if (!queryConfigurationValue("LOG_FILE", buffer, size) || size < 1 || size > CONFIGURATION_VALUE_SIZE ||
        s_pcAppender) {
        return;
    }
    s_pcAppender.reset(new LbCore::CLogFileAppender(textOf(buffer, size)));
}
} // namespace

void readConfiguration()
{
    char buffer[CONFIGURATION_VALUE_SIZE] = {0};
    unsigned size = 0;
    if (!queryConfigurationValue("LOG_LEVEL", buffer, size) || size < 1 || size > CONFIGURATION_VALUE_SIZE) {
        return;
    }
    // Compared byte for byte including the terminating zero: no case folding, no trimming. A
    // value that fills its whole buffer without a zero is no text at all.
    if (std::memchr(buffer, '\0', sizeof buffer) == nullptr) {
        return;
    }
    std::string level = textOf(buffer, size);
    // "NONE", like any other text, changes nothing.
    static const char* const LEVELS[] = {"DEBUG", "INFO", "WARN", "ERROR", "FATAL"};
    for (int i = 0; i < 5; ++i) {
        if (level == LEVELS[i]) {
            LbCore::CLogManager::setLevel(i);
            readLogFile();
        }
    }
}

} // namespace LbPmxPassport
