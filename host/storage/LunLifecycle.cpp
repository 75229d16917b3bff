/// The platform's actions on LUNs. Data changes first, then the row, then the running iSCSI service; a LUN's lock is
/// held from the first to the last.
#include "host/core/LastError.h"
#include "host/core/Lock.h"
#include "host/storage/DataFile.h"
#include "host/storage/LunChecks.h"
#include "host/storage/LunStore.h"
#include "host/storage/MapFile.h"
#include "host/storage/Sweep.h"
#include "host/target/Exports.h"
#include "platform/error.h"
#include "platform/iscsi_lun.h"

#include <bitset>
#include <cerrno>
#include <cstdio>
#include <unistd.h>

using namespace norvhost;

namespace {

/// Finds a LUN ID that has neither row nor action, and locks it for the creation.
int reserveLunId(LunLock &lock, int &lid)
{
    std::bitset<NORV_LUN_ID_MAX + 1> used;
    if (int err = forEachLun([&](const LunRow &row) { used.set(static_cast<size_t>(row.record.lid)); }))
        return err;
    for (lid = 1; lid <= NORV_LUN_ID_MAX; ++lid) {
        if (used.test(static_cast<size_t>(lid)))
            continue;
        const int err = lock.take(lid, NORV_LUN_CREATING);
        if (err == NORV_ERR_LUN_LOCKED)
            continue;
        if (err)
            return err;
        // Another creator may have come and gone since the rows were read.
        LunRow row;
        const int missing = loadLunByLid(lid, row);
        if (missing == NORV_ERR_NO_SUCH_LUN)
            return 0;
        lock.release();
        if (missing)
            return missing;
    }
    return fail(NORV_ERR_MAX_LUNS, "there are %d LUNs, those being created included: more cannot be", NORV_LUN_ID_MAX);
}

/// Locks the caller's LUN, then reads its row: what the caller's record says may be old.
int lockLun(const _tag_iscsi_lun_ *lun, int action, LunLock &lock, LunRow &row)
{
    if (!lun)
        return fail(NORV_ERR_NULL_POINTER, "no LUN record");
    if (int err = checkTerminated(*lun))
        return err;
    if (int err = loadLunByUuid(lun->uuid, row))
        return err;
    if (int err = lock.take(row.record.lid, action))
        return err;
    return loadLunByUuid(lun->uuid, row);
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
    bool name_taken;
    if (int err = NORViSCSILunIsNameExist(row.record.name, &name_taken))
        return err;
    if (name_taken)
        return fail(NORV_ERR_LUN_NAME_EXISTS, "another LUN is named '%s'", row.record.name);

    LunLock lock;
    if (int err = reserveLunId(lock, row.record.lid))
        return err;
    if (int err = sweepLun(row.record.lid))
        return err;
    snprintf(row.record.uuid, sizeof row.record.uuid, "%s", newUuid().c_str());
    if (!isBlock(row.record.type))
        if (int err = createDataFile(row.record, lock))
            return err;
    if (int err = insertLun(row)) {
        if (!isBlock(row.record.type))
            unlink(dataPath(row.record).c_str());
        return err;
    }
    *lun = row.record;
    return 0;
}

int NORViSCSILunDelete(_tag_iscsi_lun_ *lun)
{
    LunLock lock;
    LunRow row;
    if (int err = lockLun(lun, NORV_LUN_DELETING, lock, row))
        return err;
    const std::string folder = mapFileFolder(row.record);
    if (!isBlock(row.record.type) && access(folder.c_str(), W_OK) != 0 && errno != ENOENT)
        return failErrno(NORV_ERR_NO_PERMISSION, errno, "cannot remove files from %s", folder.c_str());
    if (int err = removeLun(row.record.lid))
        return err;
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
    if (wanted.record.size == current.record.size) {
        if (int err = apply())
            return err;
    } else {
        lock.become(NORV_LUN_EXPANDING);
        if (int err = resizeLunExports(current.record.lid, apply))
            return err;
    }
    return wanted.record.name == std::string_view(current.record.name) ? 0 : syncLunExports(current.record.lid);
}

int NORViSCSILunLoad(_tag_iscsi_lun_ *lun)
{
    return setLoaded(lun, true);
}

int NORViSCSILunUnload(_tag_iscsi_lun_ *lun)
{
    return setLoaded(lun, false);
}
