#include "sensor/PmxEventDispatcher.h"

#include "core/Log.h"
#include "core/Semaphore.h"
#include "sensor/PmxSession.h"

#include <exception>
#include <new>
#include <stdexcept>

namespace LbPmxVisa {

static LbCore::CLogger s_cLogger = LbCore::CLogManager::getLogger("CPmxEventDispatcher");

namespace {
const unsigned CLEANUP_WAIT_MS = 10000;
}

// ---- CPmxEventMessage

CPmxEventDispatcher::CPmxEventMessage::CPmxEventMessage(CPmxEventDispatcher* dispatcher, const CPmxEvent& event,
                                                        PmxNotification operation)
    : LbCore::CParent<CPmxEventDispatcher>(dispatcher), m_cEvent(event), m_pfOperation(operation)
{
    // Attached so that the worker, when it ends, tells every message it never delivered.
    getParent()->m_cWorker.attach(*this);
}

CPmxEventDispatcher::CPmxEventMessage::~CPmxEventMessage()
{
    if (m_pcParent != nullptr) {
        m_pcParent->m_cWorker.detach(*this);
    }
}

void CPmxEventDispatcher::CPmxEventMessage::execute(const LbCore::CThread&)
{
    // The worker ends only after a stop, whose cleanup() runs on the stopping thread: wait until
    // it has logged, so the lines keep their order. Bounded, so that an end without a stop
    // cannot hang the worker; the count is handed on to the next message.
    CPmxEventDispatcher* dispatcher = getParent();
    if (dispatcher->m_cCleanedUp.wait(CLEANUP_WAIT_MS)) {
        dispatcher->m_cCleanedUp.release(1);
    }
    s_cLogger.debug("LbPmxVisa::CPmxEventDispatcher::CPmxEventMessage::execute") << "Shutdown CPmxEventDispatcher ";
    getParent()->m_cListeners.disable();
}

void CPmxEventDispatcher::CPmxEventMessage::deliver()
{
    s_cLogger.debug("LbPmxVisa::CPmxEventDispatcher::CPmxEventMessage::deliver")
        << "Delivering message for CPmxEventDispatcher ";
    getParent()->m_cListeners.notify(m_cEvent, m_pfOperation);
}

// ---- CPmxEventDispatcher

CPmxEventDispatcher::CPmxEventDispatcher(CPmxSession* session)
    : LbCore::CParent<CPmxSession>(session), m_cWorker(*this), m_cListeners(), m_cQueue(2), m_bShutDown(false),
      m_cCleanedUp(0)
{
    if (m_cWorker.start() != LbCore::CThread::RESULT_DONE) {
        {
            LbCore::CLogMessage message = s_cLogger.error("LbPmxVisa::CPmxEventDispatcher::CPmxEventDispatcher");
            message << "Could not start thread! Undefined behavior! Session ";
            if (session != nullptr) {
                message << session;
            }
        }
        throw std::runtime_error("Could not start thread construction aborts!");
    }
}

CPmxEventDispatcher::~CPmxEventDispatcher()
{
    shutdown();
}

void CPmxEventDispatcher::shutdown()
{
    if (m_bShutDown.exchange(true)) {
        return;
    }
    s_cLogger.debug("LbPmxVisa::CPmxEventDispatcher::~CPmxEventDispatcher") << "stopAndJoin(...)";
    m_cWorker.stopAndJoin(LbCore::CSemaphore::INFINITE_WAIT);
    s_cLogger.debug("LbPmxVisa::CPmxEventDispatcher::~CPmxEventDispatcher")
        << "Thread has been stopped. Destruction continues...";
}

bool CPmxEventDispatcher::addListener(CIPmxEventListener* listener)
{
    return listener != nullptr && m_cListeners.attach(*listener);
}

bool CPmxEventDispatcher::removeListener(CIPmxEventListener* listener)
{
    return listener != nullptr && m_cListeners.detach(*listener);
}

void CPmxEventDispatcher::notifyCommandAcceptedEvent(const CPmxEvent& event)
{
    queue(event, &CIPmxEventListener::notifyCommandAcceptedEvent);
}

void CPmxEventDispatcher::notifyDataAvailableEvent(const CPmxEvent& event)
{
    queue(event, &CIPmxEventListener::notifyDataAvailableEvent);
}

void CPmxEventDispatcher::notifyErrorOccuredEvent(const CPmxEvent& event)
{
    queue(event, &CIPmxEventListener::notifyErrorOccuredEvent);
}

void CPmxEventDispatcher::notifyStateChangedEvent(const CPmxEvent& event)
{
    queue(event, &CIPmxEventListener::notifyStateChangedEvent);
}

void CPmxEventDispatcher::notifyDeviceChangedEvent(const CPmxEvent& event)
{
    queue(event, &CIPmxEventListener::notifyDeviceChangedEvent);
}

// Runs on the library's callback thread: it must neither block nor throw, so a message that
// cannot be made is logged and the event is lost rather than taking the library down.
void CPmxEventDispatcher::queue(const CPmxEvent& event, PmxNotification operation)
{
    CPmxEventMessage* message = nullptr;
    try {
        message = new CPmxEventMessage(this, event, operation);
    } catch (const std::exception& e) {
        s_cLogger.error("LbPmxVisa::CPmxEventDispatcher::queue")
            << "Could not create a message, event dropped: " << e.what();
        return;
    }
    m_cQueue.push(message, 0);
}

bool CPmxEventDispatcher::init()
{
    return true;
}

bool CPmxEventDispatcher::run()
{
    CPmxEventMessage* message = nullptr;
    if (m_cQueue.pop(message, LbCore::CSemaphore::INFINITE_WAIT) != LbCore::CQueue<CPmxEventMessage>::RESULT_ITEM) {
        return false;
    }
    // A subscriber's failure must not end the session's event thread: it is logged and the
    // next message is delivered as usual.
    try {
        message->deliver();
    } catch (const std::exception& e) {
        s_cLogger.error("LbPmxVisa::CPmxEventDispatcher::run") << "Exception during delivery: " << e.what();
    } catch (...) {
        s_cLogger.error("LbPmxVisa::CPmxEventDispatcher::run") << "Unknown exception during delivery";
    }
    delete message;
    return true;
}

void CPmxEventDispatcher::cleanup()
{
    m_cQueue.interrupt();
    m_cListeners.disable();
    s_cLogger.debug("LbPmxVisa::CPmxEventDispatcher::cleanup") << "Queue interrupt(...) ";
    m_cCleanedUp.release(1);
}

} // namespace LbPmxVisa
