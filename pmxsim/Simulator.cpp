#include "pmxsim/Simulator.h"

#include <algorithm>
#include <cctype>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>

namespace PmxSim {

namespace {

    const char* const kFunctionNames[eFunctionCount] = { "PmxOpenDriver", "PmxCloseDriver",
        "PmxOpenSensor", "PmxCloseSensor", "PmxSendCommand", "PmxGetData", "PmxGetFloatResult",
        "PmxGetFloatArray", "PmxGetAuxFloatArray", "PmxGetLongResult", "PmxGetBitfieldResult",
        "PmxGetBinaryResult", "PmxGetStringResult", "PmxGetTriggerState", "PmxGetDeviceListLength",
        "PmxGetDeviceInfo", "PmxClearDevice", "PmxEmptyAllBuffers", "PmxGetErrorText",
        "PmxSetNotifyCallbackDeviceChanged", "PmxSetNotifyCallbackErrorOccurred",
        "PmxSetNotifyCallbackDataAvailable", "PmxSetNotifyCallbackCommandAccepted",
        "PmxSetNotifyCallbackStateChanged" };

    struct SModel {
        const char* type;
        uint32_t code;
    };
    const SModel kModels[] = { { "PMX", 2 }, { "PMX-M01", 3 }, { "PMX-M02", 4 }, { "PMX-M03", 11 },
        { "PMX-M04", 12 }, { "PMX-M05", 19 }, { "PMX-M06", 20 }, { "PMX-M07", 21 },
        { "PMX-M08", 81 }, { "PMX-M09", 44 }, { "PMX-M10", 154 }, { "PMX-M11", 150 },
        { "PMX-M12", 151 }, { "PMX-M13", 152 }, { "PMX-M14", 26 }, { "PMX-M15", 33 },
        { "PMX-M16", 98 }, { "PMX-M17", 46 }, { "PMX-M18", 82 }, { "PMX-M19", 166 },
        { "PMX-M20", 167 }, { "PMX-M21", 35 }, { "PMX-M22", 131 }, { "PMX-M23", 149 },
        { "PMX-M24", 47 }, { "PMX-M25", 45 }, { "PMX-M26", 22 }, { "PMX-M27", 23 },
        { "PMX-M28", 24 }, { "PMX-M29", 25 }, { "PMX-M30", 112 }, { "PMX-M31", 168 },
        { "PMX-M32", 143 }, { "PMX-M33", 144 } };

    struct SErrorText {
        int32_t code;
        const char* text;
    };
    const SErrorText kErrorTexts[]
        = { { PMX_SUCCESS, "No error" }, { PMX_ERR_NO_MORE_RESULTS, "No further result available" },
              { PMX_INFO_COMMAND_IGNORED,
                  "Command ignored: nothing to do in the current measurement state" },
              { PMX_ERR_UNKNOWN_COMMAND, "Unknown command or invalid parameter" },
              { PMXSIM_E_DRIVER_NOT_OPEN, "Driver not open" },
              { PMXSIM_E_INVALID_ARGUMENT, "Invalid argument" },
              { PMXSIM_E_INVALID_HANDLE, "Unknown sensor handle" },
              { PMXSIM_E_BAD_DESCRIPTOR, "Malformed sensor descriptor" },
              { PMXSIM_E_NO_SUCH_SENSOR, "No such sensor attached" },
              { PMXSIM_E_SENSOR_DETACHED, "Sensor has been detached" },
              { PMXSIM_E_SENSOR_IN_USE, "Sensor already open" },
              { PMXSIM_E_INDEX_OUT_OF_RANGE, "Device index out of range" },
              { PMXSIM_E_TYPE_MISMATCH, "Pending result has another data type" },
              { PMXSIM_E_BUFFER_TOO_SMALL, "Buffer too small for the pending result" },
              { PMXSIM_E_SENSOR_NOT_OPEN, "Sensor not open" },
              { PMXSIM_E_ALREADY_ATTACHED, "Serial number already attached" },
              { PMXSIM_E_OUT_OF_RESOURCES, "Out of resources" } };

    const char* const kFirmware = "1.20";
    const int32_t kDefaultAckMs = 0;
    const int32_t kDefaultMeasureMs = 10;
    const int32_t kDefaultTracePoints = 100;
    const int32_t kMaxTracePoints = 1024;
    const size_t kMaxPending = 1024; // oldest results are dropped beyond this
    const int32_t kMaxQueuedCount = 1 << 20; // elements of one queued result
    const size_t kMaxText = 255; // device-info buffers hold 256 bytes
    const int64_t kFirstHandle = (int64_t(1) << 32) + 1; // handles do not fit 32 bits on purpose

    // Set on the callback thread while it runs a callback: a registration made from inside a
    // callback must not wait for that callback to return.
    thread_local bool t_bInCallback = false;

    bool findModel(const std::string& type, uint32_t* code)
    {
        for (const SModel& model : kModels) {
            if (type == model.type) {
                *code = model.code;
                return true;
            }
        }
        return false;
    }

    std::string lower(std::string text)
    {
        for (char& c : text)
            c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
        return text;
    }

    std::string trim(const std::string& text)
    {
        size_t begin = text.find_first_not_of(" \t\r\n");
        if (begin == std::string::npos)
            return std::string();
        size_t end = text.find_last_not_of(" \t\r\n");
        return text.substr(begin, end - begin + 1);
    }

    bool sameSerial(const std::string& a, const char* b)
    {
        return lower(a) == lower(b);
    }

    bool validText(const char* text)
    {
        return text != nullptr && *text != '\0' && std::strlen(text) <= kMaxText
            && std::strchr(text, ':') == nullptr && std::strchr(text, ',') == nullptr;
    }

    void copyText(char* target, const std::string& text)
    {
        size_t n = std::min(text.size(), kMaxText);
        std::memcpy(target, text.data(), n);
        target[n] = '\0';
    }

