// Role change, status and removal of this appliance's half.
#include "iscsiwebapi/ISCSILIBReplication.h"

#include "etc/Failure.h"
#include "iscsiwebapi/ISCSILIBLUN.h"
#include "platform/core.h"

#include <cerrno>
#include <unistd.h>

namespace ISCSI::LIB::LIBReplication {

using LIBLUN::ISCSILIBLUN;

int ISCSILIBReplication::getStatus(bool &is_locked, std::string &base_version)
{
    if (int err = loadTask(true))
        return fail(err, task, "Failed to load replication task");
    // A lock whose folder is missing could not be taken, and would pass for one that is held.
    NORVFSMkdirP("/tmp/iscsi", 0, 1, -1, -1, -1);
    int fd = -1;
    const bool locked = !NLIBCFileLockByFile(task.getLockPath().c_str(), 1, &fd);
    if (!locked && !NLIBCFileUnlockByFile(fd))
        return fail(ERR_FAILED_TO_UNLOCK_FILE, task, "Failed to unlock");
    ISCSILUNInfo lun = localLUN();
    std::string version;
    if (int err = lun.getBaseVersion(version))
        return fail(err, task, "Failed to get base version");
    is_locked = locked;
    base_version = version;
    return 0;
}

namespace {

/// One direction of a role change.
struct RoleChange {
    bool from_source;
    int wrong_role;
    const char *wrong_role_text;
    int (*convert)(const _tag_iscsi_task_ *);
    const char *failure;
};

int changeRole(ISCSILIBReplication &replication, const RoleChange &change, Site site)
{
    ISCSITaskInfo &task = replication.task;
    if (int err = task.loadFromConfig(replication.task_record, true))
        return fail(err, task, "Failed to load replication task", site);
    if (task.is_source != change.from_source)
        return fail(change.wrong_role, task, change.wrong_role_text, site);
    bool mapped = false;
    if (int err = ISCSILIBLUN((task.is_source ? task.src_lun : task.dst_lun).uuid).isLUNMapped(mapped))
        return fail(err, task, "Failed to get LUN status", site);
    if (mapped)
        return failText(site, ERR_LUN_IS_MAPPED, "LUN is mapped. Please unmap the target. info: %s. error: %d (%s)",
                        task.toString().c_str(), ERR_LUN_IS_MAPPED, ErrorCodeToString(ERR_LUN_IS_MAPPED));
    if (int err = change.convert(&replication.task_record))
        return fail(err, task, change.failure, site);
    return 0;
}

/// Runs a role change under the task's lock.
int changeRoleLocked(ISCSILIBReplication &replication, const RoleChange &change, Site site)
{
    if (int err = replication.lockTask())
        return fail(err, replication.task, "Failed to lock replication task", site);
    const int result = changeRole(replication, change, site);
    if (replication.unlockTask())
        return fail(ERR_FAILED_TO_UNLOCK_FILE, replication.task, "Failed to unlock", site);
    return result;
}

} // namespace

int ISCSILIBReplication::promote()
{
    static const RoleChange to_source = {false, ERR_NOT_A_DESTINATION_TASK, "Not a destination task",
                                         NORViSCSIReplicationTaskConvertDstToSrc, "Failed to convert task to source"};
    return changeRoleLocked(*this, to_source, here());
}

int ISCSILIBReplication::demote()
{
    static const RoleChange to_sink = {true, ERR_NOT_A_SOURCE_TASK, "Not a source task",
                                       NORViSCSIReplicationTaskConvertSrcToDst, "Failed to convert task to sink"};
    return changeRoleLocked(*this, to_sink, here());
}

int ISCSILIBReplication::deleteReplication(bool delete_sink_lun)
{
    if (int err = loadTask(false))
        return fail(err, task, "Failed to load replication task");
    if (!task.is_source && delete_sink_lun) {
        const int err = ISCSILIBLUN(task.dst_lun.uuid).deleteLUN();
        const bool is_gone = err == ERR_FAILED_TO_LOAD_LUN_CONFIG || err == ERR_NO_SUCH_LUN;
        if (err != 0 && !is_gone)
            fail(err, task, "Failed to delete sink LUN");
    } else if (!task.is_source) {
        _tag_iscsi_lun_ lun{};
        if (int err = task.dst_lun.loadFromConfig(lun, 0))
            fail(err, task, "Failed to load local LUN's info");
        else if (int failed = NORViSCSILunConvertSinkToAdv(&lun))
            fail(failed, task, "Failed to convert the sink lun to advanced lun");
    }
    if (int err = deleteTask())
        return fail(err, task, "Failed to delete task");
    return 0;
}

int ISCSILIBReplication::deleteTask()
{
    if (int err = loadTask(false))
        return fail(err, task, "Failed to load replication task");
    const int result = NORViSCSIReplicationTaskDelete(&task_record);
    if (result)
        fail(result, task, "Failed to remove replication task");
    if (unlink(task.getLockPath().c_str()) != 0 && errno != ENOENT)
        fail(-errno, task, "Failed to delete lock file");
    return result;
}

int ISCSILIBReplication::ListTask(std::vector<ISCSITaskInfo> &out)
{
    return ISCSITaskInfo::ListTask(out);
}

} // namespace ISCSI::LIB::LIBReplication
