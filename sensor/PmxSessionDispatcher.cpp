#include "sensor/PmxSessionDispatcher.h"

#include "core/Log.h"
#include "sensor/PmxSession.h"

#include <stdexcept>

namespace LbPmxVisa {

static LbCore::CLogger s_cLogger = LbCore::CLogManager::getLogger("CPmxSessionDispatcher");

typedef LbCore::CLock<LbCore::CCriticalSection> CMapGuard;

// ---- CPmxCommandException

CPmxSessionDispatcher::CPmxCommandException::CPmxCommandException(std::int32_t code) : m_nErrorCode(code)
{
    // Built while a failure is being reported, so it must not fail itself: without an attached
    // interface the message stays empty.
    char text[1024] = {0};
    CIPmxCommands* commands = CPmxSessionDispatcher::getInstance().m_pcCommand;
    if (commands != nullptr) {
        commands->getErrorText(code, text, sizeof(text));
        text[sizeof(text) - 1] = 0;
    }
    m_sMessage = text;
}

// ---- CPmxSessionDispatcher

CPmxSessionDispatcher::CPmxSessionDispatcher()
    : m_pcCommand(nullptr), m_sManufacturerName("Marlowe&Tenby"), m_nManufacturerId(3891)
{
    s_cLogger.debug("LbPmxVisa::CPmxSessionDispatcher::CPmxSessionDispatcher") << "CPmxSessionDispatcher created";
}

CPmxSessionDispatcher::~CPmxSessionDispatcher()
{
    CIPmxCommands* commands = m_pcCommand;
    if (commands != nullptr) {
        detach(commands);
    }
}

CPmxSessionDispatcher& CPmxSessionDispatcher::getInstance()
{
    static CPmxSessionDispatcher s_cInstance;
    return s_cInstance;
}

void CPmxSessionDispatcher::attach(CIPmxCommands* commands)
{
    CPmxSessionDispatcher& self = getInstance();
    if (self.m_pcCommand == commands) {
        return;
    }
    self.m_pcCommand = commands;
    if (commands == nullptr) {
        s_cLogger.error("LbPmxVisa::CPmxSessionDispatcher::attach") << "m_pcCommand has not been set...";
        return;
    }
    commands->setEventListener(&self);
}

void CPmxSessionDispatcher::detach(CIPmxCommands* commands)
{
    CPmxSessionDispatcher& self = getInstance();
    if (self.m_pcCommand != commands) {
        return;
    }
    if (self.getActiveSessionCount() != 0) {
        s_cLogger.error("LbPmxVisa::CPmxSessionDispatcher::detach")
            << "Commands interface will be detached, when still some sessions are open. "
            << "This behavior is resulting in a undefined state";
    }
    self.m_pcCommand = nullptr;
}

void CPmxSessionDispatcher::forget(CIPmxCommands* commands)
{
    getInstance().m_pcCommand.compare_exchange_strong(commands, nullptr);
}

CIPmxCommands* CPmxSessionDispatcher::getCommands()
{
    CIPmxCommands* commands = m_pcCommand;
    if (commands == nullptr) {
        throw std::runtime_error("No configuration has been set. Use method attach(...) for set a configuration");
    }
    return commands;
}

boost::shared_ptr<CPmxSession> CPmxSessionDispatcher::getSession(const CPmxResourceInfo& resource)
{
    CIPmxCommands* commands = getCommands();
    if (!commands->isDriverOpen()) {
        s_cLogger.debug("LbPmxVisa::CPmxSessionDispatcher::getSession") << "Executing PmxOpenDriver(...)";
        callChecked(&CIPmxCommands::openDriver);
    }
    std::string key = g_pcVisaSerializer->serialize(resource);
    boost::shared_ptr<CPmxSession> session;
    {
        CMapGuard guard(m_cMapLock);
        std::unordered_map<std::string, boost::weak_ptr<CPmxSession>>::iterator found = m_cResourceMap.find(key);
        // An expired entry belongs to a session whose destructor is running and has not left
        // the map yet; a new session is made instead of failing with bad_weak_ptr, and the dying
        // one leaves only its own entry (see detach).
        if (found != m_cResourceMap.end()) {
            session = found->second.lock();
        }
    }
    // A sensor plugged back before its session heard of the unplug is listed as before, but the
    // session's handle is dead. Asked outside the map lock: the library's callback thread may be
    // waiting for it. (Callers serialise getSession, so the entry cannot change meanwhile.)
    if (session && !session->isSensorRemoved() && !session->isHandleAlive()) {
        session->markSensorRemoved();
    }
    boost::shared_ptr<CPmxSession> dead; // released outside the map lock
    {
        CMapGuard guard(m_cMapLock);
        std::unordered_map<std::string, boost::weak_ptr<CPmxSession>>::iterator found = m_cResourceMap.find(key);
        // A session whose sensor was removed stays with the VISA sessions that hold it, dead; a
        // re-attached sensor gets a new one. The dead one leaves both maps now (no event names
        // its handle any more); its destructor then finds nothing of its own to remove.
        if (session && session->isSensorRemoved()) {
            std::unordered_map<std::int64_t, CPmxSession*>::iterator byHandle =
                m_cSessionMap.find(session->getHandle());
            if (byHandle != m_cSessionMap.end() && byHandle->second == session.get()) {
                m_cSessionMap.erase(byHandle);
            }
            if (found != m_cResourceMap.end()) {
                m_cResourceMap.erase(found);
            }
            dead.swap(session);
        }
        if (session) {
            s_cLogger.info("LbPmxVisa::CPmxSessionDispatcher::getSession")
                << "Recycle session for " << g_pcVisaSerializer->serialize(session->getResourceInfo());
            return session;
        }
    }
    // No map lock while the library is called: its callback thread may be waiting for it.
    session.reset(new CPmxSession(this, resource));
    session->open();
    {
        CMapGuard guard(m_cMapLock);
        m_cResourceMap[g_pcVisaSerializer->serialize(session->getResourceInfo())] = session;
    }
    return session;
}

std::vector<CPmxResourceInfo> CPmxSessionDispatcher::getAvailableDevices()
{
    CIPmxCommands* commands = getCommands();
    if (!commands->isDriverOpen()) {
        s_cLogger.debug("LbPmxVisa::CPmxSessionDispatcher::getAvailableDevices") << "Executing PmxOpenDriver(...)";
        callChecked(&CIPmxCommands::openDriver);
    }
    std::int32_t count = 0;
    s_cLogger.debug("LbPmxVisa::CPmxSessionDispatcher::getAvailableDevices") << "Getting device list length...";
    callChecked(&CIPmxCommands::getDeviceListLength, &count);
    s_cLogger.debug("LbPmxVisa::CPmxSessionDispatcher::getAvailableDevices") << "Found " << count << " device(s)...";

    std::vector<CPmxResourceInfo> devices;
    for (std::int32_t index = 0; index < count; ++index) {
        std::string name;
        std::string type;
        std::string serial;
        std::int32_t flag = 0;
        // A sensor unplugged while the list is read has no information any more; the others
        // are still worth listing.
        try {
            callChecked(&CIPmxCommands::getDeviceInfo, index, name, type, serial, &flag);
        } catch (const CPmxCommandException& e) {
            s_cLogger.warn("LbPmxVisa::CPmxSessionDispatcher::getAvailableDevices")
                << "Skipping device " << index << ", its information could not be read: " << e.what();
            continue;
        }
        s_cLogger.debug("LbPmxVisa::CPmxSessionDispatcher::getAvailableDevices")
            << "Adding device " << type << ";" << serial;
        if (flag == 0) {
            continue;
        }
        try {
            devices.push_back(CPmxResourceInfo(type, serial));
        } catch (const std::exception& e) {
            s_cLogger.error("LbPmxVisa::CPmxSessionDispatcher::getAvailableDevices")
                << "Exception during adding to the resource info: " << e.what();
        } catch (...) {
            s_cLogger.error("LbPmxVisa::CPmxSessionDispatcher::getAvailableDevices")
                << "Unknown exception during adding to the resource info";
        }
    }
    if (getCommands()->isDriverOpen() && getActiveSessionCount() == 0) {
        callChecked(&CIPmxCommands::closeDriver);
    }
    return devices;
}

unsigned CPmxSessionDispatcher::getActiveSessionCount()
{
    CMapGuard guard(m_cMapLock);
    if (m_cSessionMap.size() != m_cResourceMap.size()) {
        s_cLogger.warn("LbPmxVisa::CPmxSessionDispatcher::getActiveSessionCount")
            << "Session-Map and the Resource-Map are inconsistent!";
    }
    return static_cast<unsigned>(m_cResourceMap.size());
}

void CPmxSessionDispatcher::registerSession(CPmxSession& session)
{
    CMapGuard guard(m_cMapLock);
    m_cSessionMap[session.getHandle()] = &session;
}

void CPmxSessionDispatcher::detach(CPmxSession& session)
{
    {
        CMapGuard guard(m_cMapLock);
        std::unordered_map<std::int64_t, CPmxSession*>::iterator byHandle = m_cSessionMap.find(session.getHandle());
        if (byHandle != m_cSessionMap.end() && byHandle->second == &session) {
            m_cSessionMap.erase(byHandle);
        }
        // Only the leaving session's own entry goes: its weak reference has expired, while a
        // live entry under the same key belongs to a newer session of that resource.
        std::unordered_map<std::string, boost::weak_ptr<CPmxSession>>::iterator byName =
            m_cResourceMap.find(g_pcVisaSerializer->serialize(session.getResourceInfo()));
        if (byName != m_cResourceMap.end() && byName->second.expired()) {
            m_cResourceMap.erase(byName);
        }
        if (m_cSessionMap.size() != m_cResourceMap.size()) {
            s_cLogger.warn("LbPmxVisa::CPmxSessionDispatcher::detach")
                << "Session-Map and the Resource-Map are inconsistent!";
        }
    }
    // Outside the map lock: closing the driver waits for the library's callback thread, which
    // may be waiting for that lock in findAndNotify.
    closeDriverIfIdle();
}

void CPmxSessionDispatcher::closeDriverIfIdle()
{
    CIPmxCommands* commands = getCommands();
    if (commands->isDriverOpen() && getActiveSessionCount() == 0) {
        callChecked(&CIPmxCommands::closeDriver);
    }
}

void CPmxSessionDispatcher::findAndNotify(const CPmxEvent& event, PmxNotification operation)
{
    // The lock is held while the event is queued, so an event never reaches a session that has
    // already left the maps (its destructor takes the lock in detach).
    CMapGuard guard(m_cMapLock);
    std::unordered_map<std::int64_t, CPmxSession*>::iterator found = m_cSessionMap.find(event.handle);
    if (found == m_cSessionMap.end()) {
        s_cLogger.error("LbPmxVisa::CPmxSessionDispatcher::findAndNotify")
            << "Could not find a event listener for session " << event.handle;
        return;
    }
    CPmxSession* session = found->second;
    s_cLogger.debug("LbPmxVisa::CPmxSessionDispatcher::findAndNotify")
        << "Firing event " << event.value << " for session " << session;
    CIPmxEventListener& listener = session->getEventDispatcher();
    (listener.*operation)(event);
}

void CPmxSessionDispatcher::notifyCommandAcceptedEvent(const CPmxEvent& event)
{
    findAndNotify(event, &CIPmxEventListener::notifyCommandAcceptedEvent);
}

void CPmxSessionDispatcher::notifyDataAvailableEvent(const CPmxEvent& event)
{
    findAndNotify(event, &CIPmxEventListener::notifyDataAvailableEvent);
}

void CPmxSessionDispatcher::notifyErrorOccuredEvent(const CPmxEvent& event)
{
    findAndNotify(event, &CIPmxEventListener::notifyErrorOccuredEvent);
}

void CPmxSessionDispatcher::notifyStateChangedEvent(const CPmxEvent& event)
{
    findAndNotify(event, &CIPmxEventListener::notifyStateChangedEvent);
}

void CPmxSessionDispatcher::notifyDeviceChangedEvent(const CPmxEvent& event)
{
    CMapGuard guard(m_cMapLock);
    for (std::unordered_map<std::int64_t, CPmxSession*>::iterator it = m_cSessionMap.begin(); it != m_cSessionMap.end();
         ++it) {
        it->second->getEventDispatcher().notifyDeviceChangedEvent(event);
    }
}

} // namespace LbPmxVisa
