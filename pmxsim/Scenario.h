// Contract: a scenario is everything the simulated library is configured with at its first call or
// reset: the attached sensors with their models (measured power, trace, extra answers, a detach
// after some measurements), the delays and scripted failures of library functions. It comes from
// the file named by PMXSIM_CONFIG, else from PMXSIM_DEVICES, else the two default sensors.
// Loading never yields a half-filled scenario: on any fault the result is an empty scenario
// (no sensor, default delays, no failure) and one line on stderr says why.
// See pmxsim/README.md and pmxsim/scenarios/example.yaml for the file format.
#ifndef PMXSIM_SCENARIO_H
#define PMXSIM_SCENARIO_H

#include "pmxsim/SimSupport.h"

#include <cstdint>
#include <string>
#include <vector>

namespace PmxSim {

// The power at a sensor's input, in dBm, before the settings shape it.
struct SPowerModel {
    enum EKind {
        POWER_MODEL_BUILT_IN, // -20 dBm with +-0.05 dB evenly spread noise
        POWER_MODEL_CONSTANT, // dLevelDbm, no noise
        POWER_MODEL_SEQUENCE, // levels, one per measurement, repeated from the start
        POWER_MODEL_NOISY     // dLevelDbm with Gaussian noise of dNoiseDb (standard deviation)
    } eKind = POWER_MODEL_BUILT_IN;
    double dLevelDbm = -20.0;
    std::vector<double> levels;
    double dNoiseDb = 0.0;
};

// A pulse over dDurationUs, resampled to the trace points: dLowDbm, then an edge of dRiseUs
// starting at dDelayUs up to dHighDbm, dHighDbm until dDelayUs + dWidthUs, an edge of dFallUs back.
// bBuiltIn: the built-in pulse (-20 dBm in the middle half, -60 dBm outside, the built-in noise).
struct STraceModel {
    bool bBuiltIn = true;
    double dDurationUs = 100.0;
    double dDelayUs = 25.0;
    double dWidthUs = 50.0;
    double dRiseUs = 0.0;
    double dFallUs = 0.0;
    double dLowDbm = -60.0;
    double dHighDbm = -20.0;
    double dNoiseDb = 0.0; // Gaussian, standard deviation
};

// An answer to a command: a command matching strPattern (letter case ignored, "*" for any run of
// characters) is answered with the text strAnswer, or with the error nCode when bError.
struct SAnswer {
    std::string strPattern; // lower case
    bool bError = false;
    std::string strAnswer;
    int32_t nCode = 0;
};

struct SSensorModel {
    std::string strType;
    std::string strSerial;
    int32_t nFlag = 1;
    SPowerModel power;
    STraceModel trace;
    uint32_t nSeed = 1; // of the Gaussian noise, so runs repeat
    std::vector<SAnswer> answers;
    int32_t nDetachAfter = 0; // measurements, then the sensor detaches; 0 = never
};

// The nCall-th call (1 = the first) of library function nFunction (an EFunction) since the
// scenario was loaded returns nCode and does nothing else.
struct SFault {
    int nFunction = 0;
    int32_t nCall = 1;
    int32_t nCode = 0;
};

struct SScenario {
    int32_t nAckMs = DEFAULT_ACK_MS;
    int32_t nMeasureMs = DEFAULT_MEASURE_MS;
    std::vector<SSensorModel> sensors;
    std::vector<SFault> faults;
};

// The scenario from the environment: PMXSIM_CONFIG, else PMXSIM_DEVICES, else the defaults.
// Complaints go to stderr.
SScenario configuredScenario();

// The sensors of a PMXSIM_DEVICES list ("type:serial[:flag],..."; "none" or empty: no sensor).
// A malformed entry or a repeated serial is skipped with a line in complaints.
SScenario devicesScenario(const std::string& list, std::vector<std::string>* complaints);

// Parses the text of a scenario file. False, with the line (1 = first) and the reason, when the
// text is malformed; scenario is then unchanged. False with line 0 in a build without scenario
// support.
bool parseScenario(const std::string& text, SScenario* scenario, int* line, std::string* reason);

// True when the pattern (lower case, "*" for any run) matches the whole text (lower case).
bool matchesPattern(const char* pattern, const char* text);

} // namespace PmxSim

#endif
