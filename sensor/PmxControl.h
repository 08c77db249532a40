#ifndef LBPMXVISA_PMXCONTROL_H
#define LBPMXVISA_PMXCONTROL_H
// CPmxControl: the one implementation of CIPmxCommands, a thin adapter over the sensor-control
// library PmxControl2_64. Each operation calls one library function with the arguments in the
// library's order and returns its result unchanged; per-sensor operations read the handle of the
// session given. openDriver installs the five callbacks (command accepted, state changed, data
// available, error occurred, device changed) when the library opened its driver; closeDriver
// removes them in the same order before closing it, and the driver-open flag follows the close
// result. Callbacks are installed exactly while the driver is open: a registration that fails
// closes the driver again and fails the open, and a failed close leaves the flag set with the
// callbacks installed again, so the open driver keeps reporting. A sensor whose close failed is
// closed again before it is next opened, so the failure does not keep it from the next session.
// removeCallbacks() is for unloading: afterwards no callback reaches the adapter, whatever the
// driver's state. The callbacks arrive on the library's thread and are handed on that thread to
// the listener stored at that moment (dropped when there is none); the benign error code
// 0xD0000007 is never forwarded. The adapter never throws, never logs, and its destruction makes
// no library call.
#include "core/ThreadSafety.h"
#include "sensor/PmxCommands.h"

#include <atomic>
#include <map>

namespace LbPmxVisa {

class CPmxControl : public CIPmxCommands {
public:
    CPmxControl();
    ~CPmxControl() override;

    void setEventListener(CIPmxEventListener* listener) override;
    std::int32_t openDriver() override;
    std::int32_t closeDriver() override;
    bool isDriverOpen() override;
    std::int32_t openSensor(const CPmxResourceInfo& resource, std::int64_t* handle) override;
    std::int32_t closeSensor(CPmxSession& session) override;
    std::int32_t sendCommand(CPmxSession& session, const std::string& text) override;
    std::int32_t getData(CPmxSession& session, std::int32_t* out1, std::int32_t* out2, std::int32_t* out3) override;
    std::int32_t clearDevice(CPmxSession& session) override;
    std::int32_t getErrorText(std::int32_t code, char* buffer, std::int32_t size) override;
    std::int32_t emptyAllBuffers(CPmxSession& session) override;
    std::int32_t getStringResult(CPmxSession& session, char* buffer, std::int32_t size) override;
    std::int32_t getBinaryResult(CPmxSession& session, unsigned char* buffer, std::int32_t size,
                                 std::int32_t* count) override;
    std::int32_t getBitfieldResult(CPmxSession& session, std::int32_t* out1, std::int32_t* out2,
                                   std::int32_t* out3) override;
    std::int32_t getLongResult(CPmxSession& session, std::int32_t* out1, std::int32_t* out2,
                               std::int32_t* out3) override;
    std::int32_t getFloatResult(CPmxSession& session, float* out1, float* out2, float* out3) override;
    std::int32_t getFloatArray(CPmxSession& session, float* array, std::int32_t capacity, std::int32_t* count) override;
    std::int32_t getAuxFloatArray(CPmxSession& session, float* array1, float* array2, float* array3,
                                  std::int32_t capacity, std::int32_t* count) override;
    std::int32_t getTriggerState(CPmxSession& session, std::int32_t* state) override;
    std::int32_t getDeviceListLength(std::int32_t* count) override;
    std::int32_t getDeviceInfo(std::int32_t index, std::string& name, std::string& type, std::string& serial,
                               std::int32_t* flag) override;

    // Removes the five callbacks; when it returns no callback runs in the adapter any more.
    void removeCallbacks();

private:
    CPmxControl(const CPmxControl&) = delete;
    CPmxControl& operator=(const CPmxControl&) = delete;

    static void onCommandAccepted(std::int64_t handle, std::int32_t value, void* user);
    static void onStateChanged(std::int64_t handle, std::int32_t value, void* user);
    static void onDataAvailable(std::int64_t handle, std::int32_t value, void* user);
    static void onErrorOccurred(std::int64_t handle, std::int32_t code, void* user);
    static void onDeviceChanged(void* user);
    void forward(PmxNotification notification, std::int64_t handle, std::int32_t value);
    std::int32_t installCallbacks();

    // Handles the library refused to close, by sensor descriptor.
    LbCore::CMutex m_cUnclosedLock;
    std::map<std::string, std::int64_t> m_cUnclosed GUARDED_BY(m_cUnclosedLock);

    // Atomic: written by application threads, read on the library's callback thread.
    std::atomic<bool> m_bDriverOpen;
    std::atomic<CIPmxEventListener*> m_pcListener;
};

} // namespace LbPmxVisa

#endif
