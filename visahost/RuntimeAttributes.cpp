// Attributes: the runtime answers those of resource managers, event contexts and the
// runtime-level ones of sessions (queue length, user data, lock state, resource manager)
// itself and routes all other session attributes to the passport; interface attributes the
// passport does not answer come from its viParseRsrcEx. Also viStatusDesc.
#include "visahost/RuntimeInternal.h"

namespace LbVisaHost {

namespace {

const char g_szManufacturer[] = "LB VISA host";
const ViUInt16 g_nManufacturerId = 0x0000;
const ViUInt32 g_nImplVersion = 0x00100000;

} // namespace

// Interface attributes of a session that its passport does not answer: from the same
// viParseRsrcEx the resource manager answers with (the passport's own answers stand).
ViStatus CRuntime::parsedAttribute(const CSession& c, ViAttr nAttr, void* pValue)
{
    const SParsedRsrc& s = c.m_sParsed;
    if (nAttr == VI_ATTR_RSRC_SPEC_VERSION) {
        store<ViVersion>(pValue, VI_SPEC_VERSION);
        return VI_SUCCESS;
    }
    if (!s.m_bParsed)
        return VI_ERROR_NSUP_ATTR;
    switch (nAttr) {
    case VI_ATTR_INTF_TYPE:
        store<ViUInt16>(pValue, s.m_nIntfType);
        return VI_SUCCESS;
    case VI_ATTR_INTF_NUM:
        store<ViUInt16>(pValue, s.m_nIntfNum);
        return VI_SUCCESS;
    case VI_ATTR_RSRC_CLASS:
        copyText(static_cast<ViChar*>(pValue), s.m_strClass);
        return VI_SUCCESS;
    case VI_ATTR_INTF_INST_NAME:
        // The interface part of the expanded name ("USB0" of "USB0::...").
        copyText(static_cast<ViChar*>(pValue), s.m_strExpanded.substr(0, s.m_strExpanded.find("::")));
        return VI_SUCCESS;
    default:
        return VI_ERROR_NSUP_ATTR;
    }
}

ViStatus CRuntime::runtimeAttribute(const PObject& pc, ViAttr nAttr, void* pValue, bool& bDone)
{
    LbCore::CMutexLock aGuard(g_aRuntimeMutex);
    bDone = true;
    switch (pc->m_eKind) {
    case EKind::Event: {
        const auto& cEvent = static_cast<const CEventContext&>(*pc);
        bool bException = cEvent.m_nEventType == VI_EVENT_EXCEPTION;
        bool bCompletion = cEvent.m_nEventType == VI_EVENT_IO_COMPLETION;
        if (nAttr == VI_ATTR_EVENT_TYPE)
            store<ViEventType>(pValue, cEvent.m_nEventType);
        else if ((bException || bCompletion) && nAttr == VI_ATTR_STATUS)
            store<ViStatus>(pValue, cEvent.m_nStatus);
        else if ((bException || bCompletion) && nAttr == VI_ATTR_OPER_NAME)
            copyText(static_cast<ViChar*>(pValue), cEvent.m_strOperName);
        else if (bCompletion && nAttr == VI_ATTR_JOB_ID)
            store<ViJobId>(pValue, cEvent.m_nJobId);
        else if (bCompletion && nAttr == VI_ATTR_RET_COUNT_32)
            store<ViUInt32>(pValue, static_cast<ViUInt32>(cEvent.m_nRetCount));
        else if (bCompletion && nAttr == VI_ATTR_RET_COUNT_64)
            store<ViUInt64>(pValue, cEvent.m_nRetCount);
        else if (bCompletion && nAttr == VI_ATTR_BUFFER)
            store<ViAddr>(pValue, cEvent.m_pBuffer);
        else
            return VI_ERROR_NSUP_ATTR;
        return VI_SUCCESS;
    }
    case EKind::FindList:
        return VI_ERROR_NSUP_ATTR;
    case EKind::ResourceManager:
    case EKind::Session:
        break;
    }
    const auto& cHolder = static_cast<const CAttributeHolder&>(*pc);
    PSession pcSession = as<CSession>(pc, EKind::Session);
    switch (nAttr) {
    case VI_ATTR_MAX_QUEUE_LENGTH:
        store<ViUInt32>(pValue, cHolder.m_nMaxQueue);
        return VI_SUCCESS;
    case VI_ATTR_USER_DATA_64:
        store<ViUInt64>(pValue, cHolder.m_nUserData);
        return VI_SUCCESS;
    case VI_ATTR_USER_DATA_32:
        store<ViUInt32>(pValue, static_cast<ViUInt32>(cHolder.m_nUserData));
        return VI_SUCCESS;
    case VI_ATTR_RSRC_LOCK_STATE: {
        ViAccessMode nState = VI_NO_LOCK;
        if (pcSession) {
            auto it = m_mapRsrcLocks.find(pcSession->m_strLockKey);
            if (it != m_mapRsrcLocks.end()) {
                if (it->second.m_nExclusive)
                    nState = VI_EXCLUSIVE_LOCK;
                else if (!it->second.m_mapShared.empty())
                    nState = VI_SHARED_LOCK;
            }
        }
        store<ViAccessMode>(pValue, nState);
        return VI_SUCCESS;
    }
    default:
        break;
    }
    if (pcSession) {
        if (nAttr != VI_ATTR_RM_SESSION) {
            bDone = false;
            return VI_SUCCESS;
        }
        store<ViSession>(pValue, pcSession->m_nRm);
        return VI_SUCCESS;
    }
    switch (nAttr) {
    case VI_ATTR_RM_SESSION:
        store<ViSession>(pValue, pc->m_nHandle); // a resource manager is its own
        return VI_SUCCESS;
    case VI_ATTR_RSRC_IMPL_VERSION:
        store<ViVersion>(pValue, g_nImplVersion);
        return VI_SUCCESS;
    case VI_ATTR_RSRC_SPEC_VERSION:
        store<ViVersion>(pValue, VI_SPEC_VERSION);
        return VI_SUCCESS;
    case VI_ATTR_RSRC_MANF_ID:
        store<ViUInt16>(pValue, g_nManufacturerId);
        return VI_SUCCESS;
    case VI_ATTR_RSRC_MANF_NAME:
        copyText(static_cast<ViChar*>(pValue), g_szManufacturer);
        return VI_SUCCESS;
    default:
        return VI_ERROR_NSUP_ATTR;
    }
}

ViStatus CRuntime::getAttribute(ViObject nVi, ViAttr nAttr, void* pValue)
{
    PObject pc;
    {
        LbCore::CMutexLock aGuard(g_aRuntimeMutex);
        pc = find(nVi);
        PSession pcSession = as<CSession>(pc, EKind::Session);
        if (!pc || (pcSession && pcSession->m_bClosing))
            return VI_ERROR_INV_OBJECT;
    }
    if (!pValue)
        return VI_ERROR_INV_PARAMETER;
    bool bDone = false;
    ViStatus nStatus = runtimeAttribute(pc, nAttr, pValue, bDone);
    if (bDone)
        return nStatus;
    nStatus = route<FGetAttribute>(nVi, "viGetAttribute", false, nAttr, pValue);
    if (nStatus != VI_ERROR_NSUP_ATTR && nStatus != VI_ERROR_NSUP_OPER)
        return nStatus;
    ViStatus nOwn = parsedAttribute(static_cast<const CSession&>(*pc), nAttr, pValue);
    return nOwn == VI_SUCCESS ? nOwn : nStatus;
}

ViStatus CRuntime::setAttribute(ViObject nVi, ViAttr nAttr, ViAttrState nValue)
{
    PSession pcSession;
    {
        LbCore::CMutexLock aGuard(g_aRuntimeMutex);
        PObject pc = find(nVi);
        pcSession = as<CSession>(pc, EKind::Session);
        if (!pc || (pcSession && pcSession->m_bClosing))
            return VI_ERROR_INV_OBJECT;
        if (pc->m_eKind == EKind::Event || pc->m_eKind == EKind::FindList)
            return nAttr == VI_ATTR_EVENT_TYPE ? VI_ERROR_ATTR_READONLY : VI_ERROR_NSUP_ATTR;
        auto& cHolder = static_cast<CAttributeHolder&>(*pc);
        switch (nAttr) {
        case VI_ATTR_MAX_QUEUE_LENGTH:
            if (cHolder.m_bQueueFixed)
                return VI_ERROR_ATTR_READONLY;
            if (nValue == 0 || nValue > 0xFFFFFFFFull)
                return VI_ERROR_NSUP_ATTR_STATE;
            cHolder.m_nMaxQueue = static_cast<ViUInt32>(nValue);
            return VI_SUCCESS;
        case VI_ATTR_USER_DATA_64:
            cHolder.m_nUserData = nValue;
            return VI_SUCCESS;
        case VI_ATTR_USER_DATA_32:
            cHolder.m_nUserData = static_cast<ViUInt32>(nValue);
            return VI_SUCCESS;
        case VI_ATTR_RSRC_LOCK_STATE:
        case VI_ATTR_RM_SESSION:
            return VI_ERROR_ATTR_READONLY;
        default:
            break;
        }
        if (!pcSession) {
            switch (nAttr) {
            case VI_ATTR_RSRC_IMPL_VERSION:
            case VI_ATTR_RSRC_SPEC_VERSION:
            case VI_ATTR_RSRC_MANF_ID:
            case VI_ATTR_RSRC_MANF_NAME:
                return VI_ERROR_ATTR_READONLY;
            default:
                return VI_ERROR_NSUP_ATTR;
            }
        }
    }
    ViStatus nStatus = route<FSetAttribute>(nVi, "viSetAttribute", true, nAttr, nValue);
    if (nStatus != VI_ERROR_NSUP_ATTR && nStatus != VI_ERROR_NSUP_OPER)
        return nStatus;
    // An interface attribute the runtime answers for the passport (see getAttribute) is
    // read-only; what the passport answers itself keeps the passport's status.
    alignas(8) ViChar acValue[1024];
    ViStatus nGet = route<FGetAttribute>(nVi, "viGetAttribute", false, nAttr, static_cast<void*>(acValue));
    bool bOwn = (nGet == VI_ERROR_NSUP_ATTR || nGet == VI_ERROR_NSUP_OPER) &&
        parsedAttribute(*pcSession, nAttr, acValue) == VI_SUCCESS;
    if (bOwn)
        return VI_ERROR_ATTR_READONLY;
    if (nStatus == VI_ERROR_NSUP_ATTR)
        operationFailed(nVi, nStatus, "viSetAttribute");
    return nStatus;
}

ViStatus CRuntime::statusDesc(ViObject, ViStatus nStatus, ViChar szDesc[])
{
    // Any handle is accepted: a description is most wanted after a session failed.
    if (!szDesc)
        return VI_ERROR_USER_BUF;
    std::string strText;
    bool bKnown = statusText(nStatus, strText);
    copyText(szDesc, strText);
    return bKnown ? VI_SUCCESS : VI_WARN_UNKNOWN_STATUS;
}

} // namespace LbVisaHost
