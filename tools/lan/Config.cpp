#include "tools/lan/Config.h"

#include "tools/lan/Socket.h"

#include <algorithm>
#include <cstdarg>
#include <cstdlib>
#include <ctime>
#include <fstream>
#include <iterator>
#include <sstream>

namespace LbPmxLan {

const char* const USAGE =
    "usage: lbpmx-lan [options]\n"
    "  --config FILE       read settings from FILE (key = value lines, keys as the long options)\n"
    "  --bind ADDR         listen on this IPv4 address (default 127.0.0.1)\n"
    "  --allow NETS        only clients from these networks, e.g. 192.168.1.0/24,10.0.0.7\n"
    "  --max-links N       links per sensor (default 16)\n"
    "  --idle-timeout S    close a connection silent for S seconds (default 600, 0 = never)\n"
    "  --log DEST          stderr (default) or a file to append to\n"
    "  --socket-port P     raw SCPI socket of sensor N on port P+N (default 5025)\n"
    "  --vxi11-port P      VXI-11 core channel port (default 0: any free port)\n"
    "  --no-vxi11          serve raw sockets only\n"
    "  --no-register       do not register with rpcbind\n"
    "  --list              print device names and serials, then exit\n";

namespace {

bool parseUnsigned(const std::string& text, unsigned max, unsigned& out)
{
    if (text.empty() || text.size() > 10 || text.find_first_not_of("0123456789") != std::string::npos) {
        return false;
    }
    unsigned long value = std::strtoul(text.c_str(), nullptr, 10);
    if (value > max) {
        return false;
    }
    out = static_cast<unsigned>(value);
    return true;
}

std::string trim(const std::string& s)
{
    std::size_t b = s.find_first_not_of(" \t\r\n");
    std::size_t e = s.find_last_not_of(" \t\r\n");
    return b == std::string::npos ? std::string() : s.substr(b, e - b + 1);
}

// Applies one setting by its key (the long option without dashes).
bool applySetting(const std::string& key, const std::string& value, bool hasValue, CLanConfig& c, std::string& error)
{
    bool ok = true;
    if (key == "no-vxi11" || key == "no-register" || key == "list") {
        bool& flag = key == "list" ? c.m_bList : key == "no-vxi11" ? c.m_bVxi11 : c.m_bRegister;
        flag = key == "list";
        return !hasValue || (error = key + " takes no value", false);
    }
    if (!hasValue) {
        error = key + " needs a value";
        return false;
    }
    if (key == "bind") {
        std::uint32_t a;
        ok = parseIpv4(value, a);
        if (ok)
            c.m_strBind = value;
    } else if (key == "allow") {
        ok = c.m_cAllow.add(value);
    } else if (key == "max-links") {
        ok = parseUnsigned(value, 1024, c.m_nMaxLinks) && c.m_nMaxLinks > 0;
    } else if (key == "idle-timeout") {
        ok = parseUnsigned(value, 7 * 24 * 3600, c.m_nIdleSeconds);
    } else if (key == "log") {
        ok = !value.empty();
        if (ok)
            c.m_strLog = value;
    } else if (key == "socket-port") {
        ok = parseUnsigned(value, 65000, c.m_nSocketPort) && c.m_nSocketPort > 0;
    } else if (key == "vxi11-port") {
        ok = parseUnsigned(value, 65535, c.m_nVxi11Port);
    } else {
        error = "unknown setting " + key;
        return false;
    }
    if (!ok) {
        error = "bad value for " + key + ": " + value;
    }
    return ok;
}

bool readFile(const std::string& path, CLanConfig& config, std::string& error)
{
    std::ifstream in(path);
    if (!in) {
        error = "cannot read " + path;
        return false;
    }
    std::string line;
    for (int number = 1; std::getline(in, line); ++number) {
        if (!applyConfigLine(line, config, error)) {
            error = path + ":" + std::to_string(number) + ": " + error;
            return false;
        }
    }
    return true;
}

} // namespace

bool CAllowList::add(const std::string& text)
{
    std::string list = text;
    for (char& ch : list) {
        if (ch == ',')
            ch = ' ';
    }
    std::istringstream words(list);
    std::string word;
    while (words >> word) {
        std::size_t slash = word.find('/');
        unsigned bits = 32;
        if (slash != std::string::npos && !parseUnsigned(word.substr(slash + 1), 32, bits)) {
            return false;
        }
        std::uint32_t address;
        if (!parseIpv4(word.substr(0, slash), address)) {
            return false;
        }
        std::uint32_t mask = bits == 0 ? 0 : ~std::uint32_t(0) << (32 - bits);
        m_vecNetworks.push_back(CNetwork{address & mask, mask});
    }
    return true;
}

bool CAllowList::allows(std::uint32_t address) const
{
    if (m_vecNetworks.empty()) {
        return true;
    }
    for (const CNetwork& n : m_vecNetworks) {
        if ((address & n.m_nMask) == n.m_nAddress) {
            return true;
        }
    }
    return false;
}

bool applyConfigLine(const std::string& raw, CLanConfig& config, std::string& error)
{
    std::string line = trim(raw.substr(0, raw.find('#')));
    if (line.empty()) {
        return true;
    }
    std::size_t eq = line.find('=');
    std::string key = trim(line.substr(0, eq));
    if (key == "config") {
        error = "config files do not nest";
        return false;
    }
    return applySetting(key, eq == std::string::npos ? std::string() : trim(line.substr(eq + 1)),
                        eq != std::string::npos, config, error);
}

bool parseConfig(int argc, char** argv, CLanConfig& config, std::string& error, bool& help)
{
    help = false;
    // The file first, wherever --config stands, so that flags override it.
    for (int i = 1; i + 1 < argc; ++i) {
        if (std::string(argv[i]) == "--config" && !readFile(argv[i + 1], config, error)) {
            return false;
        }
    }
    for (int i = 1; i < argc; ++i) {
        std::string arg = argv[i];
        if (arg == "--help" || arg == "-h") {
            help = true;
            return true;
        }
        if (arg.compare(0, 2, "--") != 0) {
            error = "unexpected argument " + arg;
            return false;
        }
        std::string key = arg.substr(2);
        bool flag = key == "no-vxi11" || key == "no-register" || key == "list";
        static const char* const VALUE_KEYS[] = {"config",       "bind", "allow",       "max-links",
                                                 "idle-timeout", "log",  "socket-port", "vxi11-port"};
        if (!flag && std::find(std::begin(VALUE_KEYS), std::end(VALUE_KEYS), key) == std::end(VALUE_KEYS)) {
            error = "unknown option " + arg;
            return false;
        }
        if (!flag && i + 1 >= argc) {
            error = arg + " needs a value";
            return false;
        }
        if (key == "config") {
            ++i;
            continue;
        }
        if (!applySetting(key, flag ? std::string() : argv[i + 1], !flag, config, error)) {
            return false;
        }
        i += flag ? 0 : 1;
    }
    return true;
}

bool CLanLog::open(const std::string& destination)
{
    if (destination == "stderr") {
        return true;
    }
    std::FILE* f = std::fopen(destination.c_str(), "a");
    if (f == nullptr) {
        return false;
    }
    m_pFile = f;
    return true;
}

CLanLog::~CLanLog()
{
    if (m_pFile != stderr) {
        std::fclose(m_pFile);
    }
}

void CLanLog::line(const char* format, ...)
{
    char stamp[32];
    std::time_t now = std::time(nullptr);
    std::tm tm;
#if defined(_WIN32)
    localtime_s(&tm, &now);
#else
    localtime_r(&now, &tm);
#endif
    std::strftime(stamp, sizeof stamp, "%Y-%m-%d %H:%M:%S", &tm);
    std::lock_guard<std::mutex> guard(m_cMutex);
    std::fprintf(m_pFile, "%s lbpmx-lan: ", stamp);
    va_list args;
    va_start(args, format);
    std::vfprintf(m_pFile, format, args);
    va_end(args);
    std::fputc('\n', m_pFile);
    std::fflush(m_pFile);
}

} // namespace LbPmxLan
