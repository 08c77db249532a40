#include "tools/lan/Socket.h"

#include <arpa/inet.h>
#include <fcntl.h>
#include <netinet/in.h>
#include <netinet/tcp.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

namespace LbPmxLan {

namespace {
int fdOf(TSocket s)
{
    return static_cast<int>(s);
}
} // namespace

bool socketStartup()
{
    return true;
}

TSocket socketListen(const std::string& address, unsigned port, unsigned& boundPort, std::string& error)
{
    int fd = ::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
    int one = 1;
    sockaddr_in a;
    std::memset(&a, 0, sizeof a);
    a.sin_family = AF_INET;
    a.sin_port = htons(static_cast<std::uint16_t>(port));
    inet_pton(AF_INET, address.c_str(), &a.sin_addr);
    if (fd < 0 || setsockopt(fd, SOL_SOCKET, SO_REUSEADDR, &one, sizeof one) != 0 ||
        ::bind(fd, reinterpret_cast<sockaddr*>(&a), sizeof a) != 0 || ::listen(fd, 16) != 0) {
        error = std::strerror(errno);
        if (fd >= 0)
            ::close(fd);
        return NO_SOCKET;
    }
    socklen_t len = sizeof a;
    getsockname(fd, reinterpret_cast<sockaddr*>(&a), &len);
    boundPort = ntohs(a.sin_port);
    return fd;
}

TSocket socketAccept(TSocket listener, std::uint32_t& peer, bool& retry)
{
    sockaddr_in a;
    socklen_t len = sizeof a;
    int fd = ::accept4(fdOf(listener), reinterpret_cast<sockaddr*>(&a), &len, SOCK_CLOEXEC);
    if (fd < 0) {
        retry = errno == EINTR || errno == ECONNABORTED || errno == EMFILE || errno == ENFILE;
        return NO_SOCKET;
    }
    peer = ntohl(a.sin_addr.s_addr);
    return fd;
}

void socketWakeListener(TSocket listener)
{
    ::shutdown(fdOf(listener), SHUT_RDWR); // a blocked accept returns with EINVAL
}

void socketCloseListener(TSocket listener)
{
    ::close(fdOf(listener));
}

void socketConfigure(TSocket s, int sendTimeoutSeconds)
{
    timeval tv = {sendTimeoutSeconds, 0};
    setsockopt(fdOf(s), SOL_SOCKET, SO_SNDTIMEO, &tv, sizeof tv);
    int one = 1;
    setsockopt(fdOf(s), IPPROTO_TCP, TCP_NODELAY, &one, sizeof one);
    setsockopt(fdOf(s), SOL_SOCKET, SO_KEEPALIVE, &one, sizeof one);
}

int socketWaitReadable(TSocket s, int timeoutMs)
{
    pollfd p = {fdOf(s), POLLIN, 0};
    int n;
    do {
        n = ::poll(&p, 1, timeoutMs);
    } while (n < 0 && errno == EINTR);
    return n;
}

long socketReceive(TSocket s, void* data, std::size_t size)
{
    ssize_t n;
    do {
        n = ::recv(fdOf(s), data, size, 0);
    } while (n < 0 && errno == EINTR);
    return static_cast<long>(n);
}

long socketSend(TSocket s, const void* data, std::size_t size)
{
    ssize_t n;
    do {
        n = ::send(fdOf(s), data, size, MSG_NOSIGNAL);
    } while (n < 0 && errno == EINTR);
    return static_cast<long>(n);
}

bool socketPeerGone(TSocket s)
{
    pollfd p = {fdOf(s), POLLRDHUP, 0};
    return ::poll(&p, 1, 0) > 0 && (p.revents & (POLLRDHUP | POLLHUP | POLLERR | POLLNVAL)) != 0;
}

void socketShutdown(TSocket s)
{
    ::shutdown(fdOf(s), SHUT_RDWR);
}

void socketClose(TSocket s)
{
    ::close(fdOf(s));
}

TSocket socketConnect(std::uint32_t address, unsigned port, int timeoutMs)
{
    int fd = ::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
    if (fd < 0)
        return NO_SOCKET;
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
            ? 0
            : -1;
    }
    if (rc != 0) {
        ::close(fd);
        return NO_SOCKET;
    }
    fcntl(fd, F_SETFL, fcntl(fd, F_GETFL) & ~O_NONBLOCK);
    return fd;
}

} // namespace LbPmxLan
