/// What a user proves who they are with: a password, a one-time code.
#pragma once

#include <cstdint>
#include <string>

namespace norvhost {

/// NORV_ERR_PASSWORD for one that cannot be taken.
int checkPassword(const std::string &password);

/// The password as crypt(5) has it, by yescrypt with a salt of its own; empty when the system cannot.
std::string hashPassword(const std::string &password);

/// Whether it is the password of the hash. An empty hash fits none, and takes as long to say so.
bool passwordFits(const std::string &password, const std::string &hash);

/// A new secret for one-time codes, in base32; empty when there is no memory.
std::string newOtpSecret();

/// The secret for a user's device.
std::string otpUri(const std::string &account, const std::string &secret);

/// The time step that a code belongs to: now's, the one before or the one after; -1 when the code is wrong. Steps
/// ascend, so that the caller can tell a code that was used before.
int64_t otpStep(const std::string &code, const std::string &secret, int64_t now);

} // namespace norvhost
