// The operating-system side of the gateway's TCP plumbing, one implementation per platform
// (Socket_posix.cpp: BSD sockets; Socket_win32.cpp: Winsock; SocketAddress.cpp: the address
// texts, common to both). Sockets are plain handles; every call retries interruptions itself.
#ifndef LBPMX_LAN_SOCKET_H
#define LBPMX_LAN_SOCKET_H

#include <cstddef>
#include <cstdint>
#include <string>

namespace LbPmxLan {

typedef std::intptr_t TSocket;
constexpr TSocket NO_SOCKET = -1;

// Once per process, before any other call (Winsock start-up); false when networking is absent.
bool socketStartup();
// IPv4 text to a host-order address; false when it is none.
bool parseIpv4(const std::string& text, std::uint32_t& address);
std::string ipv4Text(std::uint32_t address);

// Binds and listens; NO_SOCKET with `error` set on failure. `boundPort` is the port bound.
TSocket socketListen(const std::string& address, unsigned port, unsigned& boundPort, std::string& error);
// Waits for a connection. NO_SOCKET when none came: `retry` tells a passing failure from the
// end of the listener (woken by socketWakeListener, or broken).
TSocket socketAccept(TSocket listener, std::uint32_t& peer, bool& retry);
// Wakes a thread blocked in socketAccept for good; then socketCloseListener after it returned.
void socketWakeListener(TSocket listener);
void socketCloseListener(TSocket listener);
// A connected socket: send time-out, no delay, keep-alive.
void socketConfigure(TSocket s, int sendTimeoutSeconds);
// > 0 readable (or closed), 0 time-out, < 0 error. timeoutMs < 0 waits without limit.
int socketWaitReadable(TSocket s, int timeoutMs);
// Bytes received (> 0), 0 when the peer closed, < 0 on error.
long socketReceive(TSocket s, void* data, std::size_t size);
long socketSend(TSocket s, const void* data, std::size_t size);
// True when the peer has closed or reset its side (checked without waiting).
bool socketPeerGone(TSocket s);
// Wakes the socket's blocked reads and ends both directions.
void socketShutdown(TSocket s);
void socketClose(TSocket s);
// Connects within timeoutMs; NO_SOCKET on failure.
TSocket socketConnect(std::uint32_t address, unsigned port, int timeoutMs);

} // namespace LbPmxLan

#endif
