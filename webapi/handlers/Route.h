/// Requests, results, and the table that connects them. Nothing here knows HTTP.
#pragma once

#include "webapi/handlers/Input.h"

#include <json/value.h>

#include <map>
#include <string>
#include <vector>

namespace webapi {

enum class Method {
    Get,
    Post,
    Put,
    Patch,
    Delete
};

/// Who may ask: a viewer reads, an administrator does everything.
enum class Role {
    Viewer,
    Admin
};

/// A request that was found in the table and checked.
struct Request {
    std::map<std::string, std::string> path; ///< the values of the pattern's parameters, by name
    Json::Value input;                       ///< an object that holds the route's fields, checked
    std::string account;                     ///< who asks
};

/// Who asks without a session: the administrator of the machine.
constexpr char LOCAL_ACCOUNT[] = "admin";

struct Result {
    int code = 0;       ///< 0, or the library's error code (ISCSIErrorCode.h)
    std::string reason; ///< of a failure: one line for people; empty when the code's text says it all
    Json::Value value;  ///< the answer; null when there is none
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

/// Finds the route, checks the input and runs the handler. The path's segments are percent-encoded;
/// for a Get the input is what the query carries. ERR_NO_SUCH_API when no route fits,
/// ERR_INVALID_INPUT or the field's own code for input that is refused. Throws nothing.
Result dispatch(Method method, const std::string &path, const Json::Value &input,
                const std::string &account = LOCAL_ACCOUNT);

/// Encodes a text as one segment of a path.
std::string pathSegment(const std::string &text);

} // namespace webapi
