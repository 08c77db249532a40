// The passport's operations through the VISA C API, against simulated sensors that answer at
// once. Each benchmark reports the heap allocations per operation ("allocs"), counted on all
// threads of the process.
#include "bench/AllocationCounter.h"
#include "bench/BenchSupport.h"

#include <benchmark/benchmark.h>

#include <chrono>
#include <condition_variable>
#include <cstring>
#include <mutex>
#include <vector>

namespace {

using namespace LbBench;

class CSession {
public:
    explicit CSession(int sensor)
    {
        m_nStatus = viOpen(resourceManager(), sensorName(sensor).c_str(), VI_NULL, 0, &m_nVi);
    }
    ~CSession()
    {
        if (m_nStatus == VI_SUCCESS) {
            viClose(m_nVi);
        }
    }
    bool isOpen() const { return m_nStatus == VI_SUCCESS; }
    operator ViSession() const { return m_nVi; }

private:
    ViSession m_nVi = VI_NULL;
    ViStatus m_nStatus;
};

bool write(ViSession vi, const char* text)
{
    ViUInt32 count = 0;
    return viWrite(vi, reinterpret_cast<ViConstBuf>(text), static_cast<ViUInt32>(std::strlen(text)), &count) ==
        VI_SUCCESS;
}

bool read(ViSession vi, std::vector<ViByte>& buffer, ViUInt32 minimum = 1)
{
    ViUInt32 count = 0;
    return viRead(vi, buffer.data(), static_cast<ViUInt32>(buffer.size()), &count) == VI_SUCCESS && count >= minimum;
}

// A failed condition ends the run with its text; true when it held.
bool require(benchmark::State& state, bool held, const char* failure)
{
    if (!held) {
        state.SkipWithError(failure);
    }
    return held;
}
#define LB_REQUIRE(state, condition) require(state, (condition), "failed: " #condition)

// One measurement: trigger, fetch and read an answer of at least `minimum` bytes.
bool triggerFetchRead(benchmark::State& state, ViSession vi, std::vector<ViByte>& buffer, ViUInt32 minimum = 1)
{
    return LB_REQUIRE(state, viAssertTrigger(vi, VI_TRIG_PROT_DEFAULT) == VI_SUCCESS) &&
        LB_REQUIRE(state, write(vi, "FETCh?")) && LB_REQUIRE(state, read(vi, buffer, minimum));
}

// Times `step` (true when it succeeded) once per iteration on a session of `sensor`, counting
// the allocations; a failed step ends the run.
template <class TStep> void timeSteps(benchmark::State& state, int sensor, TStep step)
{
    CSession session(sensor);
    if (!session.isOpen()) {
        state.SkipWithError("viOpen failed");
        return;
    }
    COperationCounters counters;
    for (auto _ : state) {
        if (!step(session))
            break;
    }
    counters.report(state);
}

void BM_AcknowledgedWrite(benchmark::State& state)
{
    timeSteps(state, 0, [&](ViSession vi) { return LB_REQUIRE(state, write(vi, "FUNC POWER")); });
}
BENCHMARK(BM_AcknowledgedWrite)->UseRealTime();

void BM_IdnQuery(benchmark::State& state)
{
    std::vector<ViByte> buffer(256);
    timeSteps(state, 0, [&](ViSession vi) {
        return LB_REQUIRE(state, write(vi, "*IDN?")) && LB_REQUIRE(state, read(vi, buffer));
    });
}
BENCHMARK(BM_IdnQuery)->UseRealTime();

void BM_TriggerFetchRead(benchmark::State& state)
{
    std::vector<ViByte> buffer(256);
    timeSteps(state, 0, [&](ViSession vi) { return triggerFetchRead(state, vi, buffer); });
}
BENCHMARK(BM_TriggerFetchRead)->UseRealTime();

// A trace of 1024 points read as one binary block of 32-bit floats.
void BM_Trace1024(benchmark::State& state)
{
    CSession session(1);
    std::vector<ViByte> buffer(8192);
    if (!session.isOpen() || !write(session, "FUNC TRACE") || !write(session, "TRAC:POIN 1024") ||
        !write(session, "FORMat REAL,32")) {
        state.SkipWithError("setting up the trace failed");
        return;
    }
    COperationCounters counters;
    for (auto _ : state) {
        if (!triggerFetchRead(state, session, buffer, 4 * 1024))
            break;
    }
    counters.report(state);
    write(session, "*RST");
}
BENCHMARK(BM_Trace1024)->UseRealTime();

void BM_ReadSTB(benchmark::State& state)
{
    timeSteps(state, 0, [&](ViSession vi) {
        ViUInt16 status = 0;
        return LB_REQUIRE(state, viReadSTB(vi, &status) == VI_SUCCESS);
    });
}
BENCHMARK(BM_ReadSTB)->UseRealTime();

// Opening a session of a sensor while the driver is open (another session keeps it open): the
// sensor session with its event worker is built each time. Only viOpen is timed; the
// allocations are those of open and close together.
void BM_OpenSession(benchmark::State& state)
{
    COperationCounters counters;
    for (auto _ : state) {
        ViSession vi = VI_NULL;
        if (!LB_REQUIRE(state, viOpen(resourceManager(), sensorName(0).c_str(), VI_NULL, 0, &vi) == VI_SUCCESS))
            break;
        state.PauseTiming();
        ViStatus closed = viClose(vi);
        state.ResumeTiming();
        if (!LB_REQUIRE(state, closed == VI_SUCCESS))
            break;
    }
    counters.report(state);
}
BENCHMARK(BM_OpenSession)->UseRealTime();

// Acknowledged writes, each thread on a sensor of its own: items_per_second is the total.
void BM_WritesOnSensors(benchmark::State& state)
{
    CSession session(state.thread_index() % SENSOR_COUNT);
    if (!session.isOpen()) {
        state.SkipWithError("viOpen failed");
        return;
    }
    for (auto _ : state) {
        if (!LB_REQUIRE(state, write(session, "FUNC POWER")))
            break;
    }
    state.SetItemsProcessed(state.iterations());
}
BENCHMARK(BM_WritesOnSensors)->Threads(1)->Threads(SENSOR_COUNT)->UseRealTime();

// The application's service-request handler counts the requests; a measurement raises three
// (trigger state 2, 3 and back to 0).
class CSrqCounter {
public:
    static ViStatus _VI_FUNCH handler(ViSession, ViEventType, ViEvent, ViAddr self)
    {
        CSrqCounter& counter = *static_cast<CSrqCounter*>(self);
        std::lock_guard<std::mutex> lock(counter.m_cMutex);
        ++counter.m_nCount;
        counter.m_cCondition.notify_one();
        return VI_SUCCESS;
    }
    bool waitFor(unsigned long count)
    {
        std::unique_lock<std::mutex> lock(m_cMutex);
        return m_cCondition.wait_for(lock, std::chrono::seconds(5), [&] { return m_nCount >= count; });
    }

private:
    std::mutex m_cMutex;
    std::condition_variable m_cCondition;
    unsigned long m_nCount = 0;
};

// Trigger, fetch and read with a service-request handler installed, until the handler has
// seen the measurement's requests.
void BM_SrqCycle(benchmark::State& state)
{
    CSession session(2);
    CSrqCounter counter;
    std::vector<ViByte> buffer(256);
    if (!session.isOpen() ||
        viInstallHandler(session, VI_EVENT_SERVICE_REQ, &CSrqCounter::handler, &counter) != VI_SUCCESS ||
        viEnableEvent(session, VI_EVENT_SERVICE_REQ, VI_HNDLR, VI_NULL) != VI_SUCCESS) {
        state.SkipWithError("installing the handler failed");
        return;
    }
    const unsigned long REQUESTS_PER_CYCLE = 3;
    unsigned long expected = 0;
    COperationCounters counters;
    for (auto _ : state) {
        expected += REQUESTS_PER_CYCLE;
        if (!triggerFetchRead(state, session, buffer) || !LB_REQUIRE(state, counter.waitFor(expected)))
            break;
    }
    counters.report(state);
    viDisableEvent(session, VI_EVENT_SERVICE_REQ, VI_HNDLR);
    viUninstallHandler(session, VI_EVENT_SERVICE_REQ, &CSrqCounter::handler, &counter);
}
BENCHMARK(BM_SrqCycle)->UseRealTime();

} // namespace
