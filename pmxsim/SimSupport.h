// Contract: the fixed tables and small text helpers that the simulator's files share: the model
// table, the texts of the result codes, the names of the library functions, the limits of the
// simulated sensors and the trigger states they report.
#ifndef PMXSIM_SIMSUPPORT_H
#define PMXSIM_SIMSUPPORT_H

#include <cstddef>
#include <cstdint>
#include <string>

namespace PmxSim {

const char* const FIRMWARE_VERSION = "1.20";
const int32_t DEFAULT_ACK_MS = 0;
const int32_t DEFAULT_MEASURE_MS = 10;
const int32_t DEFAULT_TRACE_POINTS = 100;
const int32_t MAX_TRACE_POINTS = 1024;
const double DEFAULT_FREQUENCY_HZ = 1e9;
const double MIN_FREQUENCY_HZ = 10e6;
const double MAX_FREQUENCY_HZ = 40e9;
const int32_t MAX_AVERAGE_COUNT = 1024;
const double MAX_OFFSET_DB = 100.0;
const size_t MAX_PENDING = 1024;                     // oldest results are dropped beyond this
const int32_t MAX_QUEUED_COUNT = 1 << 20;            // elements of one queued result
const size_t MAX_TEXT = 255;                         // device-info buffers hold 256 bytes
const int64_t FIRST_HANDLE = (int64_t(1) << 32) + 1; // handles do not fit 32 bits on purpose

// Trigger states that PmxGetTriggerState reports and the state-changed callback passes.
const int32_t TRIGGER_STATE_IDLE = 0;
const int32_t TRIGGER_STATE_WAITING = 2;
const int32_t TRIGGER_STATE_MEASURING = 3;

const int FUNCTION_COUNT = 24; // library functions (EFunction)

// The model code of a type of the model table; false for other types.
bool findModel(const std::string& type, uint32_t* code);
// The text of a result code, or null for a code without one.
const char* errorText(int32_t code);
// The exported name of library function number fn (EFunction).
const char* functionName(int fn);

std::string lower(std::string text);
std::string trim(const std::string& text);
// Serial numbers are compared without regard to letter case.
bool sameSerial(const std::string& a, const char* b);
// A type or serial that fits the device-info buffers and the PMXSIM_DEVICES syntax.
bool validText(const char* text);
// Copies text cut to MAX_TEXT, zero-terminated, into a device-info buffer.
void copyText(char* target, const std::string& text);

} // namespace PmxSim

#endif
