/// Where a peer's web API is: host and port.
#pragma once

#include <cstdint>
#include <string>

namespace norvhost {

constexpr uint16_t web_port = 5443; ///< of the web API, unless set otherwise

/// Whether the text is an IP address, without brackets, or a host name: letters, digits, hyphens, underscores and dots,
/// at most 253 of them, beginning with a letter, a digit or an underscore.
bool isHost(const std::string &host);

/// 127.0.0.0/8 or ::1. A name is none, whatever it resolves to.
bool isLoopbackAddress(const std::string &host);

/// "peer:5443", "[2001:db8::1]:5443"
std::string authority(const std::string &host, uint16_t port);

/// Splits "HOST", "HOST:PORT", "IPV6" or "[IPV6]:PORT"; a missing port is 0. False for what is none of these.
bool parseAuthority(const std::string &text, std::string &host, uint16_t &port);

} // namespace norvhost
