/// Sessions on this appliance's own web API, and the accounts they run as.
#pragma once

#include "platform/sdk.h"

#include <string>

typedef struct NORV_CGI NORV_CGI;

/// Options of NorvCgiSetOption; the type of each option's value is named behind it.
enum {
    NORV_CGI_SKIP_CHECK_IP = 1, ///< number: the session may be used from any address
    NORV_CGI_AUTH_TYPE = 3,     ///< number: NORV_CGI_AUTH_...
    NORV_CGI_UID = 4,           ///< number
    NORV_CGI_GID = 5,           ///< number
    NORV_CGI_APP = 7,           ///< text: what the session is for
    NORV_CGI_HOST = 8,          ///< text: where it is used from
    NORV_CGI_DURATION = 10,     ///< number: seconds, 0xFFFFFFFF for no expiry
};

enum {
    NORV_CGI_AUTH_LOCAL = 1,
    NORV_CGI_AUTH_DOMAIN = 2,    ///< DOMAIN\user
    NORV_CGI_AUTH_DIRECTORY = 8, ///< user@directory
};

/// Who a session runs as.
struct NORV_CGI_IDENTITY {
    std::string user;
};

/// Kinds of session identifiers that NorvCgiRemoveSessionByIndex takes.
enum {
    NORV_CGI_SESSION_ID = 2,
};

/// 0 on success; the handle is then freed with NorvCgiFree, which takes null.
NORV_API int NorvCgiInit(const char *arguments, NORV_CGI **cgi);
NORV_API void NorvCgiFree(NORV_CGI *cgi);

/// 1 on success.
NORV_API int NorvCgiSetOption(NORV_CGI *cgi, int option, unsigned int value);
NORV_API int NorvCgiSetOption(NORV_CGI *cgi, int option, const char *value);

/// Opens a session without a password; its identifier goes into `session` of `size` bytes. 1 on
/// success.
NORV_API int NorvCgiLoginNoAuth(NORV_CGI *cgi, char *session, int size, const NORV_CGI_IDENTITY &identity);

NORV_API bool NorvCgiRemoveSessionByIndex(NORV_CGI *cgi, int kind, const char *session);

/// IDs of an account. 0 on success; an ID of 0xFFFFFFFF is none.
NORV_API int NORVUserGetUGID(const char *name, unsigned int *uid, unsigned int *gid);
