#include "webapi/cgi/Answer.h"

#include "iscsihost/host.h"
#include "iscsihost/session.h"
#include "iscsiwebapi/ISCSIErrorCode.h"
#include "webapi/cgi/Input.h"
#include "webapi/cgi/Status.h"
#include "webapi/handlers/JsonText.h"
#include "webapi/handlers/Route.h"

#include <optional>
#include <string_view>
#include <strings.h>

namespace webapi {
namespace {

using namespace ISCSI;

constexpr std::string_view ROOT = "/api/v1";
constexpr std::string_view BEARER = "Bearer ";
constexpr std::string_view JSON_TYPE = "application/json";

std::optional<Method> methodOf(const std::string &name)
{
    for (const MethodName &entry : METHODS) {
        if (entry.name == name)
            return entry.method;
    }
    return std::nullopt;
}

std::string namesOf(const std::vector<Method> &methods)
{
    std::string names;
    for (const MethodName &entry : METHODS) {
        for (Method method : methods) {
            if (method == entry.method)
                names += (names.empty() ? "" : ", ") + std::string(entry.name);
        }
    }
    return names;
}

/// Starts with `prefix`, whatever the case of its letters.
bool startsWith(const std::string &text, std::string_view prefix)
{
    return text.size() >= prefix.size() && strncasecmp(text.data(), prefix.data(), prefix.size()) == 0;
}

/// "application/json", parameters ignored.
bool isJson(const std::string &type)
{
    return startsWith(type, JSON_TYPE) &&
           (type.size() == JSON_TYPE.size() || type[JSON_TYPE.size()] == ';' || type[JSON_TYPE.size()] == ' ');
}

HttpAnswer refused(const Result &result, int status)
{
    HttpAnswer answer = problem(status, result.code, result.reason);
    answer.retry_after = result.retry_after;
    return answer;
}

/// Who asks, by the token; nothing to refuse when the status stays 200.
HttpAnswer authenticate(const Route &route, Request &call)
{
    if (route.role == Role::Anyone)
        return {};
    if (call.token.empty())
        return problem(401, ERR_FAILED_TO_LOGIN,
                       "log in first: POST /session gives a token for the Authorization header");
    iscsihost::Session session;
    if (int err = iscsihost::authenticate(call.token, call.address, session))
        return err == ERR_FAILED_TO_LOGIN ? problem(401, err, "the session has ended; log in again")
                                          : problem(httpStatus(err), err, iscsi_host_last_error());
    call.account = session.account;
    if (route.role == Role::Admin && session.role != iscsihost::AccountRole::admin)
        return problem(403, ERR_NO_PERMISSION, "this takes the role of an administrator");
    return {};
}

/// The input of a request: the body's, or the query's where there can be no body.
HttpAnswer readInput(Method method, const Route &route, const HttpRequest &request, std::string_view query,
                     Json::Value &input)
{
    const bool has_body = !request.body.empty();
    std::string reason;
    if (method == Method::Get || (method == Method::Delete && !has_body)) {
        if (has_body)
            return problem(400, ERR_INVALID_INPUT, "a GET request has no body");
        return readQuery(route.fields, query, input, reason) ? HttpAnswer() : problem(400, ERR_INVALID_INPUT, reason);
    }
    if (!query.empty())
        return problem(400, ERR_INVALID_INPUT, "the input belongs into the body, not into the query");
    if (has_body && !isJson(request.content_type))
        return problem(415, ERR_INVALID_INPUT, "the body must be of the type application/json");
    return readBody(request.body, input, reason) ? HttpAnswer() : problem(400, ERR_INVALID_INPUT, reason);
}

HttpAnswer run(const Route &route, const Request &call)
{
    Result result = runRoute(route, call);
    if (result.code) {
        // Elsewhere this code is about a log-in to a peer.
        const bool own_login = result.code == ERR_FAILED_TO_LOGIN && route.path == std::string_view("/session");
        return refused(result, own_login ? 401 : httpStatus(result.code));
    }
    HttpAnswer answer;
    answer.status = result.value.isNull() ? 204 : 200;
    answer.body = std::move(result.value);
    return answer;
}

} // namespace

HttpAnswer problem(int status, int code, const std::string &reason)
{
    HttpAnswer answer;
    answer.status = status;
    answer.code = code;
    answer.body["type"] = "about:blank";
    answer.body["title"] = ErrorCodeToString(code);
    answer.body["status"] = status;
    answer.body["code"] = code;
    if (!reason.empty())
        answer.body["detail"] = reason;
    return answer;
}

HttpAnswer answer(const HttpRequest &request)
{
    const size_t query_at = request.target.find('?');
    const std::string path = request.target.substr(0, query_at);
    const std::string query = query_at == path.npos ? "" : request.target.substr(query_at + 1);
    const auto method = methodOf(request.method);
    if (!method)
        return problem(501, ERR_NO_SUCH_API, "no such method");
    if (path.compare(0, ROOT.size(), ROOT) != 0 || path[ROOT.size()] != '/')
        return problem(404, ERR_NO_SUCH_API, "");
    const Found found = findRoute(*method, path.substr(ROOT.size()));
    if (!found.route) {
        HttpAnswer none = problem(found.methods.empty() ? 404 : 405, ERR_NO_SUCH_API, "");
        none.allow = namesOf(found.methods);
        return none;
    }

    Request call;
    call.path = found.path;
    call.address = request.address;
    if (startsWith(request.authorization, BEARER))
        call.token = request.authorization.substr(BEARER.size());
    HttpAnswer answer = authenticate(*found.route, call);
    if (answer.status == 200)
        answer = readInput(*method, *found.route, request, query, call.input);
    if (answer.status == 200)
        answer = run(*found.route, call);
    answer.account = call.account;
    return answer;
}

std::string cgiText(const HttpAnswer &answer)
{
    std::string text = "Status: " + std::to_string(answer.status) + "\r\n";
    if (answer.status == 401)
        text += "WWW-Authenticate: Bearer\r\n";
    if (!answer.allow.empty())
        text += "Allow: " + answer.allow + "\r\n";
    if (answer.retry_after > 0)
        text += "Retry-After: " + std::to_string(answer.retry_after) + "\r\n";
    if (answer.status == 204)
        return text + "\r\n";
    const std::string body = jsonText(answer.body) + "\n";
    text += answer.status < 300 ? "Content-Type: application/json\r\n" : "Content-Type: application/problem+json\r\n";
    text += "Content-Length: " + std::to_string(body.size()) + "\r\n\r\n";
    return text + body;
}

} // namespace webapi
