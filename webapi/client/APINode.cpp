#include "webapi/client/APINode.h"

#include "etc/JsonReader.h"
#include "iscsiwebapi/ISCSIErrorCode.h"

#include <iscsihost/https.h>
#include <iscsihost/node.h>

namespace ISCSI::WebAPI::APINode {

using iscsihost::PairedNode;

namespace {

/// A node as another one is to record it. The local node is described as that one reaches it, with a session
/// that is made for it.
int describe(const ISCSINodeInfo &node, const ISCSINodeInfo &reader, PairedNode &out)
{
    if (!node.is_local_node)
        return iscsihost::describePairedNode(node.uuid, out);
    if (int err = iscsihost::describeLocalNode(reader.hostname, out))
        return err;
    ISCSINodeInfo session(reader.hostname, "admin");
    if (int err = session.createSession())
        return err;
    out.token = session.session_id;
    return 0;
}

Json::Value toJson(const PairedNode &node)
{
    Json::Value value(Json::objectValue);
    value["uuid"] = node.uuid;
    value["hostname"] = node.host;
    value["port"] = node.port;
    value["protocol"] = node.protocol;
    value["rod_key"] = node.rod_key;
    value["session_id"] = node.token;
    value["pin"] = node.pin;
    return value;
}

} // namespace

WebAPIClientNodeCreateSession::WebAPIClientNodeCreateSession(const ISCSINodeInfo &node) : Client(node, "POST", "") {}

int WebAPIClientNodeCreateSession::send()
{
    Json::Value login(Json::objectValue);
    login["account"] = node.account;
    login["password"] = node.password;
    login["otp_code"] = node.otp_code;
    node.session_id.clear();
    Json::Value answer;
    if (int err = exchange("POST", "/session", login, answer))
        return err;
    if (!JsonReader(answer).required("token", node.session_id).ok())
        return ERR_FAILED_TO_GET_SESSION_ID;

    PairedNode local;
    int err = iscsihost::describeLocalNode(node.hostname, local);
    Json::Value wish(Json::objectValue);
    wish["hostname"] = local.host;
    if (!err)
        err = exchange("POST", "/nodes/local/sessions", wish, answer);
    Json::Value nothing;
    exchange("DELETE", "/session", Json::Value(), nothing); // else it ends by itself
    if (err)
        return err;

    PairedNode peer;
    if (!JsonReader(answer)
             .required("uuid", peer.uuid)
             .required("rod_key", peer.rod_key)
             .required("session_id", peer.token)
             .ok())
        return ERR_BAD_RESPONSE;
    if (peer.uuid != node.uuid)
        return ERR_BAD_NODE_UUID;
    peer.host = node.hostname;
    peer.port = node.port;
    peer.protocol = node.protocol;
    if (int failed = iscsihost::getPin(node.hostname, node.port, peer.pin))
        return failed;
    return iscsihost::keepNodeSession(peer);
}

WebAPIClientNodeAddNode::WebAPIClientNodeAddNode(const ISCSINodeInfo &node, const std::vector<ISCSINodeInfo> &nodes)
    : Client(node, "POST", "/nodes"), nodes(nodes)
{
}

int WebAPIClientNodeAddNode::send()
{
    Json::Value body(Json::objectValue);
    body["nodes"] = Json::arrayValue;
    int known = 0;
    for (const ISCSINodeInfo &listed : nodes) {
        if (listed.uuid == node.uuid && !node.is_local_node)
            continue; // it knows itself
        PairedNode described;
        if (int err = describe(listed, node, described))
            return err;
        body["nodes"].append(toJson(described));
        if (!node.is_local_node)
            continue;
        const int err = iscsihost::addPairedNode(described);
        if (err == ERR_NODE_UUID_EXISTS)
            known = err;
        else if (err)
            return err;
    }
    if (node.is_local_node)
        return known;
    if (node.session_id.empty()) { // a node that is just joining has its session in the database
        PairedNode kept;
        if (int err = iscsihost::describePairedNode(node.uuid, kept))
            return err;
        node.session_id = kept.token;
    }
    Json::Value answer;
    return exchange("POST", "/nodes", body, answer);
}

WebAPIClientNodeGet::WebAPIClientNodeGet(const ISCSINodeInfo &node) : Client(node, "GET", "/nodes/local/key") {}

bool WebAPIClientNodeGet::readResponse(const Json::Value &response)
{
    return JsonReader(response).required("rod_key", rod_key).ok() && !rod_key.empty();
}

} // namespace ISCSI::WebAPI::APINode
