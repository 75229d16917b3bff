/// Requests, results, and the table that connects them. Nothing here knows HTTP.
#pragma once

#include "webapi/handlers/Input.h"

#include <json/value.h>

#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace webapi {

enum class Method {
    Get,
    Post,
    Put,
    Patch,
    Delete
};

/// As on the wire.
struct MethodName {
    Method method;
    const char *name;
};
constexpr MethodName METHODS[] = {
    {Method::Get, "GET"},     {Method::Post, "POST"},     {Method::Put, "PUT"},
    {Method::Patch, "PATCH"}, {Method::Delete, "DELETE"},
};
const char *methodName(Method method);

/// Who may ask: a viewer reads, an administrator does everything. Anyone needs no session.
enum class Role {
    Anyone,
    Viewer,
    Admin
};

/// A request that was found in the table and checked.
struct Request {
    std::map<std::string, std::string> path; ///< the values of the pattern's parameters, by name
    Json::Value input;                       ///< an object that holds the route's fields, checked
    std::string account;                     ///< who asks
    std::string address{};                   ///< from where, as text; empty in a process of the machine's own
    std::string token{};                     ///< secret: the session that came with the request; empty without one
};

/// Who asks without a session: the administrator of the machine.
constexpr char LOCAL_ACCOUNT[] = "admin";

struct Result {
    int code = 0;       ///< 0, or the library's error code (ISCSIErrorCode.h)
    std::string reason; ///< of a failure: one line for people; empty when the code's text says it all
    Json::Value value;  ///< the answer; null when there is none
    int retry_after{};  ///< of a failure: seconds until trying again makes sense; 0 when that is not known
};

/// One thing that can be asked for.
struct Route {
    Method method;
    const char *path; ///< "/luns/{lun}": a segment in braces is a parameter
    Role role;
    Fields fields;
    Result (*handler)(const Request &);
};

/// The whole table, in the order in which it is shown to people.
const std::vector<Route> &routes();

/// What the table has for a request.
struct Found {
    const Route *route = nullptr; ///< null when there is none
    std::map<std::string, std::string> path;
    std::vector<Method> methods; ///< without a route: what the path can be asked with
};

/// The path's segments are percent-encoded.
Found findRoute(Method method, const std::string &path);

/// Checks the request's input against the route's fields and runs the handler. ERR_INVALID_INPUT or the field's own
/// code for input that is refused. Throws nothing.
Result runRoute(const Route &route, const Request &request);

/// Finds the route, checks the input and runs the handler. The path's segments are percent-encoded;
/// for a Get the input is what the query carries. ERR_NO_SUCH_API when no route fits,
/// ERR_INVALID_INPUT or the field's own code for input that is refused. Throws nothing.
Result dispatch(Method method, const std::string &path, const Json::Value &input,
                const std::string &account = LOCAL_ACCOUNT);

/// Encodes a text as one segment of a path.
std::string pathSegment(const std::string &text);

/// Undoes the percent-encoding; nothing for a broken one or an encoded NUL.
std::optional<std::string> decodePercent(std::string_view text);

} // namespace webapi
