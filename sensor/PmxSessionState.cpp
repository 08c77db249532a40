#include "sensor/PmxSessionState.h"

#include "sensor/PmxDataBuffer.h"
#include "sensor/PmxDataSerializer.h"
#include "sensor/PmxErrorQueue.h"
#include "sensor/PmxSession.h"
#include "sensor/PmxSessionDispatcher.h"

#include <cstdint>
#include <string>

namespace LbPmxVisa {

typedef CIPmxSessionState CState;

CState::CPmxInvalidStateException::CPmxInvalidStateException(const CIPmxSessionState& current,
                                                             const CIPmxSessionState& target)
    : m_sMessage("Can't change state from " + current.getName() + " into state " + target.getName())
{
}

namespace {

[[noreturn]] void refuse(const CState* current, const CState* target)
{
    throw CState::CPmxInvalidStateException(*current, *target);
}

} // namespace

class CIPmxSessionState::CPmxNoDataState : public CIPmxSessionState {
public:
    // Nothing pending: wait for a result. The state that is current after the change serializes,
    // which is DataAvailable when a result has slipped in meanwhile.
    void serialize(CPmxDataBuffer& buffer) const override
    {
        CPmxSession* session = buffer.getParent();
        session->changeState(waitingForData());
        session->getState()->serialize(buffer);
    }

    const CState* nextState(CPmxSession&, const CState* target) const override
    {
        if (target == errorQueueToPmxDataAvailable() || target == opStatusToPmxDataAvailable()) {
            refuse(this, target);
        }
        return target;
    }

    std::string getName() const override { return "NoData"; }
};

class CIPmxSessionState::CPmxWaitingForData : public CIPmxSessionState {
public:
    void serialize(CPmxDataBuffer& buffer) const override
    {
        CPmxSession* session = buffer.getParent();
        std::uint64_t timeout = session->getTimeout();
        unsigned waitMs = timeout >= LbCore::CSemaphore::INFINITE_WAIT ? LbCore::CSemaphore::INFINITE_WAIT
                                                                       : static_cast<unsigned>(timeout);
        for (;;) {
            if (!session->getDataSemaphore().wait(waitMs)) {
                throw CPmxNoDataAvailableException();
            }
            if (session->isAbandoned()) {
                throw CPmxSession::CPmxAbandonedException();
            }
            // A count left over from a read that gave up earlier ends the wait while the state
            // is still WaitingForData: then wait again, for a full time-out.
            const CState* current = session->getState();
            if (current != this) {
                current->serialize(buffer);
                return;
            }
        }
    }

    const CState* nextState(CPmxSession& session, const CState* target) const override
    {
        if (target == noData()) {
            return target;
        }
        if (target == dataAvailable()) {
            session.getDataSemaphore().release(1);
            return target;
        }
        refuse(this, target);
    }

    std::string getName() const override { return "WaitingForData"; }
};

class CIPmxSessionState::CPmxDataAvailable : public CIPmxSessionState {
public:
    // Every result the library holds is fetched until it answers "no further result".
    // Several results are laid out one after another: each is written where the previous one
    // ended, and the caller's position and count advance past every result, so the reply holds
    // only bytes that a result wrote. (Writing each result over the first one while the count
    // still grew, and repeating a single-value block's four bytes behind the last result, would
    // leave stale bytes in the reply; that copy is therefore not made.) Two text results in a
    // row are separated by ",", the SCPI data separator, so that clients can tell them apart;
    // binary blocks carry their own length and follow each other unseparated.
    void serialize(CPmxDataBuffer& buffer) const override
    {
        CPmxSession* session = buffer.getParent();
        CPmxSessionDispatcher* dispatcher = session->getParent();
        bool previousText = false;
        bool fetched = false;
        try {
            for (;;) {
                std::int32_t type = 0;
                std::int32_t unused1 = 0;
                std::int32_t unused2 = 0;
                try {
                    dispatcher->callChecked(&CIPmxCommands::getData, *session, &type, &unused1, &unused2);
                } catch (const CPmxSessionDispatcher::CPmxCommandException& e) {
                    if (e.getErrorCode() == PMX_NO_FURTHER_RESULT) {
                        break;
                    }
                    throw;
                }
                const EDataType kind = static_cast<EDataType>(type);
                const bool text = isTextResult(kind, session->getDataFormat());
                CPmxDataBuffer working(buffer);
                if (previousText && text) {
                    working.write(std::string(","));
                }
                working.apply(CPmxDataSerializerFactory::getInstance().get(kind));
                buffer = working;
                previousText = text;
                fetched = true;
            }
        } catch (...) {
            // A failed read still discards what the library holds, so that a result which could
            // not be delivered is never taken for a fresh one later; the first failure is reported.
            try {
                dispatcher->callChecked(&CIPmxCommands::emptyAllBuffers, *session);
            } catch (...) {
            }
            throw;
        }
        if (!fetched) {
            // The announcement outlived its result: an earlier read fetched it before the data
            // notification arrived (continuous measurements), or a command or a clear discarded
            // it. Nothing is pending, so the read waits as it does in NoData rather than
            // succeeding with no bytes.
            session->changeState(noData());
            session->getState()->serialize(buffer);
            return;
        }
        dispatcher->callChecked(&CIPmxCommands::emptyAllBuffers, *session);
    }

