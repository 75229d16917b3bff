/// The addresses that the iSCSI service listens on.
#pragma once

#include "host/core/FileDescriptor.h"

#include <string>
#include <vector>

namespace norvhost {

constexpr int public_port = 3260;     ///< of the portal
constexpr int read_write_port = 3261; ///< of the daemons
constexpr int read_only_port = 3262;
constexpr int tls_port = 3263; ///< the way to the read-write daemon inside TLS

/// The addresses that the setting "portal" names, without brackets: IP addresses with spaces between them,
/// or "all", which it also is unset. NORV_ERR_BAD_PARAMETER for what is none.
int portalAddresses(std::vector<std::string> &addresses);

/// "10.0.0.1:3261", "[::1]:3261"
std::string portalName(const std::string &address, int port);

/// A listening socket at an IP address, an IPv6 one for IPv6 only; port 0 is any free one. NORV_ERR_START_SERVICE when
/// the port is taken.
int listenOn(const std::string &address, int port, FileDescriptor &listener);

} // namespace norvhost
