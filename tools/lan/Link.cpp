#include "tools/lan/Gateway.h"

#include <algorithm>
#include <chrono>
#include <cstdint>
#include <map>

namespace LbPmxLan {

namespace {

// A long wait for data is split into slices of this length; between slices the gateway checks
// whether the client is still there.
constexpr unsigned long READ_SLICE_MS = 1000;
// VI_TMO_INFINITE and other huge client timeouts are bounded by a day.
constexpr unsigned long LONGEST_WAIT_MS = 24ul * 3600 * 1000;
// A sensor hands out an answer whole or not at all, so a link reads it into a buffer of its own
// that starts at this size and grows (up to the largest answer) while the answer does not fit.
constexpr std::size_t FIRST_ANSWER_BUFFER = 65536;
constexpr std::size_t LARGEST_ANSWER = 16 * 1048576;
// How long the check whether a failed session's sensor is gone waits for the sensor's turn.
constexpr unsigned long PROBE_TIMEOUT_MS = 2000;
constexpr long REASON_REQCNT = 0x01;
constexpr long REASON_CHR = 0x02;
constexpr long REASON_END = 0x04;

Clock::time_point deadlineIn(unsigned long ms)
{
    return Clock::now() + std::chrono::milliseconds(std::min(ms, LONGEST_WAIT_MS));
}

unsigned long remainingMs(Clock::time_point deadline)
{
    auto left = std::chrono::duration_cast<std::chrono::milliseconds>(deadline - Clock::now()).count();
    return left > 0 ? static_cast<unsigned long>(left) : 0;
}

// Service-request callbacks by number: the runtime's handler thread finds a callback here, so a
// link closing at the same time never leaves it holding a dangling pointer.
std::mutex s_cSrqMutex;
std::map<std::uintptr_t, std::function<void()>> s_mapSrq;
std::uintptr_t s_nNextSrq = 1;

} // namespace

CLink::CLink(CGateway& gateway, CSensor& sensor, ViSession session)
    : m_cGateway(gateway), m_cSensor(sensor), m_nSession(session), m_vecBuffer(FIRST_ANSWER_BUFFER)
{
}

CLink::~CLink()
{
    endTurn();
    enableSrq(false, nullptr);
    if (m_bLocked) {
        viUnlock(m_nSession);
    }
    viClose(m_nSession);
    m_cGateway.released(m_cSensor);
}

ViStatus CLink::setTimeout(unsigned long ms)
{
    ms = std::min(ms, LONGEST_WAIT_MS);
    if (ms == m_nTimeout)
        return VI_SUCCESS;
    ViStatus status = viSetAttribute(m_nSession, VI_ATTR_TMO_VALUE, ms);
    if (status >= VI_SUCCESS)
        m_nTimeout = ms;
    return status;
}

bool CLink::waitTurn(std::unique_lock<std::mutex>& guard, Clock::time_point deadline)
{
    while (m_cSensor.m_bBusy) {
        if (m_cGateway.m_cChanged.wait_until(guard, deadline) == std::cv_status::timeout && m_cSensor.m_bBusy) {
            return false;
        }
    }
    m_cSensor.m_bBusy = true;
    return true;
}

void CLink::giveTurn(std::unique_lock<std::mutex>&)
{
    m_cSensor.m_bBusy = false;
    ++m_cGateway.m_nReleases;
    m_cGateway.m_cChanged.notify_all();
}

long CLink::beginTurn(unsigned long ioTimeout)
{
    std::unique_lock<std::mutex> guard(m_cGateway.m_cMutex);
    if (m_bHoldsTurn)
        return VXI11_OK;
    if (!waitTurn(guard, deadlineIn(ioTimeout)))
        return VXI11_IO_TIMEOUT;
    m_bHoldsTurn = true;
    return VXI11_OK;
}

void CLink::endTurn()
{
    std::unique_lock<std::mutex> guard(m_cGateway.m_cMutex);
    if (m_bHoldsTurn) {
        m_bHoldsTurn = false;
        giveTurn(guard);
    }
}

ViStatus CLink::exclusive(unsigned long ioTimeout, unsigned long lockTimeout, bool waitLock,
                          const std::function<ViStatus()>& op)
{
    if (m_bHoldsTurn) {
        return op(); // the sensor is this link's already (a socket query in progress)
    }
    Clock::time_point ioDeadline = deadlineIn(ioTimeout);
    Clock::time_point lockDeadline = deadlineIn(waitLock ? lockTimeout : 0);
    std::unique_lock<std::mutex> guard(m_cGateway.m_cMutex);
    for (;;) {
        if (!waitTurn(guard, ioDeadline)) {
            return VI_ERROR_TMO;
        }
        std::uint64_t releases = m_cGateway.m_nReleases;
        guard.unlock();
        ViStatus status = op();
        guard.lock();
        giveTurn(guard);
        if (status != VI_ERROR_RSRC_LOCKED || !waitLock) {
            return status;
        }
        // Another link holds the lock: wait for any release, then try again.
        ++releases;
        if (!m_cGateway.m_cChanged.wait_until(guard, lockDeadline, [&] { return m_cGateway.m_nReleases > releases; })) {
            return status;
        }
    }
}

void CLink::dropAnswer()
{
    m_strAnswer.clear();
    m_nAnswerAt = 0;
}

long CLink::write(const char* data, std::size_t size, unsigned long ioTimeout, unsigned long lockTimeout, bool waitLock,
                  unsigned long& written)
{
    dropAnswer(); // a new message makes what is left of the last answer stale
    ViUInt32 count = 0;
    ViStatus status = exclusive(ioTimeout, lockTimeout, waitLock, [&] {
        ViStatus s = setTimeout(ioTimeout);
        return s < VI_SUCCESS
            ? s
            : viWrite(m_nSession, reinterpret_cast<ViConstBuf>(data), static_cast<ViUInt32>(size), &count);
    });
    m_bFailed = status < VI_SUCCESS;
    written = count;
    return vxi11ErrorOf(status);
}

ViStatus CLink::fetchAnswer(unsigned long ioTimeout, unsigned long lockTimeout, bool waitLock,
                            const std::function<bool()>& gone)
{
    Clock::time_point deadline = deadlineIn(ioTimeout);
    return exclusive(ioTimeout, lockTimeout, waitLock, [&] {
        for (;;) {
            unsigned long left = remainingMs(deadline);
            ViStatus s = setTimeout(std::min(left, READ_SLICE_MS));
            ViUInt32 count = 0;
            if (s >= VI_SUCCESS) {
                s = viRead(m_nSession, reinterpret_cast<ViPBuf>(m_vecBuffer.data()),
                           static_cast<ViUInt32>(m_vecBuffer.size()), &count);
                if (s >= VI_SUCCESS)
                    m_strAnswer.assign(m_vecBuffer.data(), count);
            }
            if (s == VI_ERROR_USER_BUF && m_vecBuffer.size() < LARGEST_ANSWER) {
                m_vecBuffer.resize(std::min(m_vecBuffer.size() * 4, LARGEST_ANSWER)); // the sensor keeps the answer
                continue;
            }
            if (s != VI_ERROR_TMO || left <= READ_SLICE_MS || gone()) {
                return s;
            }
        }
    });
}

long CLink::read(std::size_t max, unsigned long ioTimeout, unsigned long lockTimeout, bool waitLock, int termChar,
                 const std::function<bool()>& gone, std::string& data, long& reason)
{
    reason = 0;
    data.clear();
    if (max == 0) {
        return VXI11_PARAMETER;
    }
    if (m_nAnswerAt >= m_strAnswer.size()) {
        dropAnswer();
        ViStatus status = fetchAnswer(ioTimeout, lockTimeout, waitLock, gone);
        m_bFailed = status < VI_SUCCESS && status != VI_ERROR_TMO;
        if (status < VI_SUCCESS) {
            dropAnswer();
            return vxi11ErrorOf(status);
        }
    }
    std::size_t take = std::min(max, m_strAnswer.size() - m_nAnswerAt);
    if (termChar >= 0) {
        std::size_t at = m_strAnswer.find(static_cast<char>(termChar), m_nAnswerAt);
        if (at != std::string::npos && at < m_nAnswerAt + take) {
            take = at + 1 - m_nAnswerAt;
            reason |= REASON_CHR;
        }
    }
    data.assign(m_strAnswer, m_nAnswerAt, take);
    m_nAnswerAt += take;
    if (m_nAnswerAt == m_strAnswer.size()) {
        reason |= REASON_END;
        dropAnswer();
    } else if (reason == 0) {
        reason = REASON_REQCNT;
    }
    return VXI11_OK;
}

bool CLink::sensorGone()
{
    if (!m_bFailed)
        return false;
    // A session whose sensor was unplugged fails every call for good, even after the sensor
    // returns; a living one answers its status byte unless another link holds it.
    ViUInt16 stb = 0;
    ViStatus status = exclusive(PROBE_TIMEOUT_MS, 0, false, [&] {
        ViStatus s = setTimeout(PROBE_TIMEOUT_MS);
        return s < VI_SUCCESS ? s : viReadSTB(m_nSession, &stb);
    });
    return status < VI_SUCCESS && status != VI_ERROR_TMO && status != VI_ERROR_RSRC_LOCKED &&
        status != VI_ERROR_RSRC_BUSY;
}

long CLink::readStb(unsigned long ioTimeout, unsigned long lockTimeout, bool waitLock, unsigned char& stb)
{
    ViUInt16 value = 0;
    ViStatus status = exclusive(ioTimeout, lockTimeout, waitLock, [&] {
        ViStatus s = setTimeout(ioTimeout);
        return s < VI_SUCCESS ? s : viReadSTB(m_nSession, &value);
    });
    stb = static_cast<unsigned char>(value);
    return vxi11ErrorOf(status);
}

long CLink::trigger(unsigned long ioTimeout, unsigned long lockTimeout, bool waitLock)
{
    return vxi11ErrorOf(exclusive(ioTimeout, lockTimeout, waitLock, [&] {
        ViStatus s = setTimeout(ioTimeout);
        return s < VI_SUCCESS ? s : viAssertTrigger(m_nSession, VI_TRIG_PROT_DEFAULT);
    }));
}

long CLink::clear(unsigned long ioTimeout, unsigned long lockTimeout, bool waitLock)
{
    dropAnswer();
    return vxi11ErrorOf(exclusive(ioTimeout, lockTimeout, waitLock, [&] {
        ViStatus s = setTimeout(ioTimeout);
        return s < VI_SUCCESS ? s : viClear(m_nSession);
    }));
}

long CLink::lock(unsigned long lockTimeout, bool waitLock)
{
    if (m_bLocked) {
        return VXI11_OK; // one level per link, as VXI-11 knows no nesting
    }
    ViStatus status =
        viLock(m_nSession, VI_EXCLUSIVE_LOCK,
               static_cast<ViUInt32>(waitLock ? std::min(lockTimeout, LONGEST_WAIT_MS) : 0), VI_NULL, VI_NULL);
    if (status == VI_ERROR_TMO || status == VI_ERROR_RSRC_LOCKED) {
        return VXI11_LOCKED;
    }
    m_bLocked = status >= VI_SUCCESS;
    return vxi11ErrorOf(status);
}

long CLink::unlock()
{
    if (!m_bLocked) {
        return VXI11_NO_LOCK;
    }
    viUnlock(m_nSession);
    m_bLocked = false;
    std::lock_guard<std::mutex> guard(m_cGateway.m_cMutex);
    ++m_cGateway.m_nReleases;
    m_cGateway.m_cChanged.notify_all();
    return VXI11_OK;
}

ViStatus _VI_FUNCH CLink::onServiceRequest(ViSession, ViEventType, ViEvent, ViAddr user)
{
    std::function<void()> srq;
    {
        std::lock_guard<std::mutex> guard(s_cSrqMutex);
        auto it = s_mapSrq.find(reinterpret_cast<std::uintptr_t>(user));
        if (it != s_mapSrq.end())
            srq = it->second;
    }
    if (srq)
        srq();
    return VI_SUCCESS;
}

long CLink::enableSrq(bool enable, std::function<void()> srq)
{
    if (m_nSrqId != 0) {
        viDisableEvent(m_nSession, VI_EVENT_SERVICE_REQ, VI_HNDLR);
        viUninstallHandler(m_nSession, VI_EVENT_SERVICE_REQ, onServiceRequest, reinterpret_cast<ViAddr>(m_nSrqId));
        std::lock_guard<std::mutex> guard(s_cSrqMutex);
        s_mapSrq.erase(m_nSrqId);
        m_nSrqId = 0;
    }
    if (!enable) {
        return VXI11_OK;
    }
    std::uintptr_t id;
    {
        std::lock_guard<std::mutex> guard(s_cSrqMutex);
        id = s_nNextSrq++;
        s_mapSrq[id] = srq;
    }
    ViStatus status =
        viInstallHandler(m_nSession, VI_EVENT_SERVICE_REQ, onServiceRequest, reinterpret_cast<ViAddr>(id));
    if (status >= VI_SUCCESS) {
        status = viEnableEvent(m_nSession, VI_EVENT_SERVICE_REQ, VI_HNDLR, VI_NULL);
        if (status < VI_SUCCESS) {
            viUninstallHandler(m_nSession, VI_EVENT_SERVICE_REQ, onServiceRequest, reinterpret_cast<ViAddr>(id));
        }
    }
    if (status < VI_SUCCESS) {
        std::lock_guard<std::mutex> guard(s_cSrqMutex);
        s_mapSrq.erase(id);
        return vxi11ErrorOf(status);
    }
    m_nSrqId = id;
    return VXI11_OK;
}

} // namespace LbPmxLan
