// CSessionIo: the formatted-I/O buffers of one session of the VISA C library, and the registry
// of them. The write buffer collects viPrintf / viBufWrite output and goes to the device with
// viWrite when it is full, when a format ends with "\n", at every call in VI_FLUSH_ON_ACCESS
// mode, before a formatted read, on viFlush and on viClose. The read buffer holds what viRead
// delivered for viScanf / viBufRead; it keeps unread bytes for the next call unless its mode is
// VI_FLUSH_ON_ACCESS. A read that ends with END or the termination character ends a message.
// A read the device refuses with VI_ERROR_USER_BUF (its answer does not fit) is repeated with
// twice the count, up to g_nMaxReadGrowth; the buffer size the user set stays as it is.
// Every operation of a session runs under that session's lock.
#ifndef LBVISAHOST_BUFFEREDIO_H
#define LBVISAHOST_BUFFEREDIO_H

#include <map>
#include <memory>
#include <string>

#include "core/ThreadSafety.h"
#include "visahost/FormattedIo.h"

namespace LbVisaHost {

const ViUInt32 g_nDefaultBufferSize = 4096;
// A read for a scan grows to this size at most while the device refuses it as too small.
const ViUInt32 g_nMaxReadGrowth = 64u * 1024 * 1024;

// The session attributes the library keeps: those of the buffers, and whether viReadToFile
// appends (VI_ATTR_FILE_APPEND_EN).
inline bool isBufferAttribute(ViAttr nAttr)
{
    return nAttr == VI_ATTR_RD_BUF_OPER_MODE || nAttr == VI_ATTR_WR_BUF_OPER_MODE || nAttr == VI_ATTR_RD_BUF_SIZE ||
        nAttr == VI_ATTR_WR_BUF_SIZE || nAttr == VI_ATTR_FILE_APPEND_EN;
}

class CSessionIo {
public:
    explicit CSessionIo(ViSession nVi) : m_nVi(nVi) { }

    // The session's buffers; null with nStatus for a handle that is no session.
    static std::shared_ptr<CSessionIo> of(ViSession nVi, ViStatus& nStatus);
    // Forgets the buffers of sessions that no longer exist (after a viClose).
    static void forgetClosed();

    // The operations; each runs whole under the session's lock.
    ViStatus print(ViConstString szFormat, SArgs& sArgs) EXCLUDES(m_aMutex);
    ViStatus scan(ViConstString szFormat, SArgs& sArgs) EXCLUDES(m_aMutex);
    ViStatus query(ViConstString szWrite, ViConstString szRead, SArgs& sArgs) EXCLUDES(m_aMutex);
    ViStatus bufWrite(const std::string& strData) EXCLUDES(m_aMutex);
    ViStatus bufRead(ViPBuf pBuf, ViUInt32 nCount, ViPUInt32 pnRet) EXCLUDES(m_aMutex);
    ViStatus flush(ViUInt16 nMask) EXCLUDES(m_aMutex);
    ViStatus setBuffer(ViUInt16 nMask, ViUInt32 nSize) EXCLUDES(m_aMutex);
    // VI_ATTR_RD_BUF_OPER_MODE and the other buffer attributes (see isBufferAttribute).
    void getAttribute(ViAttr nAttr, void* pValue) EXCLUDES(m_aMutex);
    ViStatus setAttribute(ViAttr nAttr, ViAttrState nValue) EXCLUDES(m_aMutex);
    bool appendsToFiles() EXCLUDES(m_aMutex);
    // Sends the write buffer unless another thread's operation holds the session (a scan that
    // waits for the device must not hold up viClose).
    void flushIfIdle() NO_THREAD_SAFETY_ANALYSIS;

private:
    class CInput;
    ViStatus write(const std::string& strData, bool bEndOfMessage) REQUIRES(m_aMutex);
    ViStatus flushWrite() REQUIRES(m_aMutex);
    ViStatus printLocked(ViConstString szFormat, SArgs& sArgs) REQUIRES(m_aMutex);
    ViStatus scanLocked(ViConstString szFormat, SArgs& sArgs) REQUIRES(m_aMutex);
    // A formatted read starts: the write buffer goes out, a finished message is dropped.
    ViStatus beginRead() REQUIRES(m_aMutex);
    void endRead() REQUIRES(m_aMutex);
    int peek() REQUIRES(m_aMutex);
    ViStatus readMore() REQUIRES(m_aMutex);

    const ViSession m_nVi;
    LbCore::CMutex m_aMutex;
    std::string m_strWrite GUARDED_BY(m_aMutex);
    ViUInt32 m_nWriteSize GUARDED_BY(m_aMutex) = g_nDefaultBufferSize;
    ViUInt16 m_nWriteMode GUARDED_BY(m_aMutex) = VI_FLUSH_WHEN_FULL;
    std::string m_strRead GUARDED_BY(m_aMutex);
    size_t m_nReadPos GUARDED_BY(m_aMutex) = 0;
    ViUInt32 m_nReadSize GUARDED_BY(m_aMutex) = g_nDefaultBufferSize;
    ViUInt16 m_nReadMode GUARDED_BY(m_aMutex) = VI_FLUSH_DISABLE;
    bool m_bEnd GUARDED_BY(m_aMutex) = false; // the read buffer holds the end of a message
    ViStatus m_nReadStatus GUARDED_BY(m_aMutex) = VI_SUCCESS;
    ViBoolean m_bAppend GUARDED_BY(m_aMutex) = VI_FALSE;
};

} // namespace LbVisaHost

#endif
