#include "iscsiwebapi/ISCSILIBReplication.h"

#include "etc/Failure.h"
#include "platform/core.h"

#include <unistd.h>

namespace ISCSI::LIB::LIBReplication {
namespace {

constexpr const char *LOCK_FOLDER = "/tmp/iscsi";
constexpr int NO_LOCK = -1;

/// Takes the lock again, or for the first time: then with `take`, which is given the lock file's path.
template <class Take>
int lock(ISCSILIBReplication &replication, Take take, Site site)
{
    const std::string path = replication.task.getLockPath();
    if (path.empty())
        return fail(ERR_BAD_REPLICATION_TASK_UUID, replication.task, "Failed to get task lock file path", site);
    if (replication.lock_fd >= 0) {
        ++replication.lock_depth;
        return 0;
    }
    if (NORVFSMkdirP(LOCK_FOLDER, 0, 1, -1, -1, -1) < 0)
        return fail(ERR_FAILED_TO_CERATE_DIRECTORY, replication.task, "Failed to create iscsi lock folder", site);
    int fd = NO_LOCK;
    if (int err = take(path.c_str(), &fd))
        return err;
    replication.lock_fd = fd;
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
    const auto take = [this, site = here()](const char *path, int *fd) {
        return NLIBCFileLockByFile(path, 1, fd)
                   ? 0
                   : fail(ERR_TASK_IS_LOCKED, task, "Another process locked this task", site);
    };
    return lock(*this, take, here());
}

int ISCSILIBReplication::blockingLockTask()
{
    const auto take = [this, site = here()](const char *path, int *fd) {
        constexpr int ONE_DAY = 86400;
        for (int second = 0; second < ONE_DAY; ++second) {
            if (NLIBCFileLockTimeByFile(path, 1, 1, fd) == 1)
                return 0;
        }
        return fail(ERR_TIMEOUT, task, "Timeout. Failed to wait until get blocking task", site);
    };
    return lock(*this, take, here());
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
    lock_fd = NO_LOCK;
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
