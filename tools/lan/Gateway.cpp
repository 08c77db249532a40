#include "tools/lan/Gateway.h"

#include <algorithm>
#include <cctype>
#include <chrono>
#include <cstdint>
#include <cstring>

#include "tools/lan/Config.h"

namespace LbPmxLan {

namespace {

typedef std::chrono::steady_clock Clock;

// A long wait for data is split into slices of this length; between slices the gateway checks
// whether the client is still there.
constexpr unsigned long READ_SLICE_MS = 1000;
// VI_TMO_INFINITE and other huge client timeouts are bounded by a day.
constexpr unsigned long LONGEST_WAIT_MS = 24ul * 3600 * 1000;
constexpr ViUInt32 OPEN_TIMEOUT_MS = 5000;

Clock::time_point deadlineIn(unsigned long ms)
{
    return Clock::now() + std::chrono::milliseconds(std::min(ms, LONGEST_WAIT_MS));
}

unsigned long remainingMs(Clock::time_point deadline)
{
    auto left = std::chrono::duration_cast<std::chrono::milliseconds>(deadline - Clock::now()).count();
    return left > 0 ? static_cast<unsigned long>(left) : 0;
}

std::string lower(std::string s)
{
    for (char& c : s)
        c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
    return s;
}

// Service-request callbacks by number: the runtime's handler thread finds a callback here, so a
// link closing at the same time never leaves it holding a dangling pointer.
std::mutex s_cSrqMutex;
std::map<std::uintptr_t, std::function<void()>> s_mapSrq;
std::uintptr_t s_nNextSrq = 1;

// Releases of the I/O turn or a VISA lock, counted so that a waiter never misses one.
std::uint64_t s_nReleases = 0;

} // namespace

long vxi11ErrorOf(ViStatus status)
{
    if (status >= VI_SUCCESS)
        return VXI11_OK;
    switch (status) {
    case VI_ERROR_TMO:
        return VXI11_IO_TIMEOUT;
    case VI_ERROR_RSRC_LOCKED:
        return VXI11_LOCKED;
    case VI_ERROR_INV_PARAMETER:
    case VI_ERROR_INV_LOCK_TYPE:
        return VXI11_PARAMETER;
    case VI_ERROR_NSUP_OPER:
        return VXI11_NOT_SUPPORTED;
    case VI_ERROR_ALLOC:
        return VXI11_OUT_OF_RESOURCES;
    default:
        return VXI11_IO_ERROR;
    }
}

// ---- links

CLink::CLink(CGateway& gateway, CSensor& sensor, ViSession session)
    : m_cGateway(gateway), m_cSensor(sensor), m_nSession(session)
{
}

CLink::~CLink()
{
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

ViStatus CLink::exclusive(unsigned long ioTimeout, unsigned long lockTimeout, bool waitLock,
                          const std::function<ViStatus()>& op)
{
    Clock::time_point ioDeadline = deadlineIn(ioTimeout);
    Clock::time_point lockDeadline = deadlineIn(waitLock ? lockTimeout : 0);
    std::unique_lock<std::mutex> guard(m_cGateway.m_cMutex);
    for (;;) {
        while (m_cSensor.m_bBusy) {
            if (m_cGateway.m_cChanged.wait_until(guard, ioDeadline) == std::cv_status::timeout && m_cSensor.m_bBusy) {
                return VI_ERROR_TMO;
            }
        }
        m_cSensor.m_bBusy = true;
        std::uint64_t releases = s_nReleases;
        guard.unlock();
        ViStatus status = op();
        guard.lock();
        m_cSensor.m_bBusy = false;
        ++s_nReleases;
        m_cGateway.m_cChanged.notify_all();
        if (status != VI_ERROR_RSRC_LOCKED || !waitLock) {
            return status;
        }
        // Another link holds the lock: wait for any release, then try again.
        ++releases;
        if (!m_cGateway.m_cChanged.wait_until(guard, lockDeadline, [&] { return s_nReleases > releases; })) {
            return status;
        }
    }
}

long CLink::write(const char* data, std::size_t size, unsigned long ioTimeout, unsigned long lockTimeout, bool waitLock,
                  unsigned long& written)
{
    ViUInt32 count = 0;
    ViStatus status = exclusive(ioTimeout, lockTimeout, waitLock, [&] {
        ViStatus s = setTimeout(ioTimeout);
        return s < VI_SUCCESS
            ? s
            : viWrite(m_nSession, reinterpret_cast<ViConstBuf>(data), static_cast<ViUInt32>(size), &count);
    });
    written = count;
    return vxi11ErrorOf(status);
}

long CLink::read(std::size_t max, unsigned long ioTimeout, unsigned long lockTimeout, bool waitLock, int termChar,
                 const std::function<bool()>& gone, std::string& data, long& reason)
{
    reason = 0;
    data.clear();
    if (max == 0) {
        return VXI11_PARAMETER;
    }
    ViStatus status = VI_SUCCESS;
    if (!m_strPending.empty()) {
        data.swap(m_strPending);
        reason = 0x04; // the rest of an answer already read to its end
    } else {
        Clock::time_point deadline = deadlineIn(ioTimeout);
        data.resize(max);
        ViUInt32 count = 0;
        status = exclusive(ioTimeout, lockTimeout, waitLock, [&] {
            for (;;) {
                unsigned long left = remainingMs(deadline);
                ViStatus s = setTimeout(std::min(left, READ_SLICE_MS));
                if (s >= VI_SUCCESS) {
                    s = viRead(m_nSession, reinterpret_cast<ViPBuf>(&data[0]), static_cast<ViUInt32>(max), &count);
                }
                if (s != VI_ERROR_TMO || left <= READ_SLICE_MS || gone()) {
                    return s;
                }
            }
        });
        data.resize(status >= VI_SUCCESS ? count : 0);
        reason = status == VI_SUCCESS_MAX_CNT ? 0x01 : status == VI_SUCCESS_TERM_CHAR ? 0x02 : 0x04;
    }
    if (status < VI_SUCCESS) {
        reason = 0;
        return vxi11ErrorOf(status);
    }
    if (data.size() > max) { // pending data longer than this request
        m_strPending = data.substr(max);
        data.resize(max);
        reason = 0x01;
    }
    if (termChar >= 0) {
        std::size_t at = data.find(static_cast<char>(termChar));
        if (at != std::string::npos) {
            if (at + 1 < data.size()) {
                m_strPending = data.substr(at + 1) + m_strPending;
                data.resize(at + 1);
                reason = 0;
            }
            reason |= 0x02;
        }
    }
    return VXI11_OK;
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
    m_strPending.clear();
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
    ++s_nReleases;
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

// ---- gateway

CGateway::CGateway(CLanLog& log, unsigned maxLinks) : m_cLog(log), m_nMaxLinks(maxLinks) { }

CGateway::~CGateway()
{
    if (m_nRm != VI_NULL)
        viClose(m_nRm);
}

bool CGateway::start()
{
    ViStatus status = viOpenDefaultRM(&m_nRm);
    if (status < VI_SUCCESS) {
        m_cLog.line("cannot open the VISA resource manager (status 0x%08X)", static_cast<unsigned>(status));
        return false;
    }
    scan();
    return true;
}

std::vector<CSensor> CGateway::scan()
{
    // Find outside the table's lock: it talks to the VISA runtime and may take a while.
    std::vector<std::pair<std::string, std::string>> found; // resource, serial
    ViFindList list = VI_NULL;
    ViUInt32 count = 0;
    ViChar name[VI_FIND_BUFLEN];
    if (viFindRsrc(m_nRm, "?*::INSTR", &list, &count, name) >= VI_SUCCESS) {
        for (ViUInt32 i = 0; i < count; ++i) {
            if (i > 0 && viFindNext(list, name) < VI_SUCCESS)
                break;
            std::string resource = name;
            std::string serial;
            {
                std::lock_guard<std::mutex> guard(m_cMutex);
                auto it = m_mapSerialOf.find(resource);
                if (it != m_mapSerialOf.end())
                    serial = it->second;
            }
            if (serial.empty()) {
                ViSession vi;
                ViChar text[256] = "";
                if (viOpen(m_nRm, name, VI_NULL, OPEN_TIMEOUT_MS, &vi) >= VI_SUCCESS) {
                    if (viGetAttribute(vi, VI_ATTR_USB_SERIAL_NUM, text) < VI_SUCCESS)
                        text[0] = '\0';
                    viClose(vi);
                }
                // Without a serial number the resource string names the sensor.
                serial = text[0] != '\0' ? text : resource;
            }
            found.emplace_back(resource, serial);
        }
        viClose(list);
    }
    std::lock_guard<std::mutex> guard(m_cMutex);
    for (auto& sensor : m_vecSensors)
        sensor->m_bPresent = false;
    for (auto& entry : found) {
        m_mapSerialOf[entry.first] = entry.second;
        CSensor* sensor = nullptr;
        for (auto& s : m_vecSensors) {
            if (lower(s->m_strSerial) == lower(entry.second))
                sensor = s.get();
        }
        if (sensor == nullptr) {
            m_vecSensors.emplace_back(new CSensor);
            sensor = m_vecSensors.back().get();
            sensor->m_nIndex = static_cast<unsigned>(m_vecSensors.size() - 1);
            sensor->m_strSerial = entry.second;
            m_cLog.line("inst%u is %s (%s)", sensor->m_nIndex, entry.second.c_str(), entry.first.c_str());
        } else if (!sensor->m_bPresent && sensor->m_strResource != entry.first) {
            m_cLog.line("inst%u is now %s", sensor->m_nIndex, entry.first.c_str());
        }
        sensor->m_strResource = entry.first;
        sensor->m_bPresent = true;
    }
    std::vector<CSensor> copy;
    for (auto& sensor : m_vecSensors)
        copy.push_back(*sensor);
    return copy;
}

CSensor* CGateway::find(const std::string& device)
{
    std::string name = lower(device);
    for (auto& sensor : m_vecSensors) {
        if (name == "inst" + std::to_string(sensor->m_nIndex) || name == lower(sensor->m_strSerial)) {
            return sensor.get();
        }
    }
    return nullptr;
}

std::unique_ptr<CLink> CGateway::open(const std::string& device, long& error)
{
    std::string resource;
    CSensor* sensor = nullptr;
    for (int attempt = 0; attempt < 2 && resource.empty(); ++attempt) {
        if (attempt > 0)
            scan();
        std::lock_guard<std::mutex> guard(m_cMutex);
        sensor = find(device);
        if (sensor != nullptr && sensor->m_bPresent) {
            if (sensor->m_nLinks >= m_nMaxLinks) {
                m_cLog.line("inst%u: refused a link, %u links open", sensor->m_nIndex, sensor->m_nLinks);
                error = VXI11_OUT_OF_RESOURCES;
                return nullptr;
            }
            ++sensor->m_nLinks;
            resource = sensor->m_strResource;
        }
    }
    if (resource.empty()) {
        error = VXI11_NOT_ACCESSIBLE;
        return nullptr;
    }
    ViSession vi = VI_NULL;
    ViStatus status = viOpen(m_nRm, resource.c_str(), VI_NULL, OPEN_TIMEOUT_MS, &vi);
    if (status < VI_SUCCESS) {
        m_cLog.line("inst%u: cannot open %s (status 0x%08X)", sensor->m_nIndex, resource.c_str(),
                    static_cast<unsigned>(status));
        released(*sensor);
        error = VXI11_NOT_ACCESSIBLE;
        return nullptr;
    }
    error = VXI11_OK;
    return std::unique_ptr<CLink>(new CLink(*this, *sensor, vi));
}

void CGateway::released(CSensor& sensor)
{
    std::lock_guard<std::mutex> guard(m_cMutex);
    --sensor.m_nLinks;
    ++s_nReleases;
    m_cChanged.notify_all();
}

} // namespace LbPmxLan
