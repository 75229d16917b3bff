/// The platform's actions on LUNs. Data changes first, then the row, then the running iSCSI service; a LUN's lock is
/// held from the first to the last.
#include "host/core/LastError.h"
#include "host/core/Lock.h"
#include "host/storage/DataFile.h"
#include "host/storage/LunActions.h"
#include "host/storage/LunChecks.h"
#include "host/storage/LunStore.h"
#include "host/storage/MapFile.h"
#include "host/storage/SnapshotFiles.h"
#include "host/storage/SnapshotStore.h"
#include "host/storage/Sweep.h"
#include "host/storage/Transfers.h"
#include "host/target/Exports.h"
#include "platform/error.h"
#include "platform/iscsi_lun.h"

#include <cstdio>
#include <vector>

using namespace norvhost;

namespace {

/// Locks every snapshot of a LUN that is to go.
int lockSnapshots(int lid, std::vector<SnapshotRow> &snapshots, std::vector<SnapshotLock> &locks)
{
    if (int err = loadSnapshotsOfLun(lid, snapshots))
        return err;
    for (const SnapshotRow &snapshot : snapshots)
        if (int err = locks.emplace_back().take(lid, snapshot.record.snap_id, NORV_LUN_DELETING))
            return err;
    return 0;
}

/// Moves the LUN into or out of the trash, when it is not there already, and stores its loaded mark.
int storePlace(const LunRow &row, bool loaded, bool trash)
{
    LunRow changed = row;
    changed.loaded = loaded;
    if (trash)
        changed.record.options |= NORV_LUN_OPTION_TRASH;
    else
        changed.record.options &= ~static_cast<uint32_t>(NORV_LUN_OPTION_TRASH);
    const auto store = [&] { return updateLun(changed); };
    if (isInTrash(row.record) == trash)
        return store();
    if (isBlock(row.record.type))
        return fail(NORV_ERR_LUN_TYPE, "a block device cannot be moved to the trash");
    return moveDataFile(row.record, changed.record, store);
}

int setLoaded(const _tag_iscsi_lun_ *lun, bool loaded)
{
    const bool moves = lun && isInTrash(*lun);
    LunLock lock;
    LunRow row;
    if (int err = lockLun(lun, moves ? NORV_LUN_MOVING : NORV_LUN_PROCESSING, lock, row))
        return err;
    if (int err = sweepLun(row.record.lid))
        return err;
    if (loaded && isInTrash(row.record) && !moves)
        return fail(NORV_ERR_LUN_NOT_LOADED, "the LUN lies in the trash: load it with the trash option");
    if (loaded || moves)
        if (int err = checkData(row.record))
            return err;
    // Without the option the LUN stays where it is.
    const bool trash = moves ? !loaded : isInTrash(row.record);
    if (int err = storePlace(row, loaded, trash))
        return err;
    return syncLunExports(row.record.lid);
}

/// The data and row side of an update.
int applyUpdate(const LunRow &current, const LunRow &wanted, LunLock &lock)
{
    const bool grows = wanted.record.size > current.record.size;
    if (grows)
        if (int err = growDataFile(current.record, wanted.record.size, lock))
            return err;
    const auto store = [&] { return updateLun(wanted); };
    const bool renames = dataPath(current.record) != dataPath(wanted.record);
    const int err = renames ? moveDataFile(current.record, wanted.record, store) : store();
    if (err && grows)
        undoGrowth(current.record);
    return err;
}

int checkUpdate(const LunRow &current, const LunRow &wanted)
{
    if (isBlock(current.record.type))
        return fail(NORV_ERR_LUN_TYPE, "a BLOCK LUN takes its size from its device and is not updated");
    if (wanted.record.size < current.record.size)
        return fail(NORV_ERR_LUN_SIZE, "a LUN cannot shrink: it has %llu bytes",
                    static_cast<unsigned long long>(current.record.size));
    if (wanted.record.size != current.record.size)
        if (int err = checkLunSize(wanted.record.size))
            return err;
    if (wanted.record.name != std::string_view(current.record.name)) {
        if (int err = checkLunName(wanted.record.name))
            return err;
        LunRow other;
        const int err = loadLunByName(wanted.record.name, other);
        if (!err)
            return fail(NORV_ERR_LUN_NAME_EXISTS, "another LUN is named '%s'", wanted.record.name);
        if (err != NORV_ERR_NO_SUCH_LUN)
            return err;
    }
    if (int err = checkMapFileLength(wanted.record))
        return err;
    return checkData(current.record);
}

} // namespace

int NORViSCSILunCreate(_tag_iscsi_lun_ *lun)
{
    if (!lun)
        return fail(NORV_ERR_NULL_POINTER, "no LUN record");
    LunRow row;
    row.record = *lun;
    row.record.options = 0;
    row.record.restored_time = 0;
    if (int err = checkNewLun(row.record))
        return err;
    LunLock lock;
    const auto make_data = [&](const LunRow &made) {
        return isBlock(made.record.type) ? 0 : createDataFile(made.record, lock);
    };
    if (int err = addLun(row, NORV_LUN_CREATING, lock, make_data))
        return err;
    *lun = row.record;
    return 0;
}

int NORViSCSILunDelete(_tag_iscsi_lun_ *lun)
{
    LunLock lock;
    LunRow row;
    if (int err = lockLun(lun, NORV_LUN_DELETING, lock, row))
        return err;
    if (!isBlock(row.record.type))
        if (int err = checkRemovable(dataPath(row.record)))
            return err;
    std::vector<SnapshotRow> snapshots;
    std::vector<SnapshotLock> locks;
    if (int err = lockSnapshots(row.record.lid, snapshots, locks))
        return err;
    if (int err = removeLun(row.record.lid))
        return err;
    forgetTransfer({row.record.lid, 0});
    for (const SnapshotRow &snapshot : snapshots) {
        forgetTransfer({row.record.lid, snapshot.record.snap_id});
        dropSnapshotData(snapshot.record);
    }
    if (!isBlock(row.record.type))
        dropDataFile(dataPath(row.record));
    return 0;
}

int NORViSCSILunUpdate(_tag_iscsi_lun_ *lun)
{
    LunLock lock;
    LunRow current;
    if (int err = lockLun(lun, NORV_LUN_PROCESSING, lock, current))
        return err;
    if (int err = sweepLun(current.record.lid))
        return err;
    LunRow wanted = current;
    snprintf(wanted.record.name, sizeof wanted.record.name, "%s", lun->name);
    wanted.record.size = lun->size;
    if (int err = checkUpdate(current, wanted))
        return err;

    const auto apply = [&] { return applyUpdate(current, wanted, lock); };
    const bool grows = wanted.record.size != current.record.size;
    if (!grows) {
        if (int err = apply())
            return err;
    } else {
        lock.become(NORV_LUN_EXPANDING);
        if (int err = resizeLunExports(current.record.lid, apply))
            return err;
    }
    if (grows && wanted.record.name == std::string_view(current.record.name))
        return 0;
    // With nothing to change, too: the same update may have been killed when it had stored the row.
    return syncLunExports(current.record.lid);
}

int NORViSCSILunLoad(_tag_iscsi_lun_ *lun)
{
    return setLoaded(lun, true);
}

int NORViSCSILunUnload(_tag_iscsi_lun_ *lun)
{
    return setLoaded(lun, false);
}
