#include "webapi/handlers/Handlers.h"

#include "iscsihost/host.h"
#include "iscsihost/replication.h"
#include "iscsiwebapi/ISCSIErrorCode.h"
#include "iscsiwebapi/ISCSILIBNode.h"
#include "iscsiwebapi/ISCSILIBReplication.h"

namespace webapi {

using namespace ISCSI;
using LIB::LIBReplication::ISCSILIBReplication;

namespace {

Result selectTask(const Request &request, std::string &uuid)
{
    const std::string &selector = request.path.at("task");
    if (int err = ISCSITaskInfo::GetTaskUUID(selector, uuid))
        return failed(err, "no replication has the UUID or index '" + selector + "'");
    return {};
}

/// How the last sending stands: bytes sent and to send, and the code that ended it, 0 for none.
int addProgress(ISCSILIBReplication &replication, Json::Value &out)
{
    unsigned long long sent = 0;
    unsigned long long total = 0;
    unsigned long long value = 0;
    int error = 0;
    if (int err = replication.getSendingStatus(sent, total, value, error))
        return err;
    out["sent_size"] = Json::UInt64(sent);
    out["send_total_size"] = Json::UInt64(total);
    out["progress_value"] = Json::UInt64(value);
    out["error"] = error;
    if (error) {
        std::string reason;
        if (int err = iscsihost::sendingFailure(replication.task.uuid, reason))
            return err;
        out["error_text"] = ErrorCodeToString(error);
        if (!reason.empty())
            out["reason"] = reason;
    }
    return 0;
}

/// Loads the task and asks for its lock. The library's getStatus() takes the lock for a moment, and who wants it just
/// then is refused.
int loadTask(ISCSILIBReplication &replication, bool &is_locked)
{
    if (int err = replication.task.loadFromConfig(replication.task_record, true))
        return err;
    return iscsihost::isTaskLocked(replication.task.getLockPath(), is_locked);
}

/// The task's JSON form with names, its lock and its base version.
Result describe(const std::string &uuid)
{
    ISCSILIBReplication replication(uuid);
    ISCSITaskInfo &task = replication.task;
    bool is_locked = false;
    std::string base_version;
    if (int err = loadTask(replication, is_locked))
        return failed(err);
    ISCSILUNInfo &lun = task.is_source ? task.src_lun : task.dst_lun;
    if (int err = lun.getBaseVersion(base_version))
        return failed(err);
    Result result;
    if (int err = task.toJsonFormat(result.value))
        return failed(err);
    result.value["is_locked"] = is_locked;
    result.value["base_version"] = base_version;
    result.value["lun_name"] = lun.name;
    result.value["peer"] = (task.is_source ? task.dst_node : task.src_node).hostname;
    return result;
}

/// Resolves the request's task and lets `act` do something with it.
template <class Act>
Result withTask(const Request &request, Act act)
{
    std::string uuid;
    if (Result bad = selectTask(request, uuid); bad.code)
        return bad;
    ISCSILIBReplication replication(uuid);
    return act(replication);
}

} // namespace

Result listReplications(const Request &)
{
    std::vector<ISCSITaskInfo> tasks;
    if (int err = ISCSILIBReplication::ListTask(tasks))
        return failed(err);
    Result result;
    result.value = Json::arrayValue;
    for (const ISCSITaskInfo &task : tasks) {
        Result described = describe(task.uuid);
        if (described.code) { // a LUN or a node has gone: what is known of the task is shown
            described.value = Json::objectValue;
            described.value["uuid"] = task.uuid;
            described.value["is_source"] = task.is_source;
            described.value["problem"] = ErrorCodeToString(described.code);
        }
        result.value.append(described.value);
    }
    return result;
}

Result createReplication(const Request &request)
{
    const Json::Value &in = request.input;
    std::string lun;
    std::string node;
    if (Result bad = selectLun(in["lun"].asString(), lun); bad.code)
        return bad;
    if (int err = ISCSINodeInfo::GetNodeUUID(in["node"].asString(), node))
        return failed(err, "no node has the UUID, host name or index '" + in["node"].asString() + "'");
    std::vector<ISCSINodeInfo> nodes;
    if (int err = LIB::LIBNode::ISCSILIBNode::ListNode(nodes))
        return failed(err);
    ISCSILIBReplication replication(lun, nodes.front().uuid, node, in["location"].asString(), in["name"].asString());
    if (int err = replication.createReplication())
        return failed(err);
    return describe(replication.task.uuid);
}

Result createReplicationTask(const Request &request)
{
    const Json::Value &in = request.input;
    ISCSILIBReplication replication(in["uuid"].asString(), in["is_source"].asBool(), in["src_lun_uuid"].asString(),
                                    in["dst_lun_uuid"].asString(), in["src_node_uuid"].asString(),
                                    in["dst_node_uuid"].asString());
    if (int err = replication.createTask())
        return failed(err);
    return {};
}

Result showReplication(const Request &request)
{
    return withTask(request, [](ISCSILIBReplication &replication) { return describe(replication.task.uuid); });
}

Result showSending(const Request &request)
{
    return withTask(request, [](ISCSILIBReplication &replication) {
        Result result;
        bool is_locked = false;
        // Asked before the rest: when nobody holds the lock, the rest is how it ended.
        if (int err = loadTask(replication, is_locked))
            return failed(err);
        result.value["is_locked"] = is_locked;
        if (int err = addProgress(replication, result.value))
            return failed(err);
        return result;
    });
}

Result sendReplication(const Request &request)
{
    return withTask(request, [&](ISCSILIBReplication &replication) {
        const Json::Value &in = request.input;
        std::string snapshot;
        if (int err = ISCSISnapshotInfo::GetSnapshotUUID(in["snapshot"].asString(), snapshot))
            return failed(err, "no snapshot has the UUID, name or index '" + in["snapshot"].asString() + "'");
        if (int err = replication.sendSnapshot(snapshot, in["address"].asString(), in["port"].asUInt(), false,
                                               in["encrypted"].asBool()))
            return failed(err);
        return describe(replication.task.uuid);
    });
}

Result stopReplication(const Request &request)
{
    return withTask(request, [](ISCSILIBReplication &replication) {
        const int err = replication.stopSending();
        return err ? failed(err) : Result();
    });
}

Result chooseBaseVersion(const Request &request)
{
    return withTask(request, [&](ISCSILIBReplication &replication) {
        // The source asks while it holds its task: nothing of it is sending now.
        if (int err = iscsihost::breakReception(replication.task.uuid))
            return failed(err);
        std::map<std::string, ISCSISnapshotInfo> snapshots;
        for (const Json::Value &listed : request.input["snapshots"]) {
            ISCSISnapshotInfo snapshot(listed["uuid"].asString());
            snapshot.version = listed["version"].asString();
            snapshots.emplace(snapshot.version, snapshot);
        }
        std::string base_version;
        bool need_full_sync = false;
        bool not_aligned = false;
        if (int err = replication.getBaseVersion(snapshots, base_version, need_full_sync, not_aligned))
            return failed(err);
        Result result;
        result.value["base_version"] = base_version;
        result.value["need_full_sync"] = need_full_sync;
        result.value["not_aligned"] = not_aligned;
        return result;
    });
}

Result beginReception(const Request &request)
{
    return withTask(request, [&](ISCSILIBReplication &replication) {
        iscsihost::Reception reception;
        const Json::Value &in = request.input;
        if (int err = iscsihost::beginReception(
                replication.task.uuid, {in["version"].asString(), in["base"].asString(), in["name"].asString()},
                reception))
            return failed(err);
        Result result;
        result.value["holding"] = reception.holding == iscsihost::Holding::zeros  ? "zeros"
                                  : reception.holding == iscsihost::Holding::base ? "base"
                                                                                  : "unknown";
        result.value["offset"] = Json::UInt64(reception.offset);
        result.value["sink"] = sinkForm(reception.sink);
        return result;
    });
}

Result noteReception(const Request &request)
{
    return withTask(request, [&](ISCSILIBReplication &replication) {
        const Json::Value &in = request.input;
        const int err =
            iscsihost::noteReception(replication.task.uuid, in["version"].asString(), in["iqn"].asString(),
                                     in["offset"].asUInt64(), in["moved"].asUInt64(), in["total"].asUInt64());
        return err ? failed(err) : Result();
    });
}

Result endReception(const Request &request)
{
    return withTask(request, [&](ISCSILIBReplication &replication) {
        const Json::Value &in = request.input;
        const int err = iscsihost::endReception(replication.task.uuid, in["version"].asString(), in["iqn"].asString(),
                                                in["total"].asUInt64());
        return err ? failed(err) : Result();
    });
}

Result countUnsynced(const Request &request)
{
    return withTask(request, [&](ISCSILIBReplication &replication) {
        std::string base;
        std::string snapshot;
        const Json::Value &in = request.input;
        if (int err = ISCSISnapshotInfo::GetSnapshotUUID(in["snapshot"].asString(), snapshot))
            return failed(err, "no snapshot has the UUID, name or index '" + in["snapshot"].asString() + "'");
        if (int err = ISCSISnapshotInfo::GetSnapshotUUID(in["base"].asString(), base))
            return failed(err, "no snapshot has the UUID, name or index '" + in["base"].asString() + "'");
        const int err = replication.startToComputeUnsyncSize(base, snapshot);
        return err ? failed(err) : Result();
    });
}

Result showUnsynced(const Request &request)
{
    return withTask(request, [](ISCSILIBReplication &replication) {
        unsigned long long size = 0;
        bool is_completed = false;
        if (int err = replication.getCurrentUnsyncSize(size, is_completed))
            return failed(err);
        Result result;
        result.value["unsync_size"] = Json::UInt64(size);
        result.value["is_completed"] = is_completed;
        return result;
    });
}

Result promoteReplication(const Request &request)
{
    return withTask(request, [](ISCSILIBReplication &replication) {
        const int err = replication.promote();
        return err ? failed(err) : describe(replication.task.uuid);
    });
}

Result demoteReplication(const Request &request)
{
    return withTask(request, [](ISCSILIBReplication &replication) {
        const int err = replication.demote();
        return err ? failed(err) : describe(replication.task.uuid);
    });
}

Result deleteReplication(const Request &request)
{
    return withTask(request, [&](ISCSILIBReplication &replication) {
        // A LUN that a peer writes to is not deleted. A source has nothing to break, and a lost task none either.
        iscsihost::breakReception(replication.task.uuid);
        const int err = replication.deleteReplication(request.input["delete_lun"].asBool());
        return err ? failed(err) : Result();
    });
}

Result checkReplicationNode(const Request &request)
{
    std::string node;
    if (int err = ISCSINodeInfo::GetNodeUUID(request.path.at("node"), node))
        return failed(err, "no node has the UUID, host name or index '" + request.path.at("node") + "'");
    ISCSILIBReplication replication;
    const int err = replication.checkNode(node, request.input["address"].asString(), request.input["port"].asUInt());
    return err ? failed(err) : Result();
}

} // namespace webapi
