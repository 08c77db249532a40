// The PmxSim* control functions (reset, attach and detach, queued results and errors, trigger
// state, last command, delays, acknowledgements, injected failures) and the configured scenario.
#include "pmxsim/Simulator.h"

#include "pmxsim/SimSupport.h"

#include <algorithm>
#include <cstring>

namespace PmxSim {

// The configured scenario (PMXSIM_CONFIG, PMXSIM_DEVICES or the two default sensors) with the
// default acknowledgement, no injected failure and fresh call counts.
void CSimulator::loadDefaultsLocked()
{
    SScenario scenario = configuredScenario();
    m_aSensors.clear();
    for (const SSensorModel& model : scenario.sensors)
        m_aSensors.push_back(makeSensor(model));
    m_nAckMs = scenario.nAckMs;
    m_nMeasureMs = scenario.nMeasureMs;
    m_bAutoAck = true;
    std::fill(m_aInjected, m_aInjected + FN_COUNT, 0);
    std::fill(m_aCalls, m_aCalls + FN_COUNT, 0);
    m_aFaults = scenario.faults;
}

CSimulator::SensorPtr CSimulator::makeSensor(const SSensorModel& model)
{
    SensorPtr sensor = std::make_shared<SSensor>();
    sensor->strType = model.strType;
    sensor->strSerial = model.strSerial;
    sensor->nFlag = model.nFlag;
    sensor->pModel = std::make_shared<const SSensorModel>(model);
    sensor->aNoise.seed(model.nSeed);
    return sensor;
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
        CLock lock(*this);
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
    CLock lock(*this);
    if (!validText(type) || !validText(serial))
        return PMXSIM_E_INVALID_ARGUMENT;
    if (findAttached(serial))
        return PMXSIM_E_ALREADY_ATTACHED;
    SSensorModel model;
    model.strType = type;
    model.strSerial = serial;
    m_aSensors.push_back(makeSensor(model));
    post(CALLBACK_DEVICE_CHANGED, 0, 0);
    return PMX_SUCCESS;
}

int32_t CSimulator::detach(const char* serial)
{
    CLock lock(*this);
    if (serial == nullptr)
        return PMXSIM_E_INVALID_ARGUMENT;
    auto it = std::find_if(m_aSensors.begin(), m_aSensors.end(),
                           [&](const SensorPtr& s) { return sameSerial(s->strSerial, serial); });
    if (it == m_aSensors.end())
        return PMXSIM_E_NO_SUCH_SENSOR;
    detachLocked(*it);
    return PMX_SUCCESS;
}

// Its handle stays known (and fails with "detached") until it is closed.
void CSimulator::detachLocked(SensorPtr sensor)
{
    m_aSensors.erase(std::find(m_aSensors.begin(), m_aSensors.end(), sensor));
    sensor->bAttached = false;
    sensor->bMeasuring = false;
    sensor->bContinuous = false;
    sensor->results.clear();
    post(CALLBACK_DEVICE_CHANGED, 0, 0);
}

int32_t CSimulator::setDeviceFlag(const char* serial, int32_t flag)
{
    CLock lock(*this);
    if (serial == nullptr)
        return PMXSIM_E_INVALID_ARGUMENT;
    SensorPtr sensor = findAttached(serial);
    if (!sensor)
        return PMXSIM_E_NO_SUCH_SENSOR;
    sensor->nFlag = flag;
    post(CALLBACK_DEVICE_CHANGED, 0, 0);
    return PMX_SUCCESS;
}

int32_t CSimulator::queueResult(const char* serial, int32_t dataType, const void* values, int32_t count)
{
    CLock lock(*this);
    if (dataType < 0 || dataType > PMXSIM_TYPE_LAST || count < 0 || count > MAX_QUEUED_COUNT ||
        (count > 0 && values == nullptr))
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
    CLock lock(*this);
    int64_t handle = 0;
    if (serial != nullptr && *serial != '\0') {
        int32_t result;
        SensorPtr sensor = findOpenBySerial(serial, &result);
        if (!sensor)
            return result;
        handle = sensor->nHandle;
    }
    post(CALLBACK_ERROR_OCCURRED, handle, code);
    return PMX_SUCCESS;
}

int32_t CSimulator::setTriggerState(const char* serial, int32_t state)
{
    CLock lock(*this);
    int32_t code;
    SensorPtr sensor = findOpenBySerial(serial, &code);
    if (!sensor)
        return code;
    setState(*sensor, state);
    return PMX_SUCCESS;
}

int32_t CSimulator::getLastCommand(const char* serial, char* text, int32_t size, int32_t* timeout)
{
    CLock lock(*this);
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
    CLock lock(*this);
    if (ackMs < 0 || measureMs < 0)
        return PMXSIM_E_INVALID_ARGUMENT;
    m_nAckMs = ackMs;
    m_nMeasureMs = measureMs;
    return PMX_SUCCESS;
}

int32_t CSimulator::setAutoAck(int32_t on)
{
    CLock lock(*this);
    m_bAutoAck = on != 0;
    return PMX_SUCCESS;
}

int32_t CSimulator::failNext(const char* function, int32_t code)
{
    CLock lock(*this);
    if (function == nullptr)
        return PMXSIM_E_INVALID_ARGUMENT;
    for (int fn = 0; fn < FN_COUNT; ++fn) {
        if (std::strcmp(functionName(fn), function) == 0) {
            m_aInjected[fn] = code;
            return PMX_SUCCESS;
        }
    }
    return PMXSIM_E_INVALID_ARGUMENT;
}

} // namespace PmxSim
