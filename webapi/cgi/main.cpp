// iscsi-webapi: answers one request of the web server, and ends.
#include "iscsiwebapi/ISCSIErrorCode.h"
#include "webapi/cgi/Answer.h"

#include <charconv>
#include <csignal>
#include <cstdlib>
#include <cstring>
#include <exception>
#include <syslog.h>
#include <unistd.h>

namespace {

using webapi::HttpAnswer;
using webapi::HttpRequest;

std::string variable(const char *name)
{
    const char *value = getenv(name);
    return value ? value : "";
}

/// A client that goes away does not end what it asked for half-way: the server tells us so with SIGTERM. A handler, not
/// "ignore", so that programs that we start are not deaf.
void surviveClient()
{
    struct sigaction action = {};
    action.sa_handler = [](int) {};
    action.sa_flags = SA_RESTART;
    sigaction(SIGTERM, &action, nullptr);
    sigaction(SIGPIPE, &action, nullptr);
}

/// The body as long as its announced length says. What is wrong with it is told as a problem; status 200 if nothing.
HttpAnswer readBody(std::string &body)
{
    const std::string announced = variable("CONTENT_LENGTH");
    size_t length = 0;
    const char *end = announced.data() + announced.size();
    if (!announced.empty()) {
        const auto [stop, error] = std::from_chars(announced.data(), end, length);
        if (error == std::errc::result_out_of_range || length > webapi::BODY_MAX_BYTES)
            return webapi::problem(413, ISCSI::ERR_INVALID_INPUT, "the body is larger than 1 MiB");
        if (error != std::errc() || stop != end)
            return webapi::problem(400, ISCSI::ERR_INVALID_INPUT, "the length of the body is no number");
    }
    body.resize(length);
    for (size_t done = 0; done < length;) {
        const ssize_t got = read(STDIN_FILENO, body.data() + done, length - done);
        if (got <= 0)
            return webapi::problem(400, ISCSI::ERR_INVALID_INPUT, "the body is shorter than announced");
        done += static_cast<size_t>(got);
    }
    return {};
}

void send(const std::string &text)
{
    for (size_t done = 0; done < text.size();) {
        const ssize_t sent = write(STDOUT_FILENO, text.data() + done, text.size() - done);
        if (sent <= 0)
            return; // the client is gone
        done += static_cast<size_t>(sent);
    }
}

/// Who changed what: a line for every request but those that read.
void note(const HttpRequest &request, const HttpAnswer &answer)
{
    if (request.method == "GET")
        return;
    constexpr size_t PATH_SHOWN = 512;
    std::string path = request.target.substr(0, std::min(request.target.find('?'), PATH_SHOWN));
    for (char &c : path)
        c = c > ' ' && c < 0x7F ? c : '?';
    syslog(LOG_INFO, "%s at %s: %s %s: %d, error %d (%s)", answer.account.empty() ? "somebody" : answer.account.c_str(),
           request.address.c_str(), request.method.c_str(), path.c_str(), answer.status, answer.code,
           answer.code ? ISCSI::ErrorCodeToString(answer.code) : "none");
}

void serve()
{
    HttpRequest request;
    request.method = variable("REQUEST_METHOD");
    request.target = variable("REQUEST_URI");
    request.content_type = variable("CONTENT_TYPE");
    request.authorization = variable("HTTP_AUTHORIZATION");
    request.address = variable("REMOTE_ADDR");
    HttpAnswer answer = readBody(request.body);
    if (answer.status == 200)
        answer = webapi::answer(request);
    note(request, answer);
    send(webapi::cgiText(answer));
}

} // namespace

int main()
{
    surviveClient();
    openlog("iscsi-webapi", LOG_PID, LOG_DAEMON);
    try {
        serve();
    } catch (const std::exception &) {
        send(webapi::cgiText(webapi::problem(500, ISCSI::ERR_OUT_OF_MEMORY, "")));
    }
    return 0;
}
