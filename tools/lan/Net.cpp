#include "tools/lan/Net.h"

#include <arpa/inet.h>
#include <fcntl.h>
#include <netinet/in.h>
#include <netinet/tcp.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "tools/lan/Config.h"

namespace LbPmxLan {

namespace {
// A client that takes no data for this long is treated as gone.
constexpr int SEND_TIMEOUT_SECONDS = 10;
}

CConnection::CConnection(int fd, std::uint32_t peer, unsigned idleSeconds)
    : m_nFd(fd), m_nPeer(peer), m_nIdleMs(idleSeconds == 0 ? -1 : static_cast<int>(idleSeconds) * 1000)
{
    timeval tv = {SEND_TIMEOUT_SECONDS, 0};
    setsockopt(fd, SOL_SOCKET, SO_SNDTIMEO, &tv, sizeof tv);
    int one = 1;
    setsockopt(fd, IPPROTO_TCP, TCP_NODELAY, &one, sizeof one);
    setsockopt(fd, SOL_SOCKET, SO_KEEPALIVE, &one, sizeof one);
}

CConnection::~CConnection()
{
    ::close(m_nFd);
}

bool CConnection::waitReadable()
{
    pollfd p = {m_nFd, POLLIN, 0};
    int n;
    do {
        n = ::poll(&p, 1, m_nIdleMs);
    } while (n < 0 && errno == EINTR);
    return n > 0;
}

std::size_t CConnection::readSome(void* data, std::size_t size)
{
    if (!waitReadable()) {
        return 0;
    }
    ssize_t n;
    do {
        n = ::recv(m_nFd, data, size, 0);
    } while (n < 0 && errno == EINTR);
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
        ssize_t n = ::send(m_nFd, p, size, MSG_NOSIGNAL);
        if (n < 0 && errno == EINTR) {
            continue;
        }
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
    pollfd p = {m_nFd, POLLRDHUP, 0};
    return ::poll(&p, 1, 0) > 0 && (p.revents & (POLLRDHUP | POLLHUP | POLLERR | POLLNVAL)) != 0;
}

void CConnection::shutdown()
{
    ::shutdown(m_nFd, SHUT_RDWR);
}

std::string CConnection::peerText() const
{
    in_addr a;
    a.s_addr = htonl(m_nPeer);
    char text[INET_ADDRSTRLEN] = "?";
    inet_ntop(AF_INET, &a, text, sizeof text);
    return text;
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
    m_nFd = ::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
    int one = 1;
    setsockopt(m_nFd, SOL_SOCKET, SO_REUSEADDR, &one, sizeof one);
    sockaddr_in a;
    std::memset(&a, 0, sizeof a);
    a.sin_family = AF_INET;
    a.sin_port = htons(static_cast<std::uint16_t>(port));
    inet_pton(AF_INET, address.c_str(), &a.sin_addr);
    if (m_nFd < 0 || ::bind(m_nFd, reinterpret_cast<sockaddr*>(&a), sizeof a) != 0 || ::listen(m_nFd, 16) != 0) {
        m_cLog.line("%s: cannot listen on %s:%u: %s", m_strName.c_str(), address.c_str(), port,
                    std::strerror(errno));
        if (m_nFd >= 0) ::close(m_nFd);
        m_nFd = -1;
        return false;
    }
    socklen_t len = sizeof a;
    getsockname(m_nFd, reinterpret_cast<sockaddr*>(&a), &len);
    m_nPort = ntohs(a.sin_port);
    m_cAcceptThread = std::thread([this] { acceptLoop(); });
    return true;
}

void CListener::acceptLoop()
{
    for (;;) {
        sockaddr_in a;
        socklen_t len = sizeof a;
        int fd = ::accept4(m_nFd, reinterpret_cast<sockaddr*>(&a), &len, SOCK_CLOEXEC);
        if (m_bStopping) {
            if (fd >= 0) ::close(fd);
            return;
        }
        if (fd < 0) {
            if (errno == EINTR || errno == ECONNABORTED || errno == EMFILE || errno == ENFILE) {
                continue;
            }
            m_cLog.line("%s: accept failed: %s", m_strName.c_str(), std::strerror(errno));
            return;
        }
        reap(false);
        std::uint32_t peer = ntohl(a.sin_addr.s_addr);
        auto connection = std::make_shared<CConnection>(fd, peer, m_nIdleSeconds);
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
    if (m_nFd < 0) {
        return;
    }
    m_bStopping = true;
    ::shutdown(m_nFd, SHUT_RDWR); // wakes the blocked accept
    m_cAcceptThread.join();
    ::close(m_nFd);
    m_nFd = -1;
    reap(true);
}

int connectTcp(std::uint32_t address, unsigned port, int timeoutMs)
{
    int fd = ::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
    if (fd < 0) {
        return -1;
    }
    sockaddr_in a;
    std::memset(&a, 0, sizeof a);
    a.sin_family = AF_INET;
    a.sin_port = htons(static_cast<std::uint16_t>(port));
    a.sin_addr.s_addr = htonl(address);
    int rc = ::connect(fd, reinterpret_cast<sockaddr*>(&a), sizeof a);
    if (rc != 0 && errno == EINPROGRESS) {
        pollfd p = {fd, POLLOUT, 0};
        int error = 0;
        socklen_t len = sizeof error;
        rc = (::poll(&p, 1, timeoutMs) == 1 && getsockopt(fd, SOL_SOCKET, SO_ERROR, &error, &len) == 0 && error == 0)
                 ? 0 : -1;
    }
    if (rc != 0) {
        ::close(fd);
        return -1;
    }
    fcntl(fd, F_SETFL, fcntl(fd, F_GETFL) & ~O_NONBLOCK);
    return fd;
}

} // namespace LbPmxLan
