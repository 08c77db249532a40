// IPv4 address texts: the same socket-library calls on every platform, only their headers differ.
#include "tools/lan/Socket.h"

#ifdef _WIN32
#include <winsock2.h>
#include <ws2tcpip.h>
#else
#include <arpa/inet.h>
#include <netinet/in.h>
#endif

namespace LbPmxLan {

bool parseIpv4(const std::string& text, std::uint32_t& address)
{
    in_addr a;
    if (inet_pton(AF_INET, text.c_str(), &a) != 1)
        return false;
    address = ntohl(a.s_addr);
    return true;
}

std::string ipv4Text(std::uint32_t address)
{
    in_addr a;
    a.s_addr = htonl(address);
    char text[INET_ADDRSTRLEN] = "?";
    inet_ntop(AF_INET, &a, text, sizeof text);
    return text;
}

} // namespace LbPmxLan
