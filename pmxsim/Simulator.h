// Contract: CSimulator is the whole state of the simulated sensor-control library, one instance per
// process (instance()), behind one mutex. Every exported function is one member call. Callbacks
// are delivered by the worker thread that runs while the driver is open, one at a time, in the
// order the events were posted, and never while the mutex is held, so a callback may call back
// into the library. Timed work (delayed acknowledgements, measurements) is a queue of tasks that
// the same worker runs when they are due.
//
// The instance is never destroyed: unloading the library must not race a callback thread that the
// application left running; shutdownAtUnload only stops that thread where the platform allows.
#ifndef PMXSIM_SIMULATOR_H
#define PMXSIM_SIMULATOR_H

#include "pmxsim/PmxSim.h"
#include "pmxsim/WorkerThread.h"

#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <deque>
#include <map>
#include <memory>
#include <mutex>
#include <random>
#include <string>
#include <utility>
#include <vector>

namespace PmxSim {

// The library functions that PmxSimFailNext can make fail, in export-table order.
enum EFunction {
    eOpenDriver,
    eCloseDriver,
    eOpenSensor,
    eCloseSensor,
    eSendCommand,
    eGetData,
    eGetFloatResult,
    eGetFloatArray,
    eGetAuxFloatArray,
    eGetLongResult,
    eGetBitfieldResult,
    eGetBinaryResult,
    eGetStringResult,
    eGetTriggerState,
    eGetDeviceListLength,
    eGetDeviceInfo,
    eClearDevice,
    eEmptyAllBuffers,
    eGetErrorText,
    eSetDeviceChanged,
    eSetErrorOccurred,
    eSetDataAvailable,
    eSetCommandAccepted,
    eSetStateChanged,
    eFunctionCount
};

enum ECallback {
    eCommandAccepted,
    eStateChanged,
    eDataAvailable,
    eErrorOccurred,
    eDeviceChanged,
    eCallbackCount
};

class CSimulator {
public:
    static CSimulator& instance();
    static void shutdownAtUnload();

    int32_t openDriver();
    int32_t closeDriver();
    int32_t openSensor(const char* descriptor, int64_t* handle);
    int32_t closeSensor(int64_t handle);
    int32_t sendCommand(int64_t handle, const char* text, int32_t timeout);
    int32_t clearDevice(int64_t handle);
    int32_t emptyAllBuffers(int64_t handle);
    int32_t getTriggerState(int64_t handle, int32_t* state);
    int32_t getData(int64_t handle, int32_t* dataType, int32_t* count, int32_t* pending);
    // The getters of one result kind: scalars (three values), arrays, bytes and text.
    int32_t getScalars(EFunction fn, int64_t handle, void* v1, void* v2, void* v3);
    int32_t getFloatArrays(EFunction fn, int64_t handle, float* a1, float* a2, float* a3,
        int32_t capacity, int32_t* count);
    int32_t getBinaryResult(int64_t handle, uint8_t* buffer, int32_t size, int32_t* count);
    int32_t getStringResult(int64_t handle, char* buffer, int32_t size);
    int32_t getDeviceListLength(int32_t* count);
    int32_t getDeviceInfo(int32_t index, char* name, char* type, char* serial, int32_t* flag);
    int32_t getErrorText(int32_t code, char* buffer, int32_t size);
    int32_t setNotifyCallback(EFunction fn, ECallback kind, PmxNotifyCallback callback, void* user);
    int32_t setDeviceChangedCallback(PmxDeviceChangedCallback callback, void* user);

    int32_t reset();
    int32_t attach(const char* type, const char* serial);
    int32_t detach(const char* serial);
    int32_t setDeviceFlag(const char* serial, int32_t flag);
    int32_t queueResult(const char* serial, int32_t dataType, const void* values, int32_t count);
    int32_t reportError(const char* serial, int32_t code);
    int32_t setTriggerState(const char* serial, int32_t state);
  int32_t getLastCommand(const char* serial, char* text, int32_t size, int32_t* timeout);
    int32_t setDelays(int32_t ackMs, int32_t measureMs);
    int32_t setAutoAck(int32_t on);
    int32_t failNext(const char* function, int32_t code);

private:
    typedef std::chrono::steady_clock Clock;

