// lbpmx-lan: serves every sensor the VISA library finds over VXI-11 (TCPIP::host::instN::INSTR)
// and raw SCPI sockets (TCPIP::host::port::SOCKET). SIGTERM or SIGINT shut it down cleanly:
// listeners close, links are destroyed (releasing their locks), rpcbind forgets the gateway.
#include <signal.h>

#include <cstdio>
#include <ctime>
#include <string>

#include "tools/lan/Config.h"
#include "tools/lan/Gateway.h"
#include "tools/lan/SocketListener.h"
#include "tools/lan/Vxi11Service.h"

using namespace LbPmxLan;

namespace {
// How often sensors are looked for again, so one plugged in later gets its socket.
constexpr long RESCAN_SECONDS = 5;
}

int main(int argc, char** argv)
{
    CLanConfig config;
    std::string error;
    bool help = false;
    if (!parseConfig(argc, argv, config, error, help)) {
        std::fprintf(stderr, "lbpmx-lan: %s\n%s", error.c_str(), USAGE);
        return 2;
    }
    if (help) {
        std::fputs(USAGE, stdout);
        return 0;
    }
    // Signals are taken by sigtimedwait below; every thread started from here on blocks them.
    sigset_t stopSignals;
    sigemptyset(&stopSignals);
    sigaddset(&stopSignals, SIGTERM);
    sigaddset(&stopSignals, SIGINT);
    pthread_sigmask(SIG_BLOCK, &stopSignals, nullptr);
    signal(SIGPIPE, SIG_IGN);

    CLanLog log;
    if (!log.open(config.m_strLog)) {
        std::fprintf(stderr, "lbpmx-lan: cannot open the log %s\n", config.m_strLog.c_str());
        return 2;
    }
    CGateway gateway(log, config.m_nMaxLinks);
    if (!gateway.start()) {
        return 1;
    }
    if (config.m_bList) {
        for (const CSensor& sensor : gateway.scan()) {
            std::printf("inst%u %s %s\n", sensor.m_nIndex, sensor.m_strSerial.c_str(), sensor.m_strResource.c_str());
        }
        return 0;
    }
    int status = 0;
    {
        CVxi11Service vxi11(gateway, config, log);
        CSocketListeners sockets(gateway, config, log);
        if ((config.m_bVxi11 && !vxi11.start()) || !sockets.update()) {
            status = 1;
        } else {
            log.line("serving; stop with SIGTERM");
            timespec wait = {RESCAN_SECONDS, 0};
            int signal;
            while ((signal = sigtimedwait(&stopSignals, nullptr, &wait)) < 0) {
                sockets.update();
            }
            log.line("%s received, shutting down", signal == SIGTERM ? "SIGTERM" : "SIGINT");
        }
        sockets.stop();
        vxi11.stop();
    }
    log.line("stopped");
    return status;
}
