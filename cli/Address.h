/// Where another appliance's web API is, as people write it.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

namespace cli {

struct Address {
    std::string host; ///< without brackets
    uint16_t port = 0;
};

/// "HOST", "HOST:PORT", "[ADDRESS]", "[ADDRESS]:PORT", or a bare IPv6 address; the port is 5443 unless given. Nothing
/// for what is none of these; whether the host's characters are right is for others to judge.
std::optional<Address> parseAddress(const std::string &text);

/// "https://" and what parseAddress() reads; a slash may end it.
std::optional<Address> parseUrl(const std::string &text);

/// "HOST:PORT", an IPv6 address in brackets: what parseAddress() reads.
std::string addressText(const Address &address);

} // namespace cli
