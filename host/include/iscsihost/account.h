/// Accounts of the web API.
#pragma once

#include <cstdint>
#include <iscsihost/host.h>
#include <string>
#include <vector>

namespace iscsihost {

enum class AccountRole {
    viewer, ///< reads
    admin,  ///< does everything
};

struct Account {
    std::string name;
    AccountRole role = AccountRole::viewer;
    bool one_time_codes = false; ///< a log-in needs a one-time code too
    int64_t created = 0;         ///< seconds since the epoch
};

/// Adds an account. The name has 1 to 64 letters, digits and "._-" and begins with a letter or digit; the password 8
/// to 511 bytes without control characters. With one-time codes `otp_uri` is the secret for the user's device, as an
/// otpauth:// URI (TOTP, SHA-1, 6 digits, 30 seconds): it is never shown again. NORV_ERR_ACCOUNT also for a name that
/// is taken, NORV_ERR_PASSWORD.
ISCSI_HOST_API int addAccount(const std::string &name, AccountRole role, const std::string &password,
                              bool one_time_codes, std::string &otp_uri);

/// Every account, ascending by name.
ISCSI_HOST_API int listAccounts(std::vector<Account> &accounts);

/// Removes an account and ends its sessions; those of peer appliances stay. NORV_ERR_ACCOUNT when there is none.
ISCSI_HOST_API int removeAccount(const std::string &name);

/// Replaces a password, ends the account's sessions as above and forgets its failed log-ins.
ISCSI_HOST_API int setAccountPassword(const std::string &name, const std::string &password);

} // namespace iscsihost
