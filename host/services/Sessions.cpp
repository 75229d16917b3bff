#include "host/services/Sessions.h"

#include "host/core/Crypto.h"
#include "host/core/LastError.h"
#include "host/core/Lock.h"
#include "host/services/Accounts.h"
#include "host/services/LoginDelay.h"
#include "host/services/Password.h"
#include "host/state/Database.h"
#include "platform/error.h"

#include <algorithm>
#include <charconv>
#include <ctime>
#include <functional>
#include <syslog.h>

namespace norvhost {
namespace {

using iscsihost::AccountRole;
using iscsihost::Session;
using iscsihost::SessionLimits;

constexpr size_t token_bytes = 32;
constexpr int64_t use_noted_every = 60;
constexpr SessionLimits default_limits = {30 * 60, 24 * 3600};
constexpr int64_t shortest_limit = 60, longest_limit = 366 * 24 * 3600;
constexpr const char *idle_setting = "session_idle_seconds";
constexpr const char *absolute_setting = "session_seconds";

/// Those not used for longest go first.
constexpr int most_sessions_of_account = 256;

std::string hashOf(const std::string &token)
{
    return toHex(sha256(token));
}

int readLimit(const char *key, int64_t fallback, int64_t &seconds)
{
    std::string text;
    if (int err = getSetting(key, "", text))
        return err;
    seconds = fallback;
    std::from_chars(text.data(), text.data() + text.size(), seconds);
    return 0;
}

struct SessionRow {
    Session session;
    std::string bound_to;            ///< address, empty for any
    std::optional<int64_t> duration; ///< as NewSession has it
    bool orphaned = false;           ///< its account is gone

