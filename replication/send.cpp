// Sending snapshots: the source's side, the destination's choice of a base, progress.
#include "iscsiwebapi/ISCSILIBReplication.h"

#include "etc/Failure.h"
#include "etc/Text.h"
#include "iscsiwebapi/ISCSILIBLUN.h"
#include "platform/event_log.h"
#include "replication/BaseVersion.h"
#include "webapi/client/APILUN.h"
#include "webapi/client/APIReplication.h"

#include <algorithm>
#include <exception>
#include <new>
#include <unistd.h>

namespace ISCSI::LIB::LIBReplication {

using LIBLUN::ISCSILIBLUN;
using WebAPI::APILUN::WebAPIClientLUNSet;
using WebAPI::APILUN::WebAPIClientLUNTakeSnapshot;
using WebAPI::APIReplication::WebAPIClientReplicationGetBaseVersion;

namespace {

constexpr unsigned int EVENT_DESTINATION_SNAPSHOT_FAILED = 0x13D0000D;

/// Ends the worked part of an operation: unlocks the task and, in a worker, tells a failure once more
/// and exits. Returns the result it is given unless the task cannot be unlocked.
int finishWork(ISCSILIBReplication &replication, int result, Site site)
{
    if (replication.unlockTask())
        result = fail(ERR_FAILED_TO_UNLOCK_FILE, replication.task, "Failed to unlock", site);
    if (replication.is_child && result != 0)
        failTagged(site, result, replication.task.toString());
    replication.childProcessExit();
    return result;
}

/// What the work returns. Nothing is thrown out of a worker: it would go on as its caller.
template <class Work>
int resultOf(Work work)
{
    try {
        return work();
    } catch (const std::bad_alloc &) {
        return ERR_OUT_OF_MEMORY;
    } catch (const std::exception &) {
        return ERR_DEFAULT_ERROR_CODE;
    }
}

/// Snapshots of a LUN, newest first.
int listByTime(const std::string &lun_uuid, std::vector<ISCSISnapshotInfo> &out)
{
    if (int err = ISCSILIBLUN(lun_uuid).listSnapshot(out, 0))
        return err;
    std::sort(out.begin(), out.end(), ISCSISnapshotInfo::CompareBySnapshotTime);
    return 0;
}

/// Of the snapshot with the version. It is the version itself, but for snapshots that came from a peer which was the
/// source before.
std::string uuidOf(const std::string &version, const std::vector<ISCSISnapshotInfo> &snapshots)
{
    const auto found = std::find_if(snapshots.begin(), snapshots.end(),
                                    [&](const ISCSISnapshotInfo &one) { return one.version == version; });
    return found == snapshots.end() ? version : found->uuid;
}

/// One sending of one snapshot: what is decided before the fork, and what the worker needs.
class Sending {
public:
    Sending(ISCSILIBReplication &replication, const std::string &snapshot_uuid, const std::string &option,
            unsigned int value, bool flag, Site site)
        : replication(replication), task(replication.task), snapshot(snapshot_uuid), option(option), value(value),
          flag(flag), site(site)
    {
    }

    /// Up to the start of the transfer; when the destination has to be set back first, up to there.
    int prepare()
    {
        if (int err = task.loadFromConfig(replication.task_record, true))
            return fail(err, task, "Failed to load replication task", site);
        if (!task.is_source)
            return fail(ERR_NOT_A_SOURCE_TASK, task, "Not a source task", site);
        if (int err = snapshot.loadFromConfig(0))
            return fail(err, task, "Failed to load sending snapshot info", site);
        if (snapshot.parent_lun_id != task.src_lun.lun_id)
            return failText(site, ERR_BAD_SNAPSHOT_ID,
                            "This snapshot is not taken from source LUN. snapshot UUID: %s. info: %s. error: %d (%s)",
                            snapshot.uuid.c_str(), task.toString().c_str(), ERR_BAD_SNAPSHOT_ID,
                            ErrorCodeToString(ERR_BAD_SNAPSHOT_ID));
        std::vector<ISCSISnapshotInfo> snapshots;
        if (int err = listByTime(task.src_lun.uuid, snapshots))
            return fail(err, task, "Failed to load source snapshot info", site);
        WebAPIClientReplicationGetBaseVersion request(task.dst_node, task.uuid, snapshots);
        if (int err = request.send())
            return fail(err, task, "Failed to get common base for sending snapshot", site);
        base = {request.baseVersion(), request.needFullSync(), request.notAligned(), ""};
        if (!base.version.empty())
            base_uuid = uuidOf(base.version, snapshots);
        if (base.need_full_sync)
            fail(0, task, "No base snapshot found. Need full sync", site);
        if (base.not_aligned)
            return 0;
        return resizeAndSend();
    }

