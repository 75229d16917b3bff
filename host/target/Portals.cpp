#include "host/target/Portals.h"

#include "host/core/FileDescriptor.h"
#include "host/core/LastError.h"
#include "host/state/Database.h"
#include "platform/error.h"

#include <arpa/inet.h>
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

} // namespace norvhost
