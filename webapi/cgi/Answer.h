/// HTTP on top of the table of routes: one request in, one answer out. No I/O of its own.
#pragma once

#include <json/value.h>

#include <string>

namespace webapi {

/// A request as the web server hands it over. Everything in it comes from a stranger, except the address.
struct HttpRequest {
    std::string method;
    std::string target; ///< path and query, as the client sent them
    std::string content_type;
    std::string authorization; ///< the header's value; secret
    std::string body;
    std::string address; ///< the client's
};

struct HttpAnswer {
    int status = 200;
    Json::Value body; ///< null when there is none; a problem description (RFC 9457) above status 299
    std::string allow{};
    int retry_after = 0;   ///< seconds; 0: not said
    std::string account{}; ///< who asked, as far as that was proved
    int code = 0;          ///< 0, or the library's error code
};

/// The largest body that is read, in bytes.
constexpr size_t BODY_MAX_BYTES = 1 << 20;

/// Finds out who asks, what for and with which input, and runs the handler. Throws nothing but std::bad_alloc.
HttpAnswer answer(const HttpRequest &request);

/// A refusal of the web API itself.
HttpAnswer problem(int status, int code, const std::string &reason);

/// Header lines and body, as the web server takes them from a CGI program. No text of a stranger is in a header.
std::string cgiText(const HttpAnswer &answer);

} // namespace webapi
