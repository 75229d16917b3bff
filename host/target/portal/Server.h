/// The portal's listening sockets and connections.
#pragma once

#include <string>
#include <vector>

namespace norvhost::portal {

struct ListenAddress {
    std::string address; ///< IPv4 or IPv6, without brackets
    int port = 0;
};

/// Serves until SIGTERM or SIGINT: one process, one thread. 0, else an error code when it cannot listen.
/// `ready` is called once all addresses are bound.
int serve(const std::vector<ListenAddress> &addresses, void (*ready)());

} // namespace norvhost::portal