    /// The worker's part.
    int follow()
    {
        if (base.not_aligned) {
            if (int err = startAfterAlignment())
                return err;
        }
        for (;;) {
            unsigned long long progress = 0;
            switch (int err = replication.waitUntilSendingCompleted(retries, progress, STALL_LIMIT)) {
            case 0:
                return takeRemoteSnapshot();
            case ERR_STOP_SENDING_SNAPSHOT:
                return 0;
            case ERR_TRY_AGAIN:
                if (int failed = sendAgain())
                    return failed;
                break;
            default:
                return fail(err, task, "Failed to wait until sending snapshot completed", site);
            }
        }
    }

private:
    static constexpr unsigned int STALL_LIMIT = 1800;
    static constexpr unsigned int REMOTE_LIMIT = 300;
    static constexpr unsigned int RETRY_SECONDS = 30;

    int resizeAndSend()
    {
        WebAPIClientLUNSet resize(task.dst_node, task.dst_lun.uuid, "", snapshot.total_size);
        if (int err = resize.send())
            return fail(err, task, "Failed to resize destination LUN", site);
        return send();
    }

    int send()
    {
        const bool last_try = retries < 1;
        const char *base_version = base.version.empty() ? nullptr : base.version.c_str();
        if (int err = NORViSCSIReplicationTaskSendSnapshot(&replication.task_record, option.c_str(),
                                                           task.dst_node.rod_key.c_str(), snapshot.uuid.c_str(),
                                                           base_version, value, base.need_full_sync, flag, last_try))
            return failText(site, err, "Failed to send snapshot: %s. base: %s, full sync: %s. info: %s. error: %d (%s)",
                            snapshot.uuid.c_str(), base.version.c_str(), boolText(base.need_full_sync),
                            task.toString().c_str(), err, ErrorCodeToString(err));
        return 0;
    }

    int startAfterAlignment()
    {
        failText(site, 0, "Base snapshot and LUN are not aligned. base: %s. info: %s. error: %d (%s)",
                 base.version.c_str(), task.toString().c_str(), 0, ErrorCodeToString(0));
        if (int err = replication.waitUntilRemoteLUNSyncDone(REMOTE_LIMIT))
            return fail(err, task, "Failed to wait until destination task is unlocked", site);
        return resizeAndSend();
    }

    int sendAgain()
    {
        sleep(RETRY_SECONDS);
        for (const std::string &uuid : {snapshot.uuid, base_uuid}) {
            if (uuid.empty())
                continue;
            if (int err = replication.waitUntilSnapshotUnlock(uuid, RETRY_SECONDS))
                return failText(site, err, "Failed to wait until snapshot unlock. uuid: %s. info: %s. error: %d (%s)",
                                uuid.c_str(), task.toString().c_str(), err, ErrorCodeToString(err));
        }
        return send();
    }

    int takeRemoteSnapshot()
    {
        WebAPIClientLUNTakeSnapshot take(task.dst_node, task.dst_lun.uuid, snapshot.is_app_consistent,
                                         snapshot.is_user_locked, "", snapshot.description, snapshot.taken_by,
                                         snapshot.snapshot_time, false);
        if (int err = take.send()) {
            fail(err, task, "Failed to take a snapshot from destination LUN", site);
            reportRemoteSnapshot(err);
            return err;
        }
        if (int err = replication.waitUntilRemoteSnapshotSyncDone(take.snapshotUUID(), REMOTE_LIMIT))
            fail(err, task, "Failed to wait until remote snapshot completed", site);
        return 0;
    }

