/// The addresses that the iSCSI service listens on.
#pragma once

#include <string>
#include <vector>

namespace norvhost {

constexpr int public_port = 3260;     ///< of the portal
constexpr int read_write_port = 3261; ///< of the daemons
constexpr int read_only_port = 3262;

/// The addresses that the setting "portal" names, without brackets: IP addresses with spaces between them,
/// or "all", which it also is unset. NORV_ERR_BAD_PARAMETER for what is none.
int portalAddresses(std::vector<std::string> &addresses);

/// "10.0.0.1:3261", "[::1]:3261"
std::string portalName(const std::string &address, int port);

} // namespace norvhost
