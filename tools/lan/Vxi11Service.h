// The VXI-11 service: the core channel (links, I/O, locks, SRQ set-up) and the abort channel,
// each on a listener of its own, the core channel registered with the local rpcbind. A link
// belongs to the connection that created it; when the connection ends (the client closed it,
// vanished, or stayed idle too long) its links are destroyed, which releases their locks.
#ifndef LBPMX_LAN_VXI11SERVICE_H
#define LBPMX_LAN_VXI11SERVICE_H

#include <memory>

#include "tools/lan/Net.h"

namespace LbPmxLan {

class CGateway;
struct CLanConfig;

class CVxi11Service {
public:
    CVxi11Service(CGateway& gateway, const CLanConfig& config, CLanLog& log);
    ~CVxi11Service();
    // Starts the listeners; false (logged) when they cannot, or when a VXI-11 server registered
    // with rpcbind answers on its port (a stale registration is replaced by publish).
    bool start();
    // Registers the core channel with rpcbind, once every listener of the gateway is up.
    bool publish();
    void stop(); // unregisters (when the registration is still this one's), closes every connection and link
    unsigned corePort() const { return m_cCore.port(); }

private:
    static unsigned registeredPort(); // 0: none
    CGateway& m_cGateway;
    const CLanConfig& m_cConfig;
    CLanLog& m_cLog;
    CListener m_cCore;
    CListener m_cAbort;
    bool m_bRegistered = false;
};

} // namespace LbPmxLan

#endif
