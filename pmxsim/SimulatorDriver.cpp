// The driver and its worker thread: the single instance, opening and closing the driver, the
// worker loop that delivers callbacks and runs due tasks, the callback registrations, and CCall,
// the shared start of every library function (lock, injected failure, driver and handle checks).
#include "pmxsim/Simulator.h"

#include "pmxsim/SimSupport.h"

#include <algorithm>
#include <atomic>
#include <new>

namespace PmxSim {

namespace {
// Set on the callback thread while it runs a callback: a registration made from inside a
// callback must not wait for that callback to return.
thread_local bool t_bInCallback = false;
// The instance once made: unloading a library that was never called has nothing to stop.
std::atomic<CSimulator*> g_pInstance(nullptr);
} // namespace

CSimulator& CSimulator::instance(bool* made)
{
    // Deliberately never destroyed (see the header). Only the first caller runs the lambda.
    static CSimulator* simulator = [made] {
        CSimulator* built = new CSimulator();
        g_pInstance.store(built);
        if (made != nullptr)
            *made = true;
        return built;
    }();
    return *simulator;
}

CSimulator::CSimulator()
{
    CLock lock(*this);
    m_nNextHandle = FIRST_HANDLE;
    m_aRandom.seed(12345);
    loadDefaultsLocked();
}

void CSimulator::shutdownAtUnload()
{
    if (g_pInstance.load() == nullptr)
        return;
    CSimulator& sim = instance();
    SWorker* worker;
    {
        CLock lock(sim);
        worker = sim.stopDriverLocked();
    }
    sim.finishStop(worker);
}

CSimulator::CCall::CCall(CSimulator& sim, EFunction fn, ENeed need, int64_t handle) : m_rSim(sim)
{
    sim.m_aMutex.lock();
    if (sim.takeInjected(fn, &m_nCode))
        return;
    if (need == NEED_SENSOR)
        m_nCode = sim.findOpen(handle, &m_pSensor);
    else if (need == NEED_DRIVER && !sim.m_bDriverOpen)
        m_nCode = PMXSIM_E_DRIVER_NOT_OPEN;
}

CSimulator::CCall::~CCall()
{
    m_rSim.unlockAndWake();
}

CSimulator::CLock::CLock(CSimulator& sim) : m_rSim(sim)
{
    sim.m_aMutex.lock();
}

CSimulator::CLock::~CLock()
{
    m_rSim.unlockAndWake();
}

void CSimulator::unlockAndWake()
{
    bool wake = m_bWakeWorker;
    m_bWakeWorker = false;
    m_aMutex.unlock();
    if (wake)
        m_aWorkChanged.notify_all();
}

// Counts the call; a failure injected with PmxSimFailNext comes first, then a failure the
// scenario scripted for this call.
bool CSimulator::takeInjected(EFunction fn, int32_t* code)
{
    uint64_t call = ++m_aCalls[fn];
    if (m_aInjected[fn] != 0) {
        *code = m_aInjected[fn];
        m_aInjected[fn] = 0;
        return true;
    }
    for (const SFault& fault : m_aFaults) {
        if (fault.nFunction == fn && static_cast<uint64_t>(fault.nCall) == call) {
            *code = fault.nCode;
            return true;
        }
    }
    return false;
}

// ---- driver ----

void CSimulator::workerMain(void* arg)
{
    std::pair<CSimulator*, uint64_t>* start = static_cast<std::pair<CSimulator*, uint64_t>*>(arg);
    CSimulator* sim = start->first;
    uint64_t generation = start->second;
    delete start;
    sim->run(generation);
}

int32_t CSimulator::openDriver()
{
    CCall call(*this, FN_OPEN_DRIVER, NEED_NOTHING);
    if (call.code() != PMX_SUCCESS)
        return call.code();
    // Opening an open driver succeeds and changes nothing; opens are not counted.
    if (m_bDriverOpen)
        return PMX_SUCCESS;
    // A worker stopped from inside its callback may still be finishing it; callbacks never overlap.
    waitForAllDeliveriesLocked();
    if (m_bDriverOpen)
        return PMX_SUCCESS;
    ++m_nGeneration;
    std::pair<CSimulator*, uint64_t>* start = new (std::nothrow) std::pair<CSimulator*, uint64_t>(this, m_nGeneration);
    if (start == nullptr)
        return PMXSIM_E_OUT_OF_RESOURCES;
    // Started under the lock: the worker's first step takes it, so it sees m_pWorker set.
    m_pWorker = startWorker(&CSimulator::workerMain, start);
    if (m_pWorker == nullptr) {
        delete start;
        return PMXSIM_E_OUT_OF_RESOURCES;
    }
    m_bDriverOpen = true;
    return PMX_SUCCESS;
}

int32_t CSimulator::closeDriver()
{
    SWorker* worker;
    {
        CCall call(*this, FN_CLOSE_DRIVER, NEED_DRIVER);
        if (call.code() != PMX_SUCCESS)
            return call.code();
        worker = stopDriverLocked();
    }
    finishStop(worker);
    return PMX_SUCCESS;
}

SWorker* CSimulator::stopDriverLocked()
{
    if (!m_bDriverOpen)
        return nullptr;
    m_bDriverOpen = false;
    ++m_nGeneration;
    for (auto& entry : m_aOpen) {
        entry.second->nHandle = 0;
        abortMeasurement(*entry.second);
        entry.second->results.clear();
    }
    m_aOpen.clear();
    m_aOutbox.clear();
    m_aTasks.clear();
    SWorker* worker = m_pWorker;
    m_pWorker = nullptr;
    m_bWakeWorker = true; // to see that its generation ended
    return worker;
}

// Closing from inside a callback: the worker ends on its own when the callback returns.
// Otherwise the worker is joined, and a worker stopped earlier from inside its callback is waited
// for, so that no callback runs once the driver is closed.
void CSimulator::finishStop(SWorker* worker)
{
    if (worker != nullptr && isWorkerThread(worker)) {
        detachWorker(worker);
        return;
    }
    if (worker != nullptr)
        joinWorker(worker);
    CLock lock(*this);
    waitForAllDeliveriesLocked();
}

void CSimulator::waitForAllDeliveriesLocked()
{
    if (t_bInCallback)
        return;
    while (std::any_of(std::begin(m_aDelivering), std::end(m_aDelivering), [](int running) { return running != 0; }))
        m_aDeliveryChanged.wait(m_aMutex);
}

// ---- worker ----

void CSimulator::run(uint64_t generation)
{
    m_aMutex.lock();
    while (m_nGeneration == generation) {
        if (!m_aOutbox.empty()) {
            SEvent event = m_aOutbox.front();
            m_aOutbox.pop_front();
            SCallback callback = m_aCallbacks[event.eKind];
            if (callback.pfnNotify == nullptr && callback.pfnDevice == nullptr)
                continue;
            ++m_aDelivering[event.eKind];
            m_aMutex.unlock();
            t_bInCallback = true;
            if (event.eKind == CALLBACK_DEVICE_CHANGED)
                callback.pfnDevice(callback.pvUser);
            else
                callback.pfnNotify(event.nHandle, event.nValue, callback.pvUser);
            t_bInCallback = false;
            m_aMutex.lock();
            --m_aDelivering[event.eKind];
            ++m_nDeliveries;
            m_aDeliveryChanged.notify_all();
            continue;
        }
        if (m_aTasks.empty()) {
            m_aWorkChanged.wait(m_aMutex);
            continue;
        }
        Clock::time_point now = Clock::now();
        auto first = m_aTasks.begin();
        // A copy: the task may be dropped while this thread waits.
        Clock::time_point due = first->first.first;
        if (due > now) {
            m_aWorkChanged.wait_until(m_aMutex, due);
            continue;
        }
        STask task = std::move(first->second);
        m_aTasks.erase(first);
        runTask(task, now);
        m_bWakeWorker = false; // what the task posted or scheduled, this loop sees next
    }
    m_aMutex.unlock();
}

void CSimulator::post(ECallback kind, int64_t handle, int32_t value)
{
    // Without an open driver there is no callback thread, and nobody to tell.
    if (!m_bDriverOpen)
        return;
    m_aOutbox.push_back(SEvent{kind, handle, value});
    m_bWakeWorker = true;
}

void CSimulator::schedule(Clock::time_point due, STask task)
{
    m_aTasks.emplace(std::make_pair(due, m_nTaskSequence++), std::move(task));
    m_bWakeWorker = true;
}

// ---- callback registrations ----

int32_t CSimulator::setNotifyCallback(EFunction fn, ECallback kind, PmxNotifyCallback callback, void* user)
{
    CCall call(*this, fn, NEED_NOTHING);
    if (call.code() != PMX_SUCCESS)
        return call.code();
    m_aCallbacks[kind].pfnNotify = callback;
    m_aCallbacks[kind].pvUser = callback != nullptr ? user : nullptr;
    waitForDeliveryLocked(kind);
    return PMX_SUCCESS;
}

int32_t CSimulator::setDeviceChangedCallback(PmxDeviceChangedCallback callback, void* user)
{
    CCall call(*this, FN_SET_DEVICE_CHANGED, NEED_NOTHING);
    if (call.code() != PMX_SUCCESS)
        return call.code();
    m_aCallbacks[CALLBACK_DEVICE_CHANGED].pfnDevice = callback;
    m_aCallbacks[CALLBACK_DEVICE_CHANGED].pvUser = callback != nullptr ? user : nullptr;
    waitForDeliveryLocked(CALLBACK_DEVICE_CHANGED);
    return PMX_SUCCESS;
}

// The replaced callback may be running right now: wait until it returned, unless called from
// inside a callback, which would wait for itself.
void CSimulator::waitForDeliveryLocked(ECallback kind)
{
    if (t_bInCallback)
        return;
    uint64_t deliveries = m_nDeliveries;
    while (m_aDelivering[kind] != 0 && m_nDeliveries == deliveries)
        m_aDeliveryChanged.wait(m_aMutex);
}

} // namespace PmxSim
