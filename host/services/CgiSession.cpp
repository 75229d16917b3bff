/// Sessions that this appliance opens on itself for programs: peers, above all.
#include "host/core/LastError.h"
#include "host/services/Sessions.h"
#include "host/state/Database.h"
#include "platform/cgi_session.h"
#include "platform/error.h"

#include <algorithm>
#include <cstring>
#include <memory>
#include <new>
#include <pwd.h>
#include <vector>

using namespace norvhost;

struct NORV_CGI {
    std::string app, host;
    unsigned int duration = 0;
    bool any_address = false;
};

namespace {

constexpr unsigned int no_expiry = 0xFFFFFFFF;
constexpr size_t longest_text = 255;

bool isOneLine(const std::string &text)
{
    return text.size() <= longest_text &&
           std::none_of(text.begin(), text.end(), [](unsigned char c) { return c < ' ' || c == 0x7f; });
}

int refuse(const char *what)
{
    fail(NORV_ERR_BAD_PARAMETER, "a session for a program: %s", what);
    return 0;
}

int open(const NORV_CGI &cgi, const std::string &user, std::string &token)
{
    NewSession wanted;
    wanted.account = user;
    wanted.app = cgi.app;
    wanted.opened_from = cgi.host;
    wanted.address = cgi.any_address ? "" : cgi.host;
    wanted.duration = cgi.duration == no_expiry ? 0 : cgi.duration;
    Transaction transaction;
    if (transaction.error())
        return transaction.error();
    if (int err = openSession(wanted, token))
        return err;
    return transaction.commit();
}

} // namespace

int NorvCgiInit(const char *, NORV_CGI **cgi)
{
    if (!cgi)
        return fail(NORV_ERR_NULL_POINTER, "no place for a session");
    NORV_CGI *made = new (std::nothrow) NORV_CGI;
    if (!made)
        return fail(NORV_ERR_OUT_OF_MEMORY, "no memory for a session");
    *cgi = made;
    return 0;
}

void NorvCgiFree(NORV_CGI *cgi)
{
    delete cgi;
}

int NorvCgiSetOption(NORV_CGI *cgi, int option, unsigned int value)
{
    if (!cgi)
        return refuse("no handle");
    switch (option) {
    case NORV_CGI_SKIP_CHECK_IP:
        cgi->any_address = value != 0;
        return 1;
    case NORV_CGI_AUTH_TYPE:
        if (value == NORV_CGI_AUTH_LOCAL || value == NORV_CGI_AUTH_DOMAIN || value == NORV_CGI_AUTH_DIRECTORY)
            return 1; // nothing is authenticated here: the caller has
        return refuse("unknown type of authentication");
    case NORV_CGI_UID:
    case NORV_CGI_GID:
        return 1; // the session's rights are its role's, not those of a user of the machine
    case NORV_CGI_DURATION:
        if (value == 0)
            return refuse("it cannot last 0 seconds");
        cgi->duration = value;
        return 1;
    default:
        return refuse("unknown option");
    }
}

int NorvCgiSetOption(NORV_CGI *cgi, int option, const char *value)
{
    if (!cgi || !value)
        return refuse("no handle or no value");
    if (!isOneLine(value))
        return refuse("an option is one line of at most 255 bytes");
    switch (option) {
    case NORV_CGI_APP:
        cgi->app = value;
        return 1;
    case NORV_CGI_HOST:
        cgi->host = value;
        return 1;
    default:
        return refuse("unknown option");
    }
}

int NorvCgiLoginNoAuth(NORV_CGI *cgi, char *session, int size, const NORV_CGI_IDENTITY &identity)
{
    if (!cgi || !session || size < 1)
        return refuse("no handle or no room for the token");
    if (cgi->app.empty() || cgi->duration == 0)
        return refuse("set what it is for and how long it lasts");
    if (!cgi->any_address && cgi->host.empty())
        return refuse("set where it is used from");
    if (identity.user.empty() || !isOneLine(identity.user))
        return refuse("an account's name is one line of at most 255 bytes");
    std::string token;
    if (open(*cgi, identity.user, token) != 0)
        return 0;
    if (token.size() >= static_cast<size_t>(size)) {
        NorvCgiRemoveSessionByIndex(cgi, NORV_CGI_SESSION_ID, token.c_str());
        return refuse("no room for the token");
    }
    memcpy(session, token.c_str(), token.size() + 1);
    return 1;
}

bool NorvCgiRemoveSessionByIndex(NORV_CGI *cgi, int kind, const char *session)
{
    if (!cgi || !session || kind != NORV_CGI_SESSION_ID)
        return refuse("no handle, no session, or an unknown kind of its identifier");
    bool found;
    if (endSession(session, found) != 0)
        return false;
    if (!found)
        fail(NORV_ERR_LOGIN, "there is no such session");
    return found;
}

int NORVUserGetUGID(const char *name, unsigned int *uid, unsigned int *gid)
{
    if (!name || !uid || !gid)
        return fail(NORV_ERR_NULL_POINTER, "no account to look up");
    passwd user;
    passwd *found = nullptr;
    std::vector<char> texts(16384);
    if (int errnum = getpwnam_r(name, &user, texts.data(), texts.size(), &found))
        return failErrno(NORV_ERR_ACCOUNT, errnum, "cannot look up the user %s", name);
    if (!found)
        return fail(NORV_ERR_ACCOUNT, "this machine knows no user %s", name);
    *uid = found->pw_uid;
    *gid = found->pw_gid;
    return 0;
}
