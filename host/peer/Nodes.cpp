/// Rows of other appliances: as the public header has them, and as the DR-node database.
#include "host/core/LastError.h"
#include "host/peer/Address.h"
#include "host/peer/Pins.h"
#include "host/services/Identity.h"
#include "host/state/Database.h"
#include "host/state/Fields.h"
#include "iscsihost/https.h"
#include "iscsihost/node.h"
#include "platform/dr_node.h"
#include "platform/error.h"

#include <algorithm>

namespace norvhost {
namespace {

using iscsihost::PairedNode;
using NorvDRNode::DRNode;
using NorvDRNode::DRNodeAttr;

constexpr const char *iscsi_app = "NORV.iSCSI";
constexpr const char *rod_key_attribute = "rod_key";
constexpr size_t secret_max = 1023; // what the SDK's callers have room for

/// Printable, without blanks: what goes into a header or a line of a file as it is.
bool isSecret(const std::string &text)
{
    return !text.empty() && text.size() <= secret_max &&
           std::all_of(text.begin(), text.end(), [](char c) { return c > ' ' && c < 0x7f; });
}

/// The uuid is in lower case.
int check(const PairedNode &node)
{
    if (!isUuid(node.uuid))
        return fail(NORV_ERR_NODE_UUID, "uuid: '%s' is none", node.uuid.c_str());
    if (!isHost(node.host))
        return fail(NORV_ERR_NODE_HOST, "hostname: '%s' is neither a host name nor an address", node.host.c_str());
    if (node.port == 0)
        return fail(NORV_ERR_NODE_PORT, "port: 0 is none");
    if (node.protocol != "https" && !(node.protocol == "http" && isLoopbackAddress(node.host)))
        return fail(NORV_ERR_NODE_PROTOCOL, "protocol: '%s'; only https is possible", node.protocol.c_str());
    if (!isSecret(node.rod_key))
        return fail(NORV_ERR_ROD_KEY, "rod_key: empty, too long, or with blanks");
    if (!isSecret(node.token))
        return fail(NORV_ERR_BAD_PARAMETER, "session_id: empty, too long, or with blanks");
    if (!node.pin.empty() && !isPin(node.pin))
        return fail(NORV_ERR_BAD_PARAMETER, "pin: '%s' is none", node.pin.c_str());

    std::string local;
    if (int err = localNodeId(local))
        return err;
    if (node.uuid == local)
        return fail(NORV_ERR_NODE_UUID_EXISTS, "node %s is this appliance", local.c_str());
    return 0;
}

int setAttribute(const std::string &uuid, const std::string &app, const std::string &key, const std::string &value)
{
    Query query("INSERT INTO node_attributes VALUES (?1, ?2, ?3, ?4) ON CONFLICT DO UPDATE SET value = excluded.value");
    return query.bind(uuid).bind(app).bind(key).bind(value).run();
}

/// Inside a transaction. A node that is paired stays so.
int store(const PairedNode &node, bool paired)
{
    if (int err = check(node))
        return err;
    if (int err = learnPin(node.host, node.port, node.pin))
        return err;
    Query query("INSERT INTO nodes (uuid, host, port, protocol, token, paired) VALUES (?1, ?2, ?3, ?4, ?5, ?6) "
                "ON CONFLICT DO UPDATE SET host = excluded.host, port = excluded.port, protocol = excluded.protocol, "
                "token = excluded.token, paired = max(paired, excluded.paired)");
    query.bind(node.uuid).bind(node.host).bind(node.port).bind(node.protocol).bind(node.token).bind(paired);
    if (int err = query.run())
        return err;
    return setAttribute(node.uuid, iscsi_app, rod_key_attribute, node.rod_key);
}

/// `found` without its pin; its uuid is empty when there is no such node.
int readNode(const std::string &uuid, PairedNode &found, bool &paired)
{
    Query query(
        "SELECT nodes.uuid, host, port, protocol, token, paired, value FROM nodes LEFT JOIN node_attributes AS a "
        "ON a.uuid = nodes.uuid AND a.app = ?2 AND a.key = ?3 WHERE nodes.uuid = ?1");
    const bool there = query.bind(uuid).bind(iscsi_app).bind(rod_key_attribute).next();
    if (query.error())
        return query.error();
    found = PairedNode();
    if (!there)
        return 0;
    found.uuid = query.text(0);
    found.host = query.text(1);
    found.port = static_cast<uint16_t>(query.number(2));
    found.protocol = query.text(3);
    found.token = query.text(4);
    paired = query.integer(5) != 0;
    found.rod_key = query.text(6);
    return 0;
}

int noSuchNode(const std::string &uuid)
{
    return fail(NORV_ERR_NO_SUCH_NODE, "there is no node %s", uuid.c_str());
}

DRNode readDrNode(const Query &query)
{
    DRNode node;
    node.id = query.text(0);
    node.host = query.text(1);
    node.port = query.integer(2);
    node.protocol = query.text(3);
    node.cred_session = query.text(4);
    return node;
}

} // namespace
} // namespace norvhost