    struct SResult {
        int32_t nType = 0;
        std::vector<uint8_t> bytes; // types 0 and 10
        std::vector<int32_t> ints; // types 1, 2, 3, 8, 9
        std::vector<float> floats; // types 4, 5, 6, 7, 11
    };

    struct SSensor {
        std::string strType;
        std::string strSerial;
        int32_t nFlag = 1;
        int64_t nHandle = 0; // 0 while not open
        bool bAttached = true;
        int32_t nTriggerState = 0;
        bool bMeasuring = false;
        bool bContinuous = false;
        uint64_t nMeasurement = 0; // number of the running measurement; stale steps are dropped
        bool bTrace = false;
        int32_t nTracePoints = 0;
        int32_t nCommandCount = 0;
    std::string strLastCommand;  // as sent, with its timeout argument
    int32_t nLastTimeout = 0;
        Clock::time_point tLastCommand;
        std::deque<SResult> results;
    };
    typedef std::shared_ptr<SSensor> SensorPtr;

    struct SEvent {
        ECallback eKind;
        int64_t nHandle;
        int32_t nValue;
    };

    struct STask {
        enum EKind { eCommand, eMeasurementDone } eKind;
        SensorPtr pSensor;
        int64_t nHandle; // the handle the task was made for; a closed or reopened sensor drops it
        std::string strText;
        uint64_t nMeasurement;
    };

    struct SCallback {
        PmxNotifyCallback pfnNotify = nullptr;
        PmxDeviceChangedCallback pfnDevice = nullptr;
        void* pvUser = nullptr;
    };

    CSimulator();

    static void workerMain(void* arg);
    void run(uint64_t generation);
    // Stops the worker with the lock held; the worker is joined (or detached) by the caller after
    // releasing the lock, through the returned record.
    SWorker* stopDriverLocked();
    void finishStop(SWorker* worker);
    void loadDefaultsLocked();
    void waitForDeliveryLocked(std::unique_lock<std::mutex>& lock, ECallback kind);
    void waitForAllDeliveriesLocked(std::unique_lock<std::mutex>& lock);

    bool takeInjected(EFunction fn, int32_t* code);
    int32_t findOpen(int64_t handle, SensorPtr* sensor);
    SensorPtr findAttached(const char* serial);
    SensorPtr findOpenBySerial(const char* serial, int32_t* code);
    int32_t takeResult(int64_t handle, int32_t firstType, int32_t lastType, SensorPtr* sensor);

    void post(ECallback kind, int64_t handle, int32_t value);
    void schedule(Clock::time_point due, STask task);
    void setState(SSensor& sensor, int32_t state);
    void runTask(STask& task, Clock::time_point now);
    void runCommand(SSensor& sensor, const std::string& text, Clock::time_point now);
    void startMeasurement(SSensor& sensor, Clock::time_point now);
    void finishMeasurement(SSensor& sensor, Clock::time_point now);
    void abortMeasurement(SSensor& sensor);
    void addResult(SSensor& sensor, SResult result);
    float noise();

    std::mutex m_aMutex;
    std::condition_variable m_aWorkChanged; // wakes the worker
    std::condition_variable m_aDeliveryChanged; // wakes registrations waiting for a delivery

    bool m_bDriverOpen = false;
    SWorker* m_pWorker = nullptr;
    uint64_t m_nGeneration = 0; // a worker runs while the generation it was started for is current

    std::vector<SensorPtr> m_aSensors; // attached, in attach order
    std::map<int64_t, SensorPtr> m_aOpen; // open handles, including detached sensors
    int64_t m_nNextHandle;

    std::deque<SEvent> m_aOutbox;
    std::map<std::pair<Clock::time_point, uint64_t>, STask> m_aTasks;
    uint64_t m_nTaskSequence = 0;

    SCallback m_aCallbacks[eCallbackCount];
    int m_aDelivering[eCallbackCount] = {}; // callbacks running right now, per kind
    uint64_t m_nDeliveries = 0; // callbacks that have returned

    int32_t m_nAckMs = 0;
    int32_t m_nMeasureMs = 0;
    bool m_bAutoAck = true;
    int32_t m_aInjected[eFunctionCount];
    std::minstd_rand m_aRandom;
};

} // namespace PmxSim

#endif
