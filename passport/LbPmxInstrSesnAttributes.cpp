// CLbPmxInstrSesn: the VISA attributes of a sensor session, enabling and disabling its three
// events, and the listeners that raise them through the runtime.
#include "passport/LbPmxInstrSesn.h"

#include "core/Log.h"
#include "core/Version.h"
#include "passport/InstrSesnText.h"
#include "sensor/PmxEventDispatcher.h"
#include "sensor/PmxResourceInfo.h"
#include "sensor/PmxSession.h"
#include "sensor/PmxSessionDispatcher.h"

#include <cstring>
#include <exception>
#include <string>

namespace LbPmxPassport {

using LbPmxVisa::CPmxSession;
using LbPmxVisa::CPmxSessionDispatcher;

static LbCore::CLogger s_cLogger = LbCore::CLogManager::getLogger("CLbPmxInstrSesn");

// ---- listeners

CLbPmxInstrSesn::CVisaEventListener::~CVisaEventListener()
{
    try {
        const boost::shared_ptr<CPmxSession>& session = getParent()->getSensorSession();
        if (session) {
            session->getEventDispatcher().removeListener(this);
        }
    } catch (...) {
    }
}

void CLbPmxInstrSesn::CVisaEventListener::raise(ViEventType type)
{
    ViSession session = getParent()->getVisaSession();
    ViEvent context = 0;
    ViUInt32 mechanisms = 0;
    if (CNiViSv::createEvent(session, type, &context, &mechanisms) != VI_SUCCESS) {
        return;
    }
    CNiViSv::raiseEvent(session, context, mechanisms);
}

// ---- attributes

namespace {
template <class T> void store(void* destination, T value)
{
    std::memcpy(destination, &value, sizeof value);
}
} // namespace

ViStatus CLbPmxInstrSesn::viGetAttribute(ViAttr attribute, void* value)
{
    if (value == nullptr) {
        return VI_ERROR_INV_PARAMETER;
    }
    // The version information of the module may be unreadable; no exception leaves the passport.
    try {
        return getAttribute(attribute, value);
    } catch (const std::exception& e) {
        s_cLogger.error("LbPmxPassport::CLbPmxInstrSesn::viGetAttribute") << e.what();
    } catch (...) {
        s_cLogger.error("LbPmxPassport::CLbPmxInstrSesn::viGetAttribute") << "Unknown exception...";
    }
    return VI_ERROR_SYSTEM_ERROR;
}

ViStatus CLbPmxInstrSesn::getAttribute(ViAttr attribute, void* value)
{
    CPmxSession& session = *m_pcSession;
    CPmxSessionDispatcher& dispatcher = CPmxSessionDispatcher::getInstance();
    switch (attribute) {
    case VI_ATTR_RSRC_CLASS:
        copyText(static_cast<ViChar*>(value), "INSTR");
        break;
    case VI_ATTR_RSRC_NAME:
        copyText(static_cast<ViChar*>(value), LbPmxVisa::g_pcVisaSerializer->serialize(session.getResourceInfo()));
        break;
    case VI_ATTR_RSRC_IMPL_VERSION: {
        const LbCore::CVersion& version = LbCore::CVersion::getModuleVersion();
        store<ViUInt32>(value, implementationVersion(__DATE__, version.getFileMajor(), version.getFileMinor()));
        break;
    }
    case VI_ATTR_SEND_END_EN:
        store<ViUInt16>(value, session.getSendEndEnabled());
        break;
    case VI_ATTR_TERMCHAR:
        store<ViUInt8>(value, session.getTermChar());
        break;
    case VI_ATTR_TMO_VALUE:
        store<ViUInt32>(value, static_cast<ViUInt32>(session.getTimeout()));
        break;
    case VI_ATTR_SUPPRESS_END_EN:
        store<ViUInt16>(value, session.getSuppressEndEnabled());
        break;
    case VI_ATTR_TERMCHAR_EN:
        store<ViUInt16>(value, session.getTermCharEnabled());
        break;
    case VI_ATTR_MANF_NAME:
        copyText(static_cast<ViChar*>(value), dispatcher.getManufacturerName());
        break;
    case VI_ATTR_MANF_ID:
        store<ViUInt16>(value, static_cast<ViUInt16>(dispatcher.getManufacturerId()));
        break;
    case VI_ATTR_INTF_INST_NAME:
        copyText(static_cast<ViChar*>(value), "pmx0");
        break;
    case VI_ATTR_RSRC_SPEC_VERSION:
        store<ViUInt32>(value, 0x00400000u);
        break;
    case VI_ATTR_RSRC_MANF_NAME:
        copyText(static_cast<ViChar*>(value), "National Instruments");
        break;
    case VI_ATTR_RSRC_MANF_ID:
        store<ViUInt16>(value, 0x0FF6);
        break;
    case VI_ATTR_USB_SERIAL_NUM:
        copyText(static_cast<ViChar*>(value), session.getResourceInfo().getSerialNumber());
        break;
    case VI_ATTR_USB_INTFC_NUM:
        store<ViInt16>(value, 0);
        break;
    case VI_ATTR_USB_PROTOCOL:
        store<ViInt16>(value, 0);
        break;
    default:
        return VI_ERROR_NSUP_ATTR;
    }
    return VI_SUCCESS;
}

ViStatus CLbPmxInstrSesn::viSetAttribute(ViAttr attribute, ViAttrState value)
{
    CPmxSession& session = *m_pcSession;
    switch (attribute) {
    case VI_ATTR_SEND_END_EN:
        session.setSendEndEnabled(value != 0);
        break;
    case VI_ATTR_TERMCHAR:
        session.setTermChar(static_cast<std::uint8_t>(value & 0xFF));
        break;
    case VI_ATTR_TMO_VALUE:
        session.setTimeout(value);
        break;
    case VI_ATTR_SUPPRESS_END_EN:
        session.setSuppressEndEnabled(value != 0);
        break;
    case VI_ATTR_TERMCHAR_EN:
        session.setTermCharEnabled(value != 0);
        break;
    case VI_ATTR_RSRC_IMPL_VERSION:
    case VI_ATTR_RSRC_SPEC_VERSION:
    case VI_ATTR_RSRC_MANF_ID:
    case VI_ATTR_RSRC_NAME:
    case VI_ATTR_INTF_INST_NAME:
    case VI_ATTR_RSRC_MANF_NAME:
        return VI_ERROR_ATTR_READONLY;
    default:
        return VI_ERROR_NSUP_ATTR;
    }
    return VI_SUCCESS;
}

// ---- events

LbPmxVisa::CIPmxEventListener* CLbPmxInstrSesn::listenerFor(ViEventType type)
{
    switch (type) {
    case VI_EVENT_SERVICE_REQ:
        return &m_cSrqListener;
    case VI_EVENT_USB_INTR:
        return &m_cUsbListener;
    case VI_EVENT_EXCEPTION:
        return &m_cExceptionListener;
    default:
        return nullptr;
    }
}

ViStatus CLbPmxInstrSesn::enableListener(ViEventType type, bool enable)
{
    if (type == VI_EVENT_IO_COMPLETION) {
        return VI_SUCCESS;
    }
    LbPmxVisa::CIPmxEventListener* listener = listenerFor(type);
    if (listener == nullptr) {
        return VI_ERROR_INV_EVENT;
    }
    try {
        LbPmxVisa::CPmxEventDispatcher& events = m_pcSession->getEventDispatcher();
        bool changed = enable ? events.addListener(listener) : events.removeListener(listener);
        return changed ? VI_SUCCESS : VI_ERROR_SYSTEM_ERROR;
    } catch (...) {
        return VI_ERROR_SYSTEM_ERROR;
    }
}

ViStatus CLbPmxInstrSesn::viEnableEvent(ViEventType type, ViUInt16, ViEventFilter)
{
    return enableListener(type, true);
}

ViStatus CLbPmxInstrSesn::viDisableEvent(ViEventType type, ViUInt16)
{
    return enableListener(type, false);
}

} // namespace LbPmxPassport
