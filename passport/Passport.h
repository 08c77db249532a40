#ifndef LBPMXPASSPORT_PASSPORT_H
#define LBPMXPASSPORT_PASSPORT_H
// Process-wide passport state and the module entry: the passport lock (serialises viOpen,
// viClose and the collection step of viFindRsrc), the vector table installed on every opened
// session, the sensor-library adapter, and the LOG_LEVEL / LOG_FILE configuration.
#include "passport/NiViSv.h"

namespace LbPmxVisa {
class CPmxControl;
}

namespace LbPmxPassport {

CNiViSv::THandle getVectorTable();

// Handed to the runtime's attribute matching of viFindRsrc: answers from the session's object.
ViStatus _VI_FUNCH findCallback(ViSession session, ViAttr attribute, ViUInt16 op, ViAttrState value, ViConstString text,
                                ViUInt32 reserved);

// Acquires the passport lock for its lifetime (unlimited wait); statuses are not looked at.
class CPassportLock {
public:
    CPassportLock();
    ~CPassportLock();
    CPassportLock(const CPassportLock&) = delete;
    CPassportLock& operator=(const CPassportLock&) = delete;
};

// A session object being closed is counted from its viClose until it is destroyed (by viClose,
// or by its last call in progress), so that a process detach can wait for it.
void closedObjectPending();
void closedObjectDestroyed();

// Process attach: lock, vector table, configuration, adapter attached to the dispatcher.
// False when the lock or the vector table could not be created.
bool attachProcess();
// How the module is detached, which decides what the detach may still wait for.
enum EDetach {
    DETACH_THREADS_RUNNING,   // POSIX unload or exit: every thread still runs
    DETACH_UNDER_LOADER_LOCK, // Windows unload while the process runs: no thread can end now
    DETACH_THREADS_STOPPED    // Windows process end: the other threads are gone, maybe holding locks
};
// Process detach: tells the runtime, and refuses every later operation. While threads run it
// closes the sessions the application left open and the driver, and removes the library's
// callbacks, so that nothing runs in the module when its static objects go; then it detaches the
// adapter from the dispatcher.
void detachProcess(EDetach kind);

// The sensor-library adapter, created on first use, destroyed at process exit.
LbPmxVisa::CPmxControl& getAdapter();

// Reads LOG_LEVEL and LOG_FILE and configures logging by their rules.
void readConfiguration();

// The size of a configuration value's buffer, terminating zero included.
const unsigned CONFIGURATION_VALUE_SIZE = 80;

// One configuration value (at most CONFIGURATION_VALUE_SIZE bytes including its terminating zero)
// into buffer; false when it is missing or longer. One implementation per platform.
bool queryConfigurationValue(const char* name, char (&buffer)[CONFIGURATION_VALUE_SIZE], unsigned& size);

} // namespace LbPmxPassport

#endif
