#include "sensor/PmxErrorQueue.h"

#include "core/Log.h"
#include "sensor/PmxDataBuffer.h"
#include "sensor/PmxSession.h"
#include "sensor/PmxSessionDispatcher.h"

namespace LbPmxVisa {

static LbCore::CLogger s_cLogger = LbCore::CLogManager::getLogger("CPmxErrorQueue");

CPmxErrorQueue::CPmxErrorQueue(CPmxSession* session) : LbCore::CParent<CPmxSession>(session)
{
    getParent()->getEventDispatcher().addListener(this);
}

// The session stops its event thread before its error queue goes, so no delivery can still be
// running here.
CPmxErrorQueue::~CPmxErrorQueue() { }

// The entry leaves the list only once it has been written: a reply that does not fit keeps it.
// The lock is held across the write (a plain copy) so that an error recorded meanwhile cannot
// take the written entry's place at the end.
void CPmxErrorQueue::serialize(CPmxDataBuffer& buffer) const
{
    LbCore::CLock<LbCore::CCriticalSection> lock(m_cLock);
    if (m_cEntries.empty()) {
        buffer.write(std::string("0, \"No Error\""));
        return;
    }
    const std::pair<std::int32_t, std::string>& entry = m_cEntries.back();
    buffer.write(std::to_string(entry.first) + ", \"" + entry.second + "\"");
    m_cEntries.pop_back();
}

bool CPmxErrorQueue::isEmpty() const
{
    LbCore::CLock<LbCore::CCriticalSection> lock(m_cLock);
    return m_cEntries.empty();
}

void CPmxErrorQueue::notifyCommandAcceptedEvent(const CPmxEvent&) { }

void CPmxErrorQueue::notifyDataAvailableEvent(const CPmxEvent&) { }

void CPmxErrorQueue::notifyErrorOccuredEvent(const CPmxEvent& event)
{
    std::int32_t code = event.value;
    CPmxSession* session = getParent();
    CPmxSessionDispatcher* dispatcher = session->getParent();
    char text[1024] = {0};
    dispatcher->getCommands()->getErrorText(code, text, sizeof(text));
    text[sizeof(text) - 1] = 0; // a library that fills the whole buffer still yields a terminated text
    s_cLogger.error("LbPmxVisa::CPmxErrorQueue::notifyErrorOccuredEvent")
        << "An Pmx-Error has been occurred on session " << session << " [Error: " << text << "]";
    LbCore::CLock<LbCore::CCriticalSection> lock(m_cLock);
    m_cEntries.push_back(std::make_pair(code, std::string(text)));
}

void CPmxErrorQueue::notifyStateChangedEvent(const CPmxEvent&) { }

void CPmxErrorQueue::notifyDeviceChangedEvent(const CPmxEvent&) { }

} // namespace LbPmxVisa
