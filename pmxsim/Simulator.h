// Contract: CSimulator is the whole state of the simulated sensor-control library, one instance per
// process (instance()), behind one mutex. Every exported function is one member call. Callbacks
// are delivered by the worker thread that runs while the driver is open, one at a time, in the
// order the events were posted, and never while the mutex is held, so a callback may call back
// into the library. Timed work (delayed acknowledgements, measurements) is a queue of tasks that
// the same worker runs when they are due.
//
// The instance is never destroyed: unloading the library must not race a callback thread that the
// application left running; shutdownAtUnload only stops that thread where the platform allows.
//
// The members live in four files: SimulatorDriver.cpp (driver, worker thread, callbacks, the
// shared start of every library function), SimulatorLibrary.cpp (the other library functions),
// SimulatorModel.cpp (what a sensor does with a command) and SimulatorControl.cpp (the PmxSim*
// control functions and the configured sensors).
#ifndef PMXSIM_SIMULATOR_H
#define PMXSIM_SIMULATOR_H

#include "core/ThreadSafety.h"
#include "pmxsim/CommandParser.h"
#include "pmxsim/PmxSim.h"
#include "pmxsim/Scenario.h"
#include "pmxsim/SimSupport.h"
#include "pmxsim/WorkerThread.h"

#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <deque>
#include <map>
#include <memory>
#include <random>
#include <string>
#include <utility>
#include <vector>

namespace PmxSim {

// The library functions that PmxSimFailNext can make fail, in export-table order.
enum EFunction {
    FN_OPEN_DRIVER,
    FN_CLOSE_DRIVER,
    FN_OPEN_SENSOR,
    FN_CLOSE_SENSOR,
    FN_SEND_COMMAND,
    FN_GET_DATA,
    FN_GET_FLOAT_RESULT,
    FN_GET_FLOAT_ARRAY,
    FN_GET_AUX_FLOAT_ARRAY,
    FN_GET_LONG_RESULT,
    FN_GET_BITFIELD_RESULT,
    FN_GET_BINARY_RESULT,
    FN_GET_STRING_RESULT,
    FN_GET_TRIGGER_STATE,
    FN_GET_DEVICE_LIST_LENGTH,
    FN_GET_DEVICE_INFO,
    FN_CLEAR_DEVICE,
    FN_EMPTY_ALL_BUFFERS,
    FN_GET_ERROR_TEXT,
    FN_SET_DEVICE_CHANGED,
    FN_SET_ERROR_OCCURRED,
    FN_SET_DATA_AVAILABLE,
    FN_SET_COMMAND_ACCEPTED,
    FN_SET_STATE_CHANGED,
    FN_COUNT
};
static_assert(FN_COUNT == FUNCTION_COUNT, "one name per library function");

enum ECallback {
    CALLBACK_COMMAND_ACCEPTED,
    CALLBACK_STATE_CHANGED,
    CALLBACK_DATA_AVAILABLE,
    CALLBACK_ERROR_OCCURRED,
    CALLBACK_DEVICE_CHANGED,
    CALLBACK_COUNT
};

class CSimulator {
public:
    // made: set when this call made the instance (which then has just loaded the defaults).
    static CSimulator& instance(bool* made = nullptr);
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
    int32_t getFloatArrays(EFunction fn, int64_t handle, float* a1, float* a2, float* a3, int32_t capacity,
                           int32_t* count);
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

    // Sensor records are reached only through the simulator's fields, so m_aMutex guards them too.
    struct SResult {
        int32_t nType = 0;
        std::vector<uint8_t> bytes; // binary block and text
        std::vector<int32_t> ints;  // bit fields and longs
        std::vector<float> floats;  // float values and arrays
    };

