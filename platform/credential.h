/// The credential service: authenticated sessions on other appliances.
#pragma once

#include "platform/sdk.h"

#include <json/value.h>

#include <string>

typedef struct NORV_CRED NORV_CRED;
typedef struct NORV_CRED_SESS NORV_CRED_SESS;

NORV_BEGIN_DECLS

/// Null on failure; freed with the function beside it, which takes null.
NORV_API NORV_CRED *NORVCredAlloc(void);
NORV_API void NORVCredFree(NORV_CRED *cred);
NORV_API NORV_CRED_SESS *NORVCredSessAlloc(void);
NORV_API void NORVCredSessFree(NORV_CRED_SESS *session);

// Setters copy; negative on failure.
NORV_API int NORVCredItemSetHost(NORV_CRED *cred, const char *host);
NORV_API int NORVCredItemSetPort(NORV_CRED *cred, int port);
NORV_API int NORVCredItemSetProtocol(NORV_CRED *cred, const char *protocol);
NORV_API int NORVCredItemSetRemoteAccount(NORV_CRED *cred, const char *account);
NORV_API int NORVCredItemSetRemotePasswd(NORV_CRED *cred, const char *password);

/// The access token of a session that a log-in filled, into `token` of `size` bytes. 0 on success.
NORV_API int NORVCredSessItemGetAccessToken(char *token, int size, const NORV_CRED_SESS *session);

NORV_END_DECLS

namespace NORV {

/// Each sends one request and waits for its answer; true on success.
class NORV_API CredRequestUtil {
public:
    /// Logs in with the credential's account and password and a one-time code (empty for none).
    static bool LoginWithOTP(const NORV_CRED *cred, const std::string &otp_code, NORV_CRED_SESS *session,
                             Json::Value *response);
    static bool Logout(const NORV_CRED *cred, const std::string &token);
};

} // namespace NORV