    /// Tells the administrator, and leaves the failure in the progress of the sending.
    void reportRemoteSnapshot(int err)
    {
        const char *reason = err == ERR_OUT_OF_FREE_SPACE          ? "Out of volume space"
                             : err == ERR_REACH_MAX_SNAPSHOT_COUNT ? "Maximum snapshot count reached"
                                                                   : "Internal error";
        NORVLogSet1(9, 1, EVENT_DESTINATION_SNAPSHOT_FAILED, task.src_lun.name.c_str(), reason, nullptr, nullptr);
        _tag_iscsi_task_progress_ progress{};
        if (int failed = NORViSCSIReplicationTaskProgressGetByTask(&replication.task_record, &progress)) {
            fail(failed, task, "Failed to get task sending progress", site);
            return;
        }
        progress.error = err;
        if (int failed = NORViSCSIReplicationTaskProgressAdd(&progress))
            fail(failed, task, "Failed to update the sending progress", site);
    }

    ISCSILIBReplication &replication;
    ISCSITaskInfo &task;
    ISCSISnapshotInfo snapshot;
    std::string option;
    unsigned int value;
    bool flag;
    Site site;
    Base base;
    std::string base_uuid;
    int retries = 3;
};

/// The destination's answer to a source that wants to send.
int chooseBase(ISCSILIBReplication &replication, const SnapshotsByVersion &source, Base &base, Site site)
{
    ISCSITaskInfo &task = replication.task;
    if (int err = task.loadFromConfig(replication.task_record, true))
        return fail(err, task, "Failed to load replication task", site);
    if (task.is_source)
        return fail(ERR_NOT_A_DESTINATION_TASK, task, "Not a destination task", site);
    ISCSILUNInfo &lun = task.dst_lun;
    std::string lun_base;
    bool is_modified = false;
    bool is_sending_failed = false;
    if (int err = lun.getBaseVersion(lun_base))
        return fail(err, task, "Failed to get LUN base version", site);
    if (int err = lun.isModified(is_modified))
        return fail(err, task, "Failed to check if LUN is modified", site);
    if (int err = lun.isSnapshotSentFailed(is_sending_failed))
        return fail(err, task, "Failed to check if last snapshot-sending failed", site);
    if (const auto found = baseOfLUN(source, lun_base, is_modified, is_sending_failed)) {
        base = *found;
        return 0;
    }
    std::vector<ISCSISnapshotInfo> snapshots;
    if (int err = listByTime(lun.uuid, snapshots))
        return fail(err, task, "Failed to list snapshots by snapshot time", site);
    base = baseOfSnapshots(source, snapshots);
    if (base.need_full_sync)
        fail(0, task, "No base snapshot found. Need FULL SYNC", site);
    return 0;
}

/// Starts setting the destination LUN back to the base.
int startAlignment(const ISCSITaskInfo &task, const Base &base, Site site)
{
    failText(site, 0, "Base snapshot and LUN are not aligned. base: %s. info: %s. error: %d (%s)", base.version.c_str(),
             task.toString().c_str(), 0, ErrorCodeToString(0));
    if (int err = ISCSILIBLUN(task.dst_lun.uuid).restoreSnapshot(base.restore_uuid))
        return fail(err, task, "Failed to restore snapshot", site);
    return 0;
}

} // namespace

int ISCSILIBReplication::sendSnapshot(const std::string &snapshot_uuid, const std::string &send_option,
                                      unsigned int send_value, bool /*ignored_flag*/, bool send_flag)
{
    if (int err = lockTask())
        return fail(err, task, "Failed to lock replication task");
    Sending sending(*this, snapshot_uuid, send_option, send_value, send_flag, here());
    if (int err = sending.prepare())
        return finishWork(*this, err, here());
    if (int err = forkProcessIfNotChild())
        return finishWork(*this, fail(err, task, "Failed to fork process"), here());
    if (!is_child)
        return 0; // the task stays locked for the worker
    return finishWork(*this, resultOf([&] { return sending.follow(); }), here());
}

int ISCSILIBReplication::getBaseVersion(const std::map<std::string, ISCSISnapshotInfo> &source_snapshots,
                                        std::string &base_version, bool &need_full_sync, bool &not_aligned)
{
    constexpr unsigned int RESTORE_LIMIT = 300;
    if (int err = lockTask())
        return fail(err, task, "Failed to lock replication task");
    Base base;
    if (int err = chooseBase(*this, source_snapshots, base, here()))
        return finishWork(*this, err, here());
    if (base.not_aligned) {
        if (int err = startAlignment(task, base, here()))
            return finishWork(*this, err, here());
        if (int err = forkProcessIfNotChild())
            return finishWork(*this, fail(err, task, "Failed to fork process"), here());
    }
    base_version = base.version;
    need_full_sync = base.need_full_sync;
    not_aligned = base.not_aligned;
    if (!base.not_aligned)
        return finishWork(*this, 0, here());
    if (!is_child)
        return 0; // the task stays locked for the worker
    const int result = resultOf([&] { return waitUntilLocalLUNUnlock(RESTORE_LIMIT); });
    if (result)
        fail(result, task, "Failed to wait until LUN restoring completed");
    return finishWork(*this, result, here());
}

int ISCSILIBReplication::startToComputeUnsyncSize(const std::string &base_version, const std::string &snapshot_uuid)
{
    if (int err = loadTask(true))
        return fail(err, task, "Failed to load replication task");
    if (!task.is_source)
        return fail(ERR_NOT_A_SOURCE_TASK, task, "Not a source task");
    _tag_iscsi_snapshot_ base{};
    if (!base_version.empty()) {
        if (int err = NORViSCSISnapshotConfGetByUUID(base_version.c_str(), &base))
            return failText(here(), err, "Failed to get base snapshot by UUID: %s. info: %s. error: %d (%s)",
                            base_version.c_str(), task.toString().c_str(), err, ErrorCodeToString(err));
    }
    _tag_iscsi_snapshot_ snapshot{};
    if (int err = NORViSCSISnapshotConfGetByUUID(snapshot_uuid.c_str(), &snapshot))
        return failText(here(), err, "Failed to get sending snapshot by UUID: %s. info: %s. error: %d (%s)",
                        snapshot_uuid.c_str(), task.toString().c_str(), err, ErrorCodeToString(err));
    if (int err = NORViSCSIReplicationTaskUnsyncSizeComputeStart(&task_record, base_version.empty() ? nullptr : &base,
                                                                 &snapshot))
        return fail(err, task, "Failed to compute unsync size");
    return 0;
}

int ISCSILIBReplication::getCurrentUnsyncSize(unsigned long long &unsync_size, bool &is_completed)
{
    if (int err = lockTask())
        return fail(err, task, "Failed to lock replication task");
    if (int err = loadTask(true))
        return finishWork(*this, fail(err, task, "Failed to load replication task"), here());
    uint64_t size = 0;
    bool completed = false;
    if (int err = NORViSCSIReplicationTaskUnsyncSizeGet(&task_record, &size, &completed))
        return finishWork(*this, fail(err, task, "Failed to compute unsync size"), here());
    unsync_size = size;
    is_completed = completed;
    return finishWork(*this, 0, here());
}

int ISCSILIBReplication::getSendingStatus(unsigned long long &sent_size, unsigned long long &send_total_size,
                                          unsigned long long &progress_value, int &error)
{
    if (int err = loadTask(true))
        return fail(err, task, "Failed to load replication task");
    _tag_iscsi_task_progress_ progress{};
    if (int err = NORViSCSIReplicationTaskProgressGetByTask(&task_record, &progress))
        return fail(err, task, "Failed to get sending progress");
    sent_size = progress.sent_size;
    send_total_size = progress.send_total_size;
    progress_value = progress.progress_value;
    error = progress.error;
    return 0;
}

int ISCSILIBReplication::stopSending()
{
    if (int err = loadTask(true))
        return fail(err, task, "Failed to load replication task");
    if (int err = NORViSCSIReplicationTaskStopSendingSnapshot(&task_record))
        return fail(err, task, "Failed to stop sending snapshot");
    return 0;
}

} // namespace ISCSI::LIB::LIBReplication
