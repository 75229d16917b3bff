// Sessions of the node record: on a peer, and on this appliance for a peer.
#include "iscsiwebapi/ISCSINodeInfo.h"

#include "etc/Failure.h"
#include "etc/Text.h"
#include "platform/cgi_session.h"
#include "platform/credential.h"

#include <memory>

namespace ISCSI {
namespace {

struct FreeCred {
    void operator()(NORV_CRED *cred) const { NORVCredFree(cred); }
    void operator()(NORV_CRED_SESS *session) const { NORVCredSessFree(session); }
};
using Cred = std::unique_ptr<NORV_CRED, FreeCred>;
using CredSession = std::unique_ptr<NORV_CRED_SESS, FreeCred>;

struct FreeCgi {
    void operator()(NORV_CGI *cgi) const { NorvCgiFree(cgi); }
};
using Cgi = std::unique_ptr<NORV_CGI, FreeCgi>;

int openCgi(Cgi &out, Site site = here())
{
    NORV_CGI *cgi = nullptr;
    const int err = NorvCgiInit("", &cgi);
    out.reset(cgi);
    if (err)
        return failText(site, ERR_FAILED_TO_INIT_CGI, "Failed to init cgi");
    return 0;
}

/// Where a credential points to.
int setAddress(NORV_CRED *cred, const ISCSINodeInfo &node)
{
    const bool set = NORVCredItemSetHost(cred, node.hostname.c_str()) >= 0 &&
                     NORVCredItemSetPort(cred, node.port) >= 0 &&
                     NORVCredItemSetProtocol(cred, node.protocol.c_str()) >= 0;
    return set ? 0 : ERR_OUT_OF_MEMORY;
}

/// How an account is authenticated, with its IDs unless it is a local one.
struct Authentication {
    unsigned int type = NORV_CGI_AUTH_LOCAL;
    unsigned int uid = 0;
    unsigned int gid = 0;

    explicit Authentication(const std::string &account)
    {
        constexpr unsigned int NO_ID = 0xFFFFFFFF;
        const bool domain = account.find('\\') != std::string::npos;
        const bool directory = account.find('@') != std::string::npos;
        if (!domain && !directory)
            return;
        if (NORVUserGetUGID(account.c_str(), &uid, &gid) == 0 && uid != NO_ID && gid != NO_ID)
            type = domain ? NORV_CGI_AUTH_DOMAIN : NORV_CGI_AUTH_DIRECTORY;
    }
};

} // namespace

int ISCSINodeInfo::login()
{
    if (logged_in)
        return 0;
    const int configured = loadFromConfig();
    if (configured != ERR_FILE_NOT_FOUND && configured != ERR_NO_SUCH_NODE)
        return failText(here(), ERR_NODE_UUID_EXISTS, "Node UUID exists. UUID: %s", uuid.c_str());
    if (isInvalid(true))
        return failText(here(), ERR_BAD_PARAMETER, "Not enough info to login. node: %s", hostname.c_str());
    const Cred cred(NORVCredAlloc());
    const CredSession session(NORVCredSessAlloc());
    if (!cred || !session || setAddress(cred.get(), *this) ||
        NORVCredItemSetRemoteAccount(cred.get(), account.c_str()) < 0 ||
        NORVCredItemSetRemotePasswd(cred.get(), password.c_str()) < 0)
        return failText(here(), ERR_OUT_OF_MEMORY, "Failed to fill the credential. node: %s", hostname.c_str());
    Json::Value response;
    if (!NORV::CredRequestUtil::LoginWithOTP(cred.get(), otp_code, session.get(), &response))
        return failText(here(), ERR_FAILED_TO_LOGIN, "Failed to login. node: %s", hostname.c_str());
    char token[1024] = {};
    if (NORVCredSessItemGetAccessToken(token, sizeof(token), session.get()))
        return failText(here(), ERR_FAILED_TO_GET_SESSION_ID, "Failed to get session ID. node: %s", hostname.c_str());
    session_id = fieldText(token);
    password.clear();
    logged_in = true;
    return updateConfig(true, false);
}

int ISCSINodeInfo::logout()
{
    if (!logged_in)
        return 0;
    if (int err = loadFromConfig())
        return err;
    if (hostname.empty() || port == 0 || protocol.empty() || session_id.empty())
        return failText(here(), ERR_BAD_PARAMETER, "Not enough info to logout. node: %s", hostname.c_str());
    const Cred cred(NORVCredAlloc());
    if (!cred || setAddress(cred.get(), *this))
        return failText(here(), ERR_OUT_OF_MEMORY, "Failed to fill the credential. node: %s", hostname.c_str());
    if (!NORV::CredRequestUtil::Logout(cred.get(), session_id))
        return failText(here(), ERR_FAILED_TO_LOGOUT, "Failed to logout. node: %s", hostname.c_str());
    return 0;
}

int ISCSINodeInfo::createSession()
{
    Cgi cgi;
    if (int err = openCgi(cgi))
        return err;
    const Authentication auth(account);
    constexpr unsigned int NO_EXPIRY = 0xFFFFFFFF;
    const bool has_ids = auth.type != NORV_CGI_AUTH_LOCAL;
    const auto set = [&cgi](int option, auto value, const char *failure, Site site = here()) {
        return NorvCgiSetOption(cgi.get(), option, value) == 1
                   ? 0
                   : failText(site, ERR_FAILED_TO_SET_CGI_OPTION, "%s", failure);
    };
    if (int err = set(NORV_CGI_AUTH_TYPE, auth.type, "Failed to set CGI option: auth type"))
        return err;
    if (int err = has_ids ? set(NORV_CGI_UID, auth.uid, "Failed to set CGI option: uid") : 0)
        return err;
    if (int err = has_ids ? set(NORV_CGI_GID, auth.gid, "Failed to set CGI option: gid") : 0)
        return err;
    if (int err = set(NORV_CGI_HOST, hostname.c_str(), "Failed to set CGI option: host"))
        return err;
    if (int err = set(NORV_CGI_APP, "NORV.iSCSI", "Failed to set CGI option: app"))
        return err;
    if (int err = set(NORV_CGI_DURATION, NO_EXPIRY, "Failed to set CGI option: duration"))
        return err;
    if (int err = set(NORV_CGI_SKIP_CHECK_IP, 1u, "Failed to set CGI option: skip check IP"))
        return err;
    char session[100] = {};
    const int ret = NorvCgiLoginNoAuth(cgi.get(), session, sizeof(session), NORV_CGI_IDENTITY{account});
    if (ret != 1)
        return failText(here(), ERR_FAILED_TO_LOGIN_WITHOUT_AUTH, "Failed to login without auth. ret: %d", ret);
    session_id = fieldText(session);
    return 0;
}

int ISCSINodeInfo::deleteSession() const
{
    Cgi cgi;
    if (int err = openCgi(cgi))
        return err;
    if (!NorvCgiRemoveSessionByIndex(cgi.get(), NORV_CGI_SESSION_ID, session_id.c_str()))
        return ERR_DEFAULT_ERROR_CODE;
    return 0;
}

} // namespace ISCSI
