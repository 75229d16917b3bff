// The DR-node database, credentials, CGI sessions and the state of the appliance, on the fake's model.
#include "platform/cgi_session.h"
#include "platform/credential.h"
#include "platform/dr_node.h"
#include "platform/extent_pool.h"
#include "platform/system.h"
#include "tests/fake/Script.h"

using namespace fake;

struct NORV_CRED {
    std::string host, protocol, account, password;
    int port = 0;
};

struct NORV_CRED_SESS {
    std::string token;
};

struct NORV_CGI {
    std::map<int, std::string> options;
};

namespace {

template <class Value>
int setOption(NORV_CGI *cgi, int option, const Value &value)
{
    if (auto failure = called("NorvCgiSetOption", option, value))
        return *failure;
    cgi->options[option] = joined(value);
    return 1;
}

/// Outputs are replaced: what a caller leaves in them must not come back.
template <class Value>
int putText(char *out, int size, const Value &text)
{
    return snprintf(out, static_cast<size_t>(size), "%s", text.c_str()) < size ? 0 : NORV_ERR_BAD_PARAMETER;
}

} // namespace

namespace NorvDRNode {

// Not noted: an appliance knows who it is, or has no identity.
bool DRNode::isLocalNodeId(const std::string &id)
{
    return id == model().local_node;
}

std::string DRNode::getLocalNodeId()
{
    return model().local_node;
}

bool DRNodeDB::Get(const std::string &id, DRNode &node)
{
    if (auto failure = called("DRNodeDB::Get", id))
        return *failure != 0;
    for (const DRNode &known : model().nodes) {
        if (known.id == id) {
            node = known;
            return true;
        }
    }
    return false;
}

bool DRNodeDB::List(std::vector<DRNode> &nodes, CredType type)
{
    if (auto failure = called("DRNodeDB::List", type))
        return *failure != 0;
    nodes.clear();
    for (const DRNode &known : model().nodes) {
        if (!DRNode::isLocalNodeId(known.id))
            nodes.push_back(known);
    }
    return true;
}

bool DRNodeDB::ListAttr(const std::string &id, const std::string &app, std::vector<DRNodeAttr> &attrs)
{
    if (auto failure = called("DRNodeDB::ListAttr", id, app))
        return *failure != 0;
    attrs.clear();
    for (const DRNodeAttr &known : model().node_attributes) {
        if (known.node_id == id && known.app == app)
            attrs.push_back(known);
    }
    return true;
}

bool DRNodeDB::SetAttr(const DRNodeAttr &attr)
{
    if (auto failure = called("DRNodeDB::SetAttr", attr.node_id, attr.app, attr.key, attr.value))
        return *failure != 0;
    for (DRNodeAttr &known : model().node_attributes) {
        if (known.node_id == attr.node_id && known.app == attr.app && known.key == attr.key) {
            known.value = attr.value;
            return true;
        }
    }
    model().node_attributes.push_back(attr);
    return true;
}

} // namespace NorvDRNode

int NORVExtentPoolRODKeyGet(char *key, int size)
{
    NOTE_CALL(size);
    return putText(key, size, model().rod_key);
}

NORV_CRED *NORVCredAlloc()
{
    return called(__func__) ? nullptr : noted(new NORV_CRED);
}

void NORVCredFree(NORV_CRED *cred)
{
    noteFreed(cred);
    delete cred;
}

NORV_CRED_SESS *NORVCredSessAlloc()
{
    return called(__func__) ? nullptr : noted(new NORV_CRED_SESS);
}

void NORVCredSessFree(NORV_CRED_SESS *session)
{
    noteFreed(session);
    delete session;
}

int NORVCredItemSetHost(NORV_CRED *cred, const char *host)
{
    cred->host = host;
    return called(__func__, host).value_or(0);
}

int NORVCredItemSetPort(NORV_CRED *cred, int port)
{
    cred->port = port;
    return called(__func__, port).value_or(0);
}

int NORVCredItemSetProtocol(NORV_CRED *cred, const char *protocol)
{
    cred->protocol = protocol;
    return called(__func__, protocol).value_or(0);
}

int NORVCredItemSetRemoteAccount(NORV_CRED *cred, const char *account)
{
    cred->account = account;
    return called(__func__, account).value_or(0);
}

int NORVCredItemSetRemotePasswd(NORV_CRED *cred, const char *password)
{
    cred->password = password;
    return called(__func__).value_or(0);
}

int NORVCredSessItemGetAccessToken(char *token, int size, const NORV_CRED_SESS *session)
{
    NOTE_CALL(size);
    return putText(token, size, session->token);
}

namespace NORV {

bool CredRequestUtil::LoginWithOTP(const NORV_CRED *cred, const std::string &otp_code, NORV_CRED_SESS *session,
                                   Json::Value *response)
{
    const std::string address = cred->protocol + "://" + cred->host + ":" + std::to_string(cred->port);
    if (auto failure = called("CredRequestUtil::LoginWithOTP", address, cred->account))
        return *failure != 0;
    const Peer &peer = model().peer;
    if (cred->account != peer.account || cred->password != peer.password || otp_code != peer.otp_code)
        return false;
    session->token = peer.token;
    *response = Json::Value(Json::objectValue);
    return true;
}

bool CredRequestUtil::Logout(const NORV_CRED *cred, const std::string &token)
{
    const std::string address = cred->protocol + "://" + cred->host + ":" + std::to_string(cred->port);
    if (auto failure = called("CredRequestUtil::Logout", address, token))
        return *failure != 0;
    return token == model().peer.token;
}

} // namespace NORV

int NorvCgiInit(const char *arguments, NORV_CGI **cgi)
{
    NOTE_CALL(arguments);
    *cgi = noted(new NORV_CGI);
    return 0;
}

void NorvCgiFree(NORV_CGI *cgi)
{
    noteFreed(cgi);
    delete cgi;
}

int NorvCgiSetOption(NORV_CGI *cgi, int option, unsigned int value)
{
    return setOption(cgi, option, value);
}

int NorvCgiSetOption(NORV_CGI *cgi, int option, const char *value)
{
    return setOption(cgi, option, value);
}

int NorvCgiLoginNoAuth(NORV_CGI *cgi, char *session, int size, const NORV_CGI_IDENTITY &identity)
{
    NOTE_CALL(size, identity.user);
    const std::string name = "session-of-" + cgi->options[NORV_CGI_HOST];
    if (putText(session, size, name))
        return 0;
    model().cgi_sessions.insert(name);
    return 1;
}

bool NorvCgiRemoveSessionByIndex(NORV_CGI *, int kind, const char *session)
{
    if (auto failure = called(__func__, kind, session))
        return *failure != 0;
    return kind == NORV_CGI_SESSION_ID && model().cgi_sessions.erase(session) == 1;
}

int NORVUserGetUGID(const char *name, unsigned int *uid, unsigned int *gid)
{
    NOTE_CALL(name);
    const auto *ids = valueOf(model().account_ids, name);
    if (!ids)
        return -1;
    *uid = ids->first;
    *gid = ids->second;
    return 0;
}

int NORVCheckModule(const char *name)
{
    NOTE_CALL(name);
    return model().missing_modules.count(name) == 0 ? 1 : 0;
}

int NORVSystemGetBootStep()
{
    if (auto failure = called(__func__))
        return *failure;
    return static_cast<int>(answerOf(__func__, NORV_BOOT_DONE));
}