    int64_t expiry(const SessionLimits &limits) const
    {
        if (!duration)
            return std::min(session.last_used + limits.idle, session.created + limits.absolute);
        return *duration ? session.created + *duration : 0;
    }
    bool hasEnded(int64_t now) const { return orphaned || (session.expires && session.expires <= now); }
};

SessionRow readSession(const Query &query, const SessionLimits &limits)
{
    SessionRow row;
    Session &session = row.session;
    session.id = query.number(0);
    session.account = query.text(1);
    session.app = query.text(3);
    session.address = query.text(4);
    row.bound_to = query.text(5);
    if (!query.isNull(6))
        row.duration = query.number(6);
    session.created = query.number(7);
    session.last_used = query.number(8);
    session.role = row.duration ? AccountRole::admin : roleOf(query.text(2));
    row.orphaned = !row.duration && query.isNull(2);
    session.expires = row.expiry(limits);
    return row;
}

int loadSession(const std::string &token, const SessionLimits &limits, bool &found, SessionRow &row)
{
    const std::string hash = hashOf(token);
    Query query("SELECT s.id, s.account, a.role, s.app, s.opened_from, s.address, s.duration, s.created, s.last_used "
                "FROM sessions s LEFT JOIN accounts a ON a.name = s.account WHERE s.token_hash = ?1");
    found = query.bind(hash).next();
    if (found)
        row = readSession(query, limits);
    return query.error();
}

int removeEnded(int64_t now)
{
    SessionLimits limits;
    if (int err = iscsihost::getSessionLimits(limits))
        return err;
    Query query("DELETE FROM sessions WHERE duration IS NULL AND (last_used + ?2 <= ?1 OR created + ?3 <= ?1) "
                "OR duration > 0 AND created + duration <= ?1");
    return query.bind(now).bind(limits.idle).bind(limits.absolute).run();
}

int removeSurplus(const std::string &account)
{
    Query query("DELETE FROM sessions WHERE id IN (SELECT id FROM sessions WHERE account = ?1 AND duration IS NULL "
                "ORDER BY last_used DESC, id DESC LIMIT -1 OFFSET ?2)");
    return query.bind(account).bind(most_sessions_of_account).run();
}

int noteUse(int64_t id, int64_t now)
{
    Query query("UPDATE sessions SET last_used = ?2 WHERE id = ?1 AND last_used < ?2");
    return query.bind(id).bind(now).run();
}

int noSession()
{
    return fail(NORV_ERR_LOGIN, "the session has ended or never was: log in");
}

/// What cannot be an account's name is one name: strangers shall not fill the state.
std::string keptName(const std::string &account)
{
    return isAccountName(account) ? account : "";
}

/// What somebody proves who they are with.
struct Proof {
    const std::string &password, &otp_code;
};

/// Takes the account's password and code; the time step of the code is in the row then.
bool proves(const Proof &proof, bool known, AccountRow &row, int64_t now)
{
    if (!passwordFits(proof.password, row.password) || !known)
        return false;
    if (row.otp_secret.empty())
        return true;
    const int64_t step = otpStep(proof.otp_code, row.otp_secret, now);
    if (step <= row.otp_step)
        return false;
    row.otp_step = step;
    return true;
}

int refuse(const std::string &account, bool known, const std::string &address, int64_t now)
{
    // A name that is none may be a password in the wrong field.
    syslog(LOG_WARNING, "log-in to %s%s from %s refused", known ? "the account " : "an unknown account",
           known ? account.c_str() : "", plainAddress(address).c_str());
    if (int err = noteLoginFailure(account, address, now))
        return err;
    return fail(NORV_ERR_LOGIN, "account, password or one-time code is wrong");
}

/// The account must still be as it was when it was looked at: its password may have been changed, its code used.
int admit(const AccountRow &row, const NewSession &wanted, std::string &token, bool &admitted)
{
    Transaction transaction;
    if (transaction.error())
        return transaction.error();
    Query query("UPDATE accounts SET otp_step = ?3 WHERE name = ?1 AND password = ?2 "
                "AND (otp_step < ?3 OR otp_secret = '')");
    if (int err = query.bind(row.account.name).bind(row.password).bind(row.otp_step).run())
        return err;
    admitted = changedRows() == 1;
    if (!admitted)
        return 0;
    if (int err = forgetLoginFailures(row.account.name))
        return err;
    if (int err = openSession(wanted, token))
        return err;
    return transaction.commit();
}

} // namespace

int openSession(const NewSession &wanted, std::string &token)
{
    const int64_t now = time(nullptr);
    if (int err = removeEnded(now))
        return err;
    const std::string made = toHex(randomBytes(token_bytes));
    const std::string hash = hashOf(made);
    Query insert("INSERT INTO sessions (token_hash, account, app, opened_from, address, duration, created, last_used) "
                 "VALUES (?1, ?2, ?3, ?4, ?5, ?6, ?7, ?7)");
    insert.bind(hash).bind(wanted.account).bind(wanted.app).bind(wanted.opened_from).bind(wanted.address);
    if (wanted.duration)
        insert.bind(*wanted.duration);
    else
        insert.bindNull();
    if (int err = insert.bind(now).run())
        return err;
    if (int err = wanted.duration ? 0 : removeSurplus(wanted.account))
        return err;
    token = made;
    return 0;
}

int endSession(const std::string &token, bool &found)
{
    const std::string hash = hashOf(token);
    Query query("DELETE FROM sessions WHERE token_hash = ?1");
    if (int err = query.bind(hash).run())
        return err;
    found = changedRows() == 1;
    return 0;
}

int endSessionsOf(const std::string &account)
{
    Query query("DELETE FROM sessions WHERE account = ?1 AND duration IS NULL");
    return query.bind(account).run();
}

} // namespace norvhost

