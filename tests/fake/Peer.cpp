// Requests to a peer: each is noted as it is sent, and answered from the model.
#include "tests/fake/Script.h"
#include "webapi/client/APILUN.h"
#include "webapi/client/APINode.h"
#include "webapi/client/APIReplication.h"

using namespace fake;

namespace ISCSI::WebAPI {
namespace {

std::string yesNo(bool value)
{
    return value ? "true" : "false";
}

std::string listed(const std::vector<std::string> &texts)
{
    std::string list = "{";
    for (const std::string &text : texts)
        list += (list.size() == 1 ? "" : " ") + text;
    return list + "}";
}

template <class Record>
std::string listedUUIDs(const std::vector<Record> &records)
{
    std::vector<std::string> uuids;
    for (const Record &record : records)
        uuids.push_back(record.uuid);
    return listed(uuids);
}

} // namespace

// The request's class stands in `method`, its arguments in `path`.
Client::Client(const ISCSINodeInfo &node, const char *method, std::string path, Json::Value)
    : node(node), method(method), path(std::move(path))
{
}

Client::~Client() = default;

int Client::send()
{
    if (auto failure = called(method, node.hostname.empty() ? node.uuid : node.hostname, path))
        return *failure;
    if (node.hostname.empty() && !node.is_local_node)
        return NORV_ERR_BAD_PARAMETER; // nowhere to send it
    readResponse(Json::Value());
    return 0;
}

bool Client::readResponse(const Json::Value &)
{
    return true;
}

namespace APILUN {

WebAPIClientLUNCreate::WebAPIClientLUNCreate(const ISCSINodeInfo &node, const std::string &name,
                                             _tag_iscsi_lun_type type, const std::string &location,
                                             unsigned long long size, unsigned int extent_size)
    : Client(node, "WebAPIClientLUNCreate", joined(name, type, location, size, extent_size))
{
}

bool WebAPIClientLUNCreate::readResponse(const Json::Value &)
{
    lun_uuid = model().peer.lun_uuid;
    return true;
}

WebAPIClientLUNDelete::WebAPIClientLUNDelete(const ISCSINodeInfo &node, const std::string &lun_uuid)
    : Client(node, "WebAPIClientLUNDelete", lun_uuid)
{
}

WebAPIClientLUNSet::WebAPIClientLUNSet(const ISCSINodeInfo &node, const std::string &lun_uuid, const std::string &name,
                                       unsigned long long size)
    : Client(node, "WebAPIClientLUNSet", joined(lun_uuid, name, size))
{
}

// The first letter of the path says which of its two classes the request is of.
StateClient::StateClient(const ISCSINodeInfo &node, std::string path, const std::vector<std::string> &additional)
    : Client(node, path[0] == 'l' ? "WebAPIClientLUNGet" : "WebAPIClientLUNGetSnapshot",
             joined(path.substr(1), listed(additional)))
{
}

bool StateClient::readResponse(const Json::Value &)
{
    const PeerState state = model().peer.states.take();
    is_action_locked = state.is_locked;
    sync_progress = state.sync_progress;
    return true;
}

WebAPIClientLUNGet::WebAPIClientLUNGet(const ISCSINodeInfo &node, const std::string &lun_uuid,
                                       const std::vector<std::string> &additional)
    : StateClient(node, "l" + lun_uuid, additional)
{
}

WebAPIClientLUNGetSnapshot::WebAPIClientLUNGetSnapshot(const ISCSINodeInfo &node, const std::string &snapshot_uuid,
                                                       const std::vector<std::string> &additional)
    : StateClient(node, "s" + snapshot_uuid, additional)
{
}

WebAPIClientLUNTakeSnapshot::WebAPIClientLUNTakeSnapshot(const ISCSINodeInfo &node, const std::string &lun_uuid,
                                                         bool is_app_consistent, bool is_user_locked,
                                                         const std::string &name, const std::string &description,
                                                         const std::string &taken_by, long snapshot_time,
                                                         bool is_scheduled)
    : Client(node, "WebAPIClientLUNTakeSnapshot",
             joined(lun_uuid, yesNo(is_app_consistent), yesNo(is_user_locked), name, description, taken_by,
                    snapshot_time, yesNo(is_scheduled)))
{
}

bool WebAPIClientLUNTakeSnapshot::readResponse(const Json::Value &)
{
    snapshot_uuid = model().peer.snapshot_uuid;
    return true;
}

} // namespace APILUN

namespace APINode {

WebAPIClientNodeCreateSession::WebAPIClientNodeCreateSession(const ISCSINodeInfo &node)
    : Client(node, "WebAPIClientNodeCreateSession", node.hostname)
{
}

int WebAPIClientNodeCreateSession::send()
{
    return Client::send();
}

WebAPIClientNodeAddNode::WebAPIClientNodeAddNode(const ISCSINodeInfo &node, const std::vector<ISCSINodeInfo> &nodes)
    : Client(node, "WebAPIClientNodeAddNode", listedUUIDs(nodes)), nodes(nodes)
{
}

int WebAPIClientNodeAddNode::send()
{
    return Client::send();
}

WebAPIClientNodeGet::WebAPIClientNodeGet(const ISCSINodeInfo &node) : Client(node, "WebAPIClientNodeGet", node.hostname)
{
}

bool WebAPIClientNodeGet::readResponse(const Json::Value &)
{
    rod_key = model().peer.rod_key;
    return true;
}

} // namespace APINode

namespace APIReplication {

WebAPIClientReplicationCreateTask::WebAPIClientReplicationCreateTask(
    const ISCSINodeInfo &node, const std::string &task_uuid, bool is_source, const std::string &src_lun_uuid,
    const std::string &dst_lun_uuid, const std::string &src_node_uuid, const std::string &dst_node_uuid)
    : Client(node, "WebAPIClientReplicationCreateTask",
             joined(task_uuid, is_source ? "source" : "destination", src_lun_uuid, dst_lun_uuid, src_node_uuid,
                    dst_node_uuid))
{
}

WebAPIClientReplicationGet::WebAPIClientReplicationGet(const ISCSINodeInfo &node, const std::string &task_uuid,
                                                       bool additional)
    : Client(node, "WebAPIClientReplicationGet", joined(task_uuid, yesNo(additional)))
{
}

bool WebAPIClientReplicationGet::readResponse(const Json::Value &)
{
    is_locked = model().peer.states.take().is_locked;
    return true;
}

WebAPIClientReplicationGetBaseVersion::WebAPIClientReplicationGetBaseVersion(
    const ISCSINodeInfo &node, const std::string &task_uuid, const std::vector<ISCSISnapshotInfo> &snapshots)
    : Client(node, "WebAPIClientReplicationGetBaseVersion", joined(task_uuid, listedUUIDs(snapshots)))
{
}

bool WebAPIClientReplicationGetBaseVersion::readResponse(const Json::Value &)
{
    base_version = model().peer.base_version;
    need_full_sync = model().peer.need_full_sync;
    not_aligned = model().peer.not_aligned;
    return true;
}

} // namespace APIReplication

} // namespace ISCSI::WebAPI