    const CState* nextState(CPmxSession&, const CState* target) const override
    {
        if (target == noData() || target == dataAvailable()) {
            return target;
        }
        if (target == errorQueueToNoData()) {
            return errorQueueToPmxDataAvailable();
        }
        if (target == opStatusToNoData()) {
            return opStatusToPmxDataAvailable();
        }
        refuse(this, target);
    }

    std::string getName() const override { return "DataAvailable"; }
};

class CIPmxSessionState::CPmxErrorQueueDataAvailable_ToNoData : public CIPmxSessionState {
public:
    void serialize(CPmxDataBuffer& buffer) const override { buffer.apply(buffer.getParent()->getErrorQueue()); }

    // A result arriving now is remembered for the read after the error read, as in the status
    // query's state: refusing it would leave the result in the library unannounced, and the
    // next command would discard it.
    const CState* nextState(CPmxSession&, const CState* target) const override
    {
        if (target == noData() || target == errorQueueToNoData()) {
            return target;
        }
        if (target == dataAvailable()) {
            return errorQueueToPmxDataAvailable();
        }
        refuse(this, target);
    }

    std::string getName() const override { return "ErrorQueueDataAvailable_ToNoData"; }
};

class CIPmxSessionState::CPmxErrorQueueDataAvailable_ToPmxDataAvailable : public CPmxErrorQueueDataAvailable_ToNoData {
public:
    const CState* nextState(CPmxSession&, const CState* target) const override
    {
        if (target == noData()) {
            return dataAvailable();
        }
        if (target == errorQueueToNoData() || target == this) {
            return this;
        }
        refuse(this, target);
    }

    std::string getName() const override { return "ErrorQueueDataAvailable_ToPmxDataAvailable"; }
};

class CIPmxSessionState::CPmxOpStatusRegDataAvailable_ToNoData : public CIPmxSessionState {
public:
    void serialize(CPmxDataBuffer& buffer) const override
    {
        // The emulated operation-status condition: bit 4 while the sensor measures, bit 5 while
        // it waits for its trigger.
        static const std::uint8_t OPER_MEASURING = 16;
        static const std::uint8_t OPER_WAITING_FOR_TRIGGER = 32;
        class CPmxOperationStatusRegisterSerializer : public LbCore::CISerializer<CPmxDataBuffer&, void> {
        public:
            void serialize(CPmxDataBuffer& target) const override
            {
                std::uint8_t flags = 0;
                std::int32_t triggerState = 0;
                CPmxSession* session = target.getParent();
                session->getParent()->callChecked(&CIPmxCommands::getTriggerState, *session, &triggerState);
                if (triggerState == PMX_TRIGGER_MEASURING) {
                    flags |= OPER_MEASURING;
                }
                if (triggerState == PMX_TRIGGER_WAITING) {
                    flags |= OPER_WAITING_FOR_TRIGGER;
                }
                target.write(std::to_string(static_cast<unsigned>(flags)));
            }
        };
        static const CPmxOperationStatusRegisterSerializer serializer{};
        buffer.apply(serializer);
    }

    // A result arriving now is remembered for the read after the status read.
    const CState* nextState(CPmxSession&, const CState* target) const override
    {
        if (target == noData() || target == opStatusToNoData()) {
            return target;
        }
        if (target == dataAvailable()) {
            return opStatusToPmxDataAvailable();
        }
        refuse(this, target);
    }

    std::string getName() const override { return "PmxOpStatusRegDataAvailable_ToNoData"; }
};

class CIPmxSessionState::CPmxOpStatusRegDataAvailable_ToPmxDataAvailable
    : public CPmxOpStatusRegDataAvailable_ToNoData {
public:
    const CState* nextState(CPmxSession&, const CState* target) const override
    {
        if (target == noData()) {
            return dataAvailable();
        }
        if (target == opStatusToNoData()) {
            return this;
        }
        refuse(this, target);
    }

    std::string getName() const override { return "PmxOpStatusRegDataAvailable_ToPmxDataAvailable"; }
};

const CState* CState::noData()
{
    static const CPmxNoDataState state{};
    return &state;
}

const CState* CState::waitingForData()
{
    static const CPmxWaitingForData state{};
    return &state;
}

const CState* CState::dataAvailable()
{
    static const CPmxDataAvailable state{};
    return &state;
}

const CState* CState::errorQueueToNoData()
{
    static const CPmxErrorQueueDataAvailable_ToNoData state{};
    return &state;
}

const CState* CState::errorQueueToPmxDataAvailable()
{
    static const CPmxErrorQueueDataAvailable_ToPmxDataAvailable state{};
    return &state;
}

const CState* CState::opStatusToNoData()
{
    static const CPmxOpStatusRegDataAvailable_ToNoData state{};
    return &state;
}

const CState* CState::opStatusToPmxDataAvailable()
{
    static const CPmxOpStatusRegDataAvailable_ToPmxDataAvailable state{};
    return &state;
}

namespace {

// All seven states exist before the first session does.
struct CStatesAtLoad {
    CStatesAtLoad()
    {
        CState::noData();
        CState::waitingForData();
        CState::dataAvailable();
        CState::errorQueueToNoData();
        CState::errorQueueToPmxDataAvailable();
        CState::opStatusToNoData();
        CState::opStatusToPmxDataAvailable();
    }
} s_cStatesAtLoad;

} // namespace

} // namespace LbPmxVisa
