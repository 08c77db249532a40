// The PmxSim* control functions (reset, attach and detach, queued results and errors, trigger
// state, last command, delays, acknowledgements, injected failures) and the sensors configured
// by PMXSIM_DEVICES.
#include "pmxsim/Simulator.h"

#include "pmxsim/SimSupport.h"

#include <algorithm>
#include <cstdlib>
#include <cstring>

namespace PmxSim {

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

int32_t CSimulator::reset()
{
    SWorker* worker;
    {
        LbCore::CMutexLock lock(m_aMutex);
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
    LbCore::CMutexLock lock(m_aMutex);
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
    LbCore::CMutexLock lock(m_aMutex);
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
    LbCore::CMutexLock lock(m_aMutex);
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
    LbCore::CMutexLock lock(m_aMutex);
    if (dataType < 0 || dataType > PMXSIM_TYPE_LAST || count < 0 || count > kMaxQueuedCount
        || (count > 0 && values == nullptr))
        return PMXSIM_E_INVALID_ARGUMENT;
    int32_t code;
    SensorPtr sensor = findOpenBySerial(serial, &code);
    if (!sensor)
        return code;
    SResult result;
    result.nType = dataType;
    size_t n = static_cast<size_t>(count);
    switch (dataType) {
    case PMXSIM_TYPE_BINARY:
    case PMXSIM_TYPE_TEXT: {
        const uint8_t* bytes = static_cast<const uint8_t*>(values);
        result.bytes.assign(bytes, bytes + n);
        break;
    }
    case PMXSIM_TYPE_BITFIELD1:
    case PMXSIM_TYPE_BITFIELD2:
    case PMXSIM_TYPE_BITFIELD3:
    case PMXSIM_TYPE_LONG_TRIPLE:
    case PMXSIM_TYPE_LONG: {
        const int32_t* ints = static_cast<const int32_t*>(values);
        result.ints.assign(ints, ints + n);
        break;
    }
    default: {
        const float* floats = static_cast<const float*>(values);
        result.floats.assign(floats, floats + n);
        break;
    }
    }
    addResult(*sensor, std::move(result));
    return PMX_SUCCESS;
}

int32_t CSimulator::reportError(const char* serial, int32_t code)
{
    LbCore::CMutexLock lock(m_aMutex);
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
    LbCore::CMutexLock lock(m_aMutex);
    int32_t code;
    SensorPtr sensor = findOpenBySerial(serial, &code);
    if (!sensor)
        return code;
    setState(*sensor, state);
    return PMX_SUCCESS;
}

int32_t CSimulator::getLastCommand(const char* serial, char* text, int32_t size, int32_t* timeout)
{
    LbCore::CMutexLock lock(m_aMutex);
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
    LbCore::CMutexLock lock(m_aMutex);
    if (ackMs < 0 || measureMs < 0)
        return PMXSIM_E_INVALID_ARGUMENT;
    m_nAckMs = ackMs;
    m_nMeasureMs = measureMs;
    return PMX_SUCCESS;
}

int32_t CSimulator::setAutoAck(int32_t on)
{
    LbCore::CMutexLock lock(m_aMutex);
    m_bAutoAck = on != 0;
    return PMX_SUCCESS;
}

int32_t CSimulator::failNext(const char* function, int32_t code)
{
    LbCore::CMutexLock lock(m_aMutex);
    if (function == nullptr)
        return PMXSIM_E_INVALID_ARGUMENT;
    for (int fn = 0; fn < eFunctionCount; ++fn) {
        if (std::strcmp(functionName(fn), function) == 0) {
            m_aInjected[fn] = code;
            return PMX_SUCCESS;
        }
    }
    return PMXSIM_E_INVALID_ARGUMENT;
}

} // namespace PmxSim