namespace iscsihost {

using namespace norvhost;

int login(const std::string &account, const std::string &password, const std::string &otp_code,
          const std::string &address, Session &session)
{
    const std::string name = keptName(account);
    // One at a time: guesses that come at once are delayed as those that come in turn.
    NamedLock turn;
    if (int err = turn.take("login-" + std::to_string(std::hash<std::string>()(name) % 16)))
        return err;

    const int64_t now = time(nullptr);
    int seconds;
    if (int err = loginDelaySeconds(name, address, now, seconds))
        return err;
    if (seconds > 0)
        return fail(NORV_ERR_TRY_AGAIN, "too many failed log-ins: try again in %d seconds", seconds);

    bool known;
    AccountRow row;
    if (int err = loadAccount(name, known, row))
        return err;
    if (!proves({password, otp_code}, known, row, now))
        return refuse(name, known, address, now);

    NewSession wanted;
    wanted.account = name;
    wanted.opened_from = wanted.address = plainAddress(address);
    std::string token;
    bool admitted;
    if (int err = admit(row, wanted, token, admitted))
        return err;
    if (!admitted)
        return refuse(name, known, address, now);
    Session opened;
    if (int err = authenticate(token, address, opened))
        return err;
    opened.token = token;
    session = std::move(opened);
    return 0;
}

int loginDelay(const std::string &account, const std::string &address, int &seconds)
{
    return loginDelaySeconds(keptName(account), address, time(nullptr), seconds);
}

int authenticate(const std::string &token, const std::string &address, Session &session)
{
    SessionLimits limits;
    if (int err = getSessionLimits(limits))
        return err;
    bool found;
    SessionRow row;
    if (int err = loadSession(token, limits, found, row))
        return err;
    const int64_t now = time(nullptr);
    if (!found || row.hasEnded(now))
        return noSession();
    if (!row.bound_to.empty() && row.bound_to != plainAddress(address))
        return fail(NORV_ERR_LOGIN, "the session was opened from another address: log in");
    // A session whose use the state is too busy to note goes on.
    if (now - row.session.last_used >= use_noted_every && noteUse(row.session.id, now) == 0) {
        row.session.last_used = now;
        row.session.expires = row.expiry(limits);
    }
    session = std::move(row.session);
    return 0;
}

int logout(const std::string &token)
{
    bool found;
    if (int err = endSession(token, found))
        return err;
    return found ? 0 : noSession();
}

int listSessions(std::vector<Session> &sessions)
{
    SessionLimits limits;
    if (int err = getSessionLimits(limits))
        return err;
    const int64_t now = time(nullptr);
    std::vector<Session> open;
    Query query("SELECT s.id, s.account, a.role, s.app, s.opened_from, s.address, s.duration, s.created, s.last_used "
                "FROM sessions s LEFT JOIN accounts a ON a.name = s.account ORDER BY s.id");
    while (query.next()) {
        SessionRow row = readSession(query, limits);
        if (!row.hasEnded(now))
            open.push_back(std::move(row.session));
    }
    if (query.error())
        return query.error();
    sessions = std::move(open);
    return 0;
}

int closeSession(int64_t id)
{
    Query query("DELETE FROM sessions WHERE id = ?1");
    if (int err = query.bind(id).run())
        return err;
    return changedRows() == 1 ? 0 : fail(NORV_ERR_LOGIN, "there is no session %lld", static_cast<long long>(id));
}

int setSessionLimits(const SessionLimits &limits)
{
    if (limits.idle < shortest_limit || limits.idle > longest_limit)
        return fail(NORV_ERR_BAD_PARAMETER, "the idle limit of sessions is a minute to a year");
    if (limits.absolute < limits.idle || limits.absolute > longest_limit)
        return fail(NORV_ERR_BAD_PARAMETER, "the limit of sessions is the idle limit to a year");
    Transaction transaction;
    if (transaction.error())
        return transaction.error();
    if (int err = setSetting(idle_setting, std::to_string(limits.idle)))
        return err;
    if (int err = setSetting(absolute_setting, std::to_string(limits.absolute)))
        return err;
    return transaction.commit();
}

int getSessionLimits(SessionLimits &limits)
{
    SessionLimits read;
    if (int err = readLimit(idle_setting, default_limits.idle, read.idle))
        return err;
    if (int err = readLimit(absolute_setting, default_limits.absolute, read.absolute))
        return err;
    limits = read;
    return 0;
}

} // namespace iscsihost
