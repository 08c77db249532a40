/*
 * PmxSim: control interface of the simulated sensor-control library, for tests, demos and
 * benchmarks. Every function returns 0 on success or one of the codes below. The per-sensor
 * functions name a sensor by its serial number (compared without regard to letter case); those
 * that report through a callback need the sensor open, since callbacks name it by its handle.
 * See pmxsim/README.md for the behaviour of the simulated sensors.
 */
#ifndef PMXSIM_PMXSIM_H
#define PMXSIM_PMXSIM_H

#include "pmxsim/PmxControl2.h"

/* Further result codes of the simulated library (PmxGetErrorText has a text for each). */
#define PMXSIM_E_DRIVER_NOT_OPEN ((int32_t)0xD0000001u)
#define PMXSIM_E_INVALID_ARGUMENT ((int32_t)0xD0000002u)
#define PMXSIM_E_INVALID_HANDLE ((int32_t)0xD0000003u)
#define PMXSIM_E_BAD_DESCRIPTOR ((int32_t)0xD0000004u)
#define PMXSIM_E_NO_SUCH_SENSOR ((int32_t)0xD0000005u)
#define PMXSIM_E_SENSOR_DETACHED ((int32_t)0xD0000006u)
#define PMXSIM_E_SENSOR_IN_USE ((int32_t)0xD0000008u)
#define PMXSIM_E_INDEX_OUT_OF_RANGE ((int32_t)0xD0000009u)
#define PMXSIM_E_TYPE_MISMATCH ((int32_t)0xD000000Au)
#define PMXSIM_E_BUFFER_TOO_SMALL ((int32_t)0xD000000Bu)
#define PMXSIM_E_SENSOR_NOT_OPEN ((int32_t)0xD000000Cu)
#define PMXSIM_E_ALREADY_ATTACHED ((int32_t)0xD000000Du)
#define PMXSIM_E_OUT_OF_RESOURCES ((int32_t)0xD000000Eu)

/* Data types of results: what PmxGetData and the data-available callback report, and what
   PmxSimQueueResult takes. */
#define PMXSIM_TYPE_BINARY 0    /* bytes */
#define PMXSIM_TYPE_BITFIELD1 1 /* int32_t */
#define PMXSIM_TYPE_BITFIELD2 2
#define PMXSIM_TYPE_BITFIELD3 3
#define PMXSIM_TYPE_FLOAT_ARRAY 4 /* float */
#define PMXSIM_TYPE_FLOAT_TRIPLE 5
#define PMXSIM_TYPE_FLOAT 6
#define PMXSIM_TYPE_FLOAT_STREAM 7
#define PMXSIM_TYPE_LONG_TRIPLE 8 /* int32_t */
#define PMXSIM_TYPE_LONG 9
#define PMXSIM_TYPE_TEXT 10            /* bytes, without a terminating zero */
#define PMXSIM_TYPE_AUX_FLOAT_ARRAY 11 /* float */
#define PMXSIM_TYPE_LAST PMXSIM_TYPE_AUX_FLOAT_ARRAY

#ifdef __cplusplus
extern "C" {
#endif

/* Back to the state of a freshly loaded library: driver closed (its callback thread stopped),
   callbacks removed, sensors, delays and scripted faults from the scenario file named by
   PMXSIM_CONFIG (else the sensors of PMXSIM_DEVICES, default delays), auto-acknowledge on,
   nothing queued, no injected failure. */
PMX_API int32_t PmxSimReset(void);

/* Attach a sensor (any type text; only types of the model table can be opened) or detach one.
   Both fire device changed. A detached sensor's handle fails with PMXSIM_E_SENSOR_DETACHED. */
PMX_API int32_t PmxSimAttach(const char* type, const char* serial);
PMX_API int32_t PmxSimDetach(const char* serial);
/* The flag that PmxGetDeviceInfo reports for the sensor (1 after attaching); fires device
   changed. */
PMX_API int32_t PmxSimSetDeviceFlag(const char* serial, int32_t flag);

/* Queue one result of data type 0..11 for the open sensor and fire data available. values holds
   count elements: bytes for 0 and 10 (text without its zero), int32_t for 1, 2, 3, 8, 9, float
   for 4, 5, 6, 7, 11. */
PMX_API int32_t PmxSimQueueResult(const char* serial, int32_t dataType, const void* values, int32_t count);
/* Fire the error callback with that code, for the open sensor, or with handle 0 for a null or
   empty serial. */
PMX_API int32_t PmxSimReportError(const char* serial, int32_t code);
/* Set the state PmxGetTriggerState reports for the open sensor and fire state changed. */
PMX_API int32_t PmxSimSetTriggerState(const char* serial, int32_t state);

/* The text and timeout argument of the last PmxSendCommand for the sensor since it was opened
   (an empty text and 0 when none); the text with its zero must fit size. */
PMX_API int32_t PmxSimGetLastCommand(const char* serial, char* text, int32_t size, int32_t* timeout);

/* Delay of acknowledgements and duration of one measurement, in milliseconds; 0 = as fast as
   possible. */
PMX_API int32_t PmxSimSetDelays(int32_t ackMs, int32_t measureMs);
/* 0 suppresses command acknowledgements; any other value restores them. */
PMX_API int32_t PmxSimSetAutoAck(int32_t on);
/* The next call of the named library function (e.g. "PmxGetData") returns code and does nothing
   else. Code 0 cancels a pending injection for that function. */
PMX_API int32_t PmxSimFailNext(const char* function, int32_t code);

#ifdef __cplusplus
}
#endif

#endif /* PMXSIM_PMXSIM_H */