    // What *RST restores: the measurement function and the settings that shape a result.
    struct SSettings {
        bool bTrace = false;
        int32_t nTracePoints = DEFAULT_TRACE_POINTS;
        double dFrequencyHz = DEFAULT_FREQUENCY_HZ;
        bool bAveraging = false;
        int32_t nAverageCount = 1;
        double dOffsetDb = 0.0;
        bool bWatt = false;
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
        uint64_t nMeasurement = 0;    // number of the running measurement; stale steps are dropped
        bool bMeasuringTrace = false; // what the running measurement gives
        SSettings settings;
        int32_t nEventStatus = 0;   // the event status register (*ESR?)
        int32_t nEventEnable = 0;   // *ESE
        int32_t nServiceEnable = 0; // *SRE
        int32_t nCommandCount = 0;
        std::string strLastCommand; // as sent, with its timeout argument
        int32_t nLastTimeout = 0;
        Clock::time_point tLastCommand;
        std::deque<SResult> results;
        // The sensor's model from the scenario, and where its measurements stand.
        std::shared_ptr<const SSensorModel> pModel;
        std::mt19937 aNoise;   // seeded from the model: runs repeat
        size_t nNextLevel = 0; // of a power sequence
        int32_t nMeasured = 0; // measurements ended since attached
    };
    typedef std::shared_ptr<SSensor> SensorPtr;

    struct SEvent {
        ECallback eKind;
        int64_t nHandle;
        int32_t nValue;
    };

    struct STask {
        enum EKind { TASK_COMMAND, TASK_MEASUREMENT_DONE } eKind;
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

    // What a library function needs before its own work: nothing but the lock, the driver open,
    // or an open, attached sensor for its handle.
    enum ENeed { NEED_NOTHING, NEED_DRIVER, NEED_SENSOR };

    // The shared start of every library function: takes the lock for the scope, then fails with
    // an injected failure, a closed driver or an unusable handle, as the function needs. code()
    // is 0 when the function may go on; sensor() is then the handle's sensor (NEED_SENSOR).
    class SCOPED_CAPABILITY CCall {
    public:
        CCall(CSimulator& sim, EFunction fn, ENeed need, int64_t handle = 0) ACQUIRE(sim.m_aMutex);
        ~CCall() RELEASE();
        CCall(const CCall&) = delete;
        CCall& operator=(const CCall&) = delete;
        int32_t code() const { return m_nCode; }
        SSensor& sensor() const { return *m_pSensor; }

    private:
        CSimulator& m_rSim;
        int32_t m_nCode = 0;
        SensorPtr m_pSensor;
    };

    // The lock for the scope, for the functions that are not library calls.
    class SCOPED_CAPABILITY CLock {
    public:
        explicit CLock(CSimulator& sim) ACQUIRE(sim.m_aMutex);
        ~CLock() RELEASE();
        CLock(const CLock&) = delete;
        CLock& operator=(const CLock&) = delete;

    private:
        CSimulator& m_rSim;
    };

    CSimulator();

    // Every holder but the worker releases the lock through this: it wakes the worker once the
    // lock is free when work was posted or scheduled under it (woken under the lock, the worker
    // would only block on it at once).
    void unlockAndWake() RELEASE(m_aMutex);
    static void workerMain(void* arg);
    void run(uint64_t generation) EXCLUDES(m_aMutex);
    // Stops the worker with the lock held; the worker is joined (or detached) by the caller after
    // releasing the lock, through the returned record.
    SWorker* stopDriverLocked() REQUIRES(m_aMutex);
    void finishStop(SWorker* worker) EXCLUDES(m_aMutex);
    void loadDefaultsLocked() REQUIRES(m_aMutex);
    void waitForDeliveryLocked(ECallback kind) REQUIRES(m_aMutex);
    void waitForAllDeliveriesLocked() REQUIRES(m_aMutex);

    bool takeInjected(EFunction fn, int32_t* code) REQUIRES(m_aMutex);
    int32_t findOpen(int64_t handle, SensorPtr* sensor) REQUIRES(m_aMutex);
    SensorPtr findAttached(const char* serial) REQUIRES(m_aMutex);
    SensorPtr findOpenBySerial(const char* serial, int32_t* code) REQUIRES(m_aMutex);
    int32_t checkPending(const SSensor& sensor, int32_t firstType, int32_t lastType) REQUIRES(m_aMutex);

