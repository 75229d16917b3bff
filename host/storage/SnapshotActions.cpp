/// The platform's actions on snapshots. Data is there before its row and goes after it; the LUN's lock is held
/// meanwhile.
#include "host/storage/SnapshotActions.h"

#include "host/core/LastError.h"
#include "host/state/Database.h"
#include "host/state/Fields.h"
#include "host/storage/DataFile.h"
#include "host/storage/LunActions.h"
#include "host/storage/LunChecks.h"
#include "host/storage/MapFile.h"
#include "host/storage/SnapshotFiles.h"
#include "host/storage/Sweep.h"
#include "host/storage/Transfers.h"
#include "host/storage/Versions.h"
#include "host/target/Exports.h"
#include "iscsihost/host.h"
#include "platform/error.h"
#include "platform/iscsi_snapshot.h"

#include <ctime>
#include <syslog.h>

using namespace norvhost;

namespace norvhost {

int loadCallersSnapshot(const _tag_iscsi_snapshot_ *snapshot, SnapshotRow &row)
{
    if (!snapshot)
        return fail(NORV_ERR_NULL_POINTER, "no snapshot record");
    if (int err = checkTerminated(*snapshot))
        return err;
    return loadSnapshotByUuid(snapshot->uuid, row);
}

int lockSnapshot(const _tag_iscsi_snapshot_ *snapshot, int action, SnapshotLock &lock, SnapshotRow &row)
{
    if (int err = loadCallersSnapshot(snapshot, row))
        return err;
    if (int err = lock.take(row.record.lid, row.record.snap_id, action))
        return err;
    const std::string uuid = row.record.uuid;
    return loadSnapshotByUuid(uuid, row);
}

int LockedSnapshot::take(const _tag_iscsi_snapshot_ *snapshot, int action)
{
    if (int err = loadCallersSnapshot(snapshot, row))
        return err;
    if (int err = lockLun(row.record.lid, action, lun_lock, lun))
        return err;
    return lockSnapshot(snapshot, action, lock, row);
}

} // namespace norvhost

