#include "webapi/client/Client.h"

#include "etc/JsonReader.h"
#include "iscsiwebapi/ISCSIErrorCode.h"
#include "platform/dr_node.h"

#include <cstdint>
#include <iscsihost/https.h>
#include <json/reader.h>
#include <json/writer.h>
#include <memory>

namespace ISCSI::WebAPI {
namespace {

constexpr int ANSWER_MAX_DEPTH = 16;

std::string compact(const Json::Value &value)
{
    Json::StreamWriterBuilder builder;
    builder["indentation"] = "";
    return Json::writeString(builder, value);
}

bool parse(const std::string &text, Json::Value &value)
{
    Json::CharReaderBuilder builder;
    Json::CharReaderBuilder::strictMode(&builder.settings_);
    builder["stackLimit"] = ANSWER_MAX_DEPTH; // jsoncpp throws above it
    const std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
    try {
        return reader->parse(text.data(), text.data() + text.size(), &value, nullptr);
    } catch (const Json::Exception &) {
        return false;
    }
}

/// A problem description carries the peer's own code.
int peersCode(const Json::Value &problem)
{
    int code = 0;
    if (!JsonReader(problem).required("code", code).ok() || code == 0)
        return ERR_FAILED_TO_GET_ERROR_CODE;
    return code;
}

} // namespace

Client::Client(const ISCSINodeInfo &node, const char *method, std::string path, Json::Value body)
    : node(node), method(method), path(std::move(path)), body(std::move(body))
{
}

Client::~Client() = default;

int Client::send()
{
    Json::Value answer;
    if (int err = exchange(method, path, body, answer))
        return err;
    return readResponse(answer) ? 0 : ERR_BAD_RESPONSE;
}

bool Client::readResponse(const Json::Value &)
{
    return true;
}

int Client::exchange(const char *verb, const std::string &resource, const Json::Value &input, Json::Value &output)
{
    if (node.hostname.empty() || node.port == 0)
        return ERR_FAILED_TO_CREATE_REQUEST;
    iscsihost::HttpsRequest request;
    request.host = node.hostname;
    request.port = node.port;
    request.protocol = node.protocol;
    request.method = verb;
    request.path = "/api/v1" + resource;
    request.token = node.session_id;
    if (!input.isNull())
        request.body = compact(input);
    iscsihost::HttpsAnswer answer;
    if (int err = iscsihost::https(request, answer))
        return err;
    if (answer.status == 204)
        return 0;
    Json::Value value;
    if (answer.content_type.rfind("application/", 0) != 0 || !parse(answer.body, value))
        return ERR_BAD_RESPONSE;
    if (answer.status < 200 || answer.status > 299)
        return peersCode(value);
    output = value;
    return 0;
}

} // namespace ISCSI::WebAPI
