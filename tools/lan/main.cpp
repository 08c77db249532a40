// lbpmx-lan: serves every sensor the VISA library finds over VXI-11 (TCPIP::host::instN::INSTR)
// and raw SCPI sockets (TCPIP::host::port::SOCKET). SIGTERM or SIGINT (on Windows a console
// Ctrl+C, Ctrl+Break or close) shut it down cleanly: listeners close, links are destroyed
// (releasing their locks), rpcbind forgets the gateway.
#if defined(_WIN32)
#include <windows.h>
#else
#include <signal.h>
#endif

#include <cstdio>
#include <ctime>
#include <string>

#include "tools/lan/Config.h"
#include "tools/lan/Gateway.h"
#include "tools/lan/SocketListener.h"
#if defined(LBPMX_LAN_VXI11)
#include "tools/lan/Vxi11Service.h"
#endif

using namespace LbPmxLan;

namespace {

// How often sensors are looked for again, so one plugged in later gets its socket.
constexpr unsigned RESCAN_SECONDS = 5;

#if defined(_WIN32)
HANDLE s_hStop = nullptr;

BOOL WINAPI onConsoleEvent(DWORD)
{
    SetEvent(s_hStop);
    return TRUE;
}

void blockStopSignals()
{
    s_hStop = CreateEventA(nullptr, TRUE, FALSE, nullptr);
    SetConsoleCtrlHandler(onConsoleEvent, TRUE);
}

const char* const STOP_HINT = "serving; stop with Ctrl+C";

// Calls `rescan` every RESCAN_SECONDS until a stop is requested; returns its name.
template <class TRescan> const char* waitForStop(TRescan rescan)
{
    while (WaitForSingleObject(s_hStop, RESCAN_SECONDS * 1000) == WAIT_TIMEOUT)
        rescan();
    return "stop request";
}
#else
sigset_t s_cStopSignals;
const char* const STOP_HINT = "serving; stop with SIGTERM";

// Signals are taken by sigtimedwait; every thread started from here on blocks them.
void blockStopSignals()
{
    sigemptyset(&s_cStopSignals);
    sigaddset(&s_cStopSignals, SIGTERM);
    sigaddset(&s_cStopSignals, SIGINT);
    pthread_sigmask(SIG_BLOCK, &s_cStopSignals, nullptr);
    signal(SIGPIPE, SIG_IGN);
}

template <class TRescan> const char* waitForStop(TRescan rescan)
{
    timespec wait = {static_cast<time_t>(RESCAN_SECONDS), 0};
    int signal;
    while ((signal = sigtimedwait(&s_cStopSignals, nullptr, &wait)) < 0)
        rescan();
    return signal == SIGTERM ? "SIGTERM" : "SIGINT";
}
#endif

} // namespace

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
    blockStopSignals();
    if (!socketStartup()) {
        std::fprintf(stderr, "lbpmx-lan: networking is not available\n");
        return 1;
    }

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
#if defined(LBPMX_LAN_VXI11)
        CVxi11Service vxi11(gateway, config, log);
        bool started = !config.m_bVxi11 || vxi11.start();
#else
        if (config.m_bVxi11) {
            log.line("VXI-11 is not part of this build (no ONC RPC library); serving raw sockets only");
        }
        bool started = true;
#endif
        CSocketListeners sockets(gateway, config, log);
        started = started && sockets.update();
#if defined(LBPMX_LAN_VXI11)
        // Registered last: clients are sent here only once every listener is up.
        started = started && (!config.m_bVxi11 || vxi11.publish());
#endif
        if (!started) {
            status = 1;
        } else {
            log.line("%s", STOP_HINT);
            const char* reason = waitForStop([&sockets] { sockets.update(); });
            log.line("%s received, shutting down", reason);
        }
        sockets.stop();
#if defined(LBPMX_LAN_VXI11)
        vxi11.stop();
#endif
    }
    log.line("stopped");
    return status;
}
