// Settings of the gateway: built-in defaults, then a small config file, then command-line
// flags (each later source wins). Also the allow-list of client networks and the log.
#ifndef LBPMX_LAN_CONFIG_H
#define LBPMX_LAN_CONFIG_H

#include <cstdint>
#include <cstdio>
#include <mutex>
#include <string>
#include <vector>

namespace LbPmxLan {

// IPv4 networks a client address must fall into; empty allows every client.
class CAllowList {
public:
    // "a.b.c.d" or "a.b.c.d/len", separated by commas or blanks. False on a malformed entry.
    bool add(const std::string& text);
    bool allows(std::uint32_t hostOrderAddress) const;
    bool empty() const { return m_vecNetworks.empty(); }

private:
    struct CNetwork {
        std::uint32_t m_nAddress;
        std::uint32_t m_nMask;
    };
    std::vector<CNetwork> m_vecNetworks;
};

struct CLanConfig {
    std::string m_strBind = "127.0.0.1";
    CAllowList m_cAllow;
    unsigned m_nMaxLinks = 16;       // per sensor, VXI-11 links and socket connections together
    unsigned m_nIdleSeconds = 600;   // a connection silent this long is closed; 0 = never
    std::string m_strLog = "stderr"; // "stderr" or a file the log lines are appended to
    unsigned m_nSocketPort = 5025;   // raw socket of sensor N listens on this + N
    unsigned m_nVxi11Port = 0;       // core channel; 0 = any free port, announced by rpcbind
    bool m_bVxi11 = true;
    bool m_bRegister = true; // register the core channel with the local rpcbind
    bool m_bList = false;    // print the device names and serials, then exit
};

// Parses argv (and the file named by --config). False with a message in `error` on a bad
// flag, value or file; `help` set when --help was given.
bool parseConfig(int argc, char** argv, CLanConfig& config, std::string& error, bool& help);

// One "key = value" line of the config file ('#' starts a comment); false on a bad line.
bool applyConfigLine(const std::string& line, CLanConfig& config, std::string& error);

extern const char* const USAGE;

// Timestamped log lines to stderr or a file; safe from any thread.
class CLanLog {
public:
    bool open(const std::string& destination);
    ~CLanLog();
    void line(const char* format, ...)
#if defined(__GNUC__)
        __attribute__((format(printf, 2, 3)))
#endif
        ;

private:
    std::mutex m_cMutex;
    std::FILE* m_pFile = stderr;
};

} // namespace LbPmxLan

#endif
