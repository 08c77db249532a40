#include "tools/lan/Socket.h"

#include <winsock2.h>
#include <ws2tcpip.h>

#include <climits>
#include <cstring>

namespace LbPmxLan {

namespace {
SOCKET handleOf(TSocket s)
{
    return static_cast<SOCKET>(s);
}

int clampSize(std::size_t size)
{
    return size > INT_MAX ? INT_MAX : static_cast<int>(size);
}
} // namespace

bool socketStartup()
{
    WSADATA data;
    return WSAStartup(MAKEWORD(2, 2), &data) == 0;
}

TSocket socketListen(const std::string& address, unsigned port, unsigned& boundPort, std::string& error)
{
    SOCKET s = ::socket(AF_INET, SOCK_STREAM, IPPROTO_TCP);
    sockaddr_in a;
    std::memset(&a, 0, sizeof a);
    a.sin_family = AF_INET;
    a.sin_port = htons(static_cast<u_short>(port));
    inet_pton(AF_INET, address.c_str(), &a.sin_addr);
    // No SO_REUSEADDR: on Windows it would let another program take over the port.
    if (s == INVALID_SOCKET || ::bind(s, reinterpret_cast<sockaddr*>(&a), sizeof a) != 0 || ::listen(s, 16) != 0) {
        error = "Winsock error " + std::to_string(WSAGetLastError());
        if (s != INVALID_SOCKET)
            closesocket(s);
        return NO_SOCKET;
    }
    int len = sizeof a;
    getsockname(s, reinterpret_cast<sockaddr*>(&a), &len);
    boundPort = ntohs(a.sin_port);
    return static_cast<TSocket>(s);
}

TSocket socketAccept(TSocket listener, std::uint32_t& peer, bool& retry)
{
    sockaddr_in a;
    int len = sizeof a;
    SOCKET s = ::accept(handleOf(listener), reinterpret_cast<sockaddr*>(&a), &len);
    if (s == INVALID_SOCKET) {
        int error = WSAGetLastError();
        retry = error == WSAEINTR || error == WSAECONNRESET || error == WSAEMFILE || error == WSAENOBUFS;
        return NO_SOCKET;
    }
    peer = ntohl(a.sin_addr.s_addr);
    return static_cast<TSocket>(s);
}

void socketWakeListener(TSocket listener)
{
    closesocket(handleOf(listener)); // a blocked accept returns with an error
}

void socketCloseListener(TSocket)
{
    // closed by socketWakeListener
}

void socketConfigure(TSocket s, int sendTimeoutSeconds)
{
    DWORD ms = static_cast<DWORD>(sendTimeoutSeconds) * 1000;
    setsockopt(handleOf(s), SOL_SOCKET, SO_SNDTIMEO, reinterpret_cast<const char*>(&ms), sizeof ms);
    BOOL one = TRUE;
    setsockopt(handleOf(s), IPPROTO_TCP, TCP_NODELAY, reinterpret_cast<const char*>(&one), sizeof one);
    setsockopt(handleOf(s), SOL_SOCKET, SO_KEEPALIVE, reinterpret_cast<const char*>(&one), sizeof one);
}

int socketWaitReadable(TSocket s, int timeoutMs)
{
    WSAPOLLFD p;
    p.fd = handleOf(s);
    p.events = POLLRDNORM;
    p.revents = 0;
    return WSAPoll(&p, 1, timeoutMs);
}

long socketReceive(TSocket s, void* data, std::size_t size)
{
    return ::recv(handleOf(s), static_cast<char*>(data), clampSize(size), 0);
}

long socketSend(TSocket s, const void* data, std::size_t size)
{
    return ::send(handleOf(s), static_cast<const char*>(data), clampSize(size), 0);
}

bool socketPeerGone(TSocket s)
{
    WSAPOLLFD p;
    p.fd = handleOf(s);
    p.events = POLLRDNORM;
    p.revents = 0;
    if (WSAPoll(&p, 1, 0) <= 0)
        return false;
    if (p.revents & (POLLHUP | POLLERR | POLLNVAL))
        return true;
    char c;
    return ::recv(handleOf(s), &c, 1, MSG_PEEK) == 0; // readable with nothing to read: closed
}

void socketShutdown(TSocket s)
{
    ::shutdown(handleOf(s), SD_BOTH);
}

void socketClose(TSocket s)
{
    closesocket(handleOf(s));
}

TSocket socketConnect(std::uint32_t address, unsigned port, int timeoutMs)
{
    SOCKET s = ::socket(AF_INET, SOCK_STREAM, IPPROTO_TCP);
    if (s == INVALID_SOCKET)
        return NO_SOCKET;
    sockaddr_in a;
    std::memset(&a, 0, sizeof a);
    a.sin_family = AF_INET;
    a.sin_port = htons(static_cast<u_short>(port));
    a.sin_addr.s_addr = htonl(address);
    u_long nonBlocking = 1;
    ioctlsocket(s, FIONBIO, &nonBlocking);
    int rc = ::connect(s, reinterpret_cast<sockaddr*>(&a), sizeof a);
    if (rc != 0 && WSAGetLastError() == WSAEWOULDBLOCK) {
        WSAPOLLFD p;
        p.fd = s;
        p.events = POLLWRNORM;
        p.revents = 0;
        rc = (WSAPoll(&p, 1, timeoutMs) == 1 && (p.revents & (POLLERR | POLLHUP)) == 0) ? 0 : -1;
    }
    nonBlocking = 0;
    ioctlsocket(s, FIONBIO, &nonBlocking);
    if (rc != 0) {
        closesocket(s);
        return NO_SOCKET;
    }
    return static_cast<TSocket>(s);
}

} // namespace LbPmxLan
