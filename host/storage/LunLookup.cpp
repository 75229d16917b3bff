/// The platform's questions about LUNs.
#include "host/core/LastError.h"
#include "host/core/Lock.h"
#include "host/storage/DataFile.h"
#include "host/storage/LunStore.h"
#include "host/storage/Restore.h"
#include "host/storage/SnapshotFiles.h"
#include "host/storage/SnapshotStore.h"
#include "platform/error.h"
#include "platform/iscsi_lun.h"

#include <cstdio>
#include <cstdlib>
#include <memory>
#include <sys/mman.h>

using namespace norvhost;

namespace {

int missingArgument(const char *function)
{
    return fail(NORV_ERR_NULL_POINTER, "%s: an argument is missing", function);
}

/// Whoever asks for a LUN goes on to use it: what a killed restore left is put right first.
int answer(int err, LunRow &row, _tag_iscsi_lun_ *lun)
{
    if (err)
        return err;
    mendRestore(row);
    *lun = row.record;
    return 0;
}

bool isHealthy(const LunRow &row)
{
    const auto check = [](const SnapshotRow &snapshot) { return checkSnapshotData(snapshot.record); };
    return checkData(row.record) == 0 && forEachSnapshot(row.record.lid, INT64_MIN, check) == 0;
}

} // namespace

int NORViSCSILunConfigGetByUUID(const char *uuid, _tag_iscsi_lun_ *lun, int)
{
    if (!uuid || !lun)
        return missingArgument(__func__);
    LunRow row;
    return answer(loadLunByUuid(uuid, row), row, lun);
}

int NORViSCSILunConfigGetAll(_tag_iscsi_lun_ **luns, size_t *count)
{
    if (!luns || !count)
        return missingArgument(__func__);
    // Room for all there can be; what is not written costs nothing. In huge pages where the system has them: faults on
    // a thousand small ones take an eighth of a full listing's time.
    constexpr size_t huge_page = 2 << 20;
    constexpr size_t room = (NORV_LUN_ID_MAX * sizeof(_tag_iscsi_lun_) + huge_page - 1) / huge_page * huge_page;
    std::unique_ptr<_tag_iscsi_lun_, decltype(&free)> all(
        static_cast<_tag_iscsi_lun_ *>(aligned_alloc(huge_page, room)), free);
    if (!all)
        return fail(NORV_ERR_OUT_OF_MEMORY, "no memory for the LUN records");
    madvise(all.get(), room, MADV_HUGEPAGE);
    size_t found = 0;
    if (int err = mendRestores())
        return err;
    if (int err = forEachLun([&](const LunRow &row) { all.get()[found++] = row.record; }))
        return err;
    *luns = found ? all.release() : nullptr;
    *count = found;
    return 0;
}

int NORViSCSILunGetByLunId(int lid, _tag_iscsi_lun_ *lun)
{
    if (!lun)
        return missingArgument(__func__);
    LunRow row;
    return answer(loadLunByLid(lid, row), row, lun);
}

int NORViSCSILunGetByLunName(const char *name, _tag_iscsi_lun_ *lun)
{
    if (!name || !lun)
        return missingArgument(__func__);
    LunRow row;
    return answer(loadLunByName(name, row), row, lun);
}

int NORViSCSILunIsNameExist(const char *name, bool *exists)
{
    if (!name || !exists)
        return missingArgument(__func__);
    LunRow row;
    const int err = loadLunByName(name, row);
    if (err && err != NORV_ERR_NO_SUCH_LUN)
        return err;
    *exists = !err;
    return 0;
}

int NORViSCSILunIsLocked(const _tag_iscsi_lun_ *lun, bool *locked)
{
    if (!lun || !locked)
        return missingArgument(__func__);
    return lunLockHeld(lun->lid, *locked);
}

int NORViSCSILunProgressGet(const _tag_iscsi_lun_ *lun, _tag_iscsi_lun_progress_ *progress)
{
    if (!lun || !progress)
        return missingArgument(__func__);
    LunAction action;
    if (int err = lunLockAction(lun->lid, action))
        return err;
    progress->st = action.state;
    progress->percent = action.percent;
    return 0;
}

int NORViSCSIFamilyConfGetByLID(int lid, _tag_iscsi_family_ *family)
{
    if (!family)
        return missingArgument(__func__);
    LunRow row;
    const int err = loadLunByLid(lid, row);
    if (err == NORV_ERR_NO_SUCH_LUN)
        return fail(NORV_ERR_NO_SUCH_FAMILY, "there is no LUN %d", lid);
    if (err)
        return err;
    // What an action is just moving or removing is not missing; has it ended, all is where the row says now.
    bool healthy = isHealthy(row), busy = false;
    if (!healthy && lunLockHeld(lid, busy) == 0 && !busy)
        healthy = loadLunByLid(lid, row) != 0 || isHealthy(row);
    *family = _tag_iscsi_family_();
    family->lid = lid;
    snprintf(family->status, sizeof family->status, "%s", healthy || busy ? "Healthy" : "Unhealthy");
    return 0;
}
