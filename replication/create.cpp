// Creating a pair, and checking that a node can be replicated to.
#include "iscsiwebapi/ISCSILIBReplication.h"

#include "etc/Failure.h"
#include "etc/Text.h"
#include "webapi/client/APILUN.h"
#include "webapi/client/APINode.h"
#include "webapi/client/APIReplication.h"

namespace ISCSI::LIB::LIBReplication {

using WebAPI::APILUN::WebAPIClientLUNCreate;
using WebAPI::APILUN::WebAPIClientLUNDelete;
using WebAPI::APINode::WebAPIClientNodeGet;
using WebAPI::APIReplication::WebAPIClientReplicationCreateTask;

int ISCSILIBReplication::createReplication()
{
    constexpr unsigned int DESTINATION_EXTENT_SIZE = 8192;
    constexpr unsigned int CREATE_LIMIT = 300;

    if (task.src_lun.isInvalid() || task.src_node.isInvalid(false) || task.dst_node.isInvalid(false) ||
        dst_lun_location.empty() || dst_lun_name.empty()) {
        fail(ERR_DEFAULT_ERROR_CODE, task, "Failed to load source LUN's info");
        return ERR_INVALID_INPUT;
    }
    _tag_iscsi_lun_ lun{};
    if (int err = task.src_lun.loadFromConfig(lun, 0))
        return fail(err, task, "Failed to load source LUN's info");
    if ((task.src_lun.type & NORV_LUN_EXTENT_POOL_BITS) != NORV_LUN_EXTENT_POOL_BITS)
        return fail(ERR_BAD_LUN_TYPE, task, "Source LUN is not an advanced LUN");
    ISCSINodeInfo node = task.dst_node;
    if (int err = node.loadFromDRNode())
        return fail(err, task, "Failed to load destination node's info");
    task.dst_node = node; // the wait below asks it
    WebAPIClientLUNCreate create(node, dst_lun_name, NORV_LUN_TYPE_SINK, dst_lun_location, task.src_lun.size,
                                 DESTINATION_EXTENT_SIZE);
    if (int err = create.send())
        return fail(err, task, "Failed to create destination LUN");
    task.dst_lun = ISCSILUNInfo(create.lunUUID());

    const auto roll_back_lun = [&](int result, Site site = here()) {
        if (int err = WebAPIClientLUNDelete(node, task.dst_lun.uuid).send())
            fail(err, task, "Failed to delete destination LUN", site);
        return result;
    };
    if (int err = waitUntilRemoteLUNUnlock(CREATE_LIMIT))
        return roll_back_lun(fail(err, task, "Failed to wait until creating destination LUN completed"));
    if (int err = createTask())
        return roll_back_lun(fail(err, task, "Failed to create source task"));
    if (int err = WebAPIClientReplicationCreateTask(node, task.uuid, false, task.src_lun.uuid, task.dst_lun.uuid,
                                                    task.src_node.uuid, task.dst_node.uuid)
                      .send()) {
        roll_back_lun(fail(err, task, "Failed to create destination task"));
        if (int failed = deleteTask())
            fail(failed, task, "Failed to delete source task");
        return err;
    }
    return 0;
}

int ISCSILIBReplication::createTask()
{
    ISCSILUNInfo lun = localLUN();
    _tag_iscsi_lun_ lun_record{};
    if (int err = lun.loadFromConfig(lun_record, 0))
        return fail(err, task, "Failed to load local LUN's info");
    task.root_path = lun.location;
    if (int err = task.fillVISCSITask(task_record))
        return fail(err, task, "Failed to get replication task");

    ISCSINodeInfo &local = localNode();
    std::string rod_key;
    if (int err = local.loadFromDRNode())
        return fail(err, task, "Failed to load local node's info");
    if (int err = local.loadLocalRODKey(rod_key))
        return fail(err, task, "Failed to get local ROD key");
    if (int err = local.insertRODKey(rod_key))
        return fail(err, task, "Failed to set local ROD key");

    ISCSINodeInfo &remote = remoteNode();
    if (int err = remote.loadFromDRNode())
        return fail(err, task, "Failed to load remote node's info");
    WebAPIClientNodeGet request(remote);
    if (int err = request.send())
        return fail(err, task, "Failed to get remote node's info");
    if (int err = remote.insertRODKey(request.rodKey()))
        return fail(err, task, "Failed to set remote ROD key");

    if (int err = NORViSCSIReplicationTaskCreate(&task_record))
        return fail(err, task, "Failed to create replication task");
    if (task.is_source)
        task.uuid = fieldText(task_record.uuid);
    task.parent_task_uuid = fieldText(task_record.parent_task_uuid);
    return 0;
}

int ISCSILIBReplication::checkNode(const std::string &node_uuid, const std::string &connection_text,
                                   unsigned int connection_number)
{
    ISCSINodeInfo node(node_uuid);
    if (int err = node.loadFromDRNode())
        return fail(err, node, "Failed to load remote node's info");
    WebAPIClientNodeGet request(node);
    if (int err = request.send())
        return fail(err, node, "Failed to get remote node's info");
    if (int err = node.insertRODKey(request.rodKey()))
        return fail(err, node, "Failed to set remote ROD key");
    if (int err =
            NORViSCSIReplicationTaskCheckConnection(connection_text.c_str(), connection_number, node.rod_key.c_str()))
        return fail(err, node, "Failed to check node");
    return 0;
}

} // namespace ISCSI::LIB::LIBReplication
