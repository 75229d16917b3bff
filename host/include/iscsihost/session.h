/// Sessions of the web API: who may ask, proved by a token.
///
/// A session's token is 256 random bits as 64 hexadecimal digits. The state has only its SHA-256: whoever reads the
/// state cannot use a session. Functions are safe to call from many processes at once.
#pragma once

#include <cstdint>
#include <iscsihost/account.h>
#include <string>
#include <vector>

namespace iscsihost {

/// Times are seconds since the epoch.
struct Session {
    int64_t id = 0;    ///< names the session in lists; no secret
    std::string token; ///< set by login() only
    std::string account;
    AccountRole role = AccountRole::viewer;
    std::string app;     ///< what it is for; empty for a person's, "NORV.iSCSI" for a peer appliance's
    std::string address; ///< where it was opened from, or the name of the peer it was made for
    int64_t created = 0;
    int64_t last_used = 0; ///< exact to a minute
    int64_t expires = 0;   ///< when it ends unless it is used before; 0: never
};

/// Opens a session. `otp_code` is looked at only for an account with one-time codes; a code opens one session.
/// `address` is the client's, as text. Failures:
/// - 18990205 (NORV_ERR_LOGIN): account, password or code is wrong. Nothing says which.
/// - 18990013 (NORV_ERR_TRY_AGAIN): too many failures for this account or from this address; the password was not
///   looked at. The reason has the seconds to wait, loginDelay() too.
/// - another code: the state cannot be read or written.
ISCSI_HOST_API int login(const std::string &account, const std::string &password, const std::string &otp_code,
                         const std::string &address, Session &session);

/// Seconds until a log-in to this account from this address is looked at again; 0: now.
ISCSI_HOST_API int loginDelay(const std::string &account, const std::string &address, int &seconds);

/// Whose session a token opens, and notes that it was used. NORV_ERR_LOGIN when there is no such session, it has ended,
/// its account is gone, or it was opened from another address.
ISCSI_HOST_API int authenticate(const std::string &token, const std::string &address, Session &session);

/// Ends the session of a token; NORV_ERR_LOGIN when there is none.
ISCSI_HOST_API int logout(const std::string &token);

/// Every session that has not ended, ascending by ID; without tokens.
ISCSI_HOST_API int listSessions(std::vector<Session> &sessions);

/// Ends a session by its ID, that of a peer appliance too.
ISCSI_HOST_API int closeSession(int64_t id);

/// How long people's sessions last: 30 minutes after their last use, 24 hours in all, unless set otherwise.
struct SessionLimits {
    int64_t idle = 0;     ///< seconds, 60 to a year
    int64_t absolute = 0; ///< seconds, `idle` to a year
};

/// Limits hold at once, also for open sessions.
ISCSI_HOST_API int setSessionLimits(const SessionLimits &limits);
ISCSI_HOST_API int getSessionLimits(SessionLimits &limits);

} // namespace iscsihost
