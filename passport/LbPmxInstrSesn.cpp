// CLbPmxInstrSesn: lifecycle, message-based and resource-manager operations. Attributes, events
// and the VISA event listeners are in LbPmxInstrSesnAttributes.cpp.
#include "passport/LbPmxInstrSesn.h"

#include "core/Log.h"
#include "core/Version.h"
#include "passport/InstrSesnText.h"
#include "passport/Passport.h"
#include "sensor/PmxDataBuffer.h"
#include "sensor/PmxEventDispatcher.h"
#include "sensor/PmxResourceInfo.h"
#include "sensor/PmxSession.h"
#include "sensor/PmxSessionDispatcher.h"
#include "sensor/PmxSessionState.h"

#include <cstring>
#include <exception>
#include <string>
#include <vector>

namespace LbPmxPassport {

using LbPmxVisa::CIPmxSessionState;
using LbPmxVisa::CPmxDataBuffer;
using LbPmxVisa::CPmxResourceInfo;
using LbPmxVisa::CPmxSession;
using LbPmxVisa::CPmxSessionDispatcher;

static LbCore::CLogger s_cLogger = LbCore::CLogManager::getLogger("CLbPmxInstrSesn");

namespace {

const ViUInt16 PASSPORT_INTERFACE_TYPE = 0x8100;
void logError(const char* operation, const char* text)
{
    s_cLogger.error(operation) << text;
}

// The common exception-to-status mapping of the session operations. Each operation names the
// statuses of the classes it treats specially; what it does not name is "other std::exception".
struct CStatusMap {
    ViStatus busy;
    ViStatus noData;
    ViStatus overflow;
    bool commandCodes; // CPmxCommandException: VI_ERROR_NSUP_OPER for an unknown command
};

template <class F> ViStatus guarded(const char* operation, const CStatusMap& map, F body)
{
    try {
        return body();
    } catch (const CPmxSession::CPmxSessionIsBusyException& e) {
        logError(operation, e.what());
        return map.busy;
    } catch (const CPmxSession::CPmxAbandonedException& e) {
        // Closed by another thread while waiting: the runtime's waits answer the same.
        logError(operation, e.what());
        return VI_ERROR_INV_OBJECT;
    } catch (const CIPmxSessionState::CPmxNoDataAvailableException& e) {
        logError(operation, e.what());
        return map.noData;
    } catch (const CPmxDataBuffer::CPmxDataBufferOverFlowException& e) {
        logError(operation, e.what());
        return map.overflow;
    } catch (const CPmxSessionDispatcher::CPmxCommandException& e) {
        logError(operation, e.what());
        return map.commandCodes && e.getErrorCode() == LbPmxVisa::PMX_UNKNOWN_COMMAND ? VI_ERROR_NSUP_OPER
                                                                                      : VI_ERROR_SYSTEM_ERROR;
    } catch (const std::exception& e) {
        logError(operation, e.what());
        return VI_ERROR_SYSTEM_ERROR;
    } catch (...) {
        logError(operation, "Unknown exception...");
        return VI_ERROR_SYSTEM_ERROR;
    }
}

const CStatusMap WRITE_MAP = {VI_ERROR_RSRC_BUSY, VI_ERROR_SYSTEM_ERROR, VI_ERROR_SYSTEM_ERROR, true};
const CStatusMap READ_MAP = {VI_ERROR_RSRC_BUSY, VI_ERROR_TMO, VI_ERROR_USER_BUF, false};
const CStatusMap TRIGGER_MAP = {VI_ERROR_RSRC_BUSY, VI_ERROR_SYSTEM_ERROR, VI_ERROR_SYSTEM_ERROR, false};
const CStatusMap PLAIN_MAP = {VI_ERROR_SYSTEM_ERROR, VI_ERROR_SYSTEM_ERROR, VI_ERROR_SYSTEM_ERROR, false};

} // namespace

// ---- lifecycle

CLbPmxInstrSesn::CLbPmxInstrSesn()
    : m_nSession(0), m_pcRecord(nullptr), m_nClosed(0), m_nClosingFromDestructor(0), m_cSrqListener(this),
      m_cUsbListener(this), m_cExceptionListener(this)
{
}

CLbPmxInstrSesn::~CLbPmxInstrSesn()
{
    if (m_nClosed == 0) {
        m_nClosingFromDestructor = 1;
        viClose();
    }
    // The event worker may be delivering to a listener right now. Unsubscribing all three while
    // they are still whole waits for such a delivery; left to the listeners' own destructors,
    // the worker could call one whose most derived part is already gone.
    try {
        if (m_pcSession) {
            LbPmxVisa::CPmxEventDispatcher& events = m_pcSession->getEventDispatcher();
            events.removeListener(&m_cExceptionListener);
            events.removeListener(&m_cUsbListener);
            events.removeListener(&m_cSrqListener);
        }
    } catch (...) {
    }
}

void CLbPmxInstrSesn::setVisaSession(ViSession session, ViAddr* record)
{
    m_nSession = session;
    m_pcRecord = record;
}

ViStatus CLbPmxInstrSesn::viOpen(ViConstRsrc name, ViAccessMode, ViUInt32)
{
    static const char* const OPERATION = "LbPmxPassport::CLbPmxInstrSesn::viOpen";
    CPassportLock lock;
    try {
        CPmxSessionDispatcher& dispatcher = CPmxSessionDispatcher::getInstance();
        if (dispatcher.getActiveSessionCount() > MAX_OPEN_BEFORE_OPEN) {
            s_cLogger.warn(OPERATION) << "There are already " << MAX_OPEN_BEFORE_OPEN << " active devices...";
            return VI_ERROR_RSRC_NFOUND;
        }
        m_pcSession = dispatcher.getSession(CPmxResourceInfo(name == nullptr ? std::string() : std::string(name)));
        try {
            const ViEventType events[3] = {VI_EVENT_SERVICE_REQ, VI_EVENT_EXCEPTION, VI_EVENT_USB_INTR};
            CNiViSv::declareEvents(m_nSession, 3, events, 0);
        } catch (...) {
        }
        if (m_pcRecord != nullptr) {
            m_pcRecord[CNiViSv::RECORD_PASSPORT_SLOT] = static_cast<CBasePassport*>(this);
        }
        return CNiViSv::installTable(m_nSession, getVectorTable(), 0, m_nSession, 0);
    } catch (const std::exception& e) {
        s_cLogger.error(OPERATION) << e.what();
        return VI_ERROR_RSRC_NFOUND;
    } catch (...) {
        s_cLogger.error(OPERATION) << "Unknown error";
        return VI_ERROR_SYSTEM_ERROR;
    }
}

ViStatus CLbPmxInstrSesn::viClose()
{
    CPassportLock lock;
    if (m_pcRecord != nullptr) {
        m_pcRecord[CNiViSv::RECORD_PASSPORT_SLOT] = nullptr;
        m_pcRecord = nullptr;
    }
    if (m_nClosingFromDestructor == 0) {
        m_nClosed = 1;
        closedObjectPending();
        if (closeWhenIdle()) {
            delete this;
            closedObjectDestroyed();
        }
    }
    return VI_SUCCESS;
}

// A read or write of this session that waits for the sensor ends with CPmxAbandonedException;
// another VISA session's command on the same sensor goes on.
void CLbPmxInstrSesn::abandonCalls()
{
    if (m_pcSession) {
        m_pcSession->abandon(this);
    }
}

// Releasing the sensor session may close the driver, which is done under the passport lock.
void CLbPmxInstrSesn::destroyClosed()
{
    {
        CPassportLock lock;
        delete this;
    }
    closedObjectDestroyed();
}

// ---- message-based operations

ViStatus CLbPmxInstrSesn::viWrite(ViConstBuf buffer, ViUInt32 count, ViPUInt32 returnCount)
{
    if (buffer == nullptr) {
        return VI_ERROR_INV_PARAMETER;
    }
    return guarded("LbPmxPassport::CLbPmxInstrSesn::viWrite", WRITE_MAP, [&] {
        std::string command(reinterpret_cast<const char*>(buffer), count);
        m_pcSession->write(command, this);
        if (returnCount != nullptr) {
            *returnCount = static_cast<ViUInt32>(command.size());
        }
        return VI_SUCCESS;
    });
}

ViStatus CLbPmxInstrSesn::viRead(ViPBuf buffer, ViUInt32 count, ViPUInt32 returnCount)
{
    if (buffer == nullptr) {
        return VI_ERROR_INV_PARAMETER;
    }
    return guarded("LbPmxPassport::CLbPmxInstrSesn::viRead", READ_MAP, [&] {
        std::uint32_t bytes = 0;
        CPmxDataBuffer data(*m_pcSession, reinterpret_cast<char*>(buffer), count, &bytes);
        m_pcSession->read(data, this);
        if (returnCount != nullptr) {
            *returnCount = bytes;
        }
        return VI_SUCCESS;
    });
}

ViStatus CLbPmxInstrSesn::viAssertTrigger(ViUInt16)
{
    return guarded("LbPmxPassport::CLbPmxInstrSesn::viAssertTrigger", TRIGGER_MAP, [&] {
        m_pcSession->write("*TRG", this);
        return VI_SUCCESS;
    });
}

ViStatus CLbPmxInstrSesn::viReadSTB(ViPUInt16 status)
{
    if (status == nullptr) {
        return VI_ERROR_INV_PARAMETER;
    }
    return guarded("LbPmxPassport::CLbPmxInstrSesn::viReadSTB", PLAIN_MAP, [&] {
        m_pcSession->readSTB(status);
        return VI_SUCCESS;
    });
}

ViStatus CLbPmxInstrSesn::viClear()
{
    return guarded("LbPmxPassport::CLbPmxInstrSesn::viClear", PLAIN_MAP, [&] {
        m_pcSession->clear();
        return VI_SUCCESS;
    });
}

ViStatus CLbPmxInstrSesn::viTerminate(ViUInt16, ViJobId)
{
    return VI_ERROR_NSUP_OPER;
}

ViStatus CLbPmxInstrSesn::findAttribute(ViAttr, ViUInt16, ViAttrState, ViConstString, ViUInt32)
{
    return VI_ERROR_NSUP_ATTR;
}

// ---- resource-manager operations

ViStatus CLbPmxInstrSesn::viParseRsrc(ViSession, ViConstRsrc name, ViPUInt16 type, ViPUInt16 number)
{
    try {
        CPmxResourceInfo resource(name == nullptr ? std::string() : std::string(name));
    } catch (...) {
        return VI_ERROR_RSRC_NFOUND;
    }
    if (type == nullptr || number == nullptr) {
        return VI_ERROR_INV_PARAMETER;
    }
    *number = 0;
    *type = PASSPORT_INTERFACE_TYPE;
    return VI_SUCCESS;
}

ViStatus CLbPmxInstrSesn::viParseRsrcEx(ViSession rm, ViConstRsrc name, ViPUInt16 type, ViPUInt16 number,
                                        ViChar* resourceClass, ViChar* expandedName, ViChar* alias)
{
    ViStatus status = viParseRsrc(rm, name, type, number);
    if (status != VI_SUCCESS) {
        return status;
    }
    if (resourceClass != nullptr) {
        copyText(resourceClass, "INSTR");
    }
    if (expandedName != nullptr && name != nullptr) {
        copyText(expandedName, name);
    }
    if (alias != nullptr) {
        copyText(alias, "");
    }
    return VI_SUCCESS;
}

ViStatus CLbPmxInstrSesn::viFindRsrc(ViSession rm, ViConstString expression, ViPFindList findList)
{
    std::vector<std::string> resources;
    {
        CPassportLock lock;
        try {
            std::vector<CPmxResourceInfo> devices = CPmxSessionDispatcher::getInstance().getAvailableDevices();
            for (std::size_t i = 0; i < devices.size(); ++i) {
                resources.push_back(LbPmxVisa::g_pcVisaSerializer->serialize(devices[i]));
            }
        } catch (const std::exception& e) {
            // The lock is released on the way out and the application gets an error status.
            s_cLogger.error("LbPmxPassport::CLbPmxInstrSesn::viFindRsrc") << e.what();
            return VI_ERROR_SYSTEM_ERROR;
        } catch (...) {
            s_cLogger.error("LbPmxPassport::CLbPmxInstrSesn::viFindRsrc") << "Unknown exception...";
            return VI_ERROR_SYSTEM_ERROR;
        }
    }
    ViStatus status = VI_SUCCESS;
    for (std::size_t i = 0; i < resources.size(); ++i) {
        const char* resource = resources[i].c_str();
        ViUInt16 attributeFlag = 0;
        ViStatus match = CNiViSv::matchRsrc(rm, expression, resource, &attributeFlag);
        if (match == VI_ERROR_RSRC_NFOUND) {
            continue;
        }
        if (match < VI_SUCCESS) {
            return match;
        }
        if (attributeFlag != 0) {
            match = CNiViSv::matchAttributes(rm, expression, resource, &findCallback, 0);
            if (match == VI_ERROR_RSRC_NFOUND) {
                continue;
            }
            if (match < VI_SUCCESS) {
                return match;
            }
        }
        if (findList == nullptr) {
            return VI_ERROR_INV_PARAMETER;
        }
        status = CNiViSv::appendFound(*findList, resource, 0);
        if (status < VI_SUCCESS) {
            return status;
        }
    }
    return status;
}

} // namespace LbPmxPassport
