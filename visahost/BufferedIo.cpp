// The formatted-I/O buffers of sessions (see BufferedIo.h).
#include "visahost/BufferedIo.h"

#include <algorithm>
#include <cstring>
#include <vector>

#include "visahost/VisaApiInternal.h"

namespace LbVisaHost {

namespace {

LbCore::CMutex g_aRegistryMutex;
std::map<ViSession, std::shared_ptr<CSessionIo>> g_mapSessions GUARDED_BY(g_aRegistryMutex);

const ViUInt16 g_nAllFlushMasks = VI_READ_BUF | VI_WRITE_BUF | VI_READ_BUF_DISCARD | VI_WRITE_BUF_DISCARD |
    VI_IO_IN_BUF | VI_IO_OUT_BUF | VI_IO_IN_BUF_DISCARD | VI_IO_OUT_BUF_DISCARD;
// The buffers of the serial driver below the formatted-I/O buffers, which these resources lack.
const ViUInt16 g_nLowerBuffers = VI_IO_IN_BUF | VI_IO_OUT_BUF | VI_IO_IN_BUF_DISCARD | VI_IO_OUT_BUF_DISCARD;

// VI_SUCCESS for a session, VI_ERROR_INV_OBJECT for no object, VI_ERROR_NSUP_OPER otherwise.
ViStatus sessionKind(ViSession nVi)
{
    ViSession nRm = VI_NULL;
    ViStatus nStatus = api().getAttribute(nVi, VI_ATTR_RM_SESSION, &nRm);
    if (nStatus == VI_ERROR_INV_OBJECT)
        return nStatus;
    // A resource manager is its own resource manager.
    return nStatus == VI_SUCCESS && nRm != nVi ? VI_SUCCESS : VI_ERROR_NSUP_OPER;
}

} // namespace

std::shared_ptr<CSessionIo> CSessionIo::of(ViSession nVi, ViStatus& nStatus)
{
    nStatus = sessionKind(nVi);
    if (nStatus != VI_SUCCESS)
        return nullptr;
    LbCore::CMutexLock aGuard(g_aRegistryMutex);
    auto& pc = g_mapSessions[nVi];
    if (!pc)
        pc = std::make_shared<CSessionIo>(nVi);
    return pc;
}

void CSessionIo::forgetClosed()
{
    std::vector<ViSession> vKnown;
    {
        LbCore::CMutexLock aGuard(g_aRegistryMutex);
        for (const auto& sEntry : g_mapSessions)
            vKnown.push_back(sEntry.first);
    }
    for (ViSession nVi : vKnown) {
        if (sessionKind(nVi) != VI_ERROR_INV_OBJECT)
            continue;
        LbCore::CMutexLock aGuard(g_aRegistryMutex);
        g_mapSessions.erase(nVi);
    }
}

ViStatus CSessionIo::flushWrite()
{
    size_t nDone = 0;
    while (nDone < m_strWrite.size()) {
        ViUInt32 nRet = 0;
        ViStatus nStatus = api().write(m_nVi, reinterpret_cast<ViConstBuf>(m_strWrite.data() + nDone),
                                       static_cast<ViUInt32>(m_strWrite.size() - nDone), &nRet);
        if (nStatus < VI_SUCCESS) {
            m_strWrite.clear(); // what the device did not take is lost, as the failure reports
            return nStatus;
        }
        if (nRet == 0)
            break;
        nDone += nRet;
    }
    m_strWrite.clear();
    return VI_SUCCESS;
}

// The bytes of the read buffer, read from the device on demand, for scanning.
class CSessionIo::CInput : public CScanInput {
public:
    explicit CInput(CSessionIo& c) : m_c(c) { }
    // Used only within scanLocked, which holds the session's lock.
    int peek() override NO_THREAD_SAFETY_ANALYSIS { return m_c.peek(); }
    void next() override NO_THREAD_SAFETY_ANALYSIS { ++m_c.m_nReadPos; }
    ViStatus status() const override NO_THREAD_SAFETY_ANALYSIS { return m_c.m_nReadStatus; }

private:
    CSessionIo& m_c;
};

ViStatus CSessionIo::printLocked(ViConstString szFormat, SArgs& sArgs)
{
    std::string strOut;
    ViStatus nStatus = formatOutput(szFormat, sArgs, strOut);
    if (nStatus < VI_SUCCESS)
        return nStatus;
    // A format that ends with "\n" ends the message: the buffer goes to the device.
    size_t nLength = std::strlen(szFormat);
    return write(strOut, nLength > 0 && szFormat[nLength - 1] == '\n');
}

ViStatus CSessionIo::scanLocked(ViConstString szFormat, SArgs& sArgs)
{
    ViStatus nStatus = beginRead();
    if (nStatus < VI_SUCCESS)
        return nStatus;
    CInput cInput(*this);
    nStatus = scanInput(szFormat, sArgs, cInput);
    endRead();
    return nStatus;
}

ViStatus CSessionIo::print(ViConstString szFormat, SArgs& sArgs)
{
    LbCore::CMutexLock aGuard(m_aMutex);
    return printLocked(szFormat, sArgs);
}

ViStatus CSessionIo::scan(ViConstString szFormat, SArgs& sArgs)
{
    LbCore::CMutexLock aGuard(m_aMutex);
    return scanLocked(szFormat, sArgs);
}

ViStatus CSessionIo::query(ViConstString szWrite, ViConstString szRead, SArgs& sArgs)
{
    LbCore::CMutexLock aGuard(m_aMutex);
    // The query goes out whole before the answer is read, "\n" or not.
    ViStatus nStatus = printLocked(szWrite, sArgs);
    if (nStatus >= VI_SUCCESS)
        nStatus = flushWrite();
    if (nStatus >= VI_SUCCESS)
        nStatus = scanLocked(szRead, sArgs);
    return nStatus;
}

ViStatus CSessionIo::bufWrite(const std::string& strData)
{
    LbCore::CMutexLock aGuard(m_aMutex);
    return write(strData, false);
}

ViStatus CSessionIo::write(const std::string& strData, bool bEndOfMessage)
{
    m_strWrite += strData;
    if (m_strWrite.size() >= m_nWriteSize || bEndOfMessage || m_nWriteMode == VI_FLUSH_ON_ACCESS)
        return flushWrite();
    return VI_SUCCESS;
}

ViStatus CSessionIo::readMore()
{
    m_strRead.erase(0, m_nReadPos);
    m_nReadPos = 0;
    size_t nOld = m_strRead.size();
    ViUInt32 nCount = m_nReadSize;
    ViUInt32 nRet = 0;
    ViStatus nStatus = VI_SUCCESS;
    for (;;) {
        m_strRead.resize(nOld + nCount);
        nRet = 0;
        nStatus = api().read(m_nVi, reinterpret_cast<ViPBuf>(&m_strRead[nOld]), nCount, &nRet);
        // A device that delivers its answers whole refuses a smaller read and keeps the answer:
        // this read asks again for twice as much, so that a scan gets any sane answer whole.
        if (nStatus != VI_ERROR_USER_BUF || nCount >= g_nMaxReadGrowth)
            break;
        nCount = nCount > g_nMaxReadGrowth / 2 ? g_nMaxReadGrowth : nCount * 2;
    }
    m_strRead.resize(nOld + (nStatus < VI_SUCCESS ? 0 : std::min(nRet, nCount)));
    if (nStatus < VI_SUCCESS) {
        m_nReadStatus = nStatus;
        return nStatus;
    }
    // A read that stops short of the count without END is treated as the end of the message too,
    // so that scanning never waits for data the device will not send.
    m_bEnd = nStatus != VI_SUCCESS_MAX_CNT || nRet == 0;
    return nStatus;
}

int CSessionIo::peek()
{
    while (m_nReadPos >= m_strRead.size()) {
        if (m_bEnd || m_nReadStatus < VI_SUCCESS)
            return -1;
        if (readMore() < VI_SUCCESS)
            return -1;
    }
    return static_cast<unsigned char>(m_strRead[m_nReadPos]);
}

ViStatus CSessionIo::beginRead()
{
    ViStatus nStatus = flushWrite();
    if (nStatus < VI_SUCCESS)
        return nStatus;
    m_nReadStatus = VI_SUCCESS;
    if (m_nReadPos >= m_strRead.size() && m_bEnd) {
        m_strRead.clear();
        m_nReadPos = 0;
        m_bEnd = false;
    }
    return VI_SUCCESS;
}

void CSessionIo::endRead()
{
    if (m_nReadMode != VI_FLUSH_ON_ACCESS)
        return;
    m_strRead.clear();
    m_nReadPos = 0;
    m_bEnd = false;
}

ViStatus CSessionIo::flush(ViUInt16 nMask)
{
    LbCore::CMutexLock aGuard(m_aMutex);
    if (nMask == 0 || (nMask & ~g_nAllFlushMasks) != 0)
        return VI_ERROR_INV_MASK;
    if ((nMask & VI_READ_BUF) && (nMask & VI_READ_BUF_DISCARD))
        return VI_ERROR_INV_MASK;
    if ((nMask & VI_WRITE_BUF) && (nMask & VI_WRITE_BUF_DISCARD))
        return VI_ERROR_INV_MASK;
    ViStatus nResult = VI_SUCCESS;
    if (nMask & VI_WRITE_BUF)
        nResult = flushWrite();
    if (nMask & VI_WRITE_BUF_DISCARD)
        m_strWrite.clear();
    if (nMask & VI_READ_BUF) {
        // The rest of a message that was begun is read and dropped.
        bool bBegun = m_nReadPos < m_strRead.size() && !m_bEnd;
        m_nReadStatus = VI_SUCCESS;
        while (bBegun && !m_bEnd) {
            m_strRead.clear();
            m_nReadPos = 0;
            ViStatus nStatus = readMore();
            if (nStatus < VI_SUCCESS) {
                nResult = nStatus;
                break;
            }
        }
    }
    if (nMask & (VI_READ_BUF | VI_READ_BUF_DISCARD)) {
        m_strRead.clear();
        m_nReadPos = 0;
        m_bEnd = false;
    }
    return nResult;
}

ViStatus CSessionIo::setBuffer(ViUInt16 nMask, ViUInt32 nSize)
{
    LbCore::CMutexLock aGuard(m_aMutex);
    if (nMask == 0 || (nMask & ~(VI_READ_BUF | VI_WRITE_BUF | VI_IO_IN_BUF | VI_IO_OUT_BUF)) != 0)
        return VI_ERROR_INV_MASK;
    nSize = std::max<ViUInt32>(nSize, 1);
    if (nMask & VI_WRITE_BUF) {
        ViStatus nStatus = flushWrite();
        if (nStatus < VI_SUCCESS)
            return nStatus;
        m_nWriteSize = nSize;
    }
    if (nMask & VI_READ_BUF)
        m_nReadSize = nSize;
    return (nMask & g_nLowerBuffers) ? VI_WARN_NSUP_BUF : VI_SUCCESS;
}

ViStatus CSessionIo::bufRead(ViPBuf pBuf, ViUInt32 nCount, ViPUInt32 pnRet)
{
    LbCore::CMutexLock aGuard(m_aMutex);
    if (pnRet)
        *pnRet = 0;
    if (!pBuf)
        return VI_ERROR_USER_BUF;
    ViStatus nStatus = beginRead();
    if (nStatus < VI_SUCCESS)
        return nStatus;
    if (m_nReadPos >= m_strRead.size() && !m_bEnd && (nStatus = readMore()) < VI_SUCCESS)
        return nStatus;
    size_t n = std::min<size_t>(nCount, m_strRead.size() - m_nReadPos);
    std::memcpy(pBuf, m_strRead.data() + m_nReadPos, n);
    m_nReadPos += n;
    if (pnRet)
        *pnRet = static_cast<ViUInt32>(n);
    return m_nReadPos >= m_strRead.size() && m_bEnd ? VI_SUCCESS : VI_SUCCESS_MAX_CNT;
}

void CSessionIo::getAttribute(ViAttr nAttr, void* pValue)
{
    LbCore::CMutexLock aGuard(m_aMutex);
    switch (nAttr) {
    case VI_ATTR_RD_BUF_OPER_MODE:
        std::memcpy(pValue, &m_nReadMode, sizeof m_nReadMode);
        break;
    case VI_ATTR_WR_BUF_OPER_MODE:
        std::memcpy(pValue, &m_nWriteMode, sizeof m_nWriteMode);
        break;
    case VI_ATTR_RD_BUF_SIZE:
        std::memcpy(pValue, &m_nReadSize, sizeof m_nReadSize);
        break;
    case VI_ATTR_FILE_APPEND_EN:
        std::memcpy(pValue, &m_bAppend, sizeof m_bAppend);
        break;
    default:
        std::memcpy(pValue, &m_nWriteSize, sizeof m_nWriteSize);
        break;
    }
}

ViStatus CSessionIo::setAttribute(ViAttr nAttr, ViAttrState nValue)
{
    LbCore::CMutexLock aGuard(m_aMutex);
    switch (nAttr) {
    case VI_ATTR_RD_BUF_OPER_MODE:
        if (nValue != VI_FLUSH_ON_ACCESS && nValue != VI_FLUSH_DISABLE)
            return VI_ERROR_NSUP_ATTR_STATE;
        m_nReadMode = static_cast<ViUInt16>(nValue);
        return VI_SUCCESS;
    case VI_ATTR_WR_BUF_OPER_MODE:
        if (nValue != VI_FLUSH_ON_ACCESS && nValue != VI_FLUSH_WHEN_FULL)
            return VI_ERROR_NSUP_ATTR_STATE;
        m_nWriteMode = static_cast<ViUInt16>(nValue);
        return VI_SUCCESS;
    case VI_ATTR_FILE_APPEND_EN:
        if (nValue != VI_TRUE && nValue != VI_FALSE)
            return VI_ERROR_NSUP_ATTR_STATE;
        m_bAppend = static_cast<ViBoolean>(nValue);
        return VI_SUCCESS;
    default:
        return VI_ERROR_ATTR_READONLY; // the sizes: viSetBuf sets them
    }
}

void CSessionIo::flushIfIdle()
{
    if (!m_aMutex.native().try_lock())
        return;
    flushWrite();
    m_aMutex.native().unlock();
}

bool CSessionIo::appendsToFiles()
{
    LbCore::CMutexLock aGuard(m_aMutex);
    return m_bAppend == VI_TRUE;
}

} // namespace LbVisaHost
