#include "host/storage/LunActions.h"

#include "host/core/LastError.h"
#include "host/storage/DataFile.h"
#include "host/storage/LunChecks.h"
#include "host/storage/MapFile.h"
#include "host/storage/Restore.h"
#include "host/storage/Sweep.h"
#include "host/storage/Transfers.h"
#include "host/target/Exports.h"
#include "platform/error.h"

#include <bitset>
#include <cstdio>
#include <syslog.h>
#include <unistd.h>

namespace norvhost {
namespace {

int checkNameFree(const char *name)
{
    LunRow other;
    const int err = loadLunByName(name, other);
    if (!err)
        return fail(NORV_ERR_LUN_NAME_EXISTS, "another LUN is named '%s'", name);
    return err == NORV_ERR_NO_SUCH_LUN ? 0 : err;
}

/// Held while IDs are tried, and while a row is stored: an ID that another creator has just stored would be locked here
/// for a moment, and what its owner does next with the new LUN would be refused.
constexpr const char *id_lock = "lun-ids";

/// Finds a LUN ID that has neither row nor action, and locks it for the creation.
int reserveLunId(LunLock &lock, int action, int &lid)
{
    NamedLock alone;
    if (int err = alone.take(id_lock))
        return err;
    std::bitset<NORV_LUN_ID_MAX + 1> used;
    if (int err = forEachLun([&](const LunRow &row) { used.set(static_cast<size_t>(row.record.lid)); }))
        return err;
    for (lid = 1; lid <= NORV_LUN_ID_MAX; ++lid) {
        if (used.test(static_cast<size_t>(lid)))
            continue;
        const int err = lock.take(lid, action);
        if (err != NORV_ERR_LUN_LOCKED)
            return err;
    }
    return fail(NORV_ERR_MAX_LUNS, "there are %d LUNs, those being created included: more cannot be", NORV_LUN_ID_MAX);
}

int insertNewLun(const LunRow &row)
{
    NamedLock alone;
    if (int err = alone.take(id_lock))
        return err;
    return insertLun(row);
}

} // namespace

int lockLun(int lid, int action, LunLock &lock, LunRow &row)
{
    if (int err = lock.take(lid, action))
        return err;
    if (int err = loadLunByLid(lid, row))
        return err;
    // A failure here is no reason to refuse what can be done all the same.
    if (lock.foundUnfinished() && sweepLun(lid) != 0)
        syslog(LOG_WARNING, "left to the next sweep: %s", lastError());
    if (importHasProgressFile(lid) && sweepTransfers() != 0)
        syslog(LOG_WARNING, "left to the next sweep: %s", lastError());
    if (requireWhole(row, lock) != 0)
        syslog(LOG_ERR, "LUN %d: an interrupted restore is not completed yet: %s", lid, lastError());
    return 0;
}

int lockLun(const _tag_iscsi_lun_ *lun, int action, LunLock &lock, LunRow &row)
{
    if (!lun)
        return fail(NORV_ERR_NULL_POINTER, "no LUN record");
    if (int err = checkTerminated(*lun))
        return err;
    LunRow found;
    if (int err = loadLunByUuid(lun->uuid, found))
        return err;
    if (int err = lockLun(found.record.lid, action, lock, row))
        return err;
    if (int err = refuseOpenSink(row.record.lid))
        return err;
    // Between the two reads another LUN may have got the ID.
    return row.record.uuid == std::string_view(found.record.uuid) ? 0 : loadLunByUuid(lun->uuid, row);
}

int requireWhole(LunRow &row, LunLock &lock)
{
    return row.restoring_uuid.empty() ? 0 : completeRestore(row, lock);
}

int addLun(LunRow &row, int action, LunLock &lock, const std::function<int(const LunRow &)> &make_data)
{
    if (int err = checkNameFree(row.record.name))
        return err;
    if (int err = reserveLunId(lock, action, row.record.lid))
        return err;
    if (int err = sweepLun(row.record.lid))
        return err;
    snprintf(row.record.uuid, sizeof row.record.uuid, "%s", newUuid().c_str());
    if (int err = make_data(row))
        return err;
    if (int err = insertNewLun(row)) {
        if (!isBlock(row.record.type))
            unlink(dataPath(row.record).c_str());
        return err;
    }
    return 0;
}

} // namespace norvhost
