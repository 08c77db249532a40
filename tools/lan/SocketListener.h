// Raw SCPI sockets: sensor N listens on the base port + N. Each connection is a link of its
// own; every line received is written to the sensor, and a line that is a query (a '?' outside
// quotes) is answered with the sensor's answer, read to its end, plus a line feed. A query the
// sensor does not answer in time gets no line, as with an instrument.
#ifndef LBPMX_LAN_SOCKETLISTENER_H
#define LBPMX_LAN_SOCKETLISTENER_H

#include <map>
#include <memory>
#include <mutex>

#include "tools/lan/Net.h"

namespace LbPmxLan {

class CGateway;
struct CLanConfig;

class CSocketListeners {
public:
    CSocketListeners(CGateway& gateway, const CLanConfig& config, CLanLog& log);
    ~CSocketListeners();
    // Starts a listener for every known sensor that has none yet; false if one failed.
    bool update();
    void stop();

private:
    CGateway& m_cGateway;
    const CLanConfig& m_cConfig;
    CLanLog& m_cLog;
    std::mutex m_cMutex;
    std::map<unsigned, std::unique_ptr<CListener>> m_mapListeners; // by sensor index
};

} // namespace LbPmxLan

#endif
