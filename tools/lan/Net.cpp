#include "tools/lan/Net.h"

#include "tools/lan/Config.h"

namespace LbPmxLan {

namespace {
// A client that takes no data for this long is treated as gone.
constexpr int SEND_TIMEOUT_SECONDS = 10;
} // namespace

CConnection::CConnection(TSocket socket, std::uint32_t peer, unsigned idleSeconds)
    : m_nSocket(socket), m_nPeer(peer), m_nIdleMs(idleSeconds == 0 ? -1 : static_cast<int>(idleSeconds) * 1000)
{
    socketConfigure(socket, SEND_TIMEOUT_SECONDS);
}

CConnection::~CConnection()
{
    socketClose(m_nSocket);
}

std::size_t CConnection::readSome(void* data, std::size_t size)
{
    if (socketWaitReadable(m_nSocket, m_nIdleMs) <= 0) {
        return 0;
    }
    long n = socketReceive(m_nSocket, data, size);
    return n > 0 ? static_cast<std::size_t>(n) : 0;
}

bool CConnection::readExact(void* data, std::size_t size)
{
    char* p = static_cast<char*>(data);
    while (size > 0) {
        std::size_t n = readSome(p, size);
        if (n == 0) {
            return false;
        }
        p += n;
        size -= n;
    }
    return true;
}

bool CConnection::writeAll(const void* data, std::size_t size)
{
    const char* p = static_cast<const char*>(data);
    while (size > 0) {
        long n = socketSend(m_nSocket, p, size);
        if (n <= 0) {
            return false;
        }
        p += n;
        size -= static_cast<std::size_t>(n);
    }
    return true;
}

bool CConnection::peerGone() const
{
    return socketPeerGone(m_nSocket);
}

void CConnection::shutdown()
{
    socketShutdown(m_nSocket);
}

std::string CConnection::peerText() const
{
    return ipv4Text(m_nPeer);
}

CListener::CListener(const std::string& name, CLanLog& log, const CAllowList& allow, unsigned idleSeconds)
    : m_strName(name), m_cLog(log), m_cAllow(allow), m_nIdleSeconds(idleSeconds)
{
}

CListener::~CListener()
{
    stop();
}

bool CListener::start(const std::string& address, unsigned port, FConnectionHandler handler)
{
    m_fHandler = handler;
    std::string error;
    m_nListener = socketListen(address, port, m_nPort, error);
    if (m_nListener == NO_SOCKET) {
        m_cLog.line("%s: cannot listen on %s:%u: %s", m_strName.c_str(), address.c_str(), port, error.c_str());
        return false;
    }
    m_cAcceptThread = std::thread([this] { acceptLoop(); });
    return true;
}

void CListener::acceptLoop()
{
    for (;;) {
        std::uint32_t peer = 0;
        bool retry = false;
        TSocket socket = socketAccept(m_nListener, peer, retry);
        if (m_bStopping) {
            if (socket != NO_SOCKET)
                socketClose(socket);
            return;
        }
        if (socket == NO_SOCKET) {
            if (retry)
                continue;
            m_cLog.line("%s: accepting connections failed", m_strName.c_str());
            return;
        }
        reap(false);
        auto connection = std::make_shared<CConnection>(socket, peer, m_nIdleSeconds);
        if (!m_cAllow.allows(peer)) {
            m_cLog.line("%s: refused %s (not in the allow-list)", m_strName.c_str(), connection->peerText().c_str());
            continue;
        }
        std::lock_guard<std::mutex> guard(m_cMutex);
        m_lstWorkers.emplace_back(new CWorker);
        CWorker* worker = m_lstWorkers.back().get();
        worker->m_pcConnection = connection;
        worker->m_cThread = std::thread([this, worker] {
            m_fHandler(*worker->m_pcConnection);
            worker->m_pcConnection->shutdown();
            worker->m_bDone = true;
        });
    }
}

void CListener::reap(bool all)
{
    std::list<std::unique_ptr<CWorker>> finished;
    {
        std::lock_guard<std::mutex> guard(m_cMutex);
        for (auto it = m_lstWorkers.begin(); it != m_lstWorkers.end();) {
            if (all) {
                (*it)->m_pcConnection->shutdown();
            }
            if (all || (*it)->m_bDone) {
                finished.splice(finished.end(), m_lstWorkers, it++);
            } else {
                ++it;
            }
        }
    }
    for (auto& worker : finished) {
        worker->m_cThread.join();
    }
}

void CListener::stop()
{
    if (m_nListener == NO_SOCKET) {
        return;
    }
    m_bStopping = true;
    socketWakeListener(m_nListener);
    m_cAcceptThread.join();
    socketCloseListener(m_nListener);
    m_nListener = NO_SOCKET;
    reap(true);
}

} // namespace LbPmxLan
