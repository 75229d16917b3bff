/// Calls of the web API: requests whose answers are JSON.
#include "host/core/LastError.h"
#include "host/peer/Address.h"
#include "host/peer/NodeApi.h"
#include "iscsihost/https.h"
#include "platform/error.h"

#include <json/reader.h>
#include <json/writer.h>
#include <memory>
#include <strings.h>

namespace norvhost {
namespace {

using iscsihost::HttpsAnswer;

constexpr int depth_max = 16;
constexpr int no_content = 204;

bool isJson(const std::string &content_type)
{
    const std::string type = content_type.substr(0, content_type.find_first_of("; \t"));
    return strcasecmp(type.c_str(), "application/json") == 0 ||
           strcasecmp(type.c_str(), "application/problem+json") == 0;
}

bool parse(const HttpsAnswer &answer, Json::Value &value)
{
    Json::CharReaderBuilder builder;
    Json::CharReaderBuilder::strictMode(&builder.settings_);
    builder["stackLimit"] = depth_max; // jsoncpp throws above it
    const std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
    const std::string &text = answer.body;
    try {
        return isJson(answer.content_type) && reader->parse(text.data(), text.data() + text.size(), &value, nullptr);
    } catch (const Json::Exception &) {
        return false;
    }
}

/// The code and the reason that a problem description carries (RFC 9457, with our "code").
int failProblem(const std::string &server, const HttpsAnswer &answer)
{
    Json::Value problem;
    if (!parse(answer, problem) || !problem.isObject())
        problem = Json::Value(Json::objectValue);
    std::string detail = "no reason given";
    for (const char *key : {"title", "detail"})
        if (problem[key].isString() && !problem[key].asString().empty())
            detail = problem[key].asString();
    const Json::Value &code = problem["code"];
    const bool has_code = code.isInt() && code.asInt() != 0;
    return fail(has_code ? code.asInt() : NORV_ERR_GET_ERROR_CODE, "%s refuses with status %d: %s", server.c_str(),
                answer.status, detail.c_str());
}

} // namespace

int askNode(const iscsihost::PairedNode &node, const char *method, const std::string &path, const Json::Value &input,
            Json::Value &answer)
{
    iscsihost::HttpsRequest request;
    request.host = node.host;
    request.port = node.port;
    request.protocol = node.protocol;
    request.method = method;
    request.path = "/api/v1" + path;
    request.token = node.token;
    request.pin = node.pin;
    Json::StreamWriterBuilder compact;
    compact["indentation"] = "";
    request.body = Json::writeString(compact, input);
    return iscsihost::callApi(request, answer);
}

} // namespace norvhost

namespace iscsihost {

using namespace norvhost;

int callApi(const HttpsRequest &request, Json::Value &value)
{
    HttpsAnswer answer;
    if (int err = https(request, answer))
        return err;
    const std::string server = authority(request.host, request.port);
    if (answer.status < 200 || answer.status > 299)
        return failProblem(server, answer);
    Json::Value read;
    if (answer.status != no_content && !parse(answer, read))
        return fail(NORV_ERR_BAD_RESPONSE, "%s answers with something that is not JSON", server.c_str());
    value = std::move(read);
    return 0;
}

int incompleteAnswer(const HttpsRequest &request)
{
    return fail(NORV_ERR_BAD_RESPONSE, "%s answers %s %s without what was asked for",
                authority(request.host, request.port).c_str(), request.method.c_str(), request.path.c_str());
}

} // namespace iscsihost
