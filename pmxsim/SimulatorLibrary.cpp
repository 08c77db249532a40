// The library functions apart from the driver and the callback registrations: sensors (open,
// close, commands, clear, trigger state), results (describe the oldest, the getters of each
// kind), the device list and the texts of result codes. Each starts with CCall.
#include "pmxsim/Simulator.h"

#include "pmxsim/SimSupport.h"

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <cstring>

namespace PmxSim {

// ---- sensors ----

// Descriptor: USB::0x0c6f::<model code in decimal, at least 4 digits>::<serial>; the two fixed
// fields in any letter case.
int32_t CSimulator::openSensor(const char* descriptor, int64_t* handle)
{
    CCall call(*this, FN_OPEN_SENSOR, NEED_DRIVER);
    if (call.code() != PMX_SUCCESS)
        return call.code();
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
    if (digits.size() < 4 || digits.size() > 10 || digits.find_first_not_of("0123456789") != std::string::npos)
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
    sensor->nTriggerState = TRIGGER_STATE_IDLE;
    sensor->bMeasuring = false;
    sensor->bContinuous = false;
    sensor->settings = SSettings();
    sensor->nEventStatus = 0;
    sensor->nEventEnable = 0;
    sensor->nServiceEnable = 0;
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
    CCall call(*this, FN_CLOSE_SENSOR, NEED_DRIVER);
    if (call.code() != PMX_SUCCESS)
        return call.code();
    auto it = m_aOpen.find(handle);
    if (it == m_aOpen.end())
        return PMXSIM_E_INVALID_HANDLE;
    SensorPtr sensor = it->second;
    m_aOpen.erase(it);
    abortMeasurement(*sensor);
    sensor->results.clear();
    sensor->nTriggerState = TRIGGER_STATE_IDLE;
    sensor->nHandle = 0;
    return PMX_SUCCESS;
}

// The timeout argument is only recorded: commands are queued and answered through the callbacks.
int32_t CSimulator::sendCommand(int64_t handle, const char* text, int32_t timeout)
{
    CCall call(*this, FN_SEND_COMMAND, NEED_SENSOR, handle);
    if (call.code() != PMX_SUCCESS)
        return call.code();
    if (text == nullptr)
        return PMXSIM_E_INVALID_ARGUMENT;
    SSensor& sensor = call.sensor();
    sensor.strLastCommand = text;
    sensor.nLastTimeout = timeout;
    // Commands of one sensor are answered in the order sent, even when the delay was shortened.
    Clock::time_point due = std::max(Clock::now() + std::chrono::milliseconds(m_nAckMs), sensor.tLastCommand);
    sensor.tLastCommand = due;
    schedule(due, STask{STask::TASK_COMMAND, m_aOpen.at(handle), handle, text, 0});
    return PMX_SUCCESS;
}

int32_t CSimulator::clearDevice(int64_t handle)
{
    CCall call(*this, FN_CLEAR_DEVICE, NEED_SENSOR, handle);
    if (call.code() != PMX_SUCCESS)
        return call.code();
    abortMeasurement(call.sensor());
    call.sensor().results.clear();
    return PMX_SUCCESS;
}

int32_t CSimulator::emptyAllBuffers(int64_t handle)
{
    CCall call(*this, FN_EMPTY_ALL_BUFFERS, NEED_SENSOR, handle);
    if (call.code() != PMX_SUCCESS)
        return call.code();
    call.sensor().results.clear();
    return PMX_SUCCESS;
}

int32_t CSimulator::getTriggerState(int64_t handle, int32_t* state)
{
    CCall call(*this, FN_GET_TRIGGER_STATE, NEED_SENSOR, handle);
    if (call.code() != PMX_SUCCESS)
        return call.code();
    if (state == nullptr)
        return PMXSIM_E_INVALID_ARGUMENT;
    *state = call.sensor().nTriggerState;
    return PMX_SUCCESS;
}

// ---- results ----

// Tells about the oldest pending result without consuming it: its data type, its element count
// and the number of pending results. Null outputs are skipped.
int32_t CSimulator::getData(int64_t handle, int32_t* dataType, int32_t* count, int32_t* pending)
{
    CCall call(*this, FN_GET_DATA, NEED_SENSOR, handle);
    if (call.code() != PMX_SUCCESS)
        return call.code();
    const std::deque<SResult>& results = call.sensor().results;
    if (results.empty())
        return PMX_ERR_NO_MORE_RESULTS;
    const SResult& result = results.front();
    size_t elements = result.bytes.size() + result.ints.size() + result.floats.size();
    if (dataType != nullptr)
        *dataType = result.nType;
    if (count != nullptr)
        *count = static_cast<int32_t>(elements);
    if (pending != nullptr)
        *pending = static_cast<int32_t>(results.size());
    return PMX_SUCCESS;
}

// A getter may take the oldest result when there is one and its type is firstType..lastType.
int32_t CSimulator::checkPending(const SSensor& sensor, int32_t firstType, int32_t lastType)
{
    if (sensor.results.empty())
        return PMX_ERR_NO_MORE_RESULTS;
    int32_t type = sensor.results.front().nType;
    if (type < firstType || type > lastType)
        return PMXSIM_E_TYPE_MISMATCH;
    return PMX_SUCCESS;
}

// Float results (5, 6, 7), long results (8, 9) and bit fields (1, 2, 3): the first three queued
// values, 0 for those not queued. Null outputs are skipped.
int32_t CSimulator::getScalars(EFunction fn, int64_t handle, void* v1, void* v2, void* v3)
{
    CCall call(*this, fn, NEED_SENSOR, handle);
    if (call.code() != PMX_SUCCESS)
        return call.code();
    bool floats = fn == FN_GET_FLOAT_RESULT;
    int32_t first = floats         ? PMXSIM_TYPE_FLOAT_TRIPLE
        : fn == FN_GET_LONG_RESULT ? PMXSIM_TYPE_LONG_TRIPLE
                                   : PMXSIM_TYPE_BITFIELD1;
    int32_t last = floats          ? PMXSIM_TYPE_FLOAT_STREAM
        : fn == FN_GET_LONG_RESULT ? PMXSIM_TYPE_LONG
                                   : PMXSIM_TYPE_BITFIELD3;
    SSensor& sensor = call.sensor();
    if (int32_t code = checkPending(sensor, first, last))
        return code;
    const SResult& result = sensor.results.front();
    void* outputs[3] = {v1, v2, v3};
    for (size_t i = 0; i < 3; ++i) {
        if (outputs[i] == nullptr)
            continue;
        if (floats)
            *static_cast<float*>(outputs[i]) = i < result.floats.size() ? result.floats[i] : 0.0f;
        else
            *static_cast<int32_t*>(outputs[i]) = i < result.ints.size() ? result.ints[i] : 0;
    }
    sensor.results.pop_front();
    return PMX_SUCCESS;
}

// Float arrays (4) fill the first array; auxiliary arrays (11) fill the first with the queued
// values and the other two, where given, with as many zeros. A result that does not fit stays
// pending.
int32_t CSimulator::getFloatArrays(EFunction fn, int64_t handle, float* a1, float* a2, float* a3, int32_t capacity,
                                   int32_t* count)
{
    CCall call(*this, fn, NEED_SENSOR, handle);
    if (call.code() != PMX_SUCCESS)
        return call.code();
    int32_t type = fn == FN_GET_FLOAT_ARRAY ? PMXSIM_TYPE_FLOAT_ARRAY : PMXSIM_TYPE_AUX_FLOAT_ARRAY;
    SSensor& sensor = call.sensor();
    if (int32_t code = checkPending(sensor, type, type))
        return code;
    if (a1 == nullptr || count == nullptr || capacity < 0)
        return PMXSIM_E_INVALID_ARGUMENT;
    const std::vector<float>& values = sensor.results.front().floats;
    if (values.size() > static_cast<size_t>(capacity))
        return PMXSIM_E_BUFFER_TOO_SMALL;
    std::copy(values.begin(), values.end(), a1);
    if (a2 != nullptr)
        std::fill(a2, a2 + values.size(), 0.0f);
    if (a3 != nullptr)
        std::fill(a3, a3 + values.size(), 0.0f);
    *count = static_cast<int32_t>(values.size());
    sensor.results.pop_front();
    return PMX_SUCCESS;
}

int32_t CSimulator::getBinaryResult(int64_t handle, uint8_t* buffer, int32_t size, int32_t* count)
{
    CCall call(*this, FN_GET_BINARY_RESULT, NEED_SENSOR, handle);
    if (call.code() != PMX_SUCCESS)
        return call.code();
    SSensor& sensor = call.sensor();
    if (int32_t code = checkPending(sensor, PMXSIM_TYPE_BINARY, PMXSIM_TYPE_BINARY))
        return code;
    if (buffer == nullptr || count == nullptr || size < 0)
        return PMXSIM_E_INVALID_ARGUMENT;
    const std::vector<uint8_t>& bytes = sensor.results.front().bytes;
    if (bytes.size() > static_cast<size_t>(size))
        return PMXSIM_E_BUFFER_TOO_SMALL;
    std::copy(bytes.begin(), bytes.end(), buffer);
    *count = static_cast<int32_t>(bytes.size());
    sensor.results.pop_front();
    return PMX_SUCCESS;
}

// The text and its terminating zero must fit.
int32_t CSimulator::getStringResult(int64_t handle, char* buffer, int32_t size)
{
    CCall call(*this, FN_GET_STRING_RESULT, NEED_SENSOR, handle);
    if (call.code() != PMX_SUCCESS)
        return call.code();
    SSensor& sensor = call.sensor();
    if (int32_t code = checkPending(sensor, PMXSIM_TYPE_TEXT, PMXSIM_TYPE_TEXT))
        return code;
    if (buffer == nullptr || size < 1)
        return PMXSIM_E_INVALID_ARGUMENT;
    const std::vector<uint8_t>& bytes = sensor.results.front().bytes;
    if (bytes.size() + 1 > static_cast<size_t>(size))
        return PMXSIM_E_BUFFER_TOO_SMALL;
    std::copy(bytes.begin(), bytes.end(), buffer);
    buffer[bytes.size()] = '\0';
    sensor.results.pop_front();
    return PMX_SUCCESS;
}

// ---- device list, texts ----

int32_t CSimulator::getDeviceListLength(int32_t* count)
{
    CCall call(*this, FN_GET_DEVICE_LIST_LENGTH, NEED_DRIVER);
    if (call.code() != PMX_SUCCESS)
        return call.code();
    if (count == nullptr)
        return PMXSIM_E_INVALID_ARGUMENT;
    *count = static_cast<int32_t>(m_aSensors.size());
    return PMX_SUCCESS;
}

// name: the sensor's descriptor when its type is a known model, else "<type> <serial>".
int32_t CSimulator::getDeviceInfo(int32_t index, char* name, char* type, char* serial, int32_t* flag)
{
    CCall call(*this, FN_GET_DEVICE_INFO, NEED_DRIVER);
    if (call.code() != PMX_SUCCESS)
        return call.code();
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
    CCall call(*this, FN_GET_ERROR_TEXT, NEED_NOTHING);
    if (call.code() != PMX_SUCCESS)
        return call.code();
    if (buffer == nullptr || size < 1)
        return PMXSIM_E_INVALID_ARGUMENT;
    char unknown[64];
    const char* text = errorText(code);
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

// ---- lookups ----

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

} // namespace PmxSim
