// Baselines of this machine: what hand-offs between threads cost, measured in the same run as
// the operations, so that the ratios cancel out the machine's speed and its current load.
#include "bench/AllocationCounter.h"
#include "core/Semaphore.h"
#include "core/Thread.h"

#include <benchmark/benchmark.h>

#include <atomic>
#include <condition_variable>
#include <mutex>
#include <thread>

namespace {

using LbCore::CSemaphore;

// Two threads: the caller releases one semaphore, the partner takes it and releases the other,
// which the caller takes: one round trip.
class CPingPong {
public:
    CPingPong() : m_cThread([this] { loop(); }) { }
    ~CPingPong()
    {
        m_bStop = true;
        m_cPing.release(1);
        m_cThread.join();
    }
    void roundTrip()
    {
        m_cPing.release(1);
        m_cPong.wait();
    }

private:
    void loop()
    {
        for (;;) {
            m_cPing.wait();
            if (m_bStop) {
                return;
            }
            m_cPong.release(1);
        }
    }

    CSemaphore m_cPing{0};
    CSemaphore m_cPong{0};
    std::atomic<bool> m_bStop{false};
    std::thread m_cThread; // last: starts once the semaphores exist
};

// Three threads in the shape of an acknowledged write: the caller wakes the library's callback
// thread through a condition variable (a command is queued), that thread hands over to the
// event worker through a semaphore (the event queue), and the worker wakes the caller through
// a semaphore (the message queue).
class CRing {
public:
    CRing() : m_cCallbackThread([this] { callbackLoop(); }), m_cWorker([this] { workerLoop(); }) { }
    ~CRing()
    {
        {
            std::lock_guard<std::mutex> lock(m_cMutex);
            m_bStop = true;
        }
        m_cCondition.notify_one();
        m_cCallbackThread.join();
        m_cEvent.release(1);
        m_cWorker.join();
    }
    void roundTrip()
    {
        {
            std::lock_guard<std::mutex> lock(m_cMutex);
            m_bCommand = true;
        }
        m_cCondition.notify_one();
        m_cAck.wait();
    }

private:
    void callbackLoop()
    {
        for (;;) {
            std::unique_lock<std::mutex> lock(m_cMutex);
            m_cCondition.wait(lock, [this] { return m_bCommand || m_bStop; });
            if (m_bStop) {
                return;
            }
            m_bCommand = false;
            lock.unlock();
            m_cEvent.release(1);
        }
    }
    void workerLoop()
    {
        for (;;) {
            m_cEvent.wait();
            if (isStopping()) {
                return;
            }
            m_cAck.release(1);
        }
    }
    bool isStopping()
    {
        std::lock_guard<std::mutex> lock(m_cMutex);
        return m_bStop;
    }

    std::mutex m_cMutex;
    std::condition_variable m_cCondition;
    bool m_bCommand = false;
    bool m_bStop = false;
    CSemaphore m_cEvent{0};
    CSemaphore m_cAck{0};
    std::thread m_cCallbackThread; // last: start once everything above exists
    std::thread m_cWorker;
};

void BM_SemaphorePingPong(benchmark::State& state)
{
    CPingPong pair;
    LbBench::COperationCounters counters;
    for (auto _ : state) {
        pair.roundTrip();
    }
    counters.report(state);
}
BENCHMARK(BM_SemaphorePingPong)->UseRealTime();

void BM_Ring(benchmark::State& state)
{
    CRing ring;
    LbBench::COperationCounters counters;
    for (auto _ : state) {
        ring.roundTrip();
    }
    counters.report(state);
}
BENCHMARK(BM_Ring)->UseRealTime();

// Independent ping-pong pairs side by side: how round trips scale on this machine, the bound
// for several threads on several sensors.
void BM_SemaphorePairs(benchmark::State& state)
{
    CPingPong pair;
    for (auto _ : state) {
        pair.roundTrip();
    }
    state.SetItemsProcessed(state.iterations());
}
BENCHMARK(BM_SemaphorePairs)->Threads(1)->Threads(4)->UseRealTime();

// Starting a worker thread and waiting for its end: part of every session opening.
void BM_ThreadStartJoin(benchmark::State& state)
{
    class CNothing : public LbCore::CIRunnable {
        bool init() override { return true; }
        bool run() override { return false; }
        void cleanup() override { }
    };
    CNothing nothing;
    for (auto _ : state) {
        LbCore::CThread thread(nothing);
        if (thread.start() != 0 || thread.join(LbCore::CSemaphore::INFINITE_WAIT) != 0) {
            state.SkipWithError("thread start failed");
            break;
        }
    }
}
BENCHMARK(BM_ThreadStartJoin)->UseRealTime();

} // namespace