namespace {

int checkSnapshotable(LunRow &lun, LunLock &lock)
{
    if (!isSparse(lun.record.type))
        return fail(NORV_ERR_LUN_TYPE, "a LUN of this kind has no snapshots: its space is its own");
    if (isInTrash(lun.record))
        return fail(NORV_ERR_LUN_NOT_LOADED, "the LUN lies in the trash");
    if (int err = checkData(lun.record))
        return err;
    return requireWhole(lun, lock);
}

/// What the caller may choose, and what follows from the LUN.
_tag_iscsi_snapshot_ newSnapshot(const _tag_iscsi_snapshot_ &wanted, const LunRow &lun)
{
    _tag_iscsi_snapshot_ made = {};
    copyText(made.name, wanted.name);
    copyText(made.desc, wanted.desc);
    copyText(made.taken_by, wanted.taken_by);
    made.flags = wanted.flags & NORV_SNAPSHOT_SCHEDULED;
    made.app_consistent = wanted.app_consistent != 0;
    made.user_locked = wanted.user_locked != 0;
    made.create_time = static_cast<int32_t>(time(nullptr));
    made.snap_time = wanted.snap_time ? wanted.snap_time : made.create_time;
    made.lid = lun.record.lid;
    made.total_size = lun.record.size;
    copyText(made.root_path, lun.record.location);
    copyText(made.uuid, newUuid());
    return made;
}

int checkNameFree(const _tag_iscsi_snapshot_ &snapshot)
{
    SnapshotRow other;
    const int err = loadSnapshotByName(snapshot.lid, snapshot.name, other);
    if (!err)
        return fail(NORV_ERR_SNAPSHOT_NAME, "another snapshot of the LUN is named '%s'", snapshot.name);
    return err == NORV_ERR_NO_SUCH_SNAPSHOT ? 0 : err;
}

int take(const LunRow &lun, SnapshotRow &snapshot, LunLock &lock)
{
    int err = createSnapshotData(lun, snapshot.record, lock);
    if (err == NORV_ERR_FILE_EXISTS) {
        // What lies there is a killed action's, or nobody's to remove.
        if ((err = sweepLun(lun.record.lid)))
            return err;
        err = createSnapshotData(lun, snapshot.record, lock);
    }
    if (err)
        return err;
    if ((err = insertSnapshot(snapshot)))
        dropSnapshotData(snapshot.record);
    return err;
}

/// A sink that holds another state in part has but this to go back to.
int refuseLastWholeState(const LockedSnapshot &locked)
{
    if (locked.lun.record.type != NORV_LUN_TYPE_SINK)
        return 0;
    Versions versions;
    if (int err = readVersions(dataPath(locked.lun.record), versions))
        return err == NORV_ERR_FILE_NOT_FOUND ? 0 : err;
    if (versions.current == versions.base || versions.base != locked.row.record.version)
        return 0;
    return fail(NORV_ERR_SNAPSHOT_LOCKED,
                "it is the last whole state of the LUN '%s', which has received the next one in part",
                locked.lun.record.name);
}

/// Renames the snapshot or moves it into or out of the trash.
int move(LockedSnapshot &locked, const SnapshotRow &wanted)
{
    if (int err = checkSnapshotData(locked.row.record))
        return err;
    if (int err = moveSnapshotData(locked.row.record, wanted.record, [&] { return updateSnapshot(wanted); }))
        return err;
    return locked.row.loaded_number ? syncLunExports(locked.lun.record.lid) : 0;
}

int moveForTrash(const _tag_iscsi_snapshot_ *snapshot, bool into_trash)
{
    LockedSnapshot locked;
    if (int err = locked.take(snapshot, NORV_LUN_MOVING))
        return err;
    if (isInTrash(locked.row.record) == into_trash)
        return 0;
    SnapshotRow wanted = locked.row;
    wanted.record.flags ^= NORV_SNAPSHOT_TRASH;
    wanted.loaded_number = 0; // nobody reads from the trash
    return move(locked, wanted);
}

/// Changes what a snapshot's row says beside its place.
int changeRow(const std::string &uuid, const std::function<int(SnapshotRow &)> &change)
{
    Transaction transaction;
    if (transaction.error())
        return transaction.error();
    SnapshotRow row;
    if (int err = loadSnapshotByUuid(uuid, row))
        return err;
    if (int err = change(row))
        return err;
    if (int err = updateSnapshot(row))
        return err;
    return transaction.commit();
}

int load(SnapshotRow &row)
{
    if (isInTrash(row.record))
        return fail(NORV_ERR_SNAPSHOT_NOT_LOADED, "the snapshot lies in the trash: load it with the trash flag");
    return row.loaded_number ? 0 : findFreeLoadedNumber(row.loaded_number);
}

int stopAction(const _tag_iscsi_snapshot_ &snapshot)
{
    constexpr int limit_seconds = 30;
    if (int err = requestSnapshotStop(snapshot.lid, snapshot.snap_id))
        return err;
    const int err = waitForSnapshotLock(snapshot.lid, snapshot.snap_id, limit_seconds);
    if (err == NORV_ERR_TIMEOUT)
        return fail(NORV_ERR_SNAPSHOT_LOCKED, "the action on the snapshot '%s' does not stop", snapshot.name);
    return err;
}

} // namespace

int NORViSCSISnapshotCreate(const _tag_iscsi_lun_ *lun, _tag_iscsi_snapshot_ *snapshot)
{
    if (!snapshot)
        return fail(NORV_ERR_NULL_POINTER, "no snapshot record");
    if (int err = checkTerminated(*snapshot))
        return err;
    LunLock lock;
    LunRow row;
    if (int err = lockLun(lun, NORV_LUN_SNAPSHOTTING, lock, row))
        return err;
    if (int err = checkSnapshotable(row, lock))
        return err;
    SnapshotRow made;
    made.record = newSnapshot(*snapshot, row);
    if (int err = checkSnapshotName(made.record))
        return err;
    if (int err = findFreeSnapshotId(row.record.lid, made.record.snap_id))
        return err;
    if (int err = checkNameFree(made.record))
        return err;
    if (int err = take(row, made, lock))
        return err;
    *snapshot = made.record;
    return 0;
}

