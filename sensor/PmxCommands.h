#ifndef LBPMXVISA_PMXCOMMANDS_H
#define LBPMXVISA_PMXCOMMANDS_H
// The narrow waist to the sensor-control library.
// CPmxEvent: the record of one library callback (sensor handle, 32-bit value; both 0 for a
// device change). CIPmxEventListener: every receiver of sensor events. CIPmxCommands: the only
// way to reach the library; each operation returns the library's result code unchanged
// (0 success) and per-sensor operations read the handle of the session they are given.
#include "core/MemoryPool.h"

#include <cstdint>
#include <string>

namespace LbPmxVisa {

class CPmxResourceInfo;
class CPmxSession;

struct CPmxEvent {
    std::int64_t handle;
    std::int32_t value;
};

class CIPmxEventListener : public LbCore::CMemoryPool::CMemoryPoolManaged {
public:
    ~CIPmxEventListener() override { }
    virtual void notifyCommandAcceptedEvent(const CPmxEvent& event) = 0;
    virtual void notifyDataAvailableEvent(const CPmxEvent& event) = 0;
    virtual void notifyErrorOccuredEvent(const CPmxEvent& event) = 0;
    virtual void notifyStateChangedEvent(const CPmxEvent& event) = 0;
    virtual void notifyDeviceChangedEvent(const CPmxEvent& event) = 0;
};

typedef void (CIPmxEventListener::*PmxNotification)(const CPmxEvent&);

// Trigger states of the library's getTriggerState that the emulated instrument shows.
const std::int32_t PMX_TRIGGER_WAITING = 2;   // armed, waiting for its trigger
const std::int32_t PMX_TRIGGER_MEASURING = 3; // triggered, measuring

// Library result codes the system gives a meaning of its own.
const std::int32_t PMX_NO_FURTHER_RESULT = static_cast<std::int32_t>(0xC000000Au);
const std::int32_t PMX_BENIGN_ERROR = static_cast<std::int32_t>(0xD0000007u);
const std::int32_t PMX_UNKNOWN_COMMAND = static_cast<std::int32_t>(0xD0000089u);

class CIPmxCommands {
public:
    virtual ~CIPmxCommands() { }
    virtual void setEventListener(CIPmxEventListener* listener) = 0;
    virtual std::int32_t openDriver() = 0;
    virtual std::int32_t closeDriver() = 0;
    virtual bool isDriverOpen() = 0;
    virtual std::int32_t openSensor(const CPmxResourceInfo& resource, std::int64_t* handle) = 0;
    virtual std::int32_t closeSensor(CPmxSession& session) = 0;
    virtual std::int32_t sendCommand(CPmxSession& session, const std::string& text) = 0;
    virtual std::int32_t getData(CPmxSession& session, std::int32_t* out1, std::int32_t* out2, std::int32_t* out3) = 0;
    virtual std::int32_t clearDevice(CPmxSession& session) = 0;
    virtual std::int32_t getErrorText(std::int32_t code, char* buffer, std::int32_t size) = 0;
    virtual std::int32_t emptyAllBuffers(CPmxSession& session) = 0;
    virtual std::int32_t getStringResult(CPmxSession& session, char* buffer, std::int32_t size) = 0;
    virtual std::int32_t getBinaryResult(CPmxSession& session, unsigned char* buffer, std::int32_t size,
                                         std::int32_t* count) = 0;
    virtual std::int32_t getBitfieldResult(CPmxSession& session, std::int32_t* out1, std::int32_t* out2,
                                           std::int32_t* out3) = 0;
    virtual std::int32_t getLongResult(CPmxSession& session, std::int32_t* out1, std::int32_t* out2,
                                       std::int32_t* out3) = 0;
    virtual std::int32_t getFloatResult(CPmxSession& session, float* out1, float* out2, float* out3) = 0;
    virtual std::int32_t getFloatArray(CPmxSession& session, float* array, std::int32_t capacity,
                                       std::int32_t* count) = 0;
    virtual std::int32_t getAuxFloatArray(CPmxSession& session, float* array1, float* array2, float* array3,
                                          std::int32_t capacity, std::int32_t* count) = 0;
    virtual std::int32_t getTriggerState(CPmxSession& session, std::int32_t* state) = 0;
    virtual std::int32_t getDeviceListLength(std::int32_t* count) = 0;
    virtual std::int32_t getDeviceInfo(std::int32_t index, std::string& name, std::string& type, std::string& serial,
                                       std::int32_t* flag) = 0;
};

} // namespace LbPmxVisa

#endif
