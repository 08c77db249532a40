#include "sensor/PmxSession.h"

#include "core/Interlocked.h"
#include "sensor/PmxDataBuffer.h"
#include "sensor/PmxScpiCommandParser.h"
#include "sensor/PmxSessionDispatcher.h"
#include "sensor/PmxSessionState.h"

#include <boost/tokenizer.hpp>
#include <cctype>
#include <chrono>
#include <memory>
#include <new>
#include <stdexcept>

namespace LbPmxVisa {

static LbCore::CLogger s_cLogger = LbCore::CLogManager::getLogger("CPmxSession");

namespace {

typedef LbCore::CQueue<CPmxSession::CPmxSessionMessage> CMessageQueue;

// The VISA time-out is unsigned 64-bit; waits take 32 bits, where 0xFFFFFFFF means no limit.
unsigned toWait(std::uint64_t timeoutMs)
{
    return timeoutMs >= LbCore::CSemaphore::INFINITE_WAIT ? LbCore::CSemaphore::INFINITE_WAIT
                                                          : static_cast<unsigned>(timeoutMs);
}

} // namespace

// The attribute fields start at the usual VISA defaults: END suppression off, END sent with
// the last byte, termination character line feed, not enabled.
CPmxSession::CPmxSession(CPmxSessionDispatcher* dispatcher, const CPmxResourceInfo& resource)
    : LbCore::CParent<CPmxSessionDispatcher>(dispatcher), m_cResourceInfo(resource),
      m_pcState(CIPmxSessionState::noData()), m_cStateLock(), m_lHandle(0), m_cEventDispatcher(this),
      m_nCommandCount(0), m_nMessageCount(0), m_lBusy(0), m_cDataSemaphore(0), m_cMessageQueue(10), m_cErrorQueue(this),
      m_nTimeout(5000), m_nDataFormat(0), m_nSuppressEndEnabled(0), m_nSendEndEnabled(1), m_nTermCharEnabled(0),
      m_nTermChar('\n'), m_bReplyHeld(false), m_bSensorRemoved(false), m_pcCaller(nullptr),
      m_bAbandoned(false)
{
}

// Never throws: the session is released from destructors and cleanup paths of its users. A
// failure to close is logged and the session leaves the dispatcher all the same.
CPmxSession::~CPmxSession()
{
    if (m_lHandle != 0) {
        try {
            s_cLogger.info("LbPmxVisa::CPmxSession::~CPmxSession") << "Closing session " << this;
            getParent()->callChecked(&CIPmxCommands::closeSensor, *this);
            s_cLogger.info("LbPmxVisa::CPmxSession::~CPmxSession") << "Session closed successfully";
        } catch (const std::exception& e) {
            s_cLogger.error("LbPmxVisa::CPmxSession::~CPmxSession")
                << "Closing session " << this << " failed: " << e.what();
        }
        m_cMessageQueue.interrupt();
        try {
            getParent()->detach(*this);
        } catch (const std::exception& e) {
            s_cLogger.error("LbPmxVisa::CPmxSession::~CPmxSession")
                << "Leaving the dispatcher failed for session " << this << ": " << e.what();
        }
    } else {
        try {
            getParent()->closeDriverIfIdle();
        } catch (const std::exception& e) {
            s_cLogger.error("LbPmxVisa::CPmxSession::~CPmxSession") << "Closing the driver failed: " << e.what();
        }
    }
    // The event thread uses the error queue, the message queue and the data semaphore, which
    // are destroyed before the event dispatcher: it must end first.
    m_cEventDispatcher.shutdown();
}

void CPmxSession::open()
{
    s_cLogger.info("LbPmxVisa::CPmxSession::open") << "Open session";
    getParent()->callChecked(&CIPmxCommands::openSensor, m_cResourceInfo, &m_lHandle);
    s_cLogger.info("LbPmxVisa::CPmxSession::open") << "Session opened successfully: " << this;
    getParent()->registerSession(*this);
    m_cEventDispatcher.addListener(this);
}

void CPmxSession::execute(const CSessionCommand& command)
{
    if (LbCore::interlockedCompareExchange(&m_lBusy, 1, 0) != 0) {
        throw CPmxSessionIsBusyException();
    }
    s_cLogger.debug("LbPmxVisa::CPmxSession::execute") << "Executing command for session " << this;
    try {
        // Commands are handed over as constant references but are ordinary objects.
        const_cast<CSessionCommand&>(command).execute(*this);
    } catch (...) {
        if (LbCore::interlockedCompareExchange(&m_lBusy, 0, 1) != 1) {
            s_cLogger.error("LbPmxVisa::CPmxSession::execute")
                << "::InterlockedCompareExchange failed for session " << this;
        }
        throw;
    }
    if (LbCore::interlockedCompareExchange(&m_lBusy, 0, 1) != 1) {
        s_cLogger.error("LbPmxVisa::CPmxSession::execute")
            << "::InterlockedCompareExchange failed for session " << this;
    }
}

// The sensor answers a refused command with the error and then the command's acceptance. Taking
// that acceptance here leaves no answer of this command for the next one. Messages are told
// apart by what they do, not by the callback's value. Without an acceptance in time the count
// stays one behind and the next command's purge accounts for it.
void CPmxSession::takeAcknowledgement()
{
    const std::uint64_t timeout = m_nTimeout;
    const std::chrono::steady_clock::time_point start = std::chrono::steady_clock::now();
    for (;;) {
        std::uint64_t left = timeout;
        if (timeout < LbCore::CSemaphore::INFINITE_WAIT) {
            const std::uint64_t spent = static_cast<std::uint64_t>(
                std::chrono::duration_cast<std::chrono::milliseconds>(std::chrono::steady_clock::now() - start)
                    .count());
            left = spent >= timeout ? 0 : timeout - spent;
        }
        CPmxSessionMessage* message = nullptr;
        if (m_cMessageQueue.pop(message, toWait(left)) != CMessageQueue::RESULT_ITEM) {
            return;
        }
        std::unique_ptr<CPmxSessionMessage> owner(message);
        try {
            owner->deliver();
        } catch (const CPmxSessionDispatcher::CPmxCommandException&) {
            continue; // a further error of the same command; its acceptance is still to come
        }
        ++m_nMessageCount;
        return;
    }
}

void CPmxSession::clearMessages()
{
    CPmxSessionMessage* message = nullptr;
    int result;
    while ((result = m_cMessageQueue.pop(message, 0)) != CMessageQueue::RESULT_TIMEOUT) {
        if (result == CMessageQueue::RESULT_ITEM) {
            delete message;
        }
    }
}

void CPmxSession::dropReply()
{
    m_bReplyHeld = false;
    m_cReply.clear();
}

// A caller marks itself closing before it calls abandon, which takes the same lock: either the
// scope sees the mark, or abandon sees the caller.
CPmxSession::CCallerScope::CCallerScope(CPmxSession& session, const CIPmxCaller* caller) : m_rSession(session)
{
    LbCore::CMutexLock guard(session.m_cCallerLock);
    if (caller != nullptr && caller->isClosing()) {
        throw CPmxAbandonedException();
    }
    session.m_pcCaller = caller;
    session.m_bAbandoned = false;
}

CPmxSession::CCallerScope::~CCallerScope()
{
    LbCore::CMutexLock guard(m_rSession.m_cCallerLock);
    m_rSession.m_pcCaller = nullptr;
    m_rSession.m_bAbandoned = false;
}

// The wake-ups stay behind if the command is not waiting: the message is purged by the next
// write, and a reader that wakes in vain waits again.
void CPmxSession::abandon(const CIPmxCaller* caller)
{
    class CPmxAbandonedMessage : public CPmxSessionMessage {
    public:
        void deliver() override { throw CPmxAbandonedException(); }
    };
    LbCore::CMutexLock guard(m_cCallerLock);
    if (caller == nullptr || m_pcCaller != caller) {
        return;
    }
    m_bAbandoned = true;
    queueMessage(new (std::nothrow) CPmxAbandonedMessage());
    m_cDataSemaphore.release(1);
}

bool CPmxSession::isAbandoned()
{
    LbCore::CMutexLock guard(m_cCallerLock);
    return m_bAbandoned;
}

void CPmxSession::write(const std::string& command, const CIPmxCaller* caller)
{
    class CWriteCommand : public CSessionCommand {
    public:
        CWriteCommand(const std::string& text, const CIPmxCaller* caller) : m_sText(text), m_pcCaller(caller) { }

        void execute(CPmxSession& session) override
        {
            CCallerScope scope(session, m_pcCaller);
            std::string head = m_sText.substr(0, m_sText.find_first_of("\r\n"));
            if (scpiCompare("FETCh?", head.c_str()) == 0) {
                s_cLogger.debug("LbPmxVisa::CPmxSession::write::CWriteCommand::execute")
                    << "fetch command executed " << &session;
                return;
            }
            session.dropReply();
            session.clearMessages();
            ++session.m_nCommandCount;
            // Answers of earlier commands that were never accounted for are purged before this
            // command is sent: purging after the send would throw away this command's own
            // answer when the sensor answers at once, and the writer would wait in vain.
            int result = CMessageQueue::RESULT_ITEM;
            while (session.m_nMessageCount + 1 < session.m_nCommandCount && result == CMessageQueue::RESULT_ITEM) {
                s_cLogger.warn("LbPmxVisa::CPmxSession::write::CWriteCommand::execute")
                    << "Asynchronous Message detected! Will be deleted to ensure stable further working!";
                if (session.m_cMessageQueue.size() >= 1) {
                    CPmxSessionMessage* stale = nullptr;
                    result = session.m_cMessageQueue.pop(stale, 0);
                    if (result == CMessageQueue::RESULT_ITEM) {
                        delete stale;
                    }
                }
                ++session.m_nMessageCount;
            }

            session.changeState(CIPmxSessionState::noData());
            CPmxSessionDispatcher* dispatcher = session.getParent();
            dispatcher->callChecked(&CIPmxCommands::emptyAllBuffers, session);
            s_cLogger.debug("LbPmxVisa::CPmxSession::write::CWriteCommand::execute")
                << "Execute PmxSendCommand(...) [" << m_sText << "] for session " << &session;
            dispatcher->callChecked(&CIPmxCommands::sendCommand, session, m_sText);

            // Set before the removal message is queued: a writer that misses the message sees the flag.
            if (session.m_bSensorRemoved) {
                throw CPmxSensorRemovedException();
            }
            if (session.isAbandoned()) { // its message may have gone with the purge above
                throw CPmxAbandonedException();
            }
            CPmxSessionMessage* message = nullptr;
            if (session.m_cMessageQueue.pop(message, toWait(session.m_nTimeout)) != CMessageQueue::RESULT_ITEM) {
                s_cLogger.info("LbPmxVisa::CPmxSession::write::CWriteCommand::execute")
                    << "No message arrived for session " << &session;
                ++session.m_nMessageCount;
                return;
            }
            std::unique_ptr<CPmxSessionMessage> owner(message);
            s_cLogger.debug("LbPmxVisa::CPmxSession::write::CWriteCommand::execute")
                << "Message arrived " << session.m_nMessageCount << " / " << session.m_nCommandCount << " for session "
                << &session;
            s_cLogger.debug("LbPmxVisa::CPmxSession::write::CWriteCommand::execute")
                << "Delivering message for session " << &session;
            try {
                owner->deliver();
            } catch (const CPmxSessionDispatcher::CPmxCommandException&) {
                owner.reset();
                session.takeAcknowledgement();
                throw;
            }
            ++session.m_nMessageCount;
        }

    private:
        const std::string& m_sText;
        const CIPmxCaller* m_pcCaller;
    };

    typedef boost::tokenizer<boost::char_separator<char>> CTokenizer;
    static const boost::char_separator<char> s_cSeparator(";", "", boost::drop_empty_tokens);
    CTokenizer tokens(command, s_cSeparator);
    for (CTokenizer::iterator it = tokens.begin(); it != tokens.end(); ++it) {
        std::string token(*it);
        for (std::string::iterator c = token.begin(); c != token.end(); ++c) {
            *c = static_cast<char>(std::tolower(static_cast<unsigned char>(*c)));
        }
        if (!token.empty() && token[0] == ':') {
            token.erase(0, 1);
        }
        s_cLogger.info("LbPmxVisa::CPmxSession::write") << "Writing to Session " << this << " with command " << token;
        switch (CPmxScpiCommandParser::getInstance().parse(token)) {
        case CPmxScpiCommandParser::COMMAND_SYSTEM_ERROR_QUERY: {
            class CErrorQueueCommand : public CSessionCommand {
            public:
                void execute(CPmxSession& session) override
                {
                    session.dropReply();
                    session.changeState(CIPmxSessionState::errorQueueToNoData());
                }
            };
            static CErrorQueueCommand s_cCommand;
            execute(s_cCommand);
            break;
        }
        case CPmxScpiCommandParser::COMMAND_OPERATION_CONDITION_QUERY: {
            class COperationStatusCommand : public CSessionCommand {
            public:
                void execute(CPmxSession& session) override
                {
                    session.dropReply();
                    session.changeState(CIPmxSessionState::opStatusToNoData());
                }
            };
            static COperationStatusCommand s_cCommand;
            execute(s_cCommand);
            break;
        }
        case CPmxScpiCommandParser::COMMAND_FORMAT_ASCII:
            m_nDataFormat = 0;
            break;
        case CPmxScpiCommandParser::COMMAND_FORMAT_REAL32:
            m_nDataFormat = 1;
            break;
        default: {
            CWriteCommand writeCommand(token, caller);
            execute(writeCommand);
            break;
        }
        }
    }
}

void CPmxSession::read(CPmxDataBuffer& buffer, const CIPmxCaller* caller)
{
    class CReadCommand : public CSessionCommand {
    public:
        CReadCommand(CPmxDataBuffer& buffer, const CIPmxCaller* caller) : m_rBuffer(buffer), m_pcCaller(caller) { }

        void execute(CPmxSession& session) override
        {
            CCallerScope scope(session, m_pcCaller);
            s_cLogger.debug("LbPmxVisa::CPmxSession::read::CReadCommand::execute")
                << "Executing GetData(...) method for fetching Pmx-Data for session " << &session;
            CPmxDataBuffer::CSpill& reply = session.m_cReply;
            m_rBuffer.setSpill(&reply);
            if (session.m_bReplyHeld) {
                // The reply kept by an earlier read comes first; the state machine has moved on
                // past it already and stays as it is.
                CPmxDataBuffer::CSpill held;
                std::swap(held, reply);
                session.m_bReplyHeld = false;
                m_rBuffer.write(held);
            } else {
                reply.clear();
                try {
                    m_rBuffer.apply(*session.getState());
                } catch (...) {
                    reply.clear();
                    session.changeState(CIPmxSessionState::noData());
                    throw;
                }
                session.changeState(CIPmxSessionState::noData());
            }
            if (reply.isActive()) {
                session.m_bReplyHeld = true;
                throw CPmxDataBuffer::CPmxDataBufferOverFlowException();
            }
        }

    private:
        CPmxDataBuffer& m_rBuffer;
        const CIPmxCaller* m_pcCaller;
    };

    s_cLogger.info("LbPmxVisa::CPmxSession::read") << "Reading from session " << this;
    CReadCommand command(buffer, caller);
    execute(command);
}

void CPmxSession::readSTB(std::uint16_t* status)
{
    s_cLogger.info("LbPmxVisa::CPmxSession::readSTB") << "Reading status byte register " << this;
    if (status == nullptr) {
        throw std::invalid_argument("NULL pointer status");
    }
    std::uint8_t flags = 0;
    if (!m_cErrorQueue.isEmpty()) {
        flags |= STB_ERROR_QUEUE;
    }
    // A kept reply is an answer waiting to be read as much as a pending result is.
    if (getState() == CIPmxSessionState::dataAvailable() || m_bReplyHeld) {
        flags |= STB_MESSAGE_AVAILABLE;
    }
    std::int32_t trigger = 0;
    getParent()->callChecked(&CIPmxCommands::getTriggerState, *this, &trigger);
    if (trigger == PMX_TRIGGER_WAITING || trigger == PMX_TRIGGER_MEASURING) {
        flags |= STB_OPERATION;
    }
    *status = flags;
}

void CPmxSession::clear()
{
    class CClearCommand : public CSessionCommand {
    public:
        void execute(CPmxSession& session) override
        {
            s_cLogger.info("LbPmxVisa::CPmxSession::clear::CClearCommand::execute") << "Clearing session " << &session;
            session.getParent()->callChecked(&CIPmxCommands::clearDevice, session);
            // The device has discarded its results: nothing is pending any more, so the status
            // byte and the next read agree (a read waits as on a fresh session). A remembered
            // result turns into DataAvailable first, hence up to two steps.
            session.dropReply();
            for (int step = 0; step < 2 && session.getState() != CIPmxSessionState::noData(); ++step) {
                session.changeState(CIPmxSessionState::noData());
            }
        }
    };
    static CClearCommand s_cCommand;
    execute(s_cCommand);
}

const CIPmxSessionState* CPmxSession::getState() const
{
    LbCore::CLock<LbCore::CCriticalSection> lock(m_cStateLock);
    return m_pcState.load();
}

void CPmxSession::changeState(const CIPmxSessionState* target)
{
    LbCore::CLock<LbCore::CCriticalSection> lock(m_cStateLock);
    const CIPmxSessionState* current = m_pcState.load();
    s_cLogger.debug("LbPmxVisa::CPmxSession::changeState")
        << "Changing state from " << current->getName() << " to " << target->getName() << " for session " << this;
    try {
        m_pcState = current->nextState(*this, target);
    } catch (const CIPmxSessionState::CPmxInvalidStateException&) {
        s_cLogger.debug("LbPmxVisa::CPmxSession::changeState")
            << "---ERROR-- CPmxInvalidStateException "
            << "Can't change state from " << current->getName() << " into state " << target->getName();
    }
}

void CPmxSession::serialize(LbCore::CLogMessage& message) const
{
    message << "[Id: " << static_cast<std::int32_t>(static_cast<std::uint32_t>(m_lHandle & 0xFFFFFFFF))
            << ", State: " << getState()->getName() << ", Resource: " << g_pcPmxSerializer->serialize(m_cResourceInfo)
            << "]";
}

} // namespace LbPmxVisa
