#include "host/services/Accounts.h"

#include "host/core/LastError.h"
#include "host/services/LoginDelay.h"
#include "host/services/Password.h"
#include "host/services/Sessions.h"
#include "host/state/Database.h"
#include "platform/error.h"

#include <algorithm>
#include <ctime>

namespace norvhost {
namespace {

constexpr size_t longest_name = 64;

int noSuchAccount(const std::string &name)
{
    return fail(NORV_ERR_ACCOUNT, "there is no account %s", name.c_str());
}

int hash(const std::string &password, std::string &hashed)
{
    if (int err = checkPassword(password))
        return err;
    hashed = hashPassword(password);
    return hashed.empty() ? fail(NORV_ERR_PASSWORD, "the system cannot hash passwords by yescrypt") : 0;
}

AccountRow readAccount(const Query &query)
{
    AccountRow row;
    row.account.name = query.text(0);
    row.account.role = roleOf(query.text(1));
    row.password = query.text(2);
    row.otp_secret = query.text(3);
    row.otp_step = query.number(4);
    row.account.created = query.number(5);
    row.account.one_time_codes = !row.otp_secret.empty();
    return row;
}

} // namespace

bool isAccountName(const std::string &name)
{
    const auto alphanumeric = [](char c) {
        return (c >= '0' && c <= '9') || (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z');
    };
    const auto allowed = [&](char c) { return alphanumeric(c) || c == '.' || c == '_' || c == '-'; };
    return !name.empty() && name.size() <= longest_name && alphanumeric(name[0]) &&
           std::all_of(name.begin(), name.end(), allowed);
}

int loadAccount(const std::string &name, bool &found, AccountRow &row)
{
    Query query("SELECT name, role, password, otp_secret, otp_step, created FROM accounts WHERE name = ?1");
    found = query.bind(name).next();
    if (found)
        row = readAccount(query);
    return query.error();
}

const char *roleName(iscsihost::AccountRole role)
{
    return role == iscsihost::AccountRole::admin ? "admin" : "viewer";
}

iscsihost::AccountRole roleOf(std::string_view name)
{
    return name == "admin" ? iscsihost::AccountRole::admin : iscsihost::AccountRole::viewer;
}

} // namespace norvhost

namespace iscsihost {

using namespace norvhost;

int addAccount(const std::string &name, AccountRole role, const std::string &password, bool one_time_codes,
               std::string &otp_uri)
{
    if (!isAccountName(name))
        return fail(NORV_ERR_ACCOUNT,
                    "an account's name has 1 to %zu letters, digits and \"._-\" and begins with a "
                    "letter or digit",
                    longest_name);
    std::string hashed;
    if (int err = hash(password, hashed))
        return err;
    const std::string secret = one_time_codes ? newOtpSecret() : "";
    if (one_time_codes && secret.empty())
        return fail(NORV_ERR_OTP_CODE, "the system cannot make a secret for one-time codes");

    Query query("INSERT INTO accounts (name, role, password, otp_secret, created) VALUES (?1, ?2, ?3, ?4, ?5)");
    query.bind(name).bind(roleName(role)).bind(hashed).bind(secret).bind(time(nullptr));
    if (int err = query.run())
        return query.violates("accounts.name") ? fail(NORV_ERR_ACCOUNT, "the account %s exists", name.c_str()) : err;
    otp_uri = one_time_codes ? otpUri(name, secret) : "";
    return 0;
}

int listAccounts(std::vector<Account> &accounts)
{
    std::vector<Account> found;
    Query query("SELECT name, role, password, otp_secret, otp_step, created FROM accounts ORDER BY name");
    while (query.next())
        found.push_back(readAccount(query).account);
    if (query.error())
        return query.error();
    accounts = std::move(found);
    return 0;
}

int removeAccount(const std::string &name)
{
    Transaction transaction;
    if (transaction.error())
        return transaction.error();
    Query query("DELETE FROM accounts WHERE name = ?1");
    if (int err = query.bind(name).run())
        return err;
    if (changedRows() == 0)
        return noSuchAccount(name);
    if (int err = endSessionsOf(name))
        return err;
    return transaction.commit();
}

int setAccountPassword(const std::string &name, const std::string &password)
{
    std::string hashed;
    if (int err = hash(password, hashed))
        return err;
    Transaction transaction;
    if (transaction.error())
        return transaction.error();
    Query query("UPDATE accounts SET password = ?2 WHERE name = ?1");
    if (int err = query.bind(name).bind(hashed).run())
        return err;
    if (changedRows() == 0)
        return noSuchAccount(name);
    if (int err = endSessionsOf(name))
        return err;
    if (int err = forgetLoginFailures(name))
        return err;
    return transaction.commit();
}

} // namespace iscsihost
