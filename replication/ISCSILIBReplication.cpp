#include "iscsiwebapi/ISCSILIBReplication.h"

#include "etc/Failure.h"
#include "platform/core.h"

#include <unistd.h>

namespace ISCSI::LIB::LIBReplication {
namespace {

constexpr const char *LOCK_FOLDER = "/tmp/iscsi";

/// The task's lock file, in a folder that exists.
int prepareLock(const ISCSITaskInfo &task, std::string &path, Site site)
{
    path = task.getLockPath();
    if (path.empty())
        return fail(ERR_BAD_REPLICATION_TASK_UUID, task, "Failed to get task lock file path", site);
    if (NORVFSMkdirP(LOCK_FOLDER, 0, 1, -1, -1, -1) < 0)
        return fail(ERR_FAILED_TO_CERATE_DIRECTORY, task, "Failed to create iscsi lock folder", site);
    return 0;
}

} // namespace

ISCSILIBReplication::ISCSILIBReplication(const std::string &task_uuid) : task(task_uuid) {}

ISCSILIBReplication::ISCSILIBReplication(const std::string &src_lun_uuid, const std::string &src_node_uuid,
                                         const std::string &dst_node_uuid, const std::string &dst_lun_location,
                                         const std::string &dst_lun_name)
    : task("", true, ISCSILUNInfo(src_lun_uuid), ISCSILUNInfo(), ISCSINodeInfo(src_node_uuid),
           ISCSINodeInfo(dst_node_uuid), "", ""),
      dst_lun_location(dst_lun_location), dst_lun_name(dst_lun_name)
{
}

ISCSILIBReplication::ISCSILIBReplication(const std::string &task_uuid, bool is_source, const std::string &src_lun_uuid,
                                         const std::string &dst_lun_uuid, const std::string &src_node_uuid,
                                         const std::string &dst_node_uuid)
    : task(task_uuid, is_source, ISCSILUNInfo(src_lun_uuid), ISCSILUNInfo(dst_lun_uuid), ISCSINodeInfo(src_node_uuid),
           ISCSINodeInfo(dst_node_uuid), "", "")
{
}

ISCSILIBReplication::~ISCSILIBReplication() = default;

int ISCSILIBReplication::lockTask()
{
    std::string path;
    if (lock_fd >= 0) {
        ++lock_depth;
        return 0;
    }
    if (int err = prepareLock(task, path, here()))
        return err;
    if (!NLIBCFileLockByFile(path.c_str(), 1, &lock_fd))
        return fail(ERR_TASK_IS_LOCKED, task, "Another process locked this task");
    return 0;
}

int ISCSILIBReplication::blockingLockTask()
{
    constexpr int ONE_DAY = 86400;
    std::string path;
    if (lock_fd >= 0) {
        ++lock_depth;
        return 0;
    }
    if (int err = prepareLock(task, path, here()))
        return err;
    for (int second = 0; second < ONE_DAY; ++second) {
        if (NLIBCFileLockTimeByFile(path.c_str(), 1, 1, &lock_fd) == 1)
            return 0;
    }
    return fail(ERR_TIMEOUT, task, "Timeout. Failed to wait until get blocking task");
}

int ISCSILIBReplication::unlockTask()
{
    if (lock_fd < 0)
        return 0;
    if (lock_depth > 0) {
        --lock_depth;
        return 0;
    }
    if (!NLIBCFileUnlockByFile(lock_fd))
        fail(0, task, "Failed to unlock task");
    lock_fd = -1;
    return 0;
}

int ISCSILIBReplication::forkProcessIfNotChild()
{
    if (is_child)
        return 0;
    const int pid = NLIBCProcForkChildNoWait();
    if (pid < 0) {
        fail(pid, task, "Failed to fork a process");
        return ERR_FAILED_TO_FORK;
    }
    is_child = pid == 0;
    return 0;
}

void ISCSILIBReplication::childProcessExit()
{
    if (is_child && lock_fd < 0)
        _exit(0);
}

int ISCSILIBReplication::loadTask(bool strict)
{
    return task.loadFromConfig(task_record, strict);
}

const ISCSILUNInfo &ISCSILIBReplication::localLUN() const
{
    return task.is_source ? task.src_lun : task.dst_lun;
}

ISCSINodeInfo &ISCSILIBReplication::localNode()
{
    return task.is_source ? task.src_node : task.dst_node;
}

ISCSINodeInfo &ISCSILIBReplication::remoteNode()
{
    return task.is_source ? task.dst_node : task.src_node;
}

} // namespace ISCSI::LIB::LIBReplication
