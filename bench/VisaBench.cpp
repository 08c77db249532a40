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
    return viWrite(vi, reinterpret_cast<ViConstBuf>(text), static_cast<ViUInt32>(std::strlen(text)), &count) == VI_SUCCESS;
}

bool read(ViSession vi, std::vector<ViByte>& buffer, ViUInt32 minimum = 1)
{
    ViUInt32 count = 0;
    return viRead(vi, buffer.data(), static_cast<ViUInt32>(buffer.size()), &count) == VI_SUCCESS && count >= minimum;
}

#define LB_REQUIRE(state, condition)                                                                                   \
    if (!(condition)) {                                                                                                \
        (state).SkipWithError("failed: " #condition);                                                                  \
        break;                                                                                                         \
    }

void BM_AcknowledgedWrite(benchmark::State& state)
{
    CSession session(0);
    if (!session.isOpen()) {
        state.SkipWithError("viOpen failed");
        return;
    }
    COperationCounters counters;
    for (auto _ : state) {
        LB_REQUIRE(state, write(session, "FUNC POWER"));
    }
    counters.report(state);
}
BENCHMARK(BM_AcknowledgedWrite)->UseRealTime();

void BM_IdnQuery(benchmark::State& state)
{
    CSession session(0);
    std::vector<ViByte> buffer(256);
    if (!session.isOpen()) {
        state.SkipWithError("viOpen failed");
        return;
    }
    COperationCounters counters;
    for (auto _ : state) {
        LB_REQUIRE(state, write(session, "*IDN?"));
        LB_REQUIRE(state, read(session, buffer));
    }
    counters.report(state);
}
BENCHMARK(BM_IdnQuery)->UseRealTime();

void BM_TriggerFetchRead(benchmark::State& state)
{
    CSession session(0);
    std::vector<ViByte> buffer(256);
    if (!session.isOpen()) {
        state.SkipWithError("viOpen failed");
        return;
    }
    COperationCounters counters;
    for (auto _ : state) {
        LB_REQUIRE(state, viAssertTrigger(session, VI_TRIG_PROT_DEFAULT) == VI_SUCCESS);
        LB_REQUIRE(state, write(session, "FETCh?"));
        LB_REQUIRE(state, read(session, buffer));
    }
    counters.report(state);
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
        LB_REQUIRE(state, viAssertTrigger(session, VI_TRIG_PROT_DEFAULT) == VI_SUCCESS);
        LB_REQUIRE(state, write(session, "FETCh?"));
        LB_REQUIRE(state, read(session, buffer, 4 * 1024));
    }
    counters.report(state);
    write(session, "*RST");
}
BENCHMARK(BM_Trace1024)->UseRealTime();

void BM_ReadSTB(benchmark::State& state)
{
    CSession session(0);
    if (!session.isOpen()) {
        state.SkipWithError("viOpen failed");
        return;
    }
    COperationCounters counters;
    for (auto _ : state) {
        ViUInt16 status = 0;
        LB_REQUIRE(state, viReadSTB(session, &status) == VI_SUCCESS);
    }
    counters.report(state);
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
        LB_REQUIRE(state, viOpen(resourceManager(), sensorName(0).c_str(), VI_NULL, 0, &vi) == VI_SUCCESS);
        state.PauseTiming();
        ViStatus closed = viClose(vi);
        state.ResumeTiming();
        LB_REQUIRE(state, closed == VI_SUCCESS);
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
        LB_REQUIRE(state, write(session, "FUNC POWER"));
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
    if (!session.isOpen() || viInstallHandler(session, VI_EVENT_SERVICE_REQ, &CSrqCounter::handler, &counter) != VI_SUCCESS ||
        viEnableEvent(session, VI_EVENT_SERVICE_REQ, VI_HNDLR, VI_NULL) != VI_SUCCESS) {
        state.SkipWithError("installing the handler failed");
        return;
    }
    const unsigned long kRequestsPerCycle = 3;
    unsigned long expected = 0;
    COperationCounters counters;
    for (auto _ : state) {
        LB_REQUIRE(state, viAssertTrigger(session, VI_TRIG_PROT_DEFAULT) == VI_SUCCESS);
        LB_REQUIRE(state, write(session, "FETCh?"));
        LB_REQUIRE(state, read(session, buffer));
        expected += kRequestsPerCycle;
        LB_REQUIRE(state, counter.waitFor(expected));
    }
    counters.report(state);
    viDisableEvent(session, VI_EVENT_SERVICE_REQ, VI_HNDLR);
    viUninstallHandler(session, VI_EVENT_SERVICE_REQ, &CSrqCounter::handler, &counter);
}
BENCHMARK(BM_SrqCycle)->UseRealTime();

} // namespace
