#ifndef LBPMXVISA_PMXSESSIONSTATE_H
#define LBPMXVISA_PMXSESSIONSTATE_H
// CIPmxSessionState: the per-session state machine deciding what the next read returns.
// Seven stateless singletons (compared by identity): serialize() produces the read's reply in
// that state; nextState() answers the state that follows a requested target, which may be a
// substitute, or refuses with CPmxInvalidStateException.
#include "core/Command.h"

#include <exception>
#include <string>

namespace LbPmxVisa {

class CPmxSession;
class CPmxDataBuffer;

class CIPmxSessionState : public LbCore::CISerializer<CPmxDataBuffer&, void> {
public:
    class CPmxInvalidStateException : public std::exception {
    public:
        CPmxInvalidStateException(const CIPmxSessionState& current, const CIPmxSessionState& target);
        const char* what() const noexcept override { return m_sMessage.c_str(); }

    private:
        std::string m_sMessage;
    };

    class CPmxNoDataAvailableException : public std::exception {
    public:
        const char* what() const noexcept override { return "no data available"; }
    };

    class CPmxNoDataState;
    class CPmxWaitingForData;
    class CPmxDataAvailable;
    class CPmxErrorQueueDataAvailable_ToNoData;
    class CPmxErrorQueueDataAvailable_ToPmxDataAvailable;
    class CPmxOpStatusRegDataAvailable_ToNoData;
    class CPmxOpStatusRegDataAvailable_ToPmxDataAvailable;

    // The singletons.
    static const CIPmxSessionState* noData();
    static const CIPmxSessionState* waitingForData();
    static const CIPmxSessionState* dataAvailable();
    static const CIPmxSessionState* errorQueueToNoData();
    static const CIPmxSessionState* errorQueueToPmxDataAvailable();
    static const CIPmxSessionState* opStatusToNoData();
    static const CIPmxSessionState* opStatusToPmxDataAvailable();

    ~CIPmxSessionState() override { }
    void serialize(CPmxDataBuffer& buffer) const override = 0;
    virtual const CIPmxSessionState* nextState(CPmxSession& session, const CIPmxSessionState* target) const = 0;
    virtual std::string getName() const = 0;
};

} // namespace LbPmxVisa

#endif
