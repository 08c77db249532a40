// CPmxSession's reactions to the sensor library's notifications, on the session's own
// event-dispatcher thread: acknowledgements and errors go to a waiting writer, results move
// the state machine, device changes are checked against the library's device list.
#include "sensor/PmxSession.h"

#include "sensor/PmxSessionDispatcher.h"
#include "sensor/PmxSessionState.h"

#include <new>
#include <stdexcept>

namespace LbPmxVisa {

static LbCore::CLogger s_cLogger = LbCore::CLogManager::getLogger("CPmxSession");

// A notification runs on the event thread and must not fail there: without memory for the
// message the waiting writer simply sees no answer and ends at its time-out.
void CPmxSession::queueMessage(CPmxSessionMessage* message)
{
    if (message == nullptr) {
        s_cLogger.error("LbPmxVisa::CPmxSession::notify") << "Could not create a message for session " << this;
        return;
    }
    m_cMessageQueue.push(message, 0);
}

bool CPmxSession::isSensorAttached()
{
    CPmxSessionDispatcher* dispatcher = getParent();
    std::int32_t count = 0;
    dispatcher->callChecked(&CIPmxCommands::getDeviceListLength, &count);
    bool complete = true;
    for (std::int32_t index = 0; index < count; ++index) {
        std::string name;
        std::string type;
        std::string serial;
        std::int32_t flag = 0;
        if (dispatcher->getCommands()->getDeviceInfo(index, name, type, serial, &flag) != 0) {
            complete = false; // that sensor may be this one
            continue;
        }
        try {
            if (CPmxResourceInfo(type, serial) == m_cResourceInfo) {
                return true;
            }
        } catch (const std::exception&) {
            // a type outside the model table is no sensor of ours
        }
    }
    if (!complete) {
        throw std::runtime_error("The device list could not be read whole");
    }
    return false;
}

// One failure may be a passing fault of the library; a handle that fails twice in a row is dead.
bool CPmxSession::isHandleAlive()
{
    CIPmxCommands* commands = getParent()->getCommands();
    std::int32_t trigger = 0;
    return commands->getTriggerState(*this, &trigger) == 0 || commands->getTriggerState(*this, &trigger) == 0;
}

void CPmxSession::markSensorRemoved()
{
    class CPmxSensorRemovedMessage : public CPmxSessionMessage {
    public:
        void deliver() override { throw CPmxSensorRemovedException(); }
    };
    clearMessages();
    // Set before the removal message is queued: a writer that misses the message sees the flag.
    m_bSensorRemoved = true;
    queueMessage(new (std::nothrow) CPmxSensorRemovedMessage());
}

void CPmxSession::notifyCommandAcceptedEvent(const CPmxEvent&)
{
    class CPmxCommandAcceptedEventMessage : public CPmxSessionMessage {
    public:
        void deliver() override { }
    };
    queueMessage(new (std::nothrow) CPmxCommandAcceptedEventMessage());
}

void CPmxSession::notifyDataAvailableEvent(const CPmxEvent&)
{
    changeState(CIPmxSessionState::dataAvailable());
}

void CPmxSession::notifyErrorOccuredEvent(const CPmxEvent& event)
{
    class CPmxCommandErrorEventMessage : public CPmxSessionMessage {
    public:
        explicit CPmxCommandErrorEventMessage(const CPmxEvent& event) : m_cEvent(event) { }
        void deliver() override { throw CPmxSessionDispatcher::CPmxCommandException(m_cEvent.value); }

    private:
        CPmxEvent m_cEvent;
    };
    queueMessage(new (std::nothrow) CPmxCommandErrorEventMessage(event));
}

void CPmxSession::notifyStateChangedEvent(const CPmxEvent&) { }

// The notification names no sensor. A session keeps its state while its own sensor is still
// listed and its handle still answers; when the sensor has gone (or was plugged back, both
// changes arriving after it is listed again), the session is dead: a waiting writer is woken
// with the removal. A list that cannot be read leaves the question open, and the session clears
// itself without being marked dead.
void CPmxSession::notifyDeviceChangedEvent(const CPmxEvent&)
{
    bool removed = false;
    try {
        if (isSensorAttached() && isHandleAlive()) {
            s_cLogger.debug("LbPmxVisa::CPmxSession::notifyDeviceChangedEvent")
                << "Sensor still attached, nothing changes for session " << this;
            return;
        }
        removed = true;
    } catch (const std::exception& e) {
        s_cLogger.warn("LbPmxVisa::CPmxSession::notifyDeviceChangedEvent")
            << "Could not read the device list: " << e.what();
    }
    if (removed) {
        markSensorRemoved();
    } else {
        clearMessages();
    }
    s_cLogger.warn("LbPmxVisa::CPmxSession::notifyDeviceChangedEvent")
        << "Device has been changed for session " << this;
    changeState(CIPmxSessionState::noData());
}

} // namespace LbPmxVisa
