// The exported C functions: each is one call on the process-wide simulator.
#include "pmxsim/PmxSim.h"
#include "pmxsim/Simulator.h"

using PmxSim::CSimulator;

namespace {
CSimulator& sim()
{
    return CSimulator::instance();
}
} // namespace

extern "C" {

PMX_API int32_t PmxOpenDriver(void)
{
    return sim().openDriver();
}
PMX_API int32_t PmxCloseDriver(void)
{
    return sim().closeDriver();
}

PMX_API int32_t PmxOpenSensor(const char* descriptor, int64_t* handle)
{
    return sim().openSensor(descriptor, handle);
}
PMX_API int32_t PmxCloseSensor(int64_t handle)
{
    return sim().closeSensor(handle);
}
PMX_API int32_t PmxSendCommand(int64_t handle, const char* text, int32_t timeout)
{
    return sim().sendCommand(handle, text, timeout);
}
PMX_API int32_t PmxClearDevice(int64_t handle)
{
    return sim().clearDevice(handle);
}
PMX_API int32_t PmxEmptyAllBuffers(int64_t handle)
{
    return sim().emptyAllBuffers(handle);
}
PMX_API int32_t PmxGetTriggerState(int64_t handle, int32_t* state)
{
    return sim().getTriggerState(handle, state);
}

PMX_API int32_t PmxGetData(int64_t handle, int32_t* dataType, int32_t* count, int32_t* pending)
{
    return sim().getData(handle, dataType, count, pending);
}
PMX_API int32_t PmxGetFloatResult(int64_t handle, float* value1, float* value2, float* value3)
{
    return sim().getScalars(PmxSim::FN_GET_FLOAT_RESULT, handle, value1, value2, value3);
}
PMX_API int32_t PmxGetFloatArray(int64_t handle, float* values, int32_t capacity, int32_t* count)
{
    return sim().getFloatArrays(PmxSim::FN_GET_FLOAT_ARRAY, handle, values, nullptr, nullptr, capacity, count);
}
PMX_API int32_t PmxGetAuxFloatArray(int64_t handle, float* values1, float* values2, float* values3, int32_t capacity,
                                    int32_t* count)
{
    return sim().getFloatArrays(PmxSim::FN_GET_AUX_FLOAT_ARRAY, handle, values1, values2, values3, capacity, count);
}
PMX_API int32_t PmxGetLongResult(int64_t handle, int32_t* value1, int32_t* value2, int32_t* value3)
{
    return sim().getScalars(PmxSim::FN_GET_LONG_RESULT, handle, value1, value2, value3);
}
PMX_API int32_t PmxGetBitfieldResult(int64_t handle, int32_t* value1, int32_t* value2, int32_t* value3)
{
    return sim().getScalars(PmxSim::FN_GET_BITFIELD_RESULT, handle, value1, value2, value3);
}
PMX_API int32_t PmxGetBinaryResult(int64_t handle, uint8_t* buffer, int32_t size, int32_t* count)
{
    return sim().getBinaryResult(handle, buffer, size, count);
}
PMX_API int32_t PmxGetStringResult(int64_t handle, char* buffer, int32_t size)
{
    return sim().getStringResult(handle, buffer, size);
}

PMX_API int32_t PmxGetDeviceListLength(int32_t* count)
{
    return sim().getDeviceListLength(count);
}
PMX_API int32_t PmxGetDeviceInfo(int32_t index, char name[256], char type[256], char serial[256], int32_t* flag)
{
    return sim().getDeviceInfo(index, name, type, serial, flag);
}
PMX_API int32_t PmxGetErrorText(int32_t code, char* buffer, int32_t size)
{
    return sim().getErrorText(code, buffer, size);
}

PMX_API int32_t PmxSetNotifyCallbackDeviceChanged(PmxDeviceChangedCallback callback, void* user)
{
    return sim().setDeviceChangedCallback(callback, user);
}
PMX_API int32_t PmxSetNotifyCallbackErrorOccurred(PmxNotifyCallback callback, void* user)
{
    return sim().setNotifyCallback(PmxSim::FN_SET_ERROR_OCCURRED, PmxSim::CALLBACK_ERROR_OCCURRED, callback, user);
}
PMX_API int32_t PmxSetNotifyCallbackDataAvailable(PmxNotifyCallback callback, void* user)
{
    return sim().setNotifyCallback(PmxSim::FN_SET_DATA_AVAILABLE, PmxSim::CALLBACK_DATA_AVAILABLE, callback, user);
}
PMX_API int32_t PmxSetNotifyCallbackCommandAccepted(PmxNotifyCallback callback, void* user)
{
    return sim().setNotifyCallback(PmxSim::FN_SET_COMMAND_ACCEPTED, PmxSim::CALLBACK_COMMAND_ACCEPTED, callback, user);
}
PMX_API int32_t PmxSetNotifyCallbackStateChanged(PmxNotifyCallback callback, void* user)
{
    return sim().setNotifyCallback(PmxSim::FN_SET_STATE_CHANGED, PmxSim::CALLBACK_STATE_CHANGED, callback, user);
}

PMX_API int32_t PmxSimReset(void)
{
    // A simulator made by this very call is as freshly loaded already: loading again would read
    // the scenario file twice and repeat its complaints.
    bool made = false;
    CSimulator& simulator = CSimulator::instance(&made);
    return made ? PMX_SUCCESS : simulator.reset();
}
PMX_API int32_t PmxSimAttach(const char* type, const char* serial)
{
    return sim().attach(type, serial);
}
PMX_API int32_t PmxSimDetach(const char* serial)
{
    return sim().detach(serial);
}
PMX_API int32_t PmxSimSetDeviceFlag(const char* serial, int32_t flag)
{
    return sim().setDeviceFlag(serial, flag);
}
PMX_API int32_t PmxSimQueueResult(const char* serial, int32_t dataType, const void* values, int32_t count)
{
    return sim().queueResult(serial, dataType, values, count);
}
PMX_API int32_t PmxSimReportError(const char* serial, int32_t code)
{
    return sim().reportError(serial, code);
}
PMX_API int32_t PmxSimSetTriggerState(const char* serial, int32_t state)
{
    return sim().setTriggerState(serial, state);
}
PMX_API int32_t PmxSimGetLastCommand(const char* serial, char* text, int32_t size, int32_t* timeout)
{
    return sim().getLastCommand(serial, text, size, timeout);
}
PMX_API int32_t PmxSimSetDelays(int32_t ackMs, int32_t measureMs)
{
    return sim().setDelays(ackMs, measureMs);
}
PMX_API int32_t PmxSimSetAutoAck(int32_t on)
{
    return sim().setAutoAck(on);
}
PMX_API int32_t PmxSimFailNext(const char* function, int32_t code)
{
    return sim().failNext(function, code);
}

} // extern "C"
