#include "host/target/Portals.h"

#include "host/core/LastError.h"
#include "host/state/Database.h"
#include "platform/error.h"

#include <arpa/inet.h>
#include <cerrno>
#include <sstream>
#include <sys/socket.h>

namespace norvhost {
namespace {

bool hasIpv6()
{
    const FileDescriptor probe(socket(AF_INET6, SOCK_STREAM | SOCK_CLOEXEC, 0));
    sockaddr_in6 any = {};
    any.sin6_family = AF_INET6;
    return probe && bind(probe.get(), reinterpret_cast<sockaddr *>(&any), sizeof any) == 0;
}

} // namespace

int portalAddresses(std::vector<std::string> &addresses)
{
    std::string setting;
    if (int err = getSetting("portal", "all", setting))
        return err;
    std::vector<std::string> found;
    std::istringstream words(setting);
    for (std::string word; words >> word && word != "all";) {
        // As the kernel writes it, because tgtd tells its portals so.
        unsigned char binary[16];
        char text[INET6_ADDRSTRLEN];
        const int family = word.find(':') == word.npos ? AF_INET : AF_INET6;
        if (inet_pton(family, word.c_str(), binary) != 1)
            return fail(NORV_ERR_BAD_PARAMETER, "portal address: '%s' is no IP address", word.c_str());
        found.emplace_back(inet_ntop(family, binary, text, sizeof text));
    }
    if (found.empty()) {
        found.emplace_back("0.0.0.0");
        if (hasIpv6())
            found.emplace_back("::");
    }
    addresses = std::move(found);
    return 0;
}

std::string portalName(const std::string &address, int port)
{
    const bool v6 = address.find(':') != address.npos;
    return (v6 ? "[" + address + "]" : address) + ":" + std::to_string(port);
}

int listenOn(const std::string &address, int port, FileDescriptor &listener)
{
    sockaddr_storage name = {};
    socklen_t size;
    auto *v4 = reinterpret_cast<sockaddr_in *>(&name);
    auto *v6 = reinterpret_cast<sockaddr_in6 *>(&name);
    if (inet_pton(AF_INET, address.c_str(), &v4->sin_addr) == 1) {
        name.ss_family = AF_INET;
        v4->sin_port = htons(static_cast<uint16_t>(port));
        size = sizeof *v4;
    } else if (inet_pton(AF_INET6, address.c_str(), &v6->sin6_addr) == 1) {
        name.ss_family = AF_INET6;
        v6->sin6_port = htons(static_cast<uint16_t>(port));
        size = sizeof *v6;
    } else {
        return fail(NORV_ERR_BAD_PARAMETER, "portal address: '%s' is no IP address", address.c_str());
    }
    listener.reset(socket(name.ss_family, SOCK_STREAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0));
    const int on = 1;
    setsockopt(listener.get(), SOL_SOCKET, SO_REUSEADDR, &on, sizeof on);
    if (name.ss_family == AF_INET6)
        setsockopt(listener.get(), IPPROTO_IPV6, IPV6_V6ONLY, &on, sizeof on);
    if (!listener || bind(listener.get(), reinterpret_cast<sockaddr *>(&name), size) != 0 ||
        listen(listener.get(), SOMAXCONN) != 0)
        return failErrno(NORV_ERR_START_SERVICE, errno, "cannot listen on %s port %d", address.c_str(), port);
    return 0;
}

} // namespace norvhost
