// The sensor model: what a sensor does with a command when it is due (an error, the acceptance,
// then its effects: status, settings, measurements), measurements (trigger states, duration, the
// value of a power or trace measurement as the settings shape it, continuous mode) and its queue
// of pending results.
#include "pmxsim/Simulator.h"

#include "pmxsim/SimSupport.h"

#include <algorithm>
#include <cmath>
#include <cstdio>

namespace PmxSim {

namespace {
const float POWER_DBM = -20.0f;          // level of a measurement and of a pulse top
const float FLOOR_DBM = -60.0f;          // level outside the pulse of a trace
const double RESPONSE_DB_PER_GHZ = -0.2; // level change per GHz away from 1 GHz
const char* const SCPI_VERSION = "1999.0";
// Bits of the event status register.
const int32_t EVENT_OPERATION_COMPLETE = 1;
const int32_t EVENT_COMMAND_ERROR = 32;

std::string number(double value)
{
    char text[32];
    std::snprintf(text, sizeof text, "%.9g", value);
    return text;
}
} // namespace

float CSimulator::noise()
{
    std::uniform_real_distribution<float> spread(-0.05f, 0.05f);
    return spread(m_aRandom);
}

void CSimulator::setState(SSensor& sensor, int32_t state)
{
    sensor.nTriggerState = state;
    post(CALLBACK_STATE_CHANGED, sensor.nHandle, state);
}

void CSimulator::abortMeasurement(SSensor& sensor)
{
    sensor.bContinuous = false;
    if (sensor.bMeasuring) {
        sensor.bMeasuring = false;
        ++sensor.nMeasurement;
        setState(sensor, TRIGGER_STATE_IDLE);
    }
}

void CSimulator::startMeasurement(SSensor& sensor, bool trace, Clock::time_point now)
{
    sensor.bMeasuring = true;
    sensor.bMeasuringTrace = trace;
    ++sensor.nMeasurement;
    setState(sensor, TRIGGER_STATE_WAITING);
    setState(sensor, TRIGGER_STATE_MEASURING);
    // A continuous measurement takes at least 1 ms so that it cannot saturate the callback thread.
    int32_t duration = sensor.bContinuous ? std::max(m_nMeasureMs, 1) : m_nMeasureMs;
    STask task{STask::TASK_MEASUREMENT_DONE, m_aOpen.at(sensor.nHandle), sensor.nHandle, std::string(),
               sensor.nMeasurement};
    schedule(now + std::chrono::milliseconds(duration), std::move(task));
}

// One value as the sensor reports it: the level at the input shifted by the frequency response
// and the offset, with its noise lowered by averaging, in the selected unit.
float CSimulator::reading(const SSensor& sensor, double levelDbm, double spreadDb)
{
    const SSettings& settings = sensor.settings;
    if (settings.bAveraging)
        spreadDb /= std::sqrt(static_cast<double>(settings.nAverageCount));
    double response = RESPONSE_DB_PER_GHZ * (settings.dFrequencyHz / 1e9 - 1.0);
    double dbm = levelDbm + response + settings.dOffsetDb + spreadDb;
    return static_cast<float>(settings.bWatt ? std::pow(10.0, (dbm - 30.0) / 10.0) : dbm);
}

float CSimulator::powerReading(SSensor& sensor)
{
    const SPowerModel& power = sensor.pModel->power;
    switch (power.eKind) {
    case SPowerModel::POWER_MODEL_CONSTANT:
        return reading(sensor, power.dLevelDbm, 0.0);
    case SPowerModel::POWER_MODEL_SEQUENCE:
        return reading(sensor, power.levels[sensor.nNextLevel++ % power.levels.size()], 0.0);
    case SPowerModel::POWER_MODEL_NOISY: {
        std::normal_distribution<double> gauss(0.0, power.dNoiseDb);
        return reading(sensor, power.dLevelDbm, power.dNoiseDb > 0.0 ? gauss(sensor.aNoise) : 0.0);
    }
    case SPowerModel::POWER_MODEL_BUILT_IN:
        break;
    }
    return reading(sensor, POWER_DBM, noise());
}

// The built-in pulse is high in the middle half of the trace. A pulse of the scenario is sampled
// at the start of each point's share of its duration, its edges linear in dB.
void CSimulator::addTrace(SSensor& sensor)
{
    SResult result;
    result.nType = PMXSIM_TYPE_FLOAT_ARRAY;
    int32_t points = sensor.settings.nTracePoints;
    result.floats.reserve(static_cast<size_t>(points));
    const STraceModel& trace = sensor.pModel->trace;
    std::normal_distribution<double> gauss(0.0, trace.dNoiseDb);
    for (int32_t i = 0; i < points; ++i) {
        if (trace.bBuiltIn) {
            bool high = i >= points / 4 && i < points * 3 / 4;
            result.floats.push_back(reading(sensor, high ? POWER_DBM : FLOOR_DBM, noise()));
            continue;
        }
        double t = trace.dDurationUs * i / points;
        double rise = t - trace.dDelayUs;
        double fall = t - (trace.dDelayUs + trace.dWidthUs);
        double share = 0.0; // of the way from low to high
        if (fall >= 0.0)
            share = trace.dFallUs > 0.0 ? std::max(0.0, 1.0 - fall / trace.dFallUs) : 0.0;
        else if (rise >= 0.0)
            share = trace.dRiseUs > 0.0 ? std::min(1.0, rise / trace.dRiseUs) : 1.0;
        double level = trace.dLowDbm + share * (trace.dHighDbm - trace.dLowDbm);
        result.floats.push_back(reading(sensor, level, trace.dNoiseDb > 0.0 ? gauss(sensor.aNoise) : 0.0));
    }
    addResult(sensor, std::move(result));
}

// A sensor told to detach after N measurements ends its next one by detaching instead of giving
// a result, so N readings succeed.
void CSimulator::finishMeasurement(SSensor& sensor, Clock::time_point now)
{
    int32_t detachAfter = sensor.pModel->nDetachAfter;
    if (detachAfter > 0 && sensor.nMeasured++ >= detachAfter) {
        detachLocked(m_aOpen.at(sensor.nHandle));
        return;
    }
    if (sensor.bMeasuringTrace) {
        addTrace(sensor);
    } else {
        SResult result;
        result.nType = PMXSIM_TYPE_FLOAT;
        result.floats.push_back(powerReading(sensor));
        addResult(sensor, std::move(result));
    }
    if (sensor.bContinuous) {
        startMeasurement(sensor, sensor.settings.bTrace, now);
    } else {
        sensor.bMeasuring = false;
        setState(sensor, TRIGGER_STATE_IDLE);
    }
}

void CSimulator::runTask(STask& task, Clock::time_point now)
{
    SSensor& sensor = *task.pSensor;
    if (!sensor.bAttached || sensor.nHandle != task.nHandle)
        return;
    if (task.eKind == STask::TASK_COMMAND) {
        runCommand(sensor, task.strText, now);
    } else if (sensor.bMeasuring && task.nMeasurement == sensor.nMeasurement) {
        finishMeasurement(sensor, now);
    }
}

// A line end ends a program message, so a text may hold several: they run in order, and the
// text as a whole is accepted once, with its last message.
void CSimulator::runCommand(SSensor& sensor, const std::string& text, Clock::time_point now)
{
    std::string::size_type start = 0;
    std::string::size_type end;
    while ((end = text.find('\n', start)) != std::string::npos &&
           text.find_first_not_of(" \t\r\n", end) != std::string::npos) {
        std::string message = text.substr(start, end + 1 - start);
        if (message.find_first_not_of(" \t\r\n") != std::string::npos) // blank lines are no messages
            runMessage(sensor, message, now, false);
        start = end + 1;
    }
    runMessage(sensor, text.substr(start), now, true);
}

void CSimulator::acceptCommand(SSensor& sensor)
{
    ++sensor.nCommandCount;
    if (m_bAutoAck)
        post(CALLBACK_COMMAND_ACCEPTED, sensor.nHandle, sensor.nCommandCount);
}

// A message is answered when it is due: an error first (if any), then the acceptance (unless
// switched off, or not the text's last message), then its effects.
void CSimulator::runMessage(SSensor& sensor, const std::string& text, Clock::time_point now, bool last)
{
    if (answerFromModel(sensor, text, last))
        return;
    SCommand command = parseCommand(text);
    bool starts =
        command.eAction == ACTION_MEASURE || command.eAction == ACTION_READ || command.eAction == ACTION_MEASURE_POWER;
    bool stopsContinuous = command.eAction == ACTION_CONTINUOUS && !command.bQuery && command.nValue == 0;
    // Asking for a measurement while one runs, or for the end of a continuous measurement that
    // is not running, is harmless and answered with the benign notice.
    bool ignored = (starts && sensor.bMeasuring) || (stopsContinuous && !sensor.bContinuous);
    if (command.eAction == ACTION_UNKNOWN) {
        sensor.nEventStatus |= EVENT_COMMAND_ERROR;
        post(CALLBACK_ERROR_OCCURRED, sensor.nHandle, PMX_ERR_UNKNOWN_COMMAND);
    }
    if (ignored)
        post(CALLBACK_ERROR_OCCURRED, sensor.nHandle, PMX_INFO_COMMAND_IGNORED);
    if (last)
        acceptCommand(sensor);
    if (!ignored)
        applyCommand(sensor, command, now);
}

void CSimulator::applyCommand(SSensor& sensor, const SCommand& command, Clock::time_point now)
{
    switch (command.eAction) {
    case ACTION_IDN:
        addText(sensor, "Marlowe&Tenby," + sensor.strType + "," + sensor.strSerial + "," + FIRMWARE_VERSION);
        break;
    case ACTION_RESET:
        abortMeasurement(sensor);
        sensor.settings = SSettings();
        sensor.results.clear();
        break;
    case ACTION_MEASURE:
    case ACTION_READ:
        startMeasurement(sensor, sensor.settings.bTrace, now);
        break;
    case ACTION_MEASURE_POWER:
        startMeasurement(sensor, false, now);
        break;
    case ACTION_CONTINUOUS:
        if (command.bQuery) {
            addText(sensor, sensor.bContinuous ? "1" : "0");
        } else if (command.nValue != 0) {
            sensor.bContinuous = true;
            if (!sensor.bMeasuring)
                startMeasurement(sensor, sensor.settings.bTrace, now);
        } else {
            sensor.bContinuous = false; // the running measurement still ends with its result
        }
        break;
    case ACTION_ABORT:
        abortMeasurement(sensor);
        break;
    case ACTION_CLEAR_STATUS:
    case ACTION_OPERATION_COMPLETE:
    case ACTION_EVENT_STATUS:
    case ACTION_EVENT_ENABLE:
    case ACTION_SERVICE_ENABLE:
    case ACTION_SELF_TEST:
    case ACTION_VERSION:
        applyStatusCommand(sensor, command);
        break;
    case ACTION_FUNCTION:
    case ACTION_TRACE_POINTS:
    case ACTION_FREQUENCY:
    case ACTION_AVERAGE_COUNT:
    case ACTION_AVERAGING:
    case ACTION_OFFSET:
    case ACTION_UNIT:
        applySetting(sensor, command);
        break;
    case ACTION_NONE:
    case ACTION_UNKNOWN:
        break;
    }
}

// The status commands. Commands run one after the other, so an operation is complete as soon as
// *OPC or *OPC? is reached; a measurement still running reports its end through its result.
void CSimulator::applyStatusCommand(SSensor& sensor, const SCommand& command)
{
    int32_t* enable = command.eAction == ACTION_EVENT_ENABLE ? &sensor.nEventEnable
        : command.eAction == ACTION_SERVICE_ENABLE           ? &sensor.nServiceEnable
                                                             : nullptr;
    switch (command.eAction) {
    case ACTION_CLEAR_STATUS:
        sensor.nEventStatus = 0;
        break;
    case ACTION_OPERATION_COMPLETE:
        if (command.bQuery)
            addText(sensor, "1");
        else
            sensor.nEventStatus |= EVENT_OPERATION_COMPLETE;
        break;
    case ACTION_EVENT_STATUS: // reading the register clears it
        addText(sensor, std::to_string(sensor.nEventStatus));
        sensor.nEventStatus = 0;
        break;
    case ACTION_EVENT_ENABLE:
    case ACTION_SERVICE_ENABLE:
        if (command.bQuery)
            addText(sensor, std::to_string(*enable));
        else
            *enable = command.nValue;
        break;
    case ACTION_SELF_TEST:
        addText(sensor, "0");
        break;
    case ACTION_VERSION:
        addText(sensor, SCPI_VERSION);
        break;
    default:
        break;
    }
}

// The settings: a query answers with the current value as text, a setting changes it.
void CSimulator::applySetting(SSensor& sensor, const SCommand& command)
{
    SSettings& settings = sensor.settings;
    bool query = command.bQuery;
    switch (command.eAction) {
    case ACTION_FUNCTION:
        if (query)
            addText(sensor, settings.bTrace ? "TRACE" : "POWER");
        else
            settings.bTrace = command.nValue == FUNCTION_TRACE;
        break;
    case ACTION_TRACE_POINTS:
        if (query)
            addText(sensor, std::to_string(settings.nTracePoints));
        else
            settings.nTracePoints = command.nValue;
        break;
    case ACTION_FREQUENCY:
        if (query)
            addText(sensor, number(settings.dFrequencyHz));
        else
            settings.dFrequencyHz = command.dValue;
        break;
    case ACTION_AVERAGE_COUNT:
        if (query)
            addText(sensor, std::to_string(settings.nAverageCount));
        else
            settings.nAverageCount = command.nValue;
        break;
    case ACTION_AVERAGING:
        if (query)
            addText(sensor, settings.bAveraging ? "1" : "0");
        else
            settings.bAveraging = command.nValue != 0;
        break;
    case ACTION_OFFSET:
        if (query)
            addText(sensor, number(settings.dOffsetDb));
        else
            settings.dOffsetDb = command.dValue;
        break;
    case ACTION_UNIT:
        if (query)
            addText(sensor, settings.bWatt ? "W" : "DBM");
        else
            settings.bWatt = command.nValue == UNIT_WATT;
        break;
    default:
        break;
    }
}

// Answers of the scenario come before the built-in commands: a text, or an error that is
// reported like a refused command.
bool CSimulator::answerFromModel(SSensor& sensor, const std::string& text, bool last)
{
    if (sensor.pModel->answers.empty())
        return false;
    std::string command = lower(trim(text.substr(0, text.find_first_of("\r\n"))));
    for (const SAnswer& answer : sensor.pModel->answers) {
        if (!matchesPattern(answer.strPattern.c_str(), command.c_str()))
            continue;
        if (answer.bError) {
            sensor.nEventStatus |= EVENT_COMMAND_ERROR;
            post(CALLBACK_ERROR_OCCURRED, sensor.nHandle, answer.nCode);
        }
        if (last)
            acceptCommand(sensor);
        if (!answer.bError)
            addText(sensor, answer.strAnswer);
        return true;
    }
    return false;
}

void CSimulator::addText(SSensor& sensor, const std::string& text)
{
    SResult result;
    result.nType = PMXSIM_TYPE_TEXT;
    result.bytes.assign(text.begin(), text.end());
    addResult(sensor, std::move(result));
}

void CSimulator::addResult(SSensor& sensor, SResult result)
{
    int32_t type = result.nType;
    if (sensor.results.size() >= MAX_PENDING)
        sensor.results.pop_front();
    sensor.results.push_back(std::move(result));
    post(CALLBACK_DATA_AVAILABLE, sensor.nHandle, type);
}

} // namespace PmxSim
