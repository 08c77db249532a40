// Contract: parseCommand turns the text of one sensor command into what the sensor is asked to do.
// It keeps no state and accepts any text: the text ends at its first line end, letter case does
// not matter, header keywords may be written in short or long form, optional keywords may be left
// out, a leading colon is allowed, and a quoted parameter loses its quotes. A command it does not
// know, a setting without its parameter, a query with one, or a parameter out of range is
// ACTION_UNKNOWN; an empty text is ACTION_NONE.
#ifndef PMXSIM_COMMANDPARSER_H
#define PMXSIM_COMMANDPARSER_H

#include <cstdint>
#include <string>

namespace PmxSim {

enum EAction {
    ACTION_NONE,
    ACTION_UNKNOWN,
    ACTION_IDN,                // *IDN?
    ACTION_RESET,              // *RST
    ACTION_CLEAR_STATUS,       // *CLS
    ACTION_OPERATION_COMPLETE, // *OPC, *OPC?
    ACTION_EVENT_STATUS,       // *ESR?
    ACTION_EVENT_ENABLE,       // *ESE, *ESE?
    ACTION_SERVICE_ENABLE,     // *SRE, *SRE?
    ACTION_SELF_TEST,          // *TST?
    ACTION_MEASURE,            // *TRG, INIT[:IMM]
    ACTION_CONTINUOUS,         // INIT:CONT
    ACTION_ABORT,              // ABOR
    ACTION_READ,               // READ?: a measurement of the current function
    ACTION_MEASURE_POWER,      // MEAS[:POW]?: a power measurement
    ACTION_FUNCTION,           // FUNC
    ACTION_TRACE_POINTS,       // TRAC:POIN
    ACTION_FREQUENCY,          // [SENS:]FREQ
    ACTION_AVERAGE_COUNT,      // [SENS:]AVER:COUN
    ACTION_AVERAGING,          // [SENS:]AVER[:STAT]
    ACTION_OFFSET,             // [SENS:]CORR:OFFS
    ACTION_UNIT,               // UNIT:POW
    ACTION_VERSION             // SYST:VERS?
};

// The choices of FUNC and UNIT:POW, as nValue.
const int32_t FUNCTION_POWER = 0;
const int32_t FUNCTION_TRACE = 1;
const int32_t UNIT_DBM = 0;
const int32_t UNIT_WATT = 1;

struct SCommand {
    EAction eAction = ACTION_UNKNOWN;
    bool bQuery = false;
    int32_t nValue = 0;  // whole numbers, booleans (0, 1) and choices
    double dValue = 0.0; // frequency in Hz, offset in dB
};

SCommand parseCommand(const std::string& text);

} // namespace PmxSim

#endif
