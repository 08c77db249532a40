#include "tools/lan/Gateway.h"

#include <algorithm>
#include <cctype>
#include <chrono>
#include <cstdint>
#include <cstring>

#include "tools/lan/Config.h"

namespace LbPmxLan {

namespace {

constexpr ViUInt32 OPEN_TIMEOUT_MS = 5000;

std::string lower(std::string s)
{
    for (char& c : s)
        c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
    return s;
}

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
    ++m_nReleases;
    m_cChanged.notify_all();
}

} // namespace LbPmxLan
