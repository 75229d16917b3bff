// Nodes: this appliance, the paired ones, and how they become so.
#include "webapi/handlers/Handlers.h"

#include "iscsihost/https.h"
#include "iscsihost/node.h"
#include "iscsihost/session.h"
#include "iscsiwebapi/ISCSIErrorCode.h"
#include "iscsiwebapi/ISCSILIBNode.h"

#include <algorithm>

namespace webapi {

using namespace ISCSI;
using iscsihost::PairedNode;
using LIB::LIBNode::ISCSILIBNode;

namespace {

constexpr char PROTOCOL[] = "https";
constexpr unsigned DEFAULT_PORT = 5443;
constexpr char PEER_APP[] = "NORV.iSCSI"; ///< what sessions of peers are opened for

uint16_t portOf(const Json::Value &input)
{
    return static_cast<uint16_t>(input.isMember("port") ? input["port"].asUInt() : DEFAULT_PORT);
}

/// The record without its secrets. The local node has no host name and no port: others reach it by them.
Result describe(const ISCSINodeInfo &node)
{
    Result result;
    Json::Value &out = result.value;
    out["uuid"] = node.uuid;
    out["hostname"] = node.hostname;
    out["port"] = node.port;
    out["protocol"] = node.protocol;
    out["is_local_node"] = node.is_local_node;
    if (node.is_local_node)
        return result;
    ISCSINodeInfo configured(node.uuid);
    out["is_logged_in"] = configured.isInConfig();
    if (out["is_logged_in"].asBool() && configured.loadFromConfig() == 0)
        out["account"] = configured.account;
    std::string pin;
    if (int err = iscsihost::getPin(node.hostname, node.port, pin))
        return failed(err);
    out["pin"] = pin;
    return result;
}

Result selectPeer(const Request &request, ISCSINodeInfo &node)
{
    if (Result bad = selectNode(request.path.at("node"), node); bad.code)
        return bad;
    return node.is_local_node ? failed(ERR_BAD_NODE_UUID, "this is the appliance itself") : Result{};
}

/// The node UUID that an appliance says it has.
Result askIdentity(const std::string &host, uint16_t port, const std::string &pin, std::string &uuid)
{
    iscsihost::HttpsRequest request;
    request.host = host;
    request.port = port;
    request.protocol = PROTOCOL;
    request.path = "/api/v1/health";
    request.pin = pin;
    Json::Value health;
    if (int err = iscsihost::callApi(request, health))
        return failed(err);
    if (!health.isObject() || !health["uuid"].isString() || !isUuid(health["uuid"].asString()))
        return failed(iscsihost::incompleteAnswer(request));
    uuid = health["uuid"].asString();
    return {};
}

/// Every node, this appliance first.
Result loadNodes(std::vector<ISCSINodeInfo> &nodes)
{
    const int err = ISCSILIBNode::ListNode(nodes);
    if (err == ERR_BAD_NODE_UUID)
        return failed(err, "this appliance has no identity yet: 'iscsi-host init' makes one");
    return err ? failed(err) : Result{};
}

/// The one with this UUID, or null.
const ISCSINodeInfo *findNode(const std::vector<ISCSINodeInfo> &nodes, const std::string &uuid)
{
    const auto node = std::find_if(nodes.begin(), nodes.end(), [&](const auto &one) { return one.uuid == uuid; });
    return node == nodes.end() ? nullptr : &*node;
}

Result describeByUuid(const std::string &uuid)
{
    ISCSINodeInfo node(uuid);
    if (int err = node.loadFromDRNode())
        return failed(err);
    return describe(node);
}

/// Ends a session that a node opened for this appliance. That it is gone is all that counts, and it may be so already.
void endSessionAt(const PairedNode &node)
{
    iscsihost::HttpsRequest request;
    request.host = node.host;
    request.port = node.port;
    request.protocol = node.protocol;
    request.method = "DELETE";
    request.path = "/api/v1/session";
    request.token = node.token;
    request.pin = node.pin;
    Json::Value nothing;
    iscsihost::callApi(request, nothing);
}

/// Ends the sessions that this appliance opened for a node. They are known by the node's host name, so that one which
/// another node shares keeps them.
Result closeSessionsOf(const ISCSINodeInfo &node)
{
    std::vector<ISCSINodeInfo> nodes;
    if (Result bad = loadNodes(nodes); bad.code)
        return bad;
    const auto sharing = std::count_if(nodes.begin(), nodes.end(),
                                       [&](const ISCSINodeInfo &other) { return other.hostname == node.hostname; });
    std::vector<iscsihost::Session> sessions;
    if (int err = sharing > 1 ? 0 : iscsihost::listSessions(sessions))
        return failed(err);
    for (const iscsihost::Session &session : sessions) {
        if (session.app != PEER_APP || session.address != node.hostname)
            continue;
        if (int err = iscsihost::closeSession(session.id))
            return failed(err);
    }
    return {};
}

/// Forgets a node here, and ends the sessions of both directions.
Result forget(const ISCSINodeInfo &node)
{
    if (Result bad = closeSessionsOf(node); bad.code)
        return bad;
    if (int err = node.deleteFromNodeConfig())
        return failed(err);
    PairedNode paired;
    if (iscsihost::describePairedNode(node.uuid, paired) == 0)
        endSessionAt(paired);
    if (int err = iscsihost::removePairedNode(node.uuid))
        return failed(err);
    return {};
}

/// After a joining that failed: what was kept of a node that did not come to be paired goes.
Result joinFailed(const Result &failure, const std::string &uuid, const std::string &host, uint16_t port,
                  const std::string &pin_before)
{
    std::vector<ISCSINodeInfo> nodes;
    if (loadNodes(nodes).code)
        return failure;
    if (findNode(nodes, uuid))
        return failed(failure.code, failure.reason + (failure.reason.empty() ? "" : "; ") +
                                        "it is paired half: remove the node before another try");
    PairedNode kept;
    if (iscsihost::describePairedNode(uuid, kept) == 0) {
        endSessionAt(kept);
        iscsihost::removePairedNode(uuid);
    }
    iscsihost::setPin(host, port, pin_before);
    return failure;
}

} // namespace

Result selectNode(const std::string &selector, ISCSINodeInfo &node)
{
    std::vector<ISCSINodeInfo> nodes;
    if (Result bad = loadNodes(nodes); bad.code)
        return bad;
    std::string uuid;
    const int err = ISCSINodeInfo::GetNodeUUID(selector == "local" ? "node#1" : selector, uuid);
    if (err && err != ERR_BAD_NODE_UUID)
        return failed(err);
    const ISCSINodeInfo *found = err ? nullptr : findNode(nodes, uuid);
    if (!found)
        return failed(ERR_NO_SUCH_NODE, "no node has the UUID, host name or index '" + selector + "'");
    node = *found;
    return {};
}

Result listNodes(const Request &)
{
    std::vector<ISCSINodeInfo> nodes;
    if (Result bad = loadNodes(nodes); bad.code)
        return bad;
    Result result;
    result.value = Json::arrayValue;
    for (const ISCSINodeInfo &node : nodes) {
        Result one = describe(node);
        if (one.code)
            return one;
        result.value.append(std::move(one.value));
    }
    return result;
}

Result showNode(const Request &request)
{
    ISCSINodeInfo node;
    if (Result bad = selectNode(request.path.at("node"), node); bad.code)
        return bad;
    return describe(node);
}

Result addNodes(const Request &request)
{
    Result known;
    for (const Json::Value &in : request.input["nodes"]) {
        PairedNode node;
        node.uuid = in["uuid"].asString();
        node.host = in["hostname"].asString();
        node.port = portOf(in);
        node.protocol = in["protocol"].asString();
        node.rod_key = in["rod_key"].asString();
        node.token = in["session_id"].asString();
        node.pin = in["pin"].asString();
        const int err = iscsihost::addPairedNode(node);
        if (err == ERR_NODE_UUID_EXISTS)
            known = failed(err, "the other nodes were added");
        else if (err)
            return failed(err);
    }
    return known;
}

Result joinNode(const Request &request)
{
    const Json::Value &in = request.input;
    const std::string host = in["hostname"].asString();
    const uint16_t port = portOf(in);
    const std::string pin = in["pin"].asString();
    std::string uuid, pin_before;
    if (Result bad = askIdentity(host, port, pin, uuid); bad.code)
        return bad;
    std::vector<ISCSINodeInfo> nodes;
    if (Result bad = loadNodes(nodes); bad.code)
        return bad;
    if (const ISCSINodeInfo *paired = findNode(nodes, uuid))
        return failed(ERR_NODE_UUID_EXISTS,
                      host + (paired->is_local_node ? " is this appliance itself" : " is paired already"));
    if (int err = iscsihost::getPin(host, port, pin_before))
        return failed(err);
    if (int err = pin.empty() ? 0 : iscsihost::setPin(host, port, pin))
        return failed(err);
    ISCSILIBNode node(uuid, host, port, PROTOCOL, "", in["account"].asString(), in["password"].asString(),
                      in["otp_code"].asString());
    if (int err = node.createNode())
        return joinFailed(failed(err), uuid, host, port, pin_before);
    return describeByUuid(uuid);
}

Result openPeerSession(const Request &request)
{
    const std::string host = request.input["hostname"].asString();
    std::vector<ISCSINodeInfo> nodes;
    if (Result bad = loadNodes(nodes); bad.code)
        return bad;
    const ISCSINodeInfo &local = nodes.front();
    std::string rod_key;
    if (int err = local.loadLocalRODKey(rod_key))
        return failed(err);
    ISCSINodeInfo session(host, request.account);
    if (int err = session.createSession())
        return failed(err);
    Result result;
    result.value["uuid"] = local.uuid;
    result.value["rod_key"] = rod_key;
    result.value["session_id"] = session.session_id;
    return result;
}

Result showLocalKey(const Request &)
{
    std::string key;
    if (int err = ISCSINodeInfo().loadLocalRODKey(key))
        return failed(err);
    Result result;
    result.value["rod_key"] = key;
    return result;
}

Result showLocalStatus(const Request &)
{
    using namespace LIB::LIBNode;
    enum {
        OK,
        NO_MODULES,
        DAEMON_DEAD,
        NOT_BOOTED,
        UNKNOWN
    };
    const unsigned status = ISCSILIBNode().getStatus();
    Result result;
    result.value["status"] = status;
    Json::Value &texts = result.value["texts"] = Json::arrayValue;
    if (status & NODE_MODULES_NOT_LOADED)
        texts.append(NODE_STATUS_TEXTS[NO_MODULES]);
    if (status & NODE_NOT_BOOT_DONE)
        texts.append(NODE_STATUS_TEXTS[NOT_BOOTED]);
    if (texts.empty())
        texts.append(NODE_STATUS_TEXTS[status == NODE_OK ? OK : UNKNOWN]);
    return result;
}

Result removeNode(const Request &request)
{
    ISCSINodeInfo node;
    if (Result bad = selectPeer(request, node); bad.code)
        return bad;
    return forget(node);
}

Result showPeerKey(const Request &request)
{
    const std::string host = request.input["hostname"].asString();
    const uint16_t port = portOf(request.input);
    std::string pin;
    if (int err = iscsihost::fetchPin(host, port, pin))
        return failed(err);
    Result result;
    result.value["hostname"] = host;
    result.value["port"] = port;
    result.value["pin"] = pin;
    return result;
}

Result trustNode(const Request &request)
{
    ISCSINodeInfo node;
    if (Result bad = selectPeer(request, node); bad.code)
        return bad;
    const std::string pin = request.input["pin"].asString();
    // Another appliance that answers there now must not come to be trusted as this one.
    std::string uuid;
    if (Result bad = askIdentity(node.hostname, node.port, pin, uuid); bad.code)
        return bad;
    if (uuid != node.uuid)
        return failed(ERR_BAD_NODE_UUID, node.hostname + " is another appliance now, " + uuid);
    if (int err = iscsihost::setPin(node.hostname, node.port, pin))
        return failed(err);
    return describe(node);
}

Result loginNode(const Request &request)
{
    const Json::Value &in = request.input;
    ISCSINodeInfo node;
    if (Result bad = selectPeer(request, node); bad.code)
        return bad;
    if (node.isInConfig())
        return failed(ERR_NODE_UUID_EXISTS, "it is logged in to already");
    ISCSINodeInfo fresh(node.uuid, node.hostname, node.port, node.protocol, node.rod_key, in["account"].asString(),
                        in["password"].asString(), in["otp_code"].asString());
    if (int err = fresh.login())
        return failed(err);
    return describe(node);
}

Result logoutNode(const Request &request)
{
    ISCSINodeInfo node;
    if (Result bad = selectPeer(request, node); bad.code)
        return bad;
    if (!node.isInConfig())
        return failed(ERR_FAILED_TO_LOGOUT, "it is not logged in to");
    ISCSINodeInfo open(node.uuid);
    open.logged_in = true; // by another process, whose session the configuration has
    if (int err = open.logout())
        return failed(err);
    if (int err = open.deleteFromNodeConfig())
        return failed(err);
    return describe(node);
}

} // namespace webapi
