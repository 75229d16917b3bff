// The connection to a peer, below the classes of its requests: each request is noted as it is sent, and answered from
// the model. The pairing of nodes, which is the host's, is noted in whole.
#include "tests/fake/Script.h"
#include "webapi/client/APINode.h"

#include <json/writer.h>

#include <typeinfo>

using namespace fake;

namespace ISCSI::WebAPI {
namespace {

/// The name of the request's class, without its namespaces.
std::string nameOf(const Client &request)
{
    const std::string mangled = typeid(request).name();
    const std::string name = mangled.substr(mangled.find("WebAPIClient"));
    return name.substr(0, name.size() - 1);
}

std::string compact(const Json::Value &value)
{
    Json::StreamWriterBuilder builder;
    builder["indentation"] = "";
    return Json::writeString(builder, value);
}

std::string listed(const std::vector<ISCSINodeInfo> &nodes)
{
    std::string list;
    for (const ISCSINodeInfo &node : nodes)
        list += (list.empty() ? "{" : " ") + node.uuid;
    return list + "}";
}

/// Holds what any request asks for.
Json::Value answerTo(const std::string &method, const std::string &path)
{
    Peer &peer = model().peer;
    const PeerState state = method == "GET" ? peer.states.take() : PeerState{};
    const bool is_snapshot = path.find("/snapshots") != std::string::npos;
    Json::Value answer(Json::objectValue);
    answer["uuid"] = is_snapshot ? peer.snapshot_uuid : peer.lun_uuid;
    answer["is_action_locked"] = answer["is_locked"] = state.is_locked;
    answer["sync_progress"] = Json::UInt64(state.sync_progress);
    answer["base_version"] = peer.base_version;
    answer["need_full_sync"] = peer.need_full_sync;
    answer["not_aligned"] = peer.not_aligned;
    answer["rod_key"] = peer.rod_key;
    return answer;
}

} // namespace

Client::Client(const ISCSINodeInfo &node, const char *method, std::string path, Json::Value body)
    : node(node), method(method), path(std::move(path)), body(std::move(body))
{
}

Client::~Client() = default;

int Client::send()
{
    const std::string text = body.isNull() ? path : joined(path, compact(body));
    if (auto failure = called(nameOf(*this).c_str(), node.hostname.empty() ? node.uuid : node.hostname, text))
        return *failure;
    if (node.hostname.empty() && !node.is_local_node)
        return NORV_ERR_BAD_PARAMETER; // nowhere to send it
    return readResponse(answerTo(method, path)) ? 0 : NORV_ERR_BAD_PARAMETER;
}

bool Client::readResponse(const Json::Value &)
{
    return true;
}

std::string Client::segment(const std::string &identifier)
{
    return identifier;
}

namespace APINode {

WebAPIClientNodeCreateSession::WebAPIClientNodeCreateSession(const ISCSINodeInfo &node)
    : Client(node, "POST", node.hostname)
{
}

int WebAPIClientNodeCreateSession::send()
{
    return Client::send();
}

WebAPIClientNodeAddNode::WebAPIClientNodeAddNode(const ISCSINodeInfo &node, const std::vector<ISCSINodeInfo> &nodes)
    : Client(node, "POST", listed(nodes)), nodes(nodes)
{
}

int WebAPIClientNodeAddNode::send()
{
    return Client::send();
}

WebAPIClientNodeGet::WebAPIClientNodeGet(const ISCSINodeInfo &node) : Client(node, "POST", node.hostname) {}

bool WebAPIClientNodeGet::readResponse(const Json::Value &response)
{
    rod_key = response["rod_key"].asString();
    return true;
}

} // namespace APINode

} // namespace ISCSI::WebAPI
