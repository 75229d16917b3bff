#include "host/services/LoginDelay.h"

#include "host/state/Database.h"

#include <algorithm>
#include <arpa/inet.h>
#include <cstring>

namespace norvhost {
namespace {

constexpr int64_t remembered_seconds = 3600;
/// Strangers decide how many rows there are.
constexpr int64_t most_rows = 10000;
constexpr size_t longest_key = 64;

struct Rule {
    const char *kind;
    int free_failures;
    int longest_seconds;
};
constexpr Rule account_rule = {"account", 3, 60};
constexpr Rule address_rule = {"address", 10, 900};

/// What strangers name is cut to what any real one may have.
std::string bounded(const std::string &key)
{
    return key.substr(0, longest_key);
}

/// Whoever has one IPv6 address has the whole /64 of it.
std::string addressKey(const std::string &address)
{
    const std::string plain = plainAddress(address);
    in6_addr number;
    if (inet_pton(AF_INET6, plain.c_str(), &number) != 1)
        return bounded(plain);
    memset(number.s6_addr + 8, 0, 8);
    char text[INET6_ADDRSTRLEN];
    return std::string(inet_ntop(AF_INET6, &number, text, sizeof text)) + "/64";
}

int64_t delayAfter(const Rule &rule, int failures)
{
    const int counted = failures - rule.free_failures;
    if (counted < 0)
        return 0;
    return counted >= 20 ? rule.longest_seconds : std::min(1 << counted, rule.longest_seconds);
}

int delayOf(const Rule &rule, const std::string &key, int64_t now, int &seconds)
{
    Query query("SELECT failures, last FROM login_failures WHERE kind = ?1 AND key = ?2");
    const bool found = query.bind(rule.kind).bind(key).next();
    if (query.error())
        return query.error();
    seconds = 0;
    if (!found)
        return 0;
    const int64_t since = query.number(1);
    // A failure from the future is one from before the clock was set back.
    if (since <= now && now - since < remembered_seconds)
        seconds = static_cast<int>(std::max<int64_t>(0, since + delayAfter(rule, query.integer(0)) - now));
    return 0;
}

int count(const Rule &rule, const std::string &key, int64_t now)
{
    Query query("INSERT INTO login_failures VALUES (?1, ?2, 1, ?3) "
                "ON CONFLICT (kind, key) DO UPDATE SET failures = failures + 1, last = excluded.last");
    return query.bind(rule.kind).bind(key).bind(now).run();
}

} // namespace

std::string plainAddress(const std::string &address)
{
    in6_addr number;
    if (inet_pton(AF_INET6, address.c_str(), &number) != 1)
        return bounded(address);
    char text[INET6_ADDRSTRLEN];
    if (IN6_IS_ADDR_V4MAPPED(&number))
        return inet_ntop(AF_INET, number.s6_addr + 12, text, sizeof text);
    return inet_ntop(AF_INET6, &number, text, sizeof text);
}

int loginDelaySeconds(const std::string &account, const std::string &address, int64_t now, int &seconds)
{
    int of_account, of_address;
    if (int err = delayOf(account_rule, bounded(account), now, of_account))
        return err;
    if (int err = delayOf(address_rule, addressKey(address), now, of_address))
        return err;
    seconds = std::max(of_account, of_address);
    return 0;
}

int noteLoginFailure(const std::string &account, const std::string &address, int64_t now)
{
    Transaction transaction;
    if (transaction.error())
        return transaction.error();
    Query forget("DELETE FROM login_failures WHERE last <= ?1 OR last > ?2 OR (kind, key) IN "
                 "(SELECT kind, key FROM login_failures ORDER BY last DESC LIMIT -1 OFFSET ?3)");
    if (int err = forget.bind(now - remembered_seconds).bind(now).bind(most_rows).run())
        return err;
    if (int err = count(account_rule, bounded(account), now))
        return err;
    if (int err = count(address_rule, addressKey(address), now))
        return err;
    return transaction.commit();
}

int forgetLoginFailures(const std::string &account)
{
    Query query("DELETE FROM login_failures WHERE kind = 'account' AND key = ?1");
    return query.bind(account).run();
}

} // namespace norvhost