    void post(ECallback kind, int64_t handle, int32_t value) REQUIRES(m_aMutex);
    void schedule(Clock::time_point due, STask task) REQUIRES(m_aMutex);
    void setState(SSensor& sensor, int32_t state) REQUIRES(m_aMutex);
    void runTask(STask& task, Clock::time_point now) REQUIRES(m_aMutex);
    void runCommand(SSensor& sensor, const std::string& text, Clock::time_point now) REQUIRES(m_aMutex);
    void runMessage(SSensor& sensor, const std::string& text, Clock::time_point now, bool last) REQUIRES(m_aMutex);
    void acceptCommand(SSensor& sensor) REQUIRES(m_aMutex);
    void applyCommand(SSensor& sensor, const SCommand& command, Clock::time_point now) REQUIRES(m_aMutex);
    void applyStatusCommand(SSensor& sensor, const SCommand& command) REQUIRES(m_aMutex);
    void applySetting(SSensor& sensor, const SCommand& command) REQUIRES(m_aMutex);
    void addText(SSensor& sensor, const std::string& text) REQUIRES(m_aMutex);
    void startMeasurement(SSensor& sensor, bool trace, Clock::time_point now) REQUIRES(m_aMutex);
    float reading(const SSensor& sensor, double levelDbm, double spreadDb) REQUIRES(m_aMutex);
    float powerReading(SSensor& sensor) REQUIRES(m_aMutex);
    void addTrace(SSensor& sensor) REQUIRES(m_aMutex);
    bool answerFromModel(SSensor& sensor, const std::string& text, bool last) REQUIRES(m_aMutex);
    SensorPtr makeSensor(const SSensorModel& model) REQUIRES(m_aMutex);
    void detachLocked(SensorPtr sensor) REQUIRES(m_aMutex); // a copy: it leaves m_aSensors
    void finishMeasurement(SSensor& sensor, Clock::time_point now) REQUIRES(m_aMutex);
    void abortMeasurement(SSensor& sensor) REQUIRES(m_aMutex);
    void addResult(SSensor& sensor, SResult result) REQUIRES(m_aMutex);
    float noise() REQUIRES(m_aMutex);

    LbCore::CMutex m_aMutex;
    std::condition_variable_any m_aWorkChanged;      // wakes the worker
    bool m_bWakeWorker GUARDED_BY(m_aMutex) = false; // work changed under the lock: wake it
    std::condition_variable_any m_aDeliveryChanged;  // wakes registrations waiting for a delivery

    bool m_bDriverOpen GUARDED_BY(m_aMutex) = false;
    SWorker* m_pWorker GUARDED_BY(m_aMutex) = nullptr;
    // A worker runs while the generation it was started for is current.
    uint64_t m_nGeneration GUARDED_BY(m_aMutex) = 0;

    std::vector<SensorPtr> m_aSensors GUARDED_BY(m_aMutex);    // attached, in attach order
    std::map<int64_t, SensorPtr> m_aOpen GUARDED_BY(m_aMutex); // open, also detached sensors
    int64_t m_nNextHandle GUARDED_BY(m_aMutex);

    std::deque<SEvent> m_aOutbox GUARDED_BY(m_aMutex);
    std::map<std::pair<Clock::time_point, uint64_t>, STask> m_aTasks GUARDED_BY(m_aMutex);
    uint64_t m_nTaskSequence GUARDED_BY(m_aMutex) = 0;

    SCallback m_aCallbacks[CALLBACK_COUNT] GUARDED_BY(m_aMutex);
    int m_aDelivering[CALLBACK_COUNT] GUARDED_BY(m_aMutex) = {}; // running now, per kind
    uint64_t m_nDeliveries GUARDED_BY(m_aMutex) = 0;             // callbacks that have returned

    int32_t m_nAckMs GUARDED_BY(m_aMutex) = 0;
    int32_t m_nMeasureMs GUARDED_BY(m_aMutex) = 0;
    bool m_bAutoAck GUARDED_BY(m_aMutex) = true;
    int32_t m_aInjected[FN_COUNT] GUARDED_BY(m_aMutex);
    uint64_t m_aCalls[FN_COUNT] GUARDED_BY(m_aMutex);   // since the scenario was loaded
    std::vector<SFault> m_aFaults GUARDED_BY(m_aMutex); // scripted by the scenario
    std::minstd_rand m_aRandom GUARDED_BY(m_aMutex);
};

} // namespace PmxSim

#endif
