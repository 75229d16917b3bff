/// How long log-ins are refused after failed ones: twice as long after each, for the account and for the address.
///
/// The first few failures are free: people mistype. An account's delay stays short, so that a stranger's guesses keep
/// nobody out for long; an address's may grow, and it counts failures over all accounts. Failures are forgotten an hour
/// after the latest.
#pragma once

#include <cstdint>
#include <string>

namespace norvhost {

/// An address as it is compared: an IPv4 address has one form only, whatever socket it came through.
std::string plainAddress(const std::string &address);

// Each returns 0 or an error code. Times are seconds since the epoch.

/// Seconds until the next log-in is looked at; 0: now.
int loginDelaySeconds(const std::string &account, const std::string &address, int64_t now, int &seconds);

int noteLoginFailure(const std::string &account, const std::string &address, int64_t now);

/// The account's. Those of the address stay: else who has one account could go on guessing at others.
int forgetLoginFailures(const std::string &account);

} // namespace norvhost
