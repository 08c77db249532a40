#include "tools/lan/Vxi11Service.h"

#include <netinet/in.h>
#include <rpc/pmap_clnt.h>

#include <algorithm>
#include <atomic>
#include <cstring>
#include <map>
#include <mutex>
#include <set>

#include "tools/lan/Config.h"
#include "tools/lan/Gateway.h"
#include "tools/lan/Vxi11Rpc.h"

namespace LbPmxLan {

namespace {

constexpr int SRQ_CONNECT_TIMEOUT_MS = 2000;
// How long the check whether a registered VXI-11 server still runs waits for its answer.
constexpr int PROBE_CONNECT_TIMEOUT_MS = 2000;
constexpr std::uint32_t LOOPBACK = 0x7F000001; // rpcbind registrations are on this machine

std::atomic<long> s_nNextLink{1};
std::atomic<std::uint32_t> s_nNextXid{1};
// Link ids alive in any connection, for the abort channel.
std::mutex s_cLinksMutex;
std::set<long> s_setLinks;

// Where a client's interrupt channel (its DEVICE_INTR server) listens.
struct CInterruptChannel {
    std::uint32_t m_nAddress = 0;
    unsigned m_nPort = 0;
};

// One core-channel connection and its links.
class CCoreConnection : public CIVxi11Device {
public:
    CCoreConnection(CGateway& gateway, CConnection& connection, unsigned short abortPort)
        : m_cGateway(gateway), m_cConnection(connection), m_nAbortPort(abortPort)
    {
    }
    // The connection ended (closed, vanished or idle): its links go with it.
    ~CCoreConnection() override
    {
        for (auto& link : m_mapLinks)
            logClosed(link.first, *link.second, ", its connection ended");
        std::lock_guard<std::mutex> guard(s_cLinksMutex);
        for (auto& link : m_mapLinks)
            s_setLinks.erase(link.first);
    }

