/// The credential service: sessions on other appliances, opened with an account and its password.
#include "platform/credential.h"
#include "host/core/LastError.h"
#include "iscsihost/https.h"
#include "platform/error.h"

#include <cstring>
#include <json/writer.h>
#include <new>

using iscsihost::HttpsRequest;
using norvhost::fail;

namespace {

constexpr const char *session_path = "/api/v1/session";

/// Overwrites a secret before its memory is used for something else.
void wipe(std::string &text)
{
    text.resize(text.capacity()); // a longer one may have stood there
    explicit_bzero(text.data(), text.size());
    text.clear();
}

void wipe(Json::Value &text)
{
    const char *begin = nullptr;
    const char *end = nullptr;
    if (text.getString(&begin, &end))
        explicit_bzero(const_cast<char *>(begin), static_cast<size_t>(end - begin));
}

/// A text that is wiped when it ends.
struct Secret {
    Secret() = default;
    ~Secret() { wipe(text); }
    Secret(const Secret &) = delete;
    Secret &operator=(const Secret &) = delete;

    std::string text;
};

} // namespace

struct NORV_CRED {
    std::string host;
    uint16_t port = 0;
    std::string protocol;
    std::string account;
    Secret password;
};

struct NORV_CRED_SESS {
    Secret token;
};

namespace {

int setText(std::string *field, const char *value)
{
    if (!field || !value)
        return -fail(NORV_ERR_NULL_POINTER, "no credential, or no value for it");
    try {
        *field = value;
    } catch (const std::bad_alloc &) {
        return -fail(NORV_ERR_OUT_OF_MEMORY, "no memory for a credential");
    }
    return 0;
}

HttpsRequest toServer(const NORV_CRED &cred, const char *method)
{
    HttpsRequest request;
    request.host = cred.host;
    request.port = cred.port;
    request.protocol = cred.protocol;
    request.method = method;
    request.path = session_path;
    return request;
}

} // namespace

NORV_CRED *NORVCredAlloc(void)
{
    return new (std::nothrow) NORV_CRED;
}

void NORVCredFree(NORV_CRED *cred)
{
    delete cred;
}

NORV_CRED_SESS *NORVCredSessAlloc(void)
{
    return new (std::nothrow) NORV_CRED_SESS;
}

void NORVCredSessFree(NORV_CRED_SESS *session)
{
    delete session;
}

int NORVCredItemSetHost(NORV_CRED *cred, const char *host)
{
    return setText(cred ? &cred->host : nullptr, host);
}

int NORVCredItemSetPort(NORV_CRED *cred, int port)
{
    if (!cred || port < 1 || port > UINT16_MAX)
        return -fail(NORV_ERR_BAD_PARAMETER, "port: %d is none", port);
    cred->port = static_cast<uint16_t>(port);
    return 0;
}

int NORVCredItemSetProtocol(NORV_CRED *cred, const char *protocol)
{
    return setText(cred ? &cred->protocol : nullptr, protocol);
}

int NORVCredItemSetRemoteAccount(NORV_CRED *cred, const char *account)
{
    return setText(cred ? &cred->account : nullptr, account);
}

int NORVCredItemSetRemotePasswd(NORV_CRED *cred, const char *password)
{
    if (cred)
        wipe(cred->password.text);
    return setText(cred ? &cred->password.text : nullptr, password);
}

int NORVCredSessItemGetAccessToken(char *token, int size, const NORV_CRED_SESS *session)
{
    if (!token || size < 1 || !session)
        return fail(NORV_ERR_NULL_POINTER, "no session, or no room for its token");
    const std::string &text = session->token.text;
    if (text.empty())
        return fail(NORV_ERR_BAD_PARAMETER, "the session is not logged in");
    if (text.size() >= static_cast<size_t>(size))
        return fail(NORV_ERR_BAD_PARAMETER, "the token has %zu bytes, there is room for %d", text.size(), size - 1);
    memcpy(token, text.c_str(), text.size() + 1);
    return 0;
}

namespace NORV {

bool CredRequestUtil::LoginWithOTP(const NORV_CRED *cred, const std::string &otp_code, NORV_CRED_SESS *session,
                                   Json::Value *response)
{
    if (!cred || !session) {
        fail(NORV_ERR_NULL_POINTER, "log-in without a credential or a session");
        return false;
    }
    Json::Value login(Json::objectValue);
    login["account"] = cred->account;
    login["password"] = cred->password.text;
    login["otp_code"] = otp_code;
    HttpsRequest request = toServer(*cred, "POST");
    Json::StreamWriterBuilder writer;
    writer["indentation"] = "";
    request.body = Json::writeString(writer, login);
    wipe(login["password"]);
    Json::Value answer;
    const int err = iscsihost::callApi(request, answer);
    wipe(request.body);
    if (err)
        return false;
    const bool has_token = answer.isObject() && answer["token"].isString() && !answer["token"].asString().empty();
    if (!has_token) {
        fail(NORV_ERR_BAD_RESPONSE, "%s answers a log-in without a token", cred->host.c_str());
        return false;
    }
    session->token.text = answer["token"].asString();
    if (response)
        *response = answer;
    wipe(answer["token"]);
    return true;
}

bool CredRequestUtil::Logout(const NORV_CRED *cred, const std::string &token)
{
    if (!cred) {
        fail(NORV_ERR_NULL_POINTER, "log-out without a credential");
        return false;
    }
    HttpsRequest request = toServer(*cred, "DELETE");
    request.token = token;
    Json::Value answer;
    const int err = iscsihost::callApi(request, answer);
    wipe(request.token);
    return err == 0;
}

} // namespace NORV
