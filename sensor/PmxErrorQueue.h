#ifndef LBPMXVISA_PMXERRORQUEUE_H
#define LBPMXVISA_PMXERRORQUEUE_H
// CPmxErrorQueue: the emulated SCPI error queue of one session. It records every sensor error
// notification with the library's text and writes one entry per error-queue read, the most
// recently recorded first, as <code>, "<text>"; an empty queue answers 0, "No Error". The list
// is shared between the event thread and application threads and has a lock of its own.
#include "core/Command.h"
#include "core/Lock.h"
#include "core/Parent.h"
#include "sensor/PmxCommands.h"

#include <cstdint>
#include <deque>
#include <string>
#include <utility>

namespace LbPmxVisa {

class CPmxSession;
class CPmxDataBuffer;

class CPmxErrorQueue : public LbCore::CParent<CPmxSession>,
                       public LbCore::CISerializer<CPmxDataBuffer&, void>,
                       private CIPmxEventListener {
public:
    // Subscribes to the session's event dispatcher, ahead of the session itself.
    explicit CPmxErrorQueue(CPmxSession* session);
    ~CPmxErrorQueue() override;

    void serialize(CPmxDataBuffer& buffer) const override;
    bool isEmpty() const;

private:
    void notifyCommandAcceptedEvent(const CPmxEvent& event) override;
    void notifyDataAvailableEvent(const CPmxEvent& event) override;
    void notifyErrorOccuredEvent(const CPmxEvent& event) override;
    void notifyStateChangedEvent(const CPmxEvent& event) override;
    void notifyDeviceChangedEvent(const CPmxEvent& event) override;

    mutable std::deque<std::pair<std::int32_t, std::string>> m_cEntries;
    mutable LbCore::CCriticalSection m_cLock;
};

} // namespace LbPmxVisa

#endif