int NORViSCSISnapshotDelete(const _tag_iscsi_snapshot_ *snapshot, const char *who)
{
    LockedSnapshot locked;
    if (int err = locked.take(snapshot, NORV_LUN_SNAPSHOT_DELETING))
        return err;
    const _tag_iscsi_snapshot_ &record = locked.row.record;
    if (int err = refuseLastWholeState(locked))
        return err;
    if (int err = checkRemovable(snapshotFolder(record)))
        return err;
    if (int err = removeSnapshot(record.uuid))
        return err;
    forgetTransfer({record.lid, record.snap_id});
    syslog(LOG_INFO, "snapshot '%s' of LUN '%s' deleted by '%.64s'", record.name, locked.lun.record.name,
           who ? who : "");
    if (locked.row.loaded_number && syncLunExports(record.lid) != 0)
        syslog(LOG_WARNING, "the deleted snapshot '%s' is still shown: %s", record.name, lastError());
    dropSnapshotData(record);
    return 0;
}

int NORViSCSISnapshotLoad(const _tag_iscsi_snapshot_ *snapshot)
{
    SnapshotRow row;
    if (int err = loadCallersSnapshot(snapshot, row))
        return err;
    // What computes the unsynchronised size reads the file where it lies, be it in the trash.
    if (snapshot->flags & NORV_SNAPSHOT_UNSYNC_SIZE)
        return checkSnapshotData(row.record);
    if (isInTrash(*snapshot))
        return moveForTrash(snapshot, false);
    if (int err = checkSnapshotData(row.record))
        return err;
    if (int err = changeRow(row.record.uuid, load))
        return err;
    return syncLunExports(row.record.lid);
}

int NORViSCSISnapshotUnload(const _tag_iscsi_snapshot_ *snapshot)
{
    SnapshotRow row;
    if (int err = loadCallersSnapshot(snapshot, row))
        return err;
    if (snapshot->flags & NORV_SNAPSHOT_UNSYNC_SIZE)
        return 0;
    if (int err = stopAction(row.record))
        return err;
    if (isInTrash(*snapshot))
        return moveForTrash(snapshot, true);
    if (int err = changeRow(row.record.uuid, [](SnapshotRow &changed) { return changed.loaded_number = 0; }))
        return err;
    return syncLunExports(row.record.lid);
}

namespace iscsihost {

int setSnapshotUserLock(const std::string &uuid, bool locked)
{
    return changeRow(uuid, [=](SnapshotRow &row) {
        row.record.user_locked = locked;
        return 0;
    });
}

int setSnapshotNote(const std::string &uuid, const std::string &note)
{
    return changeRow(uuid, [&](SnapshotRow &row) {
        if (note.size() >= sizeof row.record.desc || note.find('\0') != note.npos)
            return fail(NORV_ERR_SNAPSHOT_NOTE, "the note has %zu bytes, %zu are allowed", note.size(),
                        sizeof row.record.desc - 1);
        copyText(row.record.desc, note);
        return 0;
    });
}

int snapshotLunNumber(const std::string &uuid, int &number)
{
    SnapshotRow row;
    if (int err = loadSnapshotByUuid(uuid, row))
        return err;
    number = row.loaded_number;
    return 0;
}

int renameSnapshot(const std::string &uuid, const std::string &name)
{
    _tag_iscsi_snapshot_ named = {};
    copyText(named.uuid, uuid);
    LockedSnapshot locked;
    if (int err = locked.take(&named, NORV_LUN_PROCESSING))
        return err;
    SnapshotRow wanted = locked.row;
    copyText(wanted.record.name, name);
    if (name.size() >= sizeof wanted.record.name)
        return fail(NORV_ERR_SNAPSHOT_NAME, "the name has %zu bytes", name.size());
    if (int err = checkSnapshotName(wanted.record))
        return err;
    if (name == locked.row.record.name)
        return 0;
    if (int err = checkNameFree(wanted.record))
        return err;
    return move(locked, wanted);
}

} // namespace iscsihost
