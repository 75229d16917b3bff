#include "host/peer/Address.h"

#include <algorithm>
#include <arpa/inet.h>
#include <charconv>
#include <netinet/in.h>

namespace norvhost {
namespace {

constexpr size_t name_max = 253; // RFC 1035, 2.3.4, as text

bool isLetterOrDigit(char c)
{
    return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9');
}

} // namespace

bool isHost(const std::string &host)
{
    in6_addr address;
    if (host.find(':') != host.npos) // a NUL inside would hide what follows it
        return host.find('\0') == host.npos && inet_pton(AF_INET6, host.c_str(), &address) == 1;
    return !host.empty() && host.size() <= name_max && (isLetterOrDigit(host[0]) || host[0] == '_') &&
           std::all_of(host.begin(), host.end(),
                       [](char c) { return isLetterOrDigit(c) || c == '-' || c == '_' || c == '.'; });
}

bool isLoopbackAddress(const std::string &host)
{
    in6_addr v6;
    if (inet_pton(AF_INET6, host.c_str(), &v6) == 1)
        return IN6_IS_ADDR_LOOPBACK(&v6);
    in_addr v4;
    return inet_pton(AF_INET, host.c_str(), &v4) == 1 && ntohl(v4.s_addr) >> 24 == IN_LOOPBACKNET;
}

std::string authority(const std::string &host, uint16_t port)
{
    const bool v6 = host.find(':') != host.npos;
    return (v6 ? "[" + host + "]" : host) + ":" + std::to_string(port);
}

bool parseAuthority(const std::string &text, std::string &host, uint16_t &port)
{
    const bool bracketed = text[0] == '[';
    const size_t colon = text.rfind(bracketed ? "]:" : ":");
    const bool has_port = colon != text.npos && (bracketed || text.find(':') == colon);
    const std::string name = !has_port ? text : bracketed ? text.substr(1, colon - 1) : text.substr(0, colon);
    int number = 0;
    if (has_port) {
        const char *const digits = text.data() + colon + (bracketed ? 2 : 1);
        const auto [end, error] = std::from_chars(digits, text.data() + text.size(), number);
        if (error != std::errc() || end != text.data() + text.size() || number < 1 || number > UINT16_MAX)
            return false;
    }
    if (!isHost(name) || (bracketed && name.find(':') == name.npos))
        return false;
    host = name;
    port = static_cast<uint16_t>(number);
    return true;
}

} // namespace norvhost
