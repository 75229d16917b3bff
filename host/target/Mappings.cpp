/// The platform's mapping of LUNs to targets.
#include "host/core/LastError.h"
#include "host/core/Lock.h"
#include "host/storage/LunStore.h"
#include "host/storage/MapFile.h"
#include "host/target/Change.h"
#include "host/target/TargetStore.h"
#include "platform/error.h"
#include "platform/iscsi_lun.h"

#include <algorithm>
#include <cerrno>
#include <unistd.h>

using namespace norvhost;

namespace {

int checkTargetIds(const int *target_ids, int count)
{
    if (!target_ids || count < 1)
        return fail(NORV_ERR_TARGET_ID, "no target is named");
    for (int i = 0; i < count; ++i)
        if (target_ids[i] < 1 || target_ids[i] > NORV_TARGET_ID_MAX)
            return fail(NORV_ERR_TARGET_ID, "target ID: %d is not within 1 to %d", target_ids[i], NORV_TARGET_ID_MAX);
    return 0;
}

int checkMappable(int lid)
{
    LunRow row;
    if (int err = loadLunByLid(lid, row))
        return err;
    if (isInTrash(row.record))
        return fail(NORV_ERR_LUN_NOT_LOADED, "the LUN '%s' lies in the trash", row.record.name);
    bool locked;
    if (int err = lunLockHeld(lid, locked))
        return err;
    if (locked)
        return fail(NORV_ERR_LUN_LOCKED, "another action is working on the LUN '%s'", row.record.name);
    const std::string path = dataPath(row.record);
    if (access(path.c_str(), R_OK) != 0)
        return failErrno(NORV_ERR_FILE_NOT_FOUND, errno, "the data of the LUN '%s' cannot be read: %s", row.record.name,
                         path.c_str());
    return 0;
}

} // namespace

/// A target to which the LUN is mapped already keeps its mapping.
int NORViSCSILunMappingsAdd(const int target_ids[], int lid, int count)
{
    if (int err = checkTargetIds(target_ids, count))
        return err;
    return changeTargets([&](std::vector<int> &tids) {
        if (int err = checkMappable(lid))
            return err;
        std::vector<Mapping> present;
        if (int err = loadMappingsOfLun(lid, present))
            return err;
        for (int i = 0; i < count; ++i) {
            const int tid = target_ids[i];
            _tag_iscsi_target_ target;
            if (int err = loadTarget(tid, target))
                return err;
            if (std::find(tids.begin(), tids.end(), tid) != tids.end() ||
                std::any_of(present.begin(), present.end(), [=](const Mapping &m) { return m.tid == tid; }))
                continue;
            if (int err = insertMapping(tid, lid))
                return err;
            tids.push_back(tid);
        }
        return 0;
    });
}

int NORViSCSILunMappingsRemove(const int target_ids[], int lid, int count)
{
    if (int err = checkTargetIds(target_ids, count))
        return err;
    return changeTargets([&](std::vector<int> &tids) {
        LunRow row;
        if (int err = loadLunByLid(lid, row))
            return err;
        for (int i = 0; i < count; ++i) {
            if (std::find(tids.begin(), tids.end(), target_ids[i]) != tids.end())
                continue;
            if (int err = deleteMapping(target_ids[i], lid))
                return err;
            tids.push_back(target_ids[i]);
        }
        return 0;
    });
}