    // One keyword of a command header in its short or long form.
    bool keyword(const std::string& word, const char* shortForm, const char* longForm)
    {
        return word == shortForm || word == longForm;
    }

} // namespace

CSimulator& CSimulator::instance()
{
    // Deliberately never destroyed (see the header).
    static CSimulator* simulator = new CSimulator();
    return *simulator;
}

CSimulator::CSimulator()
    : m_nNextHandle(kFirstHandle)
    , m_aRandom(12345)
{
    std::lock_guard<std::mutex> lock(m_aMutex);
    loadDefaultsLocked();
}

void CSimulator::shutdownAtUnload()
{
    CSimulator& sim = instance();
    SWorker* worker;
    {
        std::lock_guard<std::mutex> lock(sim.m_aMutex);
        worker = sim.stopDriverLocked();
    }
    sim.finishStop(worker);
}

// Sensors from PMXSIM_DEVICES ("type:serial[:flag],..."; empty or "none" = no sensor) or the
// two defaults.
// Malformed entries are skipped: the variable is read where no caller could be told.
void CSimulator::loadDefaultsLocked()
{
    m_aSensors.clear();
    m_nAckMs = kDefaultAckMs;
    m_nMeasureMs = kDefaultMeasureMs;
    m_bAutoAck = true;
    std::fill(m_aInjected, m_aInjected + eFunctionCount, 0);

    const char* configured = std::getenv("PMXSIM_DEVICES");
    std::string list = configured != nullptr ? configured : "PMX-M01:100000,PMX-M10:100001";
    // "none" spells the empty list where an empty variable cannot be set (Windows deletes it).
    if (lower(trim(list)) == "none")
        list.clear();
    size_t start = 0;
    while (start <= list.size()) {
        size_t end = list.find(',', start);
        if (end == std::string::npos)
            end = list.size();
        std::string entry = trim(list.substr(start, end - start));
        start = end + 1;
        size_t colon = entry.find(':');
        if (colon == std::string::npos)
            continue;
        std::string type = trim(entry.substr(0, colon));
        std::string serial = trim(entry.substr(colon + 1));
        int32_t flag = 1;
        size_t flagColon = serial.find(':');
        if (flagColon != std::string::npos) {
            std::string flagText = trim(serial.substr(flagColon + 1));
            serial = trim(serial.substr(0, flagColon));
            char* rest = nullptr;
            long value = std::strtol(flagText.c_str(), &rest, 10);
            if (flagText.empty() || *rest != '\0')
                continue;
            flag = static_cast<int32_t>(value);
        }
        if (!validText(type.c_str()) || !validText(serial.c_str()) || findAttached(serial.c_str()))
            continue;
        SensorPtr sensor = std::make_shared<SSensor>();
        sensor->strType = type;
        sensor->strSerial = serial;
        sensor->nFlag = flag;
        m_aSensors.push_back(sensor);
    }
}

// ---- driver and worker ----

void CSimulator::workerMain(void* arg)
{
    std::pair<CSimulator*, uint64_t>* start = static_cast<std::pair<CSimulator*, uint64_t>*>(arg);
    CSimulator* sim = start->first;
    uint64_t generation = start->second;
    delete start;
    sim->run(generation);
}

int32_t CSimulator::openDriver()
{
    std::unique_lock<std::mutex> lock(m_aMutex);
    int32_t code;
    if (takeInjected(eOpenDriver, &code))
        return code;
    // Opening an open driver succeeds and changes nothing; opens are not counted.
    if (m_bDriverOpen)
        return PMX_SUCCESS;
    // A worker stopped from inside its callback may still be finishing it; callbacks never overlap.
    waitForAllDeliveriesLocked(lock);
    if (m_bDriverOpen)
        return PMX_SUCCESS;
    ++m_nGeneration;
    std::pair<CSimulator*, uint64_t>* start
        = new (std::nothrow) std::pair<CSimulator*, uint64_t>(this, m_nGeneration);
    if (start == nullptr)
        return PMXSIM_E_OUT_OF_RESOURCES;
    // Started under the lock: the worker's first step takes it, so it sees m_pWorker set.
    m_pWorker = startWorker(&CSimulator::workerMain, start);
    if (m_pWorker == nullptr) {
        delete start;
        return PMXSIM_E_OUT_OF_RESOURCES;
    }
    m_bDriverOpen = true;
    return PMX_SUCCESS;
}

SWorker* CSimulator::stopDriverLocked()
{
    if (!m_bDriverOpen)
        return nullptr;
    m_bDriverOpen = false;
    ++m_nGeneration;
    for (auto& entry : m_aOpen) {
        entry.second->nHandle = 0;
        abortMeasurement(*entry.second);
        entry.second->results.clear();
    }
    m_aOpen.clear();
    m_aOutbox.clear();
    m_aTasks.clear();
    SWorker* worker = m_pWorker;
    m_pWorker = nullptr;
    m_aWorkChanged.notify_all();
    return worker;
}

// Closing from inside a callback: the worker ends on its own when the callback returns.
// Otherwise the worker is joined, and a worker stopped earlier from inside its callback is waited
// for, so that no callback runs once the driver is closed.
void CSimulator::finishStop(SWorker* worker)
{
    if (worker != nullptr && isWorkerThread(worker)) {
        detachWorker(worker);
        return;
    }
    if (worker != nullptr)
        joinWorker(worker);
    std::unique_lock<std::mutex> lock(m_aMutex);
    waitForAllDeliveriesLocked(lock);
}

void CSimulator::waitForAllDeliveriesLocked(std::unique_lock<std::mutex>& lock)
{
    if (t_bInCallback)
        return;
    m_aDeliveryChanged.wait(lock, [&] {
        for (int running : m_aDelivering)
            if (running != 0)
                return false;
        return true;
    });
}

int32_t CSimulator::closeDriver()
{
    SWorker* worker;
    {
        std::lock_guard<std::mutex> lock(m_aMutex);
        int32_t code;
        if (takeInjected(eCloseDriver, &code))
            return code;
        if (!m_bDriverOpen)
            return PMXSIM_E_DRIVER_NOT_OPEN;
        worker = stopDriverLocked();
    }
    finishStop(worker);
    return PMX_SUCCESS;
}

void CSimulator::run(uint64_t generation)
{
    std::unique_lock<std::mutex> lock(m_aMutex);
    while (m_nGeneration == generation) {
        if (!m_aOutbox.empty()) {
            SEvent event = m_aOutbox.front();
            m_aOutbox.pop_front();
            SCallback callback = m_aCallbacks[event.eKind];
            if (callback.pfnNotify == nullptr && callback.pfnDevice == nullptr)
                continue;
            ++m_aDelivering[event.eKind];
            lock.unlock();
            t_bInCallback = true;
            if (event.eKind == eDeviceChanged)
                callback.pfnDevice(callback.pvUser);
            else
                callback.pfnNotify(event.nHandle, event.nValue, callback.pvUser);
            t_bInCallback = false;
            lock.lock();
            --m_aDelivering[event.eKind];
            ++m_nDeliveries;
            m_aDeliveryChanged.notify_all();
            continue;
        }
        if (m_aTasks.empty()) {
            m_aWorkChanged.wait(lock);
            continue;
        }
        Clock::time_point now = Clock::now();
        auto first = m_aTasks.begin();
        // A copy: the task may be dropped while this thread waits.
        Clock::time_point due = first->first.first;
        if (due > now) {
            m_aWorkChanged.wait_until(lock, due);
            continue;
        }
        STask task = std::move(first->second);
        m_aTasks.erase(first);
        runTask(task, now);
    }
}

void CSimulator::post(ECallback kind, int64_t handle, int32_t value)
{
    // Without an open driver there is no callback thread, and nobody to tell.
    if (!m_bDriverOpen)
        return;
    m_aOutbox.push_back(SEvent{ kind, handle, value });
    m_aWorkChanged.notify_all();
}

void CSimulator::schedule(Clock::time_point due, STask task)
{
    m_aTasks.emplace(std::make_pair(due, m_nTaskSequence++), std::move(task));
    m_aWorkChanged.notify_all();
}

// ---- lookups ----

bool CSimulator::takeInjected(EFunction fn, int32_t* code)
{
    if (m_aInjected[fn] == 0)
        return false;
    *code = m_aInjected[fn];
    m_aInjected[fn] = 0;
    return true;
}

int32_t CSimulator::findOpen(int64_t handle, SensorPtr* sensor)
{
    if (!m_bDriverOpen)
        return PMXSIM_E_DRIVER_NOT_OPEN;
    auto it = m_aOpen.find(handle);
    if (it == m_aOpen.end())
        return PMXSIM_E_INVALID_HANDLE;
    if (!it->second->bAttached)
        return PMXSIM_E_SENSOR_DETACHED;
    *sensor = it->second;
    return PMX_SUCCESS;
}

CSimulator::SensorPtr CSimulator::findAttached(const char* serial)
{
    for (const SensorPtr& sensor : m_aSensors)
        if (sameSerial(sensor->strSerial, serial))
            return sensor;
    return SensorPtr();
}

CSimulator::SensorPtr CSimulator::findOpenBySerial(const char* serial, int32_t* code)
{
    if (serial == nullptr) {
        *code = PMXSIM_E_INVALID_ARGUMENT;
        return SensorPtr();
    }
    SensorPtr sensor = findAttached(serial);
    if (!sensor) {
        *code = PMXSIM_E_NO_SUCH_SENSOR;
        return SensorPtr();
    }
    if (sensor->nHandle == 0) {
        *code = PMXSIM_E_SENSOR_NOT_OPEN;
        return SensorPtr();
    }
    *code = PMX_SUCCESS;
    return sensor;
}

// ---- sensors ----

// Descriptor: USB::0x0c6f::<model code in decimal, at least 4 digits>::<serial>; the two fixed
// fields in any letter case.
int32_t CSimulator::openSensor(const char* descriptor, int64_t* handle)
{
    std::lock_guard<std::mutex> lock(m_aMutex);
    int32_t code;
    if (takeInjected(eOpenSensor, &code))
        return code;
    if (!m_bDriverOpen)
        return PMXSIM_E_DRIVER_NOT_OPEN;
    if (descriptor == nullptr || handle == nullptr)
        return PMXSIM_E_INVALID_ARGUMENT;
    std::string text(descriptor);
    std::vector<std::string> fields;
    size_t start = 0;
    for (;;) {
        size_t sep = text.find("::", start);
        fields.push_back(text.substr(start, sep == std::string::npos ? sep : sep - start));
        if (sep == std::string::npos)
            break;
        start = sep + 2;
    }
    if (fields.size() != 4 || lower(fields[0]) != "usb" || lower(fields[1]) != "0x0c6f")
        return PMXSIM_E_BAD_DESCRIPTOR;
    const std::string& digits = fields[2];
    if (digits.size() < 4 || digits.size() > 10
        || digits.find_first_not_of("0123456789") != std::string::npos)
        return PMXSIM_E_BAD_DESCRIPTOR;
    unsigned long long model = std::strtoull(digits.c_str(), nullptr, 10);
    const std::string& serial = fields[3];
    if (serial.empty() || serial.find(':') != std::string::npos)
        return PMXSIM_E_BAD_DESCRIPTOR;

    SensorPtr sensor = findAttached(serial.c_str());
    uint32_t sensorModel = 0;
    if (!sensor || !findModel(sensor->strType, &sensorModel) || sensorModel != model)
        return PMXSIM_E_NO_SUCH_SENSOR;
    // One handle per sensor: a second open would share its results and measurements.
    if (sensor->nHandle != 0)
        return PMXSIM_E_SENSOR_IN_USE;

    sensor->nHandle = m_nNextHandle++;
    sensor->nTriggerState = 0;
    sensor->bMeasuring = false;
    sensor->bContinuous = false;
    sensor->bTrace = false;
    sensor->nTracePoints = kDefaultTracePoints;
    sensor->nCommandCount = 0;
    sensor->strLastCommand.clear();
    sensor->nLastTimeout = 0;
    sensor->tLastCommand = Clock::time_point();
    sensor->results.clear();
    m_aOpen[sensor->nHandle] = sensor;
    *handle = sensor->nHandle;
    return PMX_SUCCESS;
}

// Closing the handle of a detached sensor succeeds: it releases what is left of the session.
int32_t CSimulator::closeSensor(int64_t handle)
{
    std::lock_guard<std::mutex> lock(m_aMutex);
    int32_t code;
    if (takeInjected(eCloseSensor, &code))
        return code;
    if (!m_bDriverOpen)
        return PMXSIM_E_DRIVER_NOT_OPEN;
    auto it = m_aOpen.find(handle);
    if (it == m_aOpen.end())
        return PMXSIM_E_INVALID_HANDLE;
    SensorPtr sensor = it->second;
    m_aOpen.erase(it);
    abortMeasurement(*sensor);
    sensor->results.clear();
    sensor->nTriggerState = 0;
    sensor->nHandle = 0;
    return PMX_SUCCESS;
}

// The timeout argument is only recorded: commands are queued and answered through the callbacks.
int32_t CSimulator::sendCommand(int64_t handle, const char* text, int32_t timeout)
{
    std::lock_guard<std::mutex> lock(m_aMutex);
    int32_t code;
    if (takeInjected(eSendCommand, &code))
        return code;
    SensorPtr sensor;
    if ((code = findOpen(handle, &sensor)) != PMX_SUCCESS)
        return code;
    if (text == nullptr)
        return PMXSIM_E_INVALID_ARGUMENT;
    sensor->strLastCommand = text;
    sensor->nLastTimeout = timeout;
    // Commands of one sensor are answered in the order sent, even when the delay was shortened.
    Clock::time_point due
        = std::max(Clock::now() + std::chrono::milliseconds(m_nAckMs), sensor->tLastCommand);
    sensor->tLastCommand = due;
    STask task{ STask::eCommand, sensor, handle, text, 0 };
    schedule(due, std::move(task));
    return PMX_SUCCESS;
}

int32_t CSimulator::clearDevice(int64_t handle)
{
    std::lock_guard<std::mutex> lock(m_aMutex);
    int32_t code;
    if (takeInjected(eClearDevice, &code))
        return code;
    SensorPtr sensor;
    if ((code = findOpen(handle, &sensor)) != PMX_SUCCESS)
        return code;
    abortMeasurement(*sensor);
    sensor->results.clear();
    return PMX_SUCCESS;
}

int32_t CSimulator::emptyAllBuffers(int64_t handle)
{
    std::lock_guard<std::mutex> lock(m_aMutex);
    int32_t code;
    if (takeInjected(eEmptyAllBuffers, &code))
        return code;
    SensorPtr sensor;
    if ((code = findOpen(handle, &sensor)) != PMX_SUCCESS)
        return code;
    sensor->results.clear();
    return PMX_SUCCESS;
}

int32_t CSimulator::getTriggerState(int64_t handle, int32_t* state)
{
    std::lock_guard<std::mutex> lock(m_aMutex);
    int32_t code;
    if (takeInjected(eGetTriggerState, &code))
        return code;
    SensorPtr sensor;
    if ((code = findOpen(handle, &sensor)) != PMX_SUCCESS)
        return code;
    if (state == nullptr)
        return PMXSIM_E_INVALID_ARGUMENT;
    *state = sensor->nTriggerState;
    return PMX_SUCCESS;
}

// ---- results ----

// Tells about the oldest pending result without consuming it: its data type, its element count
// and the number of pending results. Null outputs are skipped.
int32_t CSimulator::getData(int64_t handle, int32_t* dataType, int32_t* count, int32_t* pending)
{
    std::lock_guard<std::mutex> lock(m_aMutex);
    int32_t code;
    if (takeInjected(eGetData, &code))
        return code;
    SensorPtr sensor;
    if ((code = findOpen(handle, &sensor)) != PMX_SUCCESS)
        return code;
    if (sensor->results.empty())
        return PMX_ERR_NO_MORE_RESULTS;
    const SResult& result = sensor->results.front();
    size_t elements = result.bytes.size() + result.ints.size() + result.floats.size();
    if (dataType != nullptr)
        *dataType = result.nType;
    if (count != nullptr)
        *count = static_cast<int32_t>(elements);
    if (pending != nullptr)
        *pending = static_cast<int32_t>(sensor->results.size());
    return PMX_SUCCESS;
}

int32_t CSimulator::takeResult(
    int64_t handle, int32_t firstType, int32_t lastType, SensorPtr* sensor)
{
    int32_t code = findOpen(handle, sensor);
    if (code != PMX_SUCCESS)
        return code;
    if ((*sensor)->results.empty())
        return PMX_ERR_NO_MORE_RESULTS;
    int32_t type = (*sensor)->results.front().nType;
    if (type < firstType || type > lastType)
        return PMXSIM_E_TYPE_MISMATCH;
    return PMX_SUCCESS;
}

// Float results (5, 6, 7), long results (8, 9) and bit fields (1, 2, 3): the first three queued
// values, 0 for those not queued. Null outputs are skipped.
int32_t CSimulator::getScalars(EFunction fn, int64_t handle, void* v1, void* v2, void* v3)
{
    std::lock_guard<std::mutex> lock(m_aMutex);
    int32_t code;
    if (takeInjected(fn, &code))
        return code;
    SensorPtr sensor;
    bool floats = fn == eGetFloatResult;
    int32_t first = floats ? 5 : fn == eGetLongResult ? 8 : 1;
    int32_t last = floats ? 7 : fn == eGetLongResult ? 9 : 3;
    if ((code = takeResult(handle, first, last, &sensor)) != PMX_SUCCESS)
        return code;
    const SResult& result = sensor->results.front();
    void* outputs[3] = { v1, v2, v3 };
    for (size_t i = 0; i < 3; ++i) {
        if (outputs[i] == nullptr)
            continue;
        if (floats)
            *static_cast<float*>(outputs[i]) = i < result.floats.size() ? result.floats[i] : 0.0f;
        else
            *static_cast<int32_t*>(outputs[i]) = i < result.ints.size() ? result.ints[i] : 0;
    }
    sensor->results.pop_front();
    return PMX_SUCCESS;
}

// Float arrays (4) fill the first array; auxiliary arrays (11) fill the first with the queued
// values and the other two, where given, with as many zeros. A result that does not fit stays
// pending.
int32_t CSimulator::getFloatArrays(
    EFunction fn, int64_t handle, float* a1, float* a2, float* a3, int32_t capacity, int32_t* count)
{
    std::lock_guard<std::mutex> lock(m_aMutex);
    int32_t code;
    if (takeInjected(fn, &code))
        return code;
    SensorPtr sensor;
    int32_t type = fn == eGetFloatArray ? 4 : 11;
    if ((code = takeResult(handle, type, type, &sensor)) != PMX_SUCCESS)
        return code;
    if (a1 == nullptr || count == nullptr || capacity < 0)
        return PMXSIM_E_INVALID_ARGUMENT;
    const std::vector<float>& values = sensor->results.front().floats;
    if (values.size() > static_cast<size_t>(capacity))
        return PMXSIM_E_BUFFER_TOO_SMALL;
    std::copy(values.begin(), values.end(), a1);
    if (a2 != nullptr)
        std::fill(a2, a2 + values.size(), 0.0f);
    if (a3 != nullptr)
        std::fill(a3, a3 + values.size(), 0.0f);
    *count = static_cast<int32_t>(values.size());
    sensor->results.pop_front();
    return PMX_SUCCESS;
}

int32_t CSimulator::getBinaryResult(int64_t handle, uint8_t* buffer, int32_t size, int32_t* count)
{
    std::lock_guard<std::mutex> lock(m_aMutex);
    int32_t code;
    if (takeInjected(eGetBinaryResult, &code))
        return code;
    SensorPtr sensor;
    if ((code = takeResult(handle, 0, 0, &sensor)) != PMX_SUCCESS)
        return code;
    if (buffer == nullptr || count == nullptr || size < 0)
        return PMXSIM_E_INVALID_ARGUMENT;
    const std::vector<uint8_t>& bytes = sensor->results.front().bytes;
    if (bytes.size() > static_cast<size_t>(size))
        return PMXSIM_E_BUFFER_TOO_SMALL;
    std::copy(bytes.begin(), bytes.end(), buffer);
    *count = static_cast<int32_t>(bytes.size());
    sensor->results.pop_front();
    return PMX_SUCCESS;
}

// The text and its terminating zero must fit.
int32_t CSimulator::getStringResult(int64_t handle, char* buffer, int32_t size)
{
    std::lock_guard<std::mutex> lock(m_aMutex);
    int32_t code;
    if (takeInjected(eGetStringResult, &code))
        return code;
    SensorPtr sensor;
    if ((code = takeResult(handle, 10, 10, &sensor)) != PMX_SUCCESS)
        return code;
    if (buffer == nullptr || size < 1)
        return PMXSIM_E_INVALID_ARGUMENT;
    const std::vector<uint8_t>& bytes = sensor->results.front().bytes;
    if (bytes.size() + 1 > static_cast<size_t>(size))
        return PMXSIM_E_BUFFER_TOO_SMALL;
    std::copy(bytes.begin(), bytes.end(), buffer);
    buffer[bytes.size()] = '\0';
    sensor->results.pop_front();
    return PMX_SUCCESS;
}

void CSimulator::addResult(SSensor& sensor, SResult result)
{
    int32_t type = result.nType;
    if (sensor.results.size() >= kMaxPending)
        sensor.results.pop_front();
    sensor.results.push_back(std::move(result));
    post(eDataAvailable, sensor.nHandle, type);
}

// ---- device list, texts, callbacks ----

int32_t CSimulator::getDeviceListLength(int32_t* count)
{
    std::lock_guard<std::mutex> lock(m_aMutex);
    int32_t code;
    if (takeInjected(eGetDeviceListLength, &code))
        return code;
    if (!m_bDriverOpen)
        return PMXSIM_E_DRIVER_NOT_OPEN;
    if (count == nullptr)
        return PMXSIM_E_INVALID_ARGUMENT;
    *count = static_cast<int32_t>(m_aSensors.size());
    return PMX_SUCCESS;
}

// name: the sensor's descriptor when its type is a known model, else "<type> <serial>".
int32_t CSimulator::getDeviceInfo(
    int32_t index, char* name, char* type, char* serial, int32_t* flag)
{
    std::lock_guard<std::mutex> lock(m_aMutex);
    int32_t code;
    if (takeInjected(eGetDeviceInfo, &code))
        return code;
    if (!m_bDriverOpen)
        return PMXSIM_E_DRIVER_NOT_OPEN;
    if (name == nullptr || type == nullptr || serial == nullptr || flag == nullptr)
        return PMXSIM_E_INVALID_ARGUMENT;
    if (index < 0 || static_cast<size_t>(index) >= m_aSensors.size())
        return PMXSIM_E_INDEX_OUT_OF_RANGE;
    const SSensor& sensor = *m_aSensors[index];
    uint32_t model = 0;
    std::string descriptor = sensor.strType + " " + sensor.strSerial;
    if (findModel(sensor.strType, &model)) {
        char digits[16];
        std::snprintf(digits, sizeof digits, "%04u", static_cast<unsigned>(model));
        descriptor = std::string("USB::0x0c6f::") + digits + "::" + sensor.strSerial;
    }
    copyText(name, descriptor);
    copyText(type, sensor.strType);
    copyText(serial, sensor.strSerial);
    *flag = sensor.nFlag;
    return PMX_SUCCESS;
}

// Works with the driver closed. Unknown codes get a text naming the code; a text longer than the
// buffer is cut to fit (always zero-terminated).
int32_t CSimulator::getErrorText(int32_t code, char* buffer, int32_t size)
{
    std::lock_guard<std::mutex> lock(m_aMutex);
    int32_t injected;
    if (takeInjected(eGetErrorText, &injected))
        return injected;
    if (buffer == nullptr || size < 1)
        return PMXSIM_E_INVALID_ARGUMENT;
    char unknown[64];
    const char* text = nullptr;
    for (const SErrorText& entry : kErrorTexts)
        if (entry.code == code)
            text = entry.text;
    if (text == nullptr) {
        std::snprintf(unknown, sizeof unknown, "Unknown error code 0x%08X",
            static_cast<unsigned>(static_cast<uint32_t>(code)));
        text = unknown;
    }
    size_t n = std::min(std::strlen(text), static_cast<size_t>(size) - 1);
    std::memcpy(buffer, text, n);
    buffer[n] = '\0';
    return PMX_SUCCESS;
}

int32_t CSimulator::setNotifyCallback(
    EFunction fn, ECallback kind, PmxNotifyCallback callback, void* user)
{
    std::unique_lock<std::mutex> lock(m_aMutex);
    int32_t code;
    if (takeInjected(fn, &code))
        return code;
    m_aCallbacks[kind].pfnNotify = callback;
    m_aCallbacks[kind].pvUser = callback != nullptr ? user : nullptr;
    waitForDeliveryLocked(lock, kind);
    return PMX_SUCCESS;
}

// The replaced callback may be running right now: wait until it returned, unless called from
// inside a callback, which would wait for itself.
void CSimulator::waitForDeliveryLocked(std::unique_lock<std::mutex>& lock, ECallback kind)
{
    if (t_bInCallback)
        return;
    uint64_t deliveries = m_nDeliveries;
    m_aDeliveryChanged.wait(
        lock, [&] { return m_aDelivering[kind] == 0 || m_nDeliveries != deliveries; });
}

int32_t CSimulator::setDeviceChangedCallback(PmxDeviceChangedCallback callback, void* user)
{
    std::unique_lock<std::mutex> lock(m_aMutex);
    int32_t code;
    if (takeInjected(eSetDeviceChanged, &code))
        return code;
    m_aCallbacks[eDeviceChanged].pfnDevice = callback;
    m_aCallbacks[eDeviceChanged].pvUser = callback != nullptr ? user : nullptr;
    waitForDeliveryLocked(lock, eDeviceChanged);
    return PMX_SUCCESS;
}

// ---- the sensor model ----

float CSimulator::noise()
{
    std::uniform_real_distribution<float> spread(-0.05f, 0.05f);
    return spread(m_aRandom);
}

void CSimulator::setState(SSensor& sensor, int32_t state)
{
    sensor.nTriggerState = state;
    post(eStateChanged, sensor.nHandle, state);
}

void CSimulator::abortMeasurement(SSensor& sensor)
{
    sensor.bContinuous = false;
    if (sensor.bMeasuring) {
        sensor.bMeasuring = false;
        ++sensor.nMeasurement;
        setState(sensor, 0);
    }
}

void CSimulator::startMeasurement(SSensor& sensor, Clock::time_point now)
{
    sensor.bMeasuring = true;
    ++sensor.nMeasurement;
    setState(sensor, 2);
    setState(sensor, 3);
    // A continuous measurement takes at least 1 ms so that it cannot saturate the callback thread.
    int32_t duration = sensor.bContinuous ? std::max(m_nMeasureMs, 1) : m_nMeasureMs;
    STask task{ STask::eMeasurementDone, nullptr, sensor.nHandle, std::string(),
        sensor.nMeasurement };
    task.pSensor = m_aOpen.at(sensor.nHandle);
    schedule(now + std::chrono::milliseconds(duration), std::move(task));
}

void CSimulator::finishMeasurement(SSensor& sensor, Clock::time_point now)
{
    SResult result;
    if (sensor.bTrace) {
        result.nType = 4;
        // A pulse: high in the middle half of the trace.
        for (int32_t i = 0; i < sensor.nTracePoints; ++i) {
            bool high = i >= sensor.nTracePoints / 4 && i < sensor.nTracePoints * 3 / 4;
            result.floats.push_back((high ? -20.0f : -60.0f) + noise());
        }
    } else {
        result.nType = 6;
        result.floats.push_back(-20.0f + noise());
    }
    addResult(sensor, std::move(result));
    if (sensor.bContinuous) {
        startMeasurement(sensor, now);
    } else {
        sensor.bMeasuring = false;
        setState(sensor, 0);
    }
}

void CSimulator::runTask(STask& task, Clock::time_point now)
{
    SSensor& sensor = *task.pSensor;
    if (!sensor.bAttached || sensor.nHandle != task.nHandle)
        return;
    if (task.eKind == STask::eCommand) {
        runCommand(sensor, task.strText, now);
    } else if (sensor.bMeasuring && task.nMeasurement == sensor.nMeasurement) {
        finishMeasurement(sensor, now);
    }
}

// A command is answered when it is due: an error first (if any), then the acceptance (unless
// switched off), then its effects. Header keywords in short or long form, any letter case; the
// text ends at its first line end.
void CSimulator::runCommand(SSensor& sensor, const std::string& text, Clock::time_point now)
{
    std::string command = lower(trim(text.substr(0, text.find_first_of("\r\n"))));
    size_t blank = command.find_first_of(" \t");
    std::string header = command.substr(0, blank);
    std::string parameter
        = blank == std::string::npos ? std::string() : trim(command.substr(blank));
    if (!header.empty() && header[0] == ':')
        header.erase(0, 1);
    std::vector<std::string> words;
    size_t start = 0;
    for (;;) {
        size_t colon = header.find(':', start);
        words.push_back(header.substr(start, colon == std::string::npos ? colon : colon - start));
        if (colon == std::string::npos)
            break;
        start = colon + 1;
    }
    if (parameter.size() >= 2 && (parameter.front() == '"' || parameter.front() == '\'')
        && parameter.back() == parameter.front())
        parameter = parameter.substr(1, parameter.size() - 2);

    enum EAction {
        eNone,
        eIdn,
        eReset,
        eMeasure,
        eContinuousOn,
        eContinuousOff,
        eAbort,
        ePower,
        eTrace,
        eFunctionQuery,
        eTracePoints,
        eUnknown
    } action
        = eUnknown;
    int32_t points = 0;
    bool noParameter = parameter.empty();
    if (command.empty()) {
        action = eNone;
    } else if (words.size() == 1 && noParameter && header == "*idn?") {
        action = eIdn;
    } else if (words.size() == 1 && noParameter && header == "*rst") {
        action = eReset;
    } else if (words.size() == 1 && noParameter && header == "*cls") {
        action = eNone;
    } else if (words.size() == 1 && noParameter && header == "*trg") {
        action = eMeasure;
    } else if (keyword(words[0], "init", "initiate")) {
        if (words.size() == 1 && noParameter)
            action = eMeasure;
        if (words.size() == 2 && noParameter && keyword(words[1], "imm", "immediate"))
            action = eMeasure;
        if (words.size() == 2 && keyword(words[1], "cont", "continuous")) {
            if (parameter == "on" || parameter == "1")
                action = eContinuousOn;
            if (parameter == "off" || parameter == "0")
                action = eContinuousOff;
        }
    } else if (words.size() == 1 && noParameter && keyword(words[0], "abor", "abort")) {
        action = eAbort;
    } else if (words.size() == 1 && keyword(words[0], "func", "function")) {
        if (parameter == "pow" || parameter == "power")
            action = ePower;
        if (parameter == "trac" || parameter == "trace")
            action = eTrace;
    } else if (words.size() == 1 && noParameter && keyword(words[0], "func?", "function?")) {
        action = eFunctionQuery;
    } else if (words.size() == 2 && keyword(words[0], "trac", "trace")
        && keyword(words[1], "poin", "points")) {
        char* rest = nullptr;
        errno = 0;
        long value = std::strtol(parameter.c_str(), &rest, 10);
        if (!noParameter && *rest == '\0' && errno == 0 && value >= 1 && value <= kMaxTracePoints) {
            action = eTracePoints;
            points = static_cast<int32_t>(value);
        }
    }

    // Asking for a measurement while one runs, or for the end of a continuous measurement that
    // is not running, is harmless and answered with the benign notice.
    bool ignored = (action == eMeasure && sensor.bMeasuring)
        || (action == eContinuousOff && !sensor.bContinuous);
    if (action == eUnknown)
        post(eErrorOccurred, sensor.nHandle, PMX_ERR_UNKNOWN_COMMAND);
    if (ignored)
        post(eErrorOccurred, sensor.nHandle, PMX_INFO_COMMAND_IGNORED);
    ++sensor.nCommandCount;
    if (m_bAutoAck)
        post(eCommandAccepted, sensor.nHandle, sensor.nCommandCount);
    if (ignored)
        return;

    switch (action) {
    case eIdn: {
        std::string answer
            = "Marlowe&Tenby," + sensor.strType + "," + sensor.strSerial + "," + kFirmware;
        SResult result;
        result.nType = 10;
        result.bytes.assign(answer.begin(), answer.end());
        addResult(sensor, std::move(result));
        break;
    }
    case eReset:
        abortMeasurement(sensor);
        sensor.bTrace = false;
        sensor.nTracePoints = kDefaultTracePoints;
        sensor.results.clear();
        break;
    case eMeasure:
        startMeasurement(sensor, now);
        break;
    case eContinuousOn:
        sensor.bContinuous = true;
        if (!sensor.bMeasuring)
            startMeasurement(sensor, now);
        break;
    case eContinuousOff:
        sensor.bContinuous = false; // the running measurement still ends with its result
        break;
    case eAbort:
        abortMeasurement(sensor);
        break;
    case ePower:
    case eTrace:
        sensor.bTrace = action == eTrace;
        break;
    case eFunctionQuery: {
        std::string answer = sensor.bTrace ? "TRACE" : "POWER";
        SResult result;
        result.nType = 10;
        result.bytes.assign(answer.begin(), answer.end());
        addResult(sensor, std::move(result));
        break;
    }
    case eTracePoints:
        sensor.nTracePoints = points;
        break;
    case eNone:
    case eUnknown:
        break;
    }
}

// ---- control API ----

int32_t CSimulator::reset()
{
    SWorker* worker;
    {
        std::lock_guard<std::mutex> lock(m_aMutex);
        worker = stopDriverLocked();
        for (SCallback& callback : m_aCallbacks)
            callback = SCallback();
        for (SensorPtr& sensor : m_aSensors)
            sensor->bAttached = false;
        loadDefaultsLocked();
    }
    finishStop(worker);
    return PMX_SUCCESS;
}

int32_t CSimulator::attach(const char* type, const char* serial)
{
    std::lock_guard<std::mutex> lock(m_aMutex);
    if (!validText(type) || !validText(serial))
        return PMXSIM_E_INVALID_ARGUMENT;
    if (findAttached(serial))
        return PMXSIM_E_ALREADY_ATTACHED;
    SensorPtr sensor = std::make_shared<SSensor>();
    sensor->strType = type;
    sensor->strSerial = serial;
    m_aSensors.push_back(sensor);
    post(eDeviceChanged, 0, 0);
    return PMX_SUCCESS;
}

int32_t CSimulator::detach(const char* serial)
{
    std::lock_guard<std::mutex> lock(m_aMutex);
    if (serial == nullptr)
        return PMXSIM_E_INVALID_ARGUMENT;
    auto it = std::find_if(m_aSensors.begin(), m_aSensors.end(),
        [&](const SensorPtr& s) { return sameSerial(s->strSerial, serial); });
    if (it == m_aSensors.end())
        return PMXSIM_E_NO_SUCH_SENSOR;
    SensorPtr sensor = *it;
    m_aSensors.erase(it);
    // Its handle stays known (and fails with "detached") until it is closed.
    sensor->bAttached = false;
    sensor->bMeasuring = false;
    sensor->bContinuous = false;
    sensor->results.clear();
    post(eDeviceChanged, 0, 0);
    return PMX_SUCCESS;
}

int32_t CSimulator::setDeviceFlag(const char* serial, int32_t flag)
{
    std::lock_guard<std::mutex> lock(m_aMutex);
    if (serial == nullptr)
        return PMXSIM_E_INVALID_ARGUMENT;
    SensorPtr sensor = findAttached(serial);
    if (!sensor)
        return PMXSIM_E_NO_SUCH_SENSOR;
    sensor->nFlag = flag;
    post(eDeviceChanged, 0, 0);
    return PMX_SUCCESS;
}

int32_t CSimulator::queueResult(
    const char* serial, int32_t dataType, const void* values, int32_t count)
{
    std::lock_guard<std::mutex> lock(m_aMutex);
    if (dataType < 0 || dataType > 11 || count < 0 || count > kMaxQueuedCount
        || (count > 0 && values == nullptr))
        return PMXSIM_E_INVALID_ARGUMENT;
    int32_t code;
    SensorPtr sensor = findOpenBySerial(serial, &code);
    if (!sensor)
        return code;
    SResult result;
    result.nType = dataType;
    size_t n = static_cast<size_t>(count);
    if (dataType == 0 || dataType == 10) {
        const uint8_t* bytes = static_cast<const uint8_t*>(values);
        result.bytes.assign(bytes, bytes + n);
    } else if (dataType == 1 || dataType == 2 || dataType == 3 || dataType == 8 || dataType == 9) {
        const int32_t* ints = static_cast<const int32_t*>(values);
        result.ints.assign(ints, ints + n);
    } else {
        const float* floats = static_cast<const float*>(values);
        result.floats.assign(floats, floats + n);
    }
    addResult(*sensor, std::move(result));
    return PMX_SUCCESS;
}

int32_t CSimulator::reportError(const char* serial, int32_t code)
{
    std::lock_guard<std::mutex> lock(m_aMutex);
    int64_t handle = 0;
    if (serial != nullptr && *serial != '\0') {
        int32_t result;
        SensorPtr sensor = findOpenBySerial(serial, &result);
        if (!sensor)
            return result;
        handle = sensor->nHandle;
    }
    post(eErrorOccurred, handle, code);
    return PMX_SUCCESS;
}

int32_t CSimulator::setTriggerState(const char* serial, int32_t state)
{
    std::lock_guard<std::mutex> lock(m_aMutex);
    int32_t code;
    SensorPtr sensor = findOpenBySerial(serial, &code);
    if (!sensor)
        return code;
    setState(*sensor, state);
    return PMX_SUCCESS;
}

int32_t CSimulator::getLastCommand(const char* serial, char* text, int32_t size, int32_t* timeout)
{
    std::lock_guard<std::mutex> lock(m_aMutex);
    int32_t code;
    SensorPtr sensor = findOpenBySerial(serial, &code);
    if (!sensor)
        return code;
    if (text == nullptr || size < 1 || timeout == nullptr)
        return PMXSIM_E_INVALID_ARGUMENT;
    if (sensor->strLastCommand.size() + 1 > static_cast<size_t>(size))
        return PMXSIM_E_BUFFER_TOO_SMALL;
    std::memcpy(text, sensor->strLastCommand.c_str(), sensor->strLastCommand.size() + 1);
    *timeout = sensor->nLastTimeout;
    return PMX_SUCCESS;
}

int32_t CSimulator::setDelays(int32_t ackMs, int32_t measureMs)
{
    std::lock_guard<std::mutex> lock(m_aMutex);
    if (ackMs < 0 || measureMs < 0)
        return PMXSIM_E_INVALID_ARGUMENT;
    m_nAckMs = ackMs;
    m_nMeasureMs = measureMs;
    return PMX_SUCCESS;
}

int32_t CSimulator::setAutoAck(int32_t on)
{
    std::lock_guard<std::mutex> lock(m_aMutex);
    m_bAutoAck = on != 0;
    return PMX_SUCCESS;
}

int32_t CSimulator::failNext(const char* function, int32_t code)
{
    std::lock_guard<std::mutex> lock(m_aMutex);
    if (function == nullptr)
        return PMXSIM_E_INVALID_ARGUMENT;
    for (int fn = 0; fn < eFunctionCount; ++fn) {
        if (std::strcmp(kFunctionNames[fn], function) == 0) {
            m_aInjected[fn] = code;
            return PMX_SUCCESS;
        }
    }
    return PMXSIM_E_INVALID_ARGUMENT;
}

} // namespace PmxSim