    void createLink(const Create_LinkParms& parms, Create_LinkResp& resp) override
    {
        long error = VXI11_OK;
        std::unique_ptr<CLink> link = m_cGateway.open(parms.device ? parms.device : "", error);
        if (link && parms.lockDevice) {
            error = link->lock(parms.lock_timeout, true);
            if (error != VXI11_OK)
                link.reset();
        }
        resp.error = error;
        if (!link)
            return;
        long lid = s_nNextLink++;
        m_cGateway.log().line("link %ld: %s opened inst%u (%s)", lid, m_cConnection.peerText().c_str(),
                              link->sensor().m_nIndex, link->sensor().m_strSerial.c_str());
        m_mapLinks[lid] = std::move(link);
        {
            std::lock_guard<std::mutex> guard(s_cLinksMutex);
            s_setLinks.insert(lid);
        }
        resp.lid = lid;
        resp.abortPort = m_nAbortPort;
        resp.maxRecvSize = VXI11_MAX_RECV;
    }
    long write(const Device_WriteParms& p, unsigned long& size) override
    {
        CLink* link = find(p.lid);
        if (!link)
            return VXI11_INVALID_LINK;
        return link->write(p.data.data_val, p.data.data_len, p.io_timeout, p.lock_timeout,
                           (p.flags & VXI11_FLAG_WAITLOCK) != 0, size);
    }
    long read(const Device_ReadParms& p, std::string& data, long& reason) override
    {
        CLink* link = find(p.lid);
        if (!link)
            return VXI11_INVALID_LINK;
        int term = (p.flags & VXI11_FLAG_TERMCHRSET) ? static_cast<unsigned char>(p.termChar) : -1;
        std::size_t max = std::min<std::size_t>(p.requestSize, VXI11_MAX_RECV);
        return link->read(
            max, p.io_timeout, p.lock_timeout, (p.flags & VXI11_FLAG_WAITLOCK) != 0, term,
            [this] { return m_cConnection.peerGone(); }, data, reason);
    }
    long readStb(const Device_GenericParms& p, unsigned char& stb) override
    {
        CLink* link = find(p.lid);
        return link ? link->readStb(p.io_timeout, p.lock_timeout, (p.flags & VXI11_FLAG_WAITLOCK) != 0, stb)
                    : VXI11_INVALID_LINK;
    }
    long trigger(const Device_GenericParms& p) override
    {
        CLink* link = find(p.lid);
        return link ? link->trigger(p.io_timeout, p.lock_timeout, (p.flags & VXI11_FLAG_WAITLOCK) != 0)
                    : VXI11_INVALID_LINK;
    }
    long clear(const Device_GenericParms& p) override
    {
        CLink* link = find(p.lid);
        return link ? link->clear(p.io_timeout, p.lock_timeout, (p.flags & VXI11_FLAG_WAITLOCK) != 0)
                    : VXI11_INVALID_LINK;
    }
    long lock(const Device_LockParms& p) override
    {
        CLink* link = find(p.lid);
        return link ? link->lock(p.lock_timeout, (p.flags & VXI11_FLAG_WAITLOCK) != 0) : VXI11_INVALID_LINK;
    }
    long unlock(Device_Link lid) override
    {
        CLink* link = find(lid);
        return link ? link->unlock() : VXI11_INVALID_LINK;
    }
    long enableSrq(const Device_EnableSrqParms& p) override
    {
        CLink* link = find(p.lid);
        if (!link)
            return VXI11_INVALID_LINK;
        if (!p.enable)
            return link->enableSrq(false, nullptr);
        std::string handle(p.handle.handle_val, p.handle.handle_len);
        std::shared_ptr<CInterruptChannel> channel = m_pcInterrupt;
        CLanLog& log = m_cGateway.log();
        return link->enableSrq(true, [channel, handle, &log] {
            std::vector<std::uint8_t> call;
            if (!channel || !encodeSrqCall(s_nNextXid++, handle, call))
                return;
            TSocket socket = socketConnect(channel->m_nAddress, channel->m_nPort, SRQ_CONNECT_TIMEOUT_MS);
            if (socket == NO_SOCKET) {
                log.line("service request: interrupt channel unreachable");
                return;
            }
            CConnection(socket, channel->m_nAddress, 1).writeAll(call.data(), call.size());
        });
    }
    long destroyLink(Device_Link lid) override
    {
        auto it = m_mapLinks.find(lid);
        if (it == m_mapLinks.end())
            return VXI11_INVALID_LINK;
        logClosed(lid, *it->second, "");
        m_mapLinks.erase(it);
        std::lock_guard<std::mutex> guard(s_cLinksMutex);
        s_setLinks.erase(lid);
        return VXI11_OK;
    }
    long createIntrChan(const Device_RemoteFunc& p) override
    {
        if (m_pcInterrupt)
            return VXI11_CHANNEL_EXISTS;
        if (p.progFamily != DEVICE_TCP || p.progNum != DEVICE_INTR || p.progVers != DEVICE_INTR_VERSION) {
            return VXI11_PARAMETER;
        }
        m_pcInterrupt = std::make_shared<CInterruptChannel>();
        m_pcInterrupt->m_nAddress = static_cast<std::uint32_t>(p.hostAddr);
        m_pcInterrupt->m_nPort = p.hostPort;
        return VXI11_OK;
    }
    long destroyIntrChan() override
    {
        if (!m_pcInterrupt)
            return VXI11_NO_CHANNEL;
        m_pcInterrupt.reset();
        return VXI11_OK;
    }
    long abort(Device_Link) override { return VXI11_NOT_SUPPORTED; }

private:
    void logClosed(long lid, const CLink& link, const char* why)
    {
        m_cGateway.log().line("link %ld: %s closed inst%u%s", lid, m_cConnection.peerText().c_str(),
                              link.sensor().m_nIndex, why);
    }
    CLink* find(long lid)
    {
        auto it = m_mapLinks.find(lid);
        return it == m_mapLinks.end() ? nullptr : it->second.get();
    }

