#include "webapi/client/APIReplication.h"

#include "etc/JsonReader.h"

namespace ISCSI::WebAPI::APIReplication {
namespace {

Json::Value creation(const std::string &task_uuid, bool is_source, const std::string &src_lun_uuid,
                     const std::string &dst_lun_uuid, const std::string &src_node_uuid,
                     const std::string &dst_node_uuid)
{
    Json::Value body(Json::objectValue);
    body["uuid"] = task_uuid;
    body["is_source"] = is_source;
    body["src_lun_uuid"] = src_lun_uuid;
    body["dst_lun_uuid"] = dst_lun_uuid;
    body["src_node_uuid"] = src_node_uuid;
    body["dst_node_uuid"] = dst_node_uuid;
    return body;
}

Json::Value listing(const std::vector<ISCSISnapshotInfo> &snapshots)
{
    Json::Value body(Json::objectValue);
    body["snapshots"] = Json::arrayValue;
    for (const ISCSISnapshotInfo &snapshot : snapshots) {
        Json::Value &one = body["snapshots"].append(Json::objectValue);
        one["uuid"] = snapshot.uuid;
        one["version"] = snapshot.version;
    }
    return body;
}

} // namespace

WebAPIClientReplicationCreateTask::WebAPIClientReplicationCreateTask(
    const ISCSINodeInfo &node, const std::string &task_uuid, bool is_source, const std::string &src_lun_uuid,
    const std::string &dst_lun_uuid, const std::string &src_node_uuid, const std::string &dst_node_uuid)
    : Client(node, "POST", "/replications/tasks",
             creation(task_uuid, is_source, src_lun_uuid, dst_lun_uuid, src_node_uuid, dst_node_uuid))
{
}

WebAPIClientReplicationGet::WebAPIClientReplicationGet(const ISCSINodeInfo &node, const std::string &task_uuid,
                                                       bool additional)
    : Client(node, "GET", "/replications/" + segment(task_uuid) + (additional ? "?additional=true" : ""))
{
}

bool WebAPIClientReplicationGet::readResponse(const Json::Value &response)
{
    return JsonReader(response).required("is_locked", is_locked).ok();
}

WebAPIClientReplicationGetBaseVersion::WebAPIClientReplicationGetBaseVersion(
    const ISCSINodeInfo &node, const std::string &task_uuid, const std::vector<ISCSISnapshotInfo> &snapshots)
    : Client(node, "POST", "/replications/" + segment(task_uuid) + "/base-version", listing(snapshots))
{
}

bool WebAPIClientReplicationGetBaseVersion::readResponse(const Json::Value &response)
{
    return JsonReader(response)
        .required("base_version", base_version)
        .required("need_full_sync", need_full_sync)
        .required("not_aligned", not_aligned)
        .ok();
}

} // namespace ISCSI::WebAPI::APIReplication
