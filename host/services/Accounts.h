/// Rows of accounts.
#pragma once

#include "iscsihost/account.h"

#include <cstdint>
#include <string>

namespace norvhost {

struct AccountRow {
    iscsihost::Account account;
    std::string password;   ///< hashed
    std::string otp_secret; ///< base32, empty for none
    int64_t otp_step = 0;   ///< of the code that was accepted last
};

/// Whether an account may bear the name.
bool isAccountName(const std::string &name);

/// `found` is false when there is no such account.
int loadAccount(const std::string &name, bool &found, AccountRow &row);

/// What a role is called in the state.
const char *roleName(iscsihost::AccountRole role);
iscsihost::AccountRole roleOf(std::string_view name);

} // namespace norvhost