namespace iscsihost {

using namespace norvhost;

int keepNodeSession(const PairedNode &node)
{
    Transaction transaction;
    if (transaction.error())
        return transaction.error();
    PairedNode kept = node;
    kept.uuid = lowerCase(node.uuid);
    if (int err = store(kept, false))
        return err;
    return transaction.commit();
}

int addPairedNode(const PairedNode &node)
{
    Transaction transaction;
    if (transaction.error())
        return transaction.error();
    PairedNode added = node;
    added.uuid = lowerCase(node.uuid);
    PairedNode kept;
    bool paired = false;
    if (int err = readNode(added.uuid, kept, paired))
        return err;
    if (paired)
        return fail(NORV_ERR_NODE_UUID_EXISTS, "node %s is paired already", added.uuid.c_str());
    for (auto field : {&PairedNode::host, &PairedNode::protocol, &PairedNode::rod_key, &PairedNode::token})
        if ((added.*field).empty())
            added.*field = kept.*field;
    if (added.port == 0)
        added.port = kept.port;
    if (int err = store(added, true))
        return err;
    return transaction.commit();
}

int describePairedNode(const std::string &uuid, PairedNode &node)
{
    PairedNode found;
    bool paired = false;
    if (int err = readNode(lowerCase(uuid), found, paired))
        return err;
    if (found.uuid.empty())
        return noSuchNode(uuid);
    if (int err = getPin(found.host, found.port, found.pin))
        return err;
    node = found;
    return 0;
}

int removePairedNode(const std::string &uuid)
{
    Transaction transaction;
    if (transaction.error())
        return transaction.error();
    PairedNode node;
    bool paired = false;
    if (int err = readNode(lowerCase(uuid), node, paired))
        return err;
    if (node.uuid.empty())
        return noSuchNode(uuid);
    Query attributes("DELETE FROM node_attributes WHERE uuid = ?1");
    if (int err = attributes.bind(node.uuid).run())
        return err;
    Query row("DELETE FROM nodes WHERE uuid = ?1");
    if (int err = row.bind(node.uuid).run())
        return err;
    Query others("SELECT 1 FROM nodes WHERE lower(host) = lower(?1) AND port = ?2");
    const bool shared = others.bind(node.host).bind(node.port).next();
    if (others.error())
        return others.error();
    if (int err = shared ? 0 : setPin(node.host, node.port, ""))
        return err;
    return transaction.commit();
}

} // namespace iscsihost

namespace NorvDRNode {

using namespace norvhost;

bool DRNode::isLocalNodeId(const std::string &id)
{
    return !id.empty() && lowerCase(id) == getLocalNodeId();
}

std::string DRNode::getLocalNodeId()
{
    std::string uuid;
    return localNodeId(uuid) == 0 ? uuid : std::string();
}

bool DRNodeDB::Get(const std::string &id, DRNode &node)
{
    const std::string uuid = lowerCase(id);
    if (DRNode::isLocalNodeId(uuid)) {
        node = DRNode();
        node.id = uuid;
        return true;
    }
    Query query("SELECT uuid, host, port, protocol, token FROM nodes WHERE uuid = ?1 AND paired");
    if (!query.bind(uuid).next()) {
        if (!query.error())
            noSuchNode(uuid);
        return false;
    }
    node = readDrNode(query);
    return true;
}

bool DRNodeDB::List(std::vector<DRNode> &nodes, CredType)
{
    std::vector<DRNode> found;
    Query query("SELECT uuid, host, port, protocol, token FROM nodes WHERE paired ORDER BY id");
    while (query.next())
        found.push_back(readDrNode(query));
    if (query.error())
        return false;
    nodes = std::move(found);
    return true;
}

bool DRNodeDB::ListAttr(const std::string &id, const std::string &app, std::vector<DRNodeAttr> &attrs)
{
    std::vector<DRNodeAttr> found;
    Query query("SELECT key, value FROM node_attributes WHERE uuid = ?1 AND app = ?2 ORDER BY key");
    const std::string uuid = lowerCase(id);
    query.bind(uuid).bind(app);
    while (query.next())
        found.emplace_back(uuid, app, std::string(query.text(0)), std::string(query.text(1)));
    if (query.error())
        return false;
    attrs = std::move(found);
    return true;
}

bool DRNodeDB::SetAttr(const DRNodeAttr &attr)
{
    const std::string uuid = lowerCase(attr.node_id);
    Transaction transaction;
    if (transaction.error())
        return false;
    PairedNode node;
    bool paired = false;
    if (!DRNode::isLocalNodeId(uuid)) {
        if (readNode(uuid, node, paired))
            return false;
        if (node.uuid.empty()) {
            noSuchNode(uuid);
            return false;
        }
    }
    return setAttribute(uuid, attr.app, attr.key, attr.value) == 0 && transaction.commit() == 0;
}

} // namespace NorvDRNode
