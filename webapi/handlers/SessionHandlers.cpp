// Sessions of the web API, and whether it is alive.
#include "webapi/handlers/Handlers.h"

#include "iscsihost/host.h"
#include "iscsihost/session.h"
#include "iscsiwebapi/ISCSIErrorCode.h"
#include "platform/dr_node.h"

namespace webapi {

using namespace ISCSI;

namespace {

Json::Value describe(const iscsihost::Session &session)
{
    Json::Value out;
    out["account"] = session.account;
    out["role"] = session.role == iscsihost::AccountRole::admin ? "admin" : "viewer";
    out["expires"] = static_cast<Json::Int64>(session.expires);
    return out;
}

Result noSession()
{
    return failed(ERR_BAD_CLIENT_INPUT, "there are no sessions without the web API");
}

} // namespace

Result openSession(const Request &request)
{
    if (request.address.empty())
        return noSession();
    const Json::Value &in = request.input;
    const std::string account = in["account"].asString();
    iscsihost::Session session;
    if (int err =
            iscsihost::login(account, in["password"].asString(), in["otp_code"].asString(), request.address, session)) {
        Result result = failed(err);
        if (err == ERR_TRY_AGAIN)
            iscsihost::loginDelay(account, request.address, result.retry_after);
        return result;
    }
    Result result;
    result.value = describe(session);
    result.value["token"] = session.token;
    return result;
}

Result showSession(const Request &request)
{
    if (request.token.empty())
        return noSession();
    iscsihost::Session session;
    if (int err = iscsihost::authenticate(request.token, request.address, session))
        return failed(err);
    Result result;
    result.value = describe(session);
    return result;
}

Result closeSession(const Request &request)
{
    if (request.token.empty())
        return noSession();
    if (int err = iscsihost::logout(request.token))
        return failed(err);
    return {};
}

Result showHealth(const Request &)
{
    Result result;
    result.value["status"] = "ok";
    result.value["uuid"] = NorvDRNode::DRNode::getLocalNodeId();
    result.value["version"] = ISCSIWEBAPI_VERSION;
    return result;
}

} // namespace webapi
