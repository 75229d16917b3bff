/// The platform's questions about snapshots, their locks, and waiting.
#include "host/core/LastError.h"
#include "host/core/Lock.h"
#include "host/state/Fields.h"
#include "host/storage/LunChecks.h"
#include "host/storage/LunStore.h"
#include "host/storage/SnapshotActions.h"
#include "host/storage/SnapshotFiles.h"
#include "host/storage/SnapshotStore.h"
#include "platform/error.h"
#include "platform/iscsi_snapshot.h"

#include <algorithm>
#include <cstdlib>
#include <cstring>

using namespace norvhost;

namespace {

int missingArgument(const char *function)
{
    return fail(NORV_ERR_NULL_POINTER, "%s: an argument is missing", function);
}

void setStatus(_tag_iscsi_snapshot_ &snapshot)
{
    bool healthy = checkSnapshotData(snapshot) == 0;
    if (!healthy) // what an action is just moving or removing is not missing
        snapshotLockHeld(snapshot.lid, snapshot.snap_id, healthy);
    copyText(snapshot.status, healthy ? "Healthy" : "Unhealthy");
}

int answer(int err, const SnapshotRow &row, _tag_iscsi_snapshot_ *snapshot)
{
    if (err)
        return err;
    *snapshot = row.record;
    setStatus(*snapshot);
    return 0;
}

int append(const SnapshotRow &row, _tag_iscsi_snapshot_list_ &list)
{
    auto *snapshot = static_cast<_tag_iscsi_snapshot_ *>(malloc(sizeof(_tag_iscsi_snapshot_)));
    if (!snapshot)
        return fail(NORV_ERR_OUT_OF_MEMORY, "no memory for the snapshot records");
    *snapshot = row.record;
    setStatus(*snapshot);
    snapshot->previous = list.last;
    (list.last ? list.last->next : list.first) = snapshot;
    list.last = snapshot;
    ++list.count;
    return 0;
}

/// The longest beginning of the text that has at most `room` bytes and ends between two characters.
std::string cutText(const std::string &text, size_t room)
{
    size_t end = std::min(text.size(), room);
    while (end > 0 && end < text.size() && (static_cast<unsigned char>(text[end]) & 0xc0) == 0x80)
        --end;
    return text.substr(0, end);
}

int checkAppKey(const char *key)
{
    constexpr size_t longest_key = 127;
    const size_t length = strlen(key);
    if (length == 0 || length > longest_key)
        return fail(NORV_ERR_APP_KEY, "an application key has 1 to %zu bytes, not %zu", longest_key, length);
    if (std::any_of(key, key + length, [](unsigned char c) { return c < ' ' || c == 0x7f; }))
        return fail(NORV_ERR_APP_KEY, "the application key holds control characters");
    return 0;
}

int changeAppKey(const _tag_iscsi_snapshot_ *snapshot, const char *key,
                 int (*change)(std::string_view, std::string_view))
{
    if (!key)
        return fail(NORV_ERR_NULL_POINTER, "no application key");
    if (int err = checkAppKey(key))
        return err;
    SnapshotRow row;
    if (int err = loadCallersSnapshot(snapshot, row))
        return err;
    return change(row.record.uuid, key);
}

} // namespace

int NORViSCSISnapshotConfGetByUUID(const char *uuid, _tag_iscsi_snapshot_ *snapshot)
{
    if (!uuid || !snapshot)
        return missingArgument(__func__);
    SnapshotRow row;
    return answer(loadSnapshotByUuid(uuid, row), row, snapshot);
}

int NORViSCSISnapshotConfGetByLIDAndName(int lid, const char *name, _tag_iscsi_snapshot_ *snapshot)
{
    if (!name || !snapshot)
        return missingArgument(__func__);
    SnapshotRow row;
    return answer(loadSnapshotByName(lid, name, row), row, snapshot);
}

