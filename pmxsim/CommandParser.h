// Contract: parseCommand turns the text of one sensor command into what the sensor is asked to do.
// It keeps no state and accepts any text: the text ends at its first line end, letter case does
// not matter, header keywords may be written in short or long form, optional keywords may be left
// out, a leading colon is allowed, and a quoted parameter loses its quotes. A command it does not
// know, a setting without its parameter, a query with one, or a parameter out of range is
// eUnknown; an empty text is eNone.
#ifndef PMXSIM_COMMANDPARSER_H
#define PMXSIM_COMMANDPARSER_H

#include <cstdint>
#include <string>

namespace PmxSim {

enum EAction {
    eNone,
    eUnknown,
    eIdn,               // *IDN?
    eReset,             // *RST
    eClearStatus,       // *CLS
    eOperationComplete, // *OPC, *OPC?
    eEventStatus,       // *ESR?
    eEventEnable,       // *ESE, *ESE?
    eServiceEnable,     // *SRE, *SRE?
    eSelfTest,          // *TST?
    eMeasure,           // *TRG, INIT[:IMM]
    eContinuous,        // INIT:CONT
    eAbort,             // ABOR
    eRead,              // READ?: a measurement of the current function
    eMeasurePower,      // MEAS[:POW]?: a power measurement
    eFunction,          // FUNC
    eTracePoints,       // TRAC:POIN
    eFrequency,         // [SENS:]FREQ
    eAverageCount,      // [SENS:]AVER:COUN
    eAveraging,         // [SENS:]AVER[:STAT]
    eOffset,            // [SENS:]CORR:OFFS
    eUnit,              // UNIT:POW
    eVersion            // SYST:VERS?
};

// The choices of FUNC and UNIT:POW, as nValue.
const int32_t FUNCTION_POWER = 0;
const int32_t FUNCTION_TRACE = 1;
const int32_t UNIT_DBM = 0;
const int32_t UNIT_WATT = 1;

struct SCommand {
    EAction eAction = eUnknown;
    bool bQuery = false;
    int32_t nValue = 0;  // whole numbers, booleans (0, 1) and choices
    double dValue = 0.0; // frequency in Hz, offset in dB
};

SCommand parseCommand(const std::string& text);

} // namespace PmxSim

#endif
