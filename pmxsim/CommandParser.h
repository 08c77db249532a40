// Contract: parseCommand turns the text of one sensor command into what the sensor is asked to do.
// It keeps no state and accepts any text: the text ends at its first line end, letter case does
// not matter, header keywords may be written in short or long form with an optional leading
// colon, and a quoted parameter loses its quotes. A command it does not know, or a known one with
// a bad parameter, is eUnknown; an empty text is eNone.
#ifndef PMXSIM_COMMANDPARSER_H
#define PMXSIM_COMMANDPARSER_H

#include <cstdint>
#include <string>

namespace PmxSim {

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
};

struct SCommand {
    EAction eAction = eUnknown;
    int32_t nValue = 0; // the number of points of eTracePoints
};

SCommand parseCommand(const std::string& text);

} // namespace PmxSim

#endif