int NORViSCSISnapshotConfLoad(const _tag_iscsi_snapshot_query_ *query, _tag_iscsi_snapshot_list_ *list)
{
    if (!query || !list)
        return missingArgument(__func__);
    const bool of_lun = query->query_flags & NORV_SNAPSHOT_QUERY_LID;
    const bool since = query->query_flags & NORV_SNAPSHOT_QUERY_TIME;
    if (of_lun && (query->query_lid < 1 || query->query_lid > NORV_LUN_ID_MAX))
        return fail(NORV_ERR_LUN_ID, "the LUN ID %d is not within 1 to %d", query->query_lid, NORV_LUN_ID_MAX);
    return forEachSnapshot(of_lun ? query->query_lid : 0, since ? query->query_time : INT64_MIN,
                           [&](const SnapshotRow &row) { return append(row, *list); });
}

int NORViSCSIIsSnapshotLocked(const _tag_iscsi_snapshot_ *snapshot, bool *locked)
{
    if (!snapshot || !locked)
        return missingArgument(__func__);
    return snapshotLockHeld(snapshot->lid, snapshot->snap_id, *locked);
}

int NORViSCSISnapshotLockedAppKeysGet(const _tag_iscsi_snapshot_ *snapshot, NLIBC_SZ_LIST *keys)
{
    if (!keys)
        return missingArgument(__func__);
    SnapshotRow row;
    if (int err = loadCallersSnapshot(snapshot, row))
        return err;
    std::vector<std::string> found;
    if (int err = loadAppKeys(row.record.uuid, found))
        return err;
    for (const std::string &key : found)
        if (NLIBCSzListPush(keys, key.c_str()) < 0)
            return fail(NORV_ERR_OUT_OF_MEMORY, "no memory for the application keys");
    return 0;
}

int NORViSCSISnapshotLockByAppKey(const _tag_iscsi_snapshot_ *snapshot, const char *key)
{
    return changeAppKey(snapshot, key, addAppKey);
}

int NORViSCSISnapshotUnlockByAppKey(const _tag_iscsi_snapshot_ *snapshot, const char *key)
{
    return changeAppKey(snapshot, key, removeAppKey);
}

/// The peer's name for a state that arrived from it, else "<LUN name>-<number>".
int NORViSCSIUnusedSnapshotNameFind(int lid, char *name, int size)
{
    if (!name)
        return missingArgument(__func__);
    LunRow lun;
    if (int err = loadLunByLid(lid, lun))
        return err;
    constexpr size_t number_room = 4; // "-512": no more numbers are tried than twice the snapshots there can be
    const size_t room = std::min(snapshotNameRoom(lun.record.location), static_cast<size_t>(std::max(size, 1)) - 1);
    if (room <= number_room)
        return fail(NORV_ERR_SNAPSHOT_NAME, "there is no room for a snapshot's name");
    std::vector<SnapshotRow> taken;
    if (int err = loadSnapshotsOfLun(lid, taken))
        return err;
    const auto is_free = [&](const std::string &candidate) {
        return std::none_of(taken.begin(), taken.end(),
                            [&](const SnapshotRow &row) { return candidate == row.record.name; });
    };
    const auto choose = [name](const std::string &chosen) {
        memcpy(name, chosen.c_str(), chosen.size() + 1);
        return 0;
    };
    std::string arrived;
    if (int err = loadArrivedName(lun.record.uuid, arrived))
        return err;
    if (!arrived.empty() && arrived.size() <= room && is_free(arrived))
        return choose(arrived);
    const std::string begin = cutText(lun.record.name, room - number_room);
    // A deleted snapshot's name comes back as late as can be.
    for (size_t number = taken.size() + 1;; ++number) {
        const std::string candidate = begin + "-" + std::to_string(number);
        if (is_free(candidate))
            return choose(candidate);
    }
}

int NORViSCSILunWaitUntilUnlock(const _tag_iscsi_lun_ *lun, int limit)
{
    if (!lun)
        return missingArgument(__func__);
    return waitForLunLock(lun->lid, limit);
}

int NORViSCSISnapshotWaitUntilUnlock(const _tag_iscsi_snapshot_ *snapshot, int limit)
{
    if (!snapshot)
        return missingArgument(__func__);
    return waitForSnapshotLock(snapshot->lid, snapshot->snap_id, limit);
}