    CGateway& m_cGateway;
    CConnection& m_cConnection;
    unsigned short m_nAbortPort;
    std::map<long, std::unique_ptr<CLink>> m_mapLinks;
    std::shared_ptr<CInterruptChannel> m_pcInterrupt;
};

// The abort channel: links of any connection may be named. The gateway cannot interrupt a
// VISA operation in progress (reads end at their own time-out), so a known link answers that
// nothing was aborted with success and an unknown one is an invalid link.
class CAbortConnection : public CIVxi11Device {
public:
    void createLink(const Create_LinkParms&, Create_LinkResp& r) override { r.error = VXI11_NOT_SUPPORTED; }
    long write(const Device_WriteParms&, unsigned long&) override { return VXI11_NOT_SUPPORTED; }
    long read(const Device_ReadParms&, std::string&, long&) override { return VXI11_NOT_SUPPORTED; }
    long readStb(const Device_GenericParms&, unsigned char&) override { return VXI11_NOT_SUPPORTED; }
    long trigger(const Device_GenericParms&) override { return VXI11_NOT_SUPPORTED; }
    long clear(const Device_GenericParms&) override { return VXI11_NOT_SUPPORTED; }
    long lock(const Device_LockParms&) override { return VXI11_NOT_SUPPORTED; }
    long unlock(Device_Link) override { return VXI11_NOT_SUPPORTED; }
    long enableSrq(const Device_EnableSrqParms&) override { return VXI11_NOT_SUPPORTED; }
    long destroyLink(Device_Link) override { return VXI11_NOT_SUPPORTED; }
    long createIntrChan(const Device_RemoteFunc&) override { return VXI11_NOT_SUPPORTED; }
    long destroyIntrChan() override { return VXI11_NOT_SUPPORTED; }
    long abort(Device_Link lid) override
    {
        std::lock_guard<std::mutex> guard(s_cLinksMutex);
        return s_setLinks.count(lid) ? VXI11_OK : VXI11_INVALID_LINK;
    }
};

// Serves records until the client leaves or sends something malformed.
void serve(EVxi11Channel channel, CConnection& connection, CIVxi11Device& device, CLanLog& log)
{
    std::vector<std::uint8_t> record;
    std::vector<std::uint8_t> reply;
    auto readExact = [&](void* p, std::size_t n) { return connection.readExact(p, n); };
    while (readRpcRecord(readExact, RPC_MAX_RECORD, record)) {
        bool ok = dispatchVxi11(channel, record, device, reply);
        if (!reply.empty() && !connection.writeAll(reply.data(), reply.size()))
            return;
        if (!ok) {
            log.line("%s: malformed RPC input, connection closed", connection.peerText().c_str());
            return;
        }
    }
}

} // namespace

CVxi11Service::CVxi11Service(CGateway& gateway, const CLanConfig& config, CLanLog& log)
    : m_cGateway(gateway), m_cConfig(config), m_cLog(log),
      m_cCore("vxi11", log, config.m_cAllow, config.m_nIdleSeconds),
      m_cAbort("vxi11-abort", log, config.m_cAllow, config.m_nIdleSeconds)
{
}

CVxi11Service::~CVxi11Service()
{
    stop();
}

bool CVxi11Service::start()
{
    CLanLog& log = m_cLog;
    if (m_cConfig.m_bRegister) {
        unsigned port = registeredPort();
        TSocket probe = port != 0 ? socketConnect(LOOPBACK, port, PROBE_CONNECT_TIMEOUT_MS) : NO_SOCKET;
        if (probe != NO_SOCKET) {
            socketClose(probe);
            m_cLog.line("another VXI-11 server is registered with rpcbind on port %u and running; not starting", port);
            return false;
        }
    }
    if (!m_cAbort.start(m_cConfig.m_strBind, 0, [&log](CConnection& c) {
            CAbortConnection device;
            serve(EVxi11Channel::Abort, c, device, log);
        })) {
        return false;
    }
    unsigned short abortPort = static_cast<unsigned short>(m_cAbort.port());
    CGateway& gateway = m_cGateway;
    if (!m_cCore.start(m_cConfig.m_strBind, m_cConfig.m_nVxi11Port, [&gateway, &log, abortPort](CConnection& c) {
            CCoreConnection device(gateway, c, abortPort);
            serve(EVxi11Channel::Core, c, device, log);
        })) {
        return false;
    }
    m_cLog.line("VXI-11 core channel on %s:%u, abort channel on port %u", m_cConfig.m_strBind.c_str(), m_cCore.port(),
                abortPort);
    return true;
}

bool CVxi11Service::publish()
{
    if (!m_cConfig.m_bRegister)
        return true;
    // What is registered now answers nobody (checked at start): a gateway that died left it.
    pmap_unset(DEVICE_CORE, DEVICE_CORE_VERSION);
    m_bRegistered =
        pmap_set(DEVICE_CORE, DEVICE_CORE_VERSION, IPPROTO_TCP, static_cast<unsigned short>(m_cCore.port())) != 0;
    if (!m_bRegistered) {
        m_cLog.line("cannot register with rpcbind; VXI-11 clients will not find the gateway");
    }
    return m_bRegistered;
}

unsigned CVxi11Service::registeredPort()
{
    sockaddr_in address;
    std::memset(&address, 0, sizeof address);
    address.sin_family = AF_INET;
    address.sin_addr.s_addr = htonl(LOOPBACK);
    return pmap_getport(&address, DEVICE_CORE, DEVICE_CORE_VERSION, IPPROTO_TCP);
}

void CVxi11Service::stop()
{
    // Another gateway may have replaced a registration that looked stale to it; that one stays.
    if (m_bRegistered && registeredPort() == m_cCore.port()) {
        pmap_unset(DEVICE_CORE, DEVICE_CORE_VERSION);
    }
    m_bRegistered = false;
    m_cCore.stop();
    m_cAbort.stop();
}

} // namespace LbPmxLan
