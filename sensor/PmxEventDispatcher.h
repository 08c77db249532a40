#ifndef LBPMXVISA_PMXEVENTDISPATCHER_H
#define LBPMXVISA_PMXEVENTDISPATCHER_H
// CPmxEventDispatcher: moves a session's sensor events off the library's callback thread.
// Each notification only queues a copy of the event (never blocking, never dropping); one
// worker thread per session delivers the queued events in arrival order to the subscribers,
// in subscription order, under the subscriber list's lock (so a removal waits for a running
// delivery). shutdown() (also run by the destructor) stops and joins the worker; events still
// queued then reach no subscriber.
#include "core/Command.h"
#include "core/MemoryPool.h"
#include "core/Parent.h"
#include "core/Queue.h"
#include "core/Semaphore.h"
#include "core/Subject.h"
#include "core/Thread.h"
#include "sensor/PmxCommands.h"

#include <atomic>

namespace LbPmxVisa {

class CPmxSession;

class CPmxEventDispatcher : public LbCore::CParent<CPmxSession>, public CIPmxEventListener, public LbCore::CIRunnable {
public:
    class CPmxEventMessage : public LbCore::CParent<CPmxEventDispatcher>,
                             public LbCore::CICommand<void(const LbCore::CThread&), 0>,
                             public LbCore::CMemoryPool::CMemoryPoolManaged {
    public:
        CPmxEventMessage(CPmxEventDispatcher* dispatcher, const CPmxEvent& event, PmxNotification operation);
        ~CPmxEventMessage() override;
        void execute(const LbCore::CThread& thread) override;
        void deliver();

    private:
        CPmxEvent m_cEvent;
        PmxNotification m_pfOperation;
    };

    // Throws std::runtime_error("Could not start thread construction aborts!") when the worker
    // cannot be started.
    explicit CPmxEventDispatcher(CPmxSession* session);
    ~CPmxEventDispatcher() override;

    bool addListener(CIPmxEventListener* listener);
    bool removeListener(CIPmxEventListener* listener);
    // Stops and joins the worker once; the owner calls it before the subscribers' data go.
    void shutdown();

    void notifyCommandAcceptedEvent(const CPmxEvent& event) override;
    void notifyDataAvailableEvent(const CPmxEvent& event) override;
    void notifyErrorOccuredEvent(const CPmxEvent& event) override;
    void notifyStateChangedEvent(const CPmxEvent& event) override;
    void notifyDeviceChangedEvent(const CPmxEvent& event) override;

    bool init() override;
    bool run() override;
    void cleanup() override;

private:
    void queue(const CPmxEvent& event, PmxNotification operation);

    LbCore::CThread m_cWorker;
    LbCore::CSubject<CIPmxEventListener, void(const CPmxEvent&)> m_cListeners;
    LbCore::CQueue<CPmxEventMessage> m_cQueue;
    std::atomic<bool> m_bShutDown;
    // Released once cleanup() has logged, so that the worker's shutdown lines come after it.
    LbCore::CSemaphore m_cCleanedUp;
};

} // namespace LbPmxVisa

#endif
