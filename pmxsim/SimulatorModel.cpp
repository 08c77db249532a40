// The sensor model: what a sensor does with a command when it is due (an error, the acceptance,
// then its effects), measurements (trigger states, duration, the result of a power or trace
// measurement, continuous mode) and its queue of pending results.
#include "pmxsim/Simulator.h"

#include "pmxsim/SimSupport.h"

#include <algorithm>

namespace PmxSim {

namespace {
    const float kPowerDbm = -20.0f; // level of a measurement and of a pulse top
    const float kFloorDbm = -60.0f; // level outside the pulse of a trace
} // namespace

float CSimulator::noise()
{
    std::uniform_real_distribution<float> spread(-0.05f, 0.05f);
    return spread(m_aRandom);
}

void CSimulator::setState(SSensor& sensor, int32_t state)
{
    sensor.nTriggerState = state;
    post(eStateChanged, sensor.nHandle, state);
}

void CSimulator::abortMeasurement(SSensor& sensor)
{
    sensor.bContinuous = false;
    if (sensor.bMeasuring) {
        sensor.bMeasuring = false;
        ++sensor.nMeasurement;
        setState(sensor, kStateIdle);
    }
}

void CSimulator::startMeasurement(SSensor& sensor, Clock::time_point now)
{
    sensor.bMeasuring = true;
    ++sensor.nMeasurement;
    setState(sensor, kStateWaitingForTrigger);
    setState(sensor, kStateMeasuring);
    // A continuous measurement takes at least 1 ms so that it cannot saturate the callback thread.
    int32_t duration = sensor.bContinuous ? std::max(m_nMeasureMs, 1) : m_nMeasureMs;
    STask task{ STask::eMeasurementDone, m_aOpen.at(sensor.nHandle), sensor.nHandle,
        std::string(), sensor.nMeasurement };
    schedule(now + std::chrono::milliseconds(duration), std::move(task));
}

void CSimulator::finishMeasurement(SSensor& sensor, Clock::time_point now)
{
    SResult result;
    if (sensor.bTrace) {
        result.nType = PMXSIM_TYPE_FLOAT_ARRAY;
        // A pulse: high in the middle half of the trace.
        for (int32_t i = 0; i < sensor.nTracePoints; ++i) {
            bool high = i >= sensor.nTracePoints / 4 && i < sensor.nTracePoints * 3 / 4;
            result.floats.push_back((high ? kPowerDbm : kFloorDbm) + noise());
        }
    } else {
        result.nType = PMXSIM_TYPE_FLOAT;
        result.floats.push_back(kPowerDbm + noise());
    }
    addResult(sensor, std::move(result));
    if (sensor.bContinuous) {
        startMeasurement(sensor, now);
    } else {
        sensor.bMeasuring = false;
        setState(sensor, kStateIdle);
    }
}

void CSimulator::runTask(STask& task, Clock::time_point now)
{
    SSensor& sensor = *task.pSensor;
    if (!sensor.bAttached || sensor.nHandle != task.nHandle)
        return;
    if (task.eKind == STask::eCommand) {
        runCommand(sensor, task.strText, now);
    } else if (sensor.bMeasuring && task.nMeasurement == sensor.nMeasurement) {
        finishMeasurement(sensor, now);
    }
}

// A command is answered when it is due: an error first (if any), then the acceptance (unless
// switched off), then its effects.
void CSimulator::runCommand(SSensor& sensor, const std::string& text, Clock::time_point now)
{
    SCommand command = parseCommand(text);
    // Asking for a measurement while one runs, or for the end of a continuous measurement that
    // is not running, is harmless and answered with the benign notice.
    bool ignored = (command.eAction == eMeasure && sensor.bMeasuring)
        || (command.eAction == eContinuousOff && !sensor.bContinuous);
    if (command.eAction == eUnknown)
        post(eErrorOccurred, sensor.nHandle, PMX_ERR_UNKNOWN_COMMAND);
    if (ignored)
        post(eErrorOccurred, sensor.nHandle, PMX_INFO_COMMAND_IGNORED);
    ++sensor.nCommandCount;
    if (m_bAutoAck)
        post(eCommandAccepted, sensor.nHandle, sensor.nCommandCount);
    if (!ignored)
        applyCommand(sensor, command, now);
}

void CSimulator::applyCommand(SSensor& sensor, const SCommand& command, Clock::time_point now)
{
    switch (command.eAction) {
    case eIdn:
        addText(sensor, "Marlowe&Tenby," + sensor.strType + "," + sensor.strSerial + "," + kFirmware);
        break;
    case eReset:
        abortMeasurement(sensor);
        sensor.bTrace = false;
        sensor.nTracePoints = kDefaultTracePoints;
        sensor.results.clear();
        break;
    case eMeasure:
        startMeasurement(sensor, now);
        break;
    case eContinuousOn:
        sensor.bContinuous = true;
        if (!sensor.bMeasuring)
            startMeasurement(sensor, now);
        break;
    case eContinuousOff:
        sensor.bContinuous = false; // the running measurement still ends with its result
        break;
    case eAbort:
        abortMeasurement(sensor);
        break;
    case ePower:
    case eTrace:
        sensor.bTrace = command.eAction == eTrace;
        break;
    case eFunctionQuery:
        addText(sensor, sensor.bTrace ? "TRACE" : "POWER");
        break;
    case eTracePoints:
        sensor.nTracePoints = command.nValue;
        break;
    case eNone:
    case eUnknown:
        break;
    }
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
    if (sensor.results.size() >= kMaxPending)
        sensor.results.pop_front();
    sensor.results.push_back(std::move(result));
    post(eDataAvailable, sensor.nHandle, type);
}

} // namespace PmxSim
