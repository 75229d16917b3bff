// Snapshots of a LUN.
#include "iscsiwebapi/ISCSILIBLUN.h"

#include "etc/Failure.h"
#include "etc/ISCSIWebAPIStringTool.h"
#include "etc/Text.h"
#include "etc/Worker.h"
#include "lun/Waits.h"
#include "platform/core.h"
#include "platform/event_log.h"
#include "platform/retention.h"

namespace ISCSI::LIB::LIBLUN {
namespace {

constexpr unsigned int EVENT_RESTORE_FAILED = 0x13d00005;
constexpr unsigned int EVENT_RESTORE_DONE = 0x13d00002;

int logRestore(int scope, int level, unsigned int event, const _tag_iscsi_lun_ &lun,
               const _tag_iscsi_snapshot_ &snapshot)
{
    return NORVLogSet1(scope, level, event, fieldText(lun.name).c_str(), EventTime(snapshot.snap_time).c_str(), nullptr,
                       nullptr);
}

/// The log that a failed restore goes to depends on whether the appliance has the snapshot log.
int restoreFailureScope()
{
    return NLIBCFileCheckKeyValue("/etc.defaults/norvinfo.conf", "support_dr_snap", "yes", 0) == 1 ? 9 : 1;
}

void setLoadFlags(_tag_iscsi_snapshot_ &record, bool is_for_trash, bool is_for_unsync_size)
{
    if (is_for_trash)
        record.flags |= NORV_SNAPSHOT_TRASH;
    else if (is_for_unsync_size)
        record.flags |= NORV_SNAPSHOT_UNSYNC_SIZE;
}

const char *actor(const std::string &name)
{
    return name.empty() ? "webapi" : name.c_str();
}

} // namespace

int ISCSILIBLUN::takeSnapshot(bool is_app_consistent, bool is_user_locked, const std::string &name,
                              const std::string &description, const std::string &taken_by, long snapshot_time,
                              bool is_scheduled, std::string &snapshot_uuid, int &snapshot_id)
{
    if (int err = info.loadFromConfig(record, 0))
        return fail(err, info, "Failed to load LUN info from SDK");
    _tag_iscsi_snapshot_ snapshot{};
    snapshot.app_consistent = is_app_consistent;
    snapshot.user_locked = is_user_locked;
    snapshot.snap_time = static_cast<int32_t>(snapshot_time);
    if (name.empty()) {
        if (int err = NORViSCSIUnusedSnapshotNameFind(info.lun_id, snapshot.name, sizeof(snapshot.name)))
            return fail(err, info, "Failed to find unused snapshot name");
    } else if (int err = StringCopy(snapshot.name, name)) {
        return fail(err, info, "Failed to copy snapshot's name");
    }
    if (int err = StringCopy(snapshot.desc, description))
        return fail(err, info, "Failed to copy snapshot's note");
    if (int err = StringCopy(snapshot.taken_by, actor(taken_by)))
        return fail(err, info, "Failed to copy snapshot's taken-by");
    if (is_scheduled)
        snapshot.flags |= NORV_SNAPSHOT_SCHEDULED;
    if (int err = NORViSCSISnapshotCreate(&record, &snapshot))
        return fail(err, info, "Failed to take a snapshot");
    snapshot_uuid = fieldText(snapshot.uuid);
    snapshot_id = snapshot.snap_id;

    const auto run_retention = [this, site = here()] {
        if (int err = NORViSCSILunWaitUntilUnlock(&record, ACTION_LIMIT)) {
            fail(err, info, "Failed to wait until taking snapshot completed", site);
            return;
        }
        const std::string key = std::to_string(info.lun_id);
        if (int err = NORVRETENTIONRunPolicy("Lun#", key.c_str(), NORVRETAINERiSCSIRetentionTargetGet,
                                             NORVRETAINERiSCSIRetentionTargetDelete, 0);
            err < 0)
            fail(err, info, "Failed to run retention policy", site);
    };
    if (int err = startWorker(run_retention))
        return fail(err, info, "Failed to fork a process");
    return 0;
}

int ISCSILIBLUN::deleteSnapshot(const std::string &uuid, const std::string &deleted_by)
{
    _tag_iscsi_snapshot_ snapshot{};
    if (int err = NORViSCSISnapshotConfGetByUUID(uuid.c_str(), &snapshot))
        return failText(here(), err, "Failed to load snapshot config. UUID: %s info: %s. error: %d (%s)", uuid.c_str(),
                        info.toString().c_str(), err, ErrorCodeToString(err));
    if (int err = NORViSCSISnapshotDelete(&snapshot, actor(deleted_by)))
        return failText(here(), err, "Failed to delete snapshot. UUID: %s info: %s. error: %d (%s)", uuid.c_str(),
                        info.toString().c_str(), err, ErrorCodeToString(err));
    return 0;
}

int ISCSILIBLUN::listSnapshot(std::vector<ISCSISnapshotInfo> &out, int filter)
{
    if (info.isInvalid()) {
        if (int err = ISCSISnapshotInfo::ListSnapshot(-1, out, 0, filter))
            return fail(err, info, "Failed to list all snapshots");
        return 0;
    }
    if (int err = info.loadFromConfig(record, 0))
        return fail(err, info, "Failed to load LUN info from SDK");
    if (int err = ISCSISnapshotInfo::ListSnapshot(info.lun_id, out, 0, filter))
        return fail(err, info, "Failed to list snapshots");
    return 0;
}

int ISCSILIBLUN::restoreSnapshot(const std::string &uuid)
{
    if (int err = info.loadFromConfig(record, 0))
        return fail(err, info, "Failed to load LUN info from SDK");
    _tag_iscsi_snapshot_ snapshot{};
    if (int err = NORViSCSISnapshotConfGetByUUID(uuid.c_str(), &snapshot))
        return failShort(here(), err, "Failed to load snapshot config. UUID: %s, info: %s, error: %d (%s)",
                         uuid.c_str(), info.toString().c_str(), err, ErrorCodeToString(err));
    if (int err = NORViSCSISnapshotRestore(&snapshot, &record)) {
        failShort(here(), err, "Failed to restore snapshot. UUID: %s, info: %s, error: %d (%s)", uuid.c_str(),
                  info.toString().c_str(), err, ErrorCodeToString(err));
        logRestore(restoreFailureScope(), 3, EVENT_RESTORE_FAILED, record, snapshot);
        return err;
    }
    const auto report = [this, &snapshot, site = here()] {
        if (int err = NORViSCSILunWaitUntilUnlock(&record, ACTION_LIMIT))
            fail(err, info, "Failed to wait until restoring snapshot completed", site);
        else
            logRestore(9, 1, EVENT_RESTORE_DONE, record, snapshot);
    };
    if (int err = startWorker(report))
        return fail(err, info, "Failed to fork a process");
    return 0;
}

int ISCSILIBLUN::stopSnapshot(const std::string &uuid)
{
    if (int err = info.loadFromConfig(record, 0))
        return fail(err, info, "Failed to load LUN info from SDK");
    _tag_iscsi_snapshot_ snapshot{};
    if (int err = NORViSCSISnapshotConfGetByUUID(uuid.c_str(), &snapshot))
        return failText(here(), err, "Failed to load snapshot config. UUID: %s info: %s. error: %d (%s)", uuid.c_str(),
                        info.toString().c_str(), err, ErrorCodeToString(err));
    bool lun_locked = false;
    if (int err = NORViSCSILunIsLocked(&record, &lun_locked))
        return fail(err, info, "Failed to check if LUN is locked");
    bool snapshot_locked = false;
    if (int err = NORViSCSIIsSnapshotLocked(&snapshot, &snapshot_locked))
        return failText(here(), err, "Failed to check if snapshot is locked. UUID: %s info: %s. error: %d (%s)",
                        uuid.c_str(), info.toString().c_str(), err, ErrorCodeToString(err));
    if (!lun_locked || !snapshot_locked)
        return 0;
    if (int err = NORViSCSISnapshotUnload(&snapshot))
        return failText(here(), err, "Failed to unload snapshot. UUID: %s info: %s. error: %d (%s)", uuid.c_str(),
                        info.toString().c_str(), err, ErrorCodeToString(err));
    return 0;
}

int ISCSILIBLUN::loadSnapshot(const std::string &uuid, bool is_for_trash, bool is_for_unsync_size)
{
    _tag_iscsi_snapshot_ snapshot{};
    if (int err = NORViSCSISnapshotConfGetByUUID(uuid.c_str(), &snapshot))
        return failText(here(), err, "Failed to load snapshot config by UUID: %s. info: %s. error: %d (%s)",
                        uuid.c_str(), info.toString().c_str(), err, ErrorCodeToString(err));
    setLoadFlags(snapshot, is_for_trash, is_for_unsync_size);
    if (int err = NORViSCSISnapshotLoad(&snapshot))
        return failText(here(), err,
                        "Failed to load snapshot. UUID: %s, is_for_trash: %s, is_for_unsync_size: %s info: %s. "
                        "error: %d (%s)",
                        uuid.c_str(), boolText(is_for_trash), boolText(is_for_unsync_size), info.toString().c_str(),
                        err, ErrorCodeToString(err));
    return 0;
}

int ISCSILIBLUN::unloadSnapshot(const std::string &uuid, bool is_for_trash, bool is_for_unsync_size)
{
    _tag_iscsi_snapshot_ snapshot{};
    if (int err = NORViSCSISnapshotConfGetByUUID(uuid.c_str(), &snapshot))
        return failText(here(), err, "Failed to load snapshot config by UUID: %s. info: %s. error: %d (%s)",
                        uuid.c_str(), info.toString().c_str(), err, ErrorCodeToString(err));
    setLoadFlags(snapshot, is_for_trash, is_for_unsync_size);
    if (int err = NORViSCSISnapshotUnload(&snapshot))
        return failText(here(), err,
                        "Failed to unload snapshot. UUID: %s, is_for_trash: %s, is_for_unsync_size: %s info: %s. "
                        "error: %d (%s)",
                        uuid.c_str(), boolText(is_for_trash), boolText(is_for_unsync_size), info.toString().c_str(),
                        err, ErrorCodeToString(err));
    return 0;
}

} // namespace ISCSI::LIB::LIBLUN
