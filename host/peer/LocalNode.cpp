/// This appliance as its peers know it.
#include "host/core/FileDescriptor.h"
#include "host/core/LastError.h"
#include "host/peer/Address.h"
#include "host/services/Identity.h"
#include "host/state/Database.h"
#include "iscsihost/node.h"
#include "iscsihost/web.h"
#include "platform/error.h"

#include <cerrno>
#include <memory>
#include <netdb.h>
#include <sys/socket.h>

namespace norvhost {
namespace {

constexpr const char *address_setting = "node_address";

/// The address from which packets to the peer leave. No packet is sent.
int sourceAddress(const std::string &peer, std::string &address)
{
    if (!isHost(peer))
        return fail(NORV_ERR_NODE_HOST, "hostname: '%s' is neither a host name nor an address", peer.c_str());
    addrinfo hints = {};
    hints.ai_socktype = SOCK_DGRAM;
    addrinfo *found = nullptr;
    if (int err = getaddrinfo(peer.c_str(), std::to_string(web_port).c_str(), &hints, &found))
        return fail(NORV_ERR_NODE_HOST, "hostname: %s: %s", peer.c_str(), gai_strerror(err));
    const std::unique_ptr<addrinfo, decltype(&freeaddrinfo)> list(found, freeaddrinfo);
    int errnum = 0;
    for (const addrinfo *to = found; to; to = to->ai_next) {
        const FileDescriptor probe(socket(to->ai_family, to->ai_socktype | SOCK_CLOEXEC, to->ai_protocol));
        sockaddr_storage from = {};
        socklen_t size = sizeof from;
        auto *const name = reinterpret_cast<sockaddr *>(&from);
        char text[NI_MAXHOST];
        if (!probe || connect(probe.get(), to->ai_addr, to->ai_addrlen) != 0 ||
            getsockname(probe.get(), name, &size) != 0)
            errnum = errno;
        else if (getnameinfo(name, size, text, sizeof text, nullptr, 0, NI_NUMERICHOST) == 0) {
            address = text;
            return 0;
        }
    }
    return failErrno(NORV_ERR_NODE_HOST, errnum, "there is no way to %s", peer.c_str());
}

int localAddress(const std::string &peer, std::string &host, uint16_t &port)
{
    iscsihost::WebListener listener;
    if (int err = iscsihost::getWebListener(listener))
        return err;
    std::string setting;
    if (int err = iscsihost::getNodeAddress(setting))
        return err;
    if (setting != "auto") {
        if (!parseAuthority(setting, host, port))
            return fail(NORV_ERR_NODE_HOST, "address: '%s' is none", setting.c_str());
        port = port == 0 ? listener.port : port;
        return 0;
    }
    port = listener.port;
    if (listener.address == "all")
        return sourceAddress(peer, host);
    host = listener.address;
    return 0;
}

} // namespace
} // namespace norvhost

namespace iscsihost {

using namespace norvhost;

int describeLocalNode(const std::string &peer, PairedNode &node)
{
    PairedNode local;
    if (int err = localNodeId(local.uuid))
        return err;
    if (int err = localRodKey(local.rod_key))
        return err;
    if (int err = localAddress(peer, local.host, local.port))
        return err;
    WebCertificate certificate;
    if (int err = getWebCertificate(certificate))
        return err;
    local.pin = certificate.pin;
    node = local;
    return 0;
}

int setNodeAddress(const std::string &address)
{
    std::string host;
    uint16_t port = 0;
    if (address != "auto" && !parseAuthority(address, host, port))
        return fail(NORV_ERR_NODE_HOST, "address: '%s' is neither HOST, HOST:PORT, [IPV6]:PORT nor auto",
                    address.c_str());
    return setSetting(address_setting, address);
}

int getNodeAddress(std::string &address)
{
    return getSetting(address_setting, "auto", address);
}

} // namespace iscsihost
