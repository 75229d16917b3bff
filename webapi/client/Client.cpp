#include "webapi/client/Client.h"

#include <iscsihost/https.h>
#include <json/writer.h>

namespace ISCSI::WebAPI {
namespace {

std::string compact(const Json::Value &value)
{
    Json::StreamWriterBuilder builder;
    builder["indentation"] = "";
    return Json::writeString(builder, value);
}

iscsihost::HttpsRequest requestTo(const ISCSINodeInfo &node, const char *verb, const std::string &resource)
{
    iscsihost::HttpsRequest request;
    request.host = node.hostname;
    request.port = node.port;
    request.protocol = node.protocol;
    request.method = verb;
    request.path = "/api/v1" + resource;
    request.token = node.session_id;
    return request;
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
    return readResponse(answer) ? 0 : iscsihost::incompleteAnswer(requestTo(node, method, path));
}

bool Client::readResponse(const Json::Value &)
{
    return true;
}

int Client::exchange(const char *verb, const std::string &resource, const Json::Value &input, Json::Value &output) const
{
    iscsihost::HttpsRequest request = requestTo(node, verb, resource);
    if (!input.isNull())
        request.body = compact(input);
    return iscsihost::callApi(request, output);
}

std::string Client::segment(const std::string &identifier)
{
    std::string escaped;
    for (const char c : identifier) {
        if ((c >= '0' && c <= '9') || (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z') || c == '-') {
            escaped += c;
            continue;
        }
        constexpr char DIGITS[] = "0123456789ABCDEF";
        const auto byte = static_cast<unsigned char>(c);
        escaped += {'%', DIGITS[byte >> 4], DIGITS[byte & 15]};
    }
    return escaped;
}

} // namespace ISCSI::WebAPI
