#include "host/transfer/PeerSink.h"

#include "host/core/LastError.h"
#include "host/peer/Address.h"
#include "host/peer/NodeApi.h"
#include "host/target/Sinks.h"
#include "platform/dr_node.h"
#include "platform/error.h"
#include "platform/extent_pool.h"

#include <algorithm>
#include <cstdint>
#include <json/value.h>

namespace norvhost {
namespace {

using iscsihost::PairedNode;
using iscsihost::Sink;

/// A request about a sink of the node, "open" or "close".
int ask(const PairedNode &node, const std::string &lun_uuid, const char *what, const Json::Value &input,
        Json::Value &answer)
{
    return askNode(node, "POST", "/sinks/" + lun_uuid + "/" + what, input, answer);
}

/// The node is another appliance: what it answers is looked at before it is used.
bool readSink(const Json::Value &answer, Sink &sink)
{
    if (!answer.isObject() || !answer["portals"].isArray() || !answer["iqn"].isString() || !answer["lun"].isInt() ||
        !answer["size"].isUInt64() || !answer["is_blank"].isBool())
        return false;
    for (const Json::Value &portal : answer["portals"])
        sink.portals.push_back(portal.isString() ? portal.asString() : "");
    sink.iqn = answer["iqn"].asString();
    sink.lun = answer["lun"].asInt();
    sink.size = answer["size"].asUInt64();
    sink.blank = answer["is_blank"].asBool();
    sink.tls_port = answer["tls_port"].isInt() ? answer["tls_port"].asInt() : 0;
    return !sink.portals.empty() && sink.iqn.compare(0, 4, "iqn.") == 0 && sink.lun >= 0 && sink.tls_port >= 0 &&
           sink.tls_port <= UINT16_MAX;
}

/// "[::1]" of "::1"; names and IPv4 addresses as they are.
std::string bracketed(const std::string &host)
{
    const bool bare_ipv6 = host[0] != '[' && std::count(host.begin(), host.end(), ':') > 1;
    return bare_ipv6 ? "[" + host + "]" : host;
}

/// The one where the appliance was reached for its web API, else the first: we may know nothing of the others'
/// networks.
std::string portalAt(const std::string &reached, const std::vector<std::string> &portals)
{
    for (const std::string &portal : portals) {
        std::string host;
        uint16_t port = 0;
        if (portal.empty() || portal[0] == ':') // it listens everywhere
            return bracketed(reached) + portal;
        if (parseAuthority(portal, host, port) && host == reached)
            return portal;
    }
    return portals.front();
}

/// How an open sink is entered, when its appliance is reached at `host` and has this ROD key.
IscsiUnit unitOf(const Sink &sink, const std::string &host, const std::string &rod_key, const std::string &lun_uuid)
{
    IscsiUnit unit;
    unit.portal = portalAt(host, sink.portals);
    unit.target = sink.iqn;
    unit.lun = sink.lun;
    const SinkLogIn log_in = sinkLogIn(rod_key, lun_uuid);
    unit.initiator = log_in.initiator;
    unit.user = log_in.user;
    unit.secret = log_in.secret;
    unit.mutual_user = log_in.mutual_user;
    unit.mutual_secret = log_in.mutual_secret;
    return unit;
}

int openLocally(const std::string &lun_uuid, PeerSink &sink)
{
    char rod_key[256] = {};
    if (int err = NORVExtentPoolRODKeyGet(rod_key, sizeof rod_key))
        return err;
    if (int err = iscsihost::openSink(lun_uuid, sink.sink))
        return err;
    sink.unit = unitOf(sink.sink, "127.0.0.1", rod_key, lun_uuid);
    return 0;
}

int openRemotely(const std::string &node_uuid, const std::string &lun_uuid, PeerSink &sink)
{
    PairedNode node;
    Json::Value answer;
    if (int err = iscsihost::describePairedNode(node_uuid, node))
        return err;
    if (int err = ask(node, lun_uuid, "open", Json::Value(Json::objectValue), answer))
        return err;
    return enterPeerSink(node, node.rod_key, lun_uuid, answer, sink);
}

} // namespace

int openPeerSink(const std::string &node_uuid, const std::string &lun_uuid, const std::string &portal, PeerSink &sink)
{
    PeerSink opened;
    const bool local = NorvDRNode::DRNode::isLocalNodeId(node_uuid);
    if (int err = local ? openLocally(lun_uuid, opened) : openRemotely(node_uuid, lun_uuid, opened))
        return err;
    opened.node = node_uuid;
    opened.lun = lun_uuid;
    if (!portal.empty())
        opened.unit.portal = bracketed(portal);
    sink = opened;
    return 0;
}

int enterPeerSink(const PairedNode &node, const std::string &rod_key, const std::string &lun_uuid,
                  const Json::Value &answer, PeerSink &sink)
{
    Sink opened;
    if (!readSink(answer, opened))
        return fail(NORV_ERR_BAD_RESPONSE, "%s does not say where its sink is", node.host.c_str());
    sink = {node.uuid, lun_uuid, opened, unitOf(opened, node.host, rod_key, lun_uuid)};
    return 0;
}

int closePeerSink(const std::string &node_uuid, const std::string &lun_uuid, const std::string &sink_iqn, bool complete,
                  bool *volume_full)
{
    if (NorvDRNode::DRNode::isLocalNodeId(node_uuid))
        return iscsihost::closeSink(lun_uuid, sink_iqn, complete, volume_full);
    PairedNode node;
    Json::Value input, answer;
    input["iqn"] = sink_iqn;
    input["complete"] = complete;
    if (int err = iscsihost::describePairedNode(node_uuid, node))
        return err;
    if (int err = ask(node, lun_uuid, "close", input, answer))
        return err;
    if (volume_full)
        *volume_full = answer.isObject() && answer["is_volume_full"].isBool() && answer["is_volume_full"].asBool();
    return 0;
}

} // namespace norvhost
