// Waits on the peer, and on local snapshots and LUNs.
#include "iscsiwebapi/ISCSILIBReplication.h"

#include "etc/Failure.h"
#include "etc/Wait.h"
#include "iscsiwebapi/ISCSILIBLUN.h"
#include "webapi/client/APILUN.h"
#include "webapi/client/APIReplication.h"

namespace ISCSI::LIB::LIBReplication {

using LIBLUN::ISCSILIBLUN;
using WebAPI::APILUN::StateClient;
using WebAPI::APILUN::WebAPIClientLUNGet;
using WebAPI::APILUN::WebAPIClientLUNGetSnapshot;
using WebAPI::APIReplication::WebAPIClientReplicationGet;

namespace {

/// Waits until what the request asks about is no longer locked, or makes no progress for too long.
int waitUntilSyncDone(const ISCSITaskInfo &task, StateClient &request, unsigned int timeout, const char *timed_out,
                      Site site)
{
    for (Wait wait(timeout);;) {
        if (int err = request.send())
            return fail(err, task, "Failed to get remote LUN status", site);
        if (!request.isActionLocked())
            return 0;
        if (wait.stalled(request.syncProgress()))
            return fail(ERR_TIMEOUT, task, timed_out, site);
    }
}

} // namespace

int ISCSILIBReplication::waitUntilRemoteTaskUnlock(unsigned int timeout) const
{
    WebAPIClientReplicationGet request(task.dst_node, task.uuid, false);
    for (Wait wait(timeout);;) {
        if (int err = request.send())
            return fail(err, task, "Failed to get remote task status");
        if (!request.isLocked())
            return 0;
        if (wait.expired()) {
            fail(0, task, "Timeout! Failed to wait until remote task unlocked");
            return ERR_TIMEOUT;
        }
    }
}

int ISCSILIBReplication::waitUntilRemoteLUNUnlock(unsigned int timeout) const
{
    WebAPIClientLUNGet request(task.dst_node, task.dst_lun.uuid, {"is_action_locked"});
    for (Wait wait(timeout);;) {
        if (int err = request.send())
            return fail(err, task, "Failed to get remote LUN status");
        if (!request.isActionLocked())
            return 0;
        if (wait.expired()) {
            fail(0, task, "Timeout! Failed to wait until remote lun unlocked");
            return ERR_TIMEOUT;
        }
    }
}

int ISCSILIBReplication::waitUntilRemoteLUNSyncDone(unsigned int timeout) const
{
    WebAPIClientLUNGet request(task.dst_node, task.dst_lun.uuid, {"is_action_locked", "sync_progress"});
    return waitUntilSyncDone(task, request, timeout, "Timeout! Failed to wait until LUN sync completed", here());
}

int ISCSILIBReplication::waitUntilRemoteSnapshotSyncDone(const std::string &snapshot_uuid, unsigned int timeout) const
{
    WebAPIClientLUNGetSnapshot request(task.dst_node, snapshot_uuid, {"is_action_locked", "sync_progress"});
    return waitUntilSyncDone(task, request, timeout, "Timeout! Failed to wait until snapshot sync completed", here());
}

int ISCSILIBReplication::waitUntilSendingCompleted(int &retries_left, unsigned long long &progress_value,
                                                   unsigned int timeout) const
{
    constexpr int FATAL = -71;
    constexpr int STOPPED = -19;
    for (Wait wait(timeout);;) {
        _tag_iscsi_task_progress_ progress{};
        if (int err = NORViSCSIReplicationTaskProgressGetByTask(&task_record, &progress))
            return fail(err, task, "Failed to get sending progress");
        progress_value = progress.progress_value;
        if (progress.error != 0) {
            if (progress.error == FATAL || retries_left <= 0)
                return fail(ERR_FAILED_TO_SEND_SNAPSHOT, task, "Failed to send a snapshot");
            if (progress.error == STOPPED)
                return ERR_STOP_SENDING_SNAPSHOT;
            failText(here(), ERR_TRY_AGAIN, "Failed to send a snapshot. Max retry count: %d. info: %s. error: %d (%s)",
                     retries_left, task.toString().c_str(), progress.error, ErrorCodeToString(progress.error));
            --retries_left;
            return ERR_TRY_AGAIN;
        }
        if (progress.sent_size != 0 && progress.sent_size == progress.send_total_size)
            return 0;
        if (wait.stalled(progress.sent_size + progress.progress_value))
            return fail(ERR_TIMEOUT, task, "Timeout! Failed to wait until sending snapshot completed");
    }
}

int ISCSILIBReplication::waitUntilSnapshotUnlock(const std::string &snapshot_uuid, unsigned int timeout) const
{
    _tag_iscsi_snapshot_ snapshot{};
    if (int err = NORViSCSISnapshotConfGetByUUID(snapshot_uuid.c_str(), &snapshot))
        return failShort(here(), err, "Failed to get sending snapshot's config. UUID: %s.", snapshot_uuid.c_str());
    for (Wait wait(timeout);;) {
        bool locked = false;
        if (int err = NORViSCSIIsSnapshotLocked(&snapshot, &locked))
            return fail(err, task, "Failed to get snapshot's lock status");
        if (!locked)
            return 0;
        if (wait.expired())
            return fail(ERR_TIMEOUT, task, "Timeout! Failed to wait until snapshot unlocked");
    }
}

int ISCSILIBReplication::waitUntilLocalLUNUnlock(unsigned int timeout) const
{
    ISCSILIBLUN lun(localLUN().uuid);
    for (Wait wait(timeout);;) {
        bool locked = false;
        if (int err = lun.isLUNLocked(locked))
            return fail(err, task, "Failed to get local LUN status");
        if (!locked)
            return 0;
        if (wait.expired())
            return fail(ERR_TIMEOUT, task, "Timeout! Failed to wait until local LUN unlocked");
    }
}

} // namespace ISCSI::LIB::LIBReplication
