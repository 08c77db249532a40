#ifndef LBPMXVISA_PMXSESSION_H
#define LBPMXVISA_PMXSESSION_H
// CPmxSession: one open sensor, shared through boost::shared_ptr by every VISA session on its
// resource. It turns written command strings into library calls and waits for the sensor's
// acknowledgement, answers reads from its state machine (measurement result, error-queue entry
// or operation-status value) and emulates a status byte. One command runs at a time under an
// interlocked busy flag; a concurrent one is refused at once with CPmxSessionIsBusyException.
// Sensor notifications arrive on the session's own event-dispatcher thread. The destructor
// closes the sensor and leaves the dispatcher; it never throws (failures are logged at ERROR).
// A reply that does not fit the reader's buffer is kept whole for the next read (the read still
// fails with the overflow); writing a command or clearing the device gives it up. A session
// whose sensor has left the library's device list is dead: a waiting write fails at once, and
// the dispatcher no longer hands it out. A caller that gives up (its VISA session is closing)
// ends the wait of its own read or write with abandon; another caller's command goes on.
#include "core/Command.h"
#include "core/Lock.h"
#include "core/Log.h"
#include "core/Parent.h"
#include "core/Queue.h"
#include "core/Semaphore.h"
#include "core/ThreadSafety.h"
#include "sensor/PmxCaller.h"
#include "sensor/PmxCommands.h"
#include "sensor/PmxDataBuffer.h"
#include "sensor/PmxErrorQueue.h"
#include "sensor/PmxEventDispatcher.h"
#include "sensor/PmxResourceInfo.h"

#include <atomic>
#include <boost/noncopyable.hpp>
#include <cstdint>
#include <exception>
#include <string>

