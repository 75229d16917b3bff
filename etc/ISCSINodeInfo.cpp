// The node record, its lookup and its place in the DR-node database.
#include "iscsiwebapi/ISCSINodeInfo.h"

#include "etc/Failure.h"
#include "etc/Selector.h"
#include "etc/Text.h"
#include "platform/dr_node.h"
#include "platform/extent_pool.h"

namespace ISCSI {
namespace {

const SelectorKind SELECTOR = {
    "node#%u%c",
    "Failed to list nodes.",
    "Index of node is out of range. index: %d, #nodes: %zu",
    "Invalid node UUID, hostname or index. input: %s",
    ERR_BAD_NODE_UUID,
};

constexpr const char *ATTRIBUTE_APP = "NORV.iSCSI";

} // namespace

ISCSINodeInfo::ISCSINodeInfo(const std::string &uuid) : uuid(uuid) {}

ISCSINodeInfo::ISCSINodeInfo(const std::string &hostname, const std::string &account)
    : hostname(hostname), account(account)
{
}

ISCSINodeInfo::ISCSINodeInfo(const std::string &hostname, const std::string &account, const std::string &session_id)
    : hostname(hostname), account(account), session_id(session_id)
{
}

ISCSINodeInfo::ISCSINodeInfo(const std::string &uuid, const std::string &session_id, const std::string &hostname,
                             unsigned short port, const std::string &protocol, const std::string &rod_key,
                             const std::string &account, bool is_local_node)
    : uuid(uuid), hostname(hostname), port(port), protocol(protocol), rod_key(rod_key), account(account),
      session_id(session_id), is_local_node(is_local_node)
{
}

ISCSINodeInfo::ISCSINodeInfo(const std::string &uuid, const std::string &hostname, unsigned short port,
                             const std::string &protocol, const std::string &rod_key, const std::string &account,
                             const std::string &password, const std::string &otp_code)
    : uuid(uuid), hostname(hostname), port(port), protocol(protocol), rod_key(rod_key), account(account),
      password(password), otp_code(otp_code)
{
}

ISCSINodeInfo::~ISCSINodeInfo() = default;

std::string logText(const ISCSINodeInfo &node)
{
    ISCSINodeInfo masked = node;
    for (std::string *secret : {&masked.rod_key, &masked.session_id}) {
        if (!secret->empty())
            *secret = "***";
    }
    return masked.toString();
}

std::string ISCSINodeInfo::toString() const
{
    return TextLine()
        .add("uuid: ", uuid)
        .add(" ,is_local_node: ", is_local_node)
        .add(" ,rod_key: ", rod_key)
        .add(" ,hostname: ", hostname)
        .add(" ,port: ", static_cast<unsigned int>(port))
        .add(" ,protocol: ", protocol)
        .add(" ,session_id: ", session_id)
        .text();
}

int ISCSINodeInfo::toJsonFormat(Json::Value &value) const
{
    if (uuid.empty())
        return failText(here(), ERR_NO_NODE_UUID, "Need node UUID to create node info in Json format: %s",
                        logText(*this).c_str());
    value = Json::Value(Json::objectValue);
    value["uuid"] = uuid;
    value["session_id"] = session_id;
    value["hostname"] = hostname;
    value["port"] = static_cast<int>(port);
    value["protocol"] = protocol;
    value["rod_key"] = rod_key;
    value["account"] = account;
    value["is_local_node"] = is_local_node;
    return 0;
}

bool ISCSINodeInfo::isInvalid(bool full) const
{
    if (!full)
        return uuid.empty();
    return hostname.empty() || protocol.empty() || account.empty() || password.empty() || port == 0;
}

int ISCSINodeInfo::loadFromDRNode()
{
    if (uuid.empty())
        return failText(here(), ERR_BAD_NODE_UUID, "Node UUID is empty");
    NorvDRNode::DRNode node;
    if (!NorvDRNode::DRNodeDB::Get(uuid, node))
        return failText(here(), ERR_FAILED_TO_LOAD_NODE_CONFIG, "Failed to get node info from DR Node. UUID: %s",
                        uuid.c_str());
    std::vector<NorvDRNode::DRNodeAttr> attributes;
    const bool has_key = NorvDRNode::DRNodeDB::ListAttr(uuid, ATTRIBUTE_APP, attributes) && !attributes.empty();
    rod_key = has_key ? attributes.front().value : "";
    is_local_node = NorvDRNode::DRNode::isLocalNodeId(node.id);
    if (!is_local_node) {
        hostname = node.host;
        port = static_cast<unsigned short>(node.port);
        protocol = node.protocol;
        session_id = node.cred_session;
    }
    return 0;
}

int ISCSINodeInfo::ListNodesFromDRNode(std::vector<ISCSINodeInfo> &out)
{
    ISCSINodeInfo local(NorvDRNode::DRNode::getLocalNodeId());
    if (int err = local.loadFromDRNode())
        return failText(here(), err, "Failed to load local node info.");
    out.push_back(std::move(local));
    std::vector<NorvDRNode::DRNode> nodes;
    if (!NorvDRNode::DRNodeDB::List(nodes, NorvDRNode::CRED_REMOTE))
        return failText(here(), ERR_FAILED_TO_LIST_NODES, "Failed to load list DR Nodes.");
    for (const auto &node : nodes) {
        ISCSINodeInfo info(node.id);
        if (int err = info.loadFromDRNode())
            return failText(here(), err, "Failed to load node info from DR Node. Node ID: %s", node.id.c_str());
        out.push_back(std::move(info));
    }
    return 0;
}

int ISCSINodeInfo::GetNodeInfoByHostname(const std::string &hostname, ISCSINodeInfo &out)
{
    std::vector<ISCSINodeInfo> nodes;
    if (int err = ListNodesFromDRNode(nodes))
        return failText(here(), err, "Failed to list nodes.");
    for (auto &node : nodes) {
        if (node.hostname == hostname) {
            out = std::move(node);
            return 0;
        }
    }
    return failText(here(), ERR_NO_SUCH_NODE, "No such hostname: %s", hostname.c_str());
}

int ISCSINodeInfo::GetNodeUUID(const std::string &selector, std::string &uuid)
{
    if (selector.empty() || isUUID(selector)) {
        uuid = selector;
        return 0;
    }
    const auto by_hostname = [&, site = here()](const std::string &hostname) {
        ISCSINodeInfo node;
        if (GetNodeInfoByHostname(hostname, node))
            return failInvalid(SELECTOR, hostname, site);
        uuid = node.uuid;
        return 0;
    };
    return resolveSelector<ISCSINodeInfo>(
        SELECTOR, selector, ListNodesFromDRNode, [&](const ISCSINodeInfo &node) { uuid = node.uuid; }, by_hostname);
}

int ISCSINodeInfo::insertRODKey(const std::string &key)
{
    if (uuid.empty())
        return failText(here(), ERR_BAD_NODE_UUID, "Node UUID is empty");
    if (key.empty())
        return failText(here(), ERR_BAD_NODE_ROD_KEY, "Node ROD key is empty");
    rod_key = key;
    if (!NorvDRNode::DRNodeDB::SetAttr(NorvDRNode::DRNodeAttr(uuid, ATTRIBUTE_APP, "rod_key", rod_key)))
        return failText(here(), ERR_FAILED_TO_SET_ROD_KEY, "Failed to set ROD key");
    return 0;
}

int ISCSINodeInfo::loadLocalRODKey(std::string &out) const
{
    char key[64] = {};
    if (int err = NORVExtentPoolRODKeyGet(key, sizeof(key)))
        return failText(here(), err, "Failed to get ROD key. err: %s", ErrorCodeToString(err));
    out = fieldText(key);
    return 0;
}

} // namespace ISCSI
