/*
 * PmxControl2: C interface of the sensor-control library for USB power sensors.
 *
 * Every function returns a result code: 0 on success, another value on failure; PmxGetErrorText
 * turns a code into text. A sensor is opened by its descriptor USB::0x0c6f::<model code, 4 decimal
 * digits>::<serial> and is then named by a 64-bit handle in every per-sensor call and callback.
 *
 * Five callbacks report what happens on the sensors. They are called on one thread of the library's
 * own (never on the caller's thread), in the order in which the events happened, and only while the
 * driver is open. Registering a null callback stops that callback; once a registration returns, the
 * callback it replaced is no longer running (unless the registration was made from inside a
 * callback) and is not called again. A callback may call back into the library.
 */
#ifndef PMXSIM_PMXCONTROL2_H
#define PMXSIM_PMXCONTROL2_H

#include <stdint.h>

#if defined(_WIN32)
#if defined(PMXCONTROL2_BUILD)
#define PMX_API __declspec(dllexport)
#else
#define PMX_API __declspec(dllimport)
#endif
#else
#define PMX_API __attribute__((visibility("default")))
#endif

/* Result codes that callers rely on. */
#define PMX_SUCCESS ((int32_t)0)
/* No (further) result is pending for the sensor. */
#define PMX_ERR_NO_MORE_RESULTS ((int32_t)0xC000000Au)
/* Benign notice: the command was accepted but had nothing to do. */
#define PMX_INFO_COMMAND_IGNORED ((int32_t)0xD0000007u)
/* The sensor did not understand the command or its parameter. */
#define PMX_ERR_UNKNOWN_COMMAND ((int32_t)0xD0000089u)

#ifdef __cplusplus
extern "C" {
#endif

/* Command accepted, state changed, data available and error occurred: (handle, value, user). */
typedef void (*PmxNotifyCallback)(int64_t handle, int32_t value, void* user);
/* Device changed (a sensor was attached or removed): (user). */
typedef void (*PmxDeviceChangedCallback)(void* user);

PMX_API int32_t PmxOpenDriver(void);
PMX_API int32_t PmxCloseDriver(void);

PMX_API int32_t PmxOpenSensor(const char* descriptor, int64_t* handle);
PMX_API int32_t PmxCloseSensor(int64_t handle);
PMX_API int32_t PmxSendCommand(int64_t handle, const char* text, int32_t timeout);
PMX_API int32_t PmxClearDevice(int64_t handle);
PMX_API int32_t PmxEmptyAllBuffers(int64_t handle);
PMX_API int32_t PmxGetTriggerState(int64_t handle, int32_t* state);

/* Results: PmxGetData tells the data type of the next pending result; the getter of that type
   consumes it. */
PMX_API int32_t PmxGetData(int64_t handle, int32_t* dataType, int32_t* count, int32_t* pending);
PMX_API int32_t PmxGetFloatResult(int64_t handle, float* value1, float* value2, float* value3);
PMX_API int32_t PmxGetFloatArray(int64_t handle, float* values, int32_t capacity, int32_t* count);
PMX_API int32_t PmxGetAuxFloatArray(int64_t handle, float* values1, float* values2, float* values3, int32_t capacity,
                                    int32_t* count);
PMX_API int32_t PmxGetLongResult(int64_t handle, int32_t* value1, int32_t* value2, int32_t* value3);
PMX_API int32_t PmxGetBitfieldResult(int64_t handle, int32_t* value1, int32_t* value2, int32_t* value3);
PMX_API int32_t PmxGetBinaryResult(int64_t handle, uint8_t* buffer, int32_t size, int32_t* count);
PMX_API int32_t PmxGetStringResult(int64_t handle, char* buffer, int32_t size);

/* Attached sensors. */
PMX_API int32_t PmxGetDeviceListLength(int32_t* count);
PMX_API int32_t PmxGetDeviceInfo(int32_t index, char name[256], char type[256], char serial[256], int32_t* flag);

PMX_API int32_t PmxGetErrorText(int32_t code, char* buffer, int32_t size);

/* Callback registration: (callback, user argument handed back on every call). */
PMX_API int32_t PmxSetNotifyCallbackDeviceChanged(PmxDeviceChangedCallback callback, void* user);
PMX_API int32_t PmxSetNotifyCallbackErrorOccurred(PmxNotifyCallback callback, void* user);
PMX_API int32_t PmxSetNotifyCallbackDataAvailable(PmxNotifyCallback callback, void* user);
PMX_API int32_t PmxSetNotifyCallbackCommandAccepted(PmxNotifyCallback callback, void* user);
PMX_API int32_t PmxSetNotifyCallbackStateChanged(PmxNotifyCallback callback, void* user);

#ifdef __cplusplus
}
#endif

#endif /* PMXSIM_PMXCONTROL2_H */