namespace LbPmxVisa {

class CPmxSessionDispatcher;
class CIPmxSessionState;

// Bits of the emulated IEEE 488.2 status byte.
const std::uint8_t STB_ERROR_QUEUE = 4;        // bit 2: the error queue holds an entry
const std::uint8_t STB_MESSAGE_AVAILABLE = 16; // bit 4: an answer waits to be read
const std::uint8_t STB_OPERATION = 128;        // bit 7: the sensor waits for its trigger or measures

class CPmxSession : public LbCore::CParent<CPmxSessionDispatcher>,
                    public CIPmxEventListener,
                    public LbCore::CISerializer<LbCore::CLogMessage&, void>,
                    private LbCore::CICommand<void(const LbCore::CICommand<void(CPmxSession&), 1>&), 0>,
                    private boost::noncopyable {
public:
    typedef LbCore::CICommand<void(CPmxSession&), 1> CSessionCommand;

    // A notification handed from the event thread to a waiting writer.
    class CPmxSessionMessage : public LbCore::CMemoryPool::CMemoryPoolManaged {
    public:
        ~CPmxSessionMessage() override { }
        virtual void deliver() = 0;
    };

    class CPmxSessionIsBusyException : public std::exception {
    public:
        const char* what() const noexcept override { return "The PMX session is currently busy with another command"; }
    };

    class CPmxSensorRemovedException : public std::exception {
    public:
        const char* what() const noexcept override { return "The sensor of this session has been removed"; }
    };

    class CPmxAbandonedException : public std::exception {
    public:
        const char* what() const noexcept override { return "The operation was abandoned: its session is closing"; }
    };

    CPmxSession(CPmxSessionDispatcher* dispatcher, const CPmxResourceInfo& resource);
    ~CPmxSession() override;

    void open();
    // `caller` names who runs the command, for abandon; nullptr: nobody can abandon it.
    void write(const std::string& command, const CIPmxCaller* caller = nullptr);
    void read(CPmxDataBuffer& buffer, const CIPmxCaller* caller = nullptr);
    // For a caller that is closing now: ends the wait of the read or write it runs, which throws
    // CPmxAbandonedException. Anything else (another caller's command, no command) goes on.
    void abandon(const CIPmxCaller* caller);
    // Whether the command in progress was abandoned; a reader checks it whenever it wakes.
    bool isAbandoned();
    void readSTB(std::uint16_t* status);
    void clear();

    const CIPmxSessionState* getState() const;
    void changeState(const CIPmxSessionState* target);

    std::uint64_t getTimeout() const { return m_nTimeout; }
    void setTimeout(std::uint64_t timeoutMs) { m_nTimeout = timeoutMs; }
    std::uint32_t getDataFormat() const { return m_nDataFormat; }
    std::int64_t getHandle() const { return m_lHandle; }
    // True once the sensor is known to have gone: it left the library's device list, or the
    // library no longer answers for the session's handle.
    bool isSensorRemoved() const { return m_bSensorRemoved; }
    // Whether the library still answers for the session's handle. A sensor unplugged and plugged
    // back is listed again under its resource, but with a new handle; the old one is dead.
    bool isHandleAlive();
    // Marks the session dead; a writer waiting for an answer is woken with the removal.
    void markSensorRemoved();
    // Commands sent to the sensor and answers accounted for; equal while nothing is pending.
    std::uint64_t getCommandCount() const { return m_nCommandCount; }
    std::uint64_t getMessageCount() const { return m_nMessageCount; }
    const CPmxResourceInfo& getResourceInfo() const { return m_cResourceInfo; }
    CPmxEventDispatcher& getEventDispatcher() { return m_cEventDispatcher; }
    CPmxErrorQueue& getErrorQueue() { return m_cErrorQueue; }
    LbCore::CSemaphore& getDataSemaphore() { return m_cDataSemaphore; }

    // The four one-byte VISA attributes; stored and reported, nothing else reads them.
    std::uint8_t getSuppressEndEnabled() const { return m_nSuppressEndEnabled; }
    void setSuppressEndEnabled(std::uint8_t value) { m_nSuppressEndEnabled = value; }
    std::uint8_t getSendEndEnabled() const { return m_nSendEndEnabled; }
    void setSendEndEnabled(std::uint8_t value) { m_nSendEndEnabled = value; }
    std::uint8_t getTermCharEnabled() const { return m_nTermCharEnabled; }
    void setTermCharEnabled(std::uint8_t value) { m_nTermCharEnabled = value; }
    std::uint8_t getTermChar() const { return m_nTermChar; }
    void setTermChar(std::uint8_t value) { m_nTermChar = value; }

    // Writes "[Id: <handle>, State: <state>, Resource: <library form>]".
    void serialize(LbCore::CLogMessage& message) const override;

private:
    // Names the caller of the command in progress while the command runs (under the busy flag).
    class CCallerScope {
    public:
        // Throws CPmxAbandonedException for a caller that is closing.
        CCallerScope(CPmxSession& session, const CIPmxCaller* caller);
        ~CCallerScope();
        CCallerScope(const CCallerScope&) = delete;
        CCallerScope& operator=(const CCallerScope&) = delete;

    private:
        CPmxSession& m_rSession;
    };

    void execute(const CSessionCommand& command) override;
    // After a refused command: waits up to the time-out for the command's acknowledgement.
    void takeAcknowledgement();
    // Throws away every message no writer has taken, without delivering it.
    void clearMessages();
    // Queues a notification's message for the writer; a message that could not be made is logged.
    void queueMessage(CPmxSessionMessage* message);
    // Gives up a kept reply (under the busy flag).
    void dropReply();
    // Whether the library still lists this sensor; throws when the list cannot be read whole.
    bool isSensorAttached();

    void notifyCommandAcceptedEvent(const CPmxEvent& event) override;
    void notifyDataAvailableEvent(const CPmxEvent& event) override;
    void notifyErrorOccuredEvent(const CPmxEvent& event) override;
    void notifyStateChangedEvent(const CPmxEvent& event) override;
    void notifyDeviceChangedEvent(const CPmxEvent& event) override;

    CPmxResourceInfo m_cResourceInfo;
    // Everything the session's description reads (resource, state and its lock, handle) comes
    // before the event dispatcher, whose construction may already log that description.
    std::atomic<const CIPmxSessionState*> m_pcState;
    // Serialises changeState between the command thread and the event thread, so a transition
    // computed from a stale state never overwrites a newer one. getState takes it too: a
    // transition may release the data semaphore before the new state is stored, and the woken
    // reader must see the stored state.
    mutable LbCore::CCriticalSection m_cStateLock;
    std::int64_t m_lHandle;
    CPmxEventDispatcher m_cEventDispatcher;
    std::uint64_t m_nCommandCount;
    std::uint64_t m_nMessageCount;
    volatile std::int32_t m_lBusy;
    LbCore::CSemaphore m_cDataSemaphore;
    LbCore::CQueue<CPmxSessionMessage> m_cMessageQueue;
    CPmxErrorQueue m_cErrorQueue;
    std::atomic<std::uint64_t> m_nTimeout;
    std::atomic<std::uint32_t> m_nDataFormat;
    std::atomic<std::uint8_t> m_nSuppressEndEnabled;
    std::atomic<std::uint8_t> m_nSendEndEnabled;
    std::atomic<std::uint8_t> m_nTermCharEnabled;
    std::atomic<std::uint8_t> m_nTermChar;
    // The reply kept after an overflow, used under the busy flag; the flag is read by readSTB.
    CPmxDataBuffer::CSpill m_cReply;
    std::atomic<bool> m_bReplyHeld;
    std::atomic<bool> m_bSensorRemoved;
    LbCore::CMutex m_cCallerLock;
    const CIPmxCaller* m_pcCaller GUARDED_BY(m_cCallerLock);
    bool m_bAbandoned GUARDED_BY(m_cCallerLock);
};

} // namespace LbPmxVisa

#endif
