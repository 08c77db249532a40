// TCP plumbing shared by the VXI-11 service and the raw socket listener: listening sockets,
// an accept loop that checks the allow-list, one thread per connection, reads bounded by an
// idle timeout, and a stop that wakes every blocked accept and read (shutdown of the sockets)
// and joins every thread.
#ifndef LBPMX_LAN_NET_H
#define LBPMX_LAN_NET_H

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <list>
#include <memory>
#include <mutex>
#include <string>
#include <thread>

#include "tools/lan/Socket.h"

namespace LbPmxLan {

class CAllowList;
class CLanLog;

// A connected socket handed to a connection's handler.
class CConnection {
public:
    CConnection(TSocket socket, std::uint32_t peer, unsigned idleSeconds);
    ~CConnection();
    // Fills exactly `size` bytes; false on close, error, stop or when the peer stays silent
    // for the idle timeout.
    bool readExact(void* data, std::size_t size);
    // Reads what is there (at least one byte); 0 on close, error, stop or idle timeout.
    std::size_t readSome(void* data, std::size_t size);
    // Sends everything; false when the peer is gone or does not take data for a while.
    bool writeAll(const void* data, std::size_t size);
    // True when the peer has closed or reset its side (checked without waiting).
    bool peerGone() const;
    void shutdown();
    std::uint32_t peer() const { return m_nPeer; }
    std::string peerText() const;

private:
    TSocket m_nSocket;
    std::uint32_t m_nPeer;
    int m_nIdleMs;
};

typedef std::function<void(CConnection&)> FConnectionHandler;

// Listens on one address and port and runs `handler` on a thread of its own per accepted
// connection; clients outside the allow-list are closed at once and logged.
class CListener {
public:
    CListener(const std::string& name, CLanLog& log, const CAllowList& allow, unsigned idleSeconds);
    ~CListener();
    // Binds and starts accepting; false with a log line when the port cannot be had.
    bool start(const std::string& address, unsigned port, FConnectionHandler handler);
    unsigned port() const { return m_nPort; }
    // Stops accepting, wakes and closes every connection, joins every thread.
    void stop();

private:
    struct CWorker {
        std::shared_ptr<CConnection> m_pcConnection;
        std::thread m_cThread;
        std::atomic<bool> m_bDone{false};
    };
    void acceptLoop();
    void reap(bool all);

    std::string m_strName;
    CLanLog& m_cLog;
    const CAllowList& m_cAllow;
    unsigned m_nIdleSeconds;
    TSocket m_nListener = NO_SOCKET;
    unsigned m_nPort = 0;
    FConnectionHandler m_fHandler;
    std::thread m_cAcceptThread;
    std::atomic<bool> m_bStopping{false};
    std::mutex m_cMutex;
    std::list<std::unique_ptr<CWorker>> m_lstWorkers;
};

} // namespace LbPmxLan

#endif
