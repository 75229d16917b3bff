// Snapshots, and the actions that start from them, on the fake's model. Every action is over when its
// call returns; a test that wants one to run sets the locks itself.
#include "platform/error.h"
#include "platform/iscsi_snapshot.h"
#include "tests/fake/Script.h"

#include <poll.h>

#include <cstdio>
#include <cstdlib>

using namespace fake;

namespace {

Snapshot *byUUID(const char *uuid)
{
    return firstOf(model().snapshots, [&](const auto &record) { return strcmp(record.uuid, uuid) == 0; });
}

Snapshot *byName(int lid, const char *name)
{
    return firstOf(model().snapshots,
                   [&](const auto &record) { return record.lid == lid && strcmp(record.name, name) == 0; });
}

bool isAsked(const _tag_iscsi_snapshot_query_ &query, const _tag_iscsi_snapshot_ &record)
{
    return (!(query.query_flags & NORV_SNAPSHOT_QUERY_LID) || record.lid == query.query_lid) &&
           (!(query.query_flags & NORV_SNAPSHOT_QUERY_TIME) || record.snap_time >= query.query_time);
}

int freeNumber(int lid)
{
    int number = 1;
    while (model().snapshots.count({lid, number}) != 0)
        ++number;
    return number;
}

int setLoaded(const char *name, const _tag_iscsi_snapshot_ &record, bool is_loaded)
{
    Snapshot *snapshot = byUUID(record.uuid);
    if (auto failure = calledOn(snapshot, name, record.uuid, record.flags))
        return *failure;
    const uint32_t trash = record.flags & NORV_SNAPSHOT_TRASH;
    if (is_loaded && !trash && snapshot->record.flags & NORV_SNAPSHOT_TRASH)
        return NORV_ERR_SNAPSHOT_NOT_LOADED;
    snapshot->record.flags = is_loaded ? snapshot->record.flags & ~trash : snapshot->record.flags | trash;
    if (!is_loaded)
        snapshot->is_locked = false;
    return 0;
}

/// Waits for an object's lock.
template <class Object>
int waitFor(const Object *object, const char *name, const char *uuid, int limit)
{
    if (auto failure = calledOn(object, name, uuid, limit))
        return *failure;
    constexpr int PATIENCE = 10000;
    pollfd held{model().held_by, POLLIN, 0}; // poll() passes over a descriptor of -1
    if (model().held_by >= 0 && poll(&held, 1, PATIENCE) != 1)
        return NORV_ERR_TIMEOUT;
    return object->is_locked ? NORV_ERR_TIMEOUT : 0;
}

} // namespace

int NORViSCSISnapshotConfGetByUUID(const char *uuid, _tag_iscsi_snapshot_ *snapshot)
{
    return answerRecord(byUUID(uuid), snapshot, __func__, uuid);
}

int NORViSCSISnapshotConfGetByLIDAndName(int lid, const char *name, _tag_iscsi_snapshot_ *snapshot)
{
    return answerRecord(byName(lid, name), snapshot, __func__, lid, name);
}

int NORViSCSISnapshotConfLoad(const _tag_iscsi_snapshot_query_ *query, _tag_iscsi_snapshot_list_ *list)
{
    const auto failure = called(__func__, query->query_flags, query->query_lid, query->query_time);
    for (const auto &[key, snapshot] : model().snapshots) {
        if (!isAsked(*query, snapshot.record))
            continue;
        auto *record = noted(static_cast<_tag_iscsi_snapshot_ *>(malloc(sizeof(_tag_iscsi_snapshot_))));
        *record = snapshot.record;
        record->previous = list->last;
        record->next = nullptr;
        (list->last ? list->last->next : list->first) = record;
        list->last = record;
        ++list->count;
        if (failure)
            break; // part of an answer is the caller's to free too
    }
    return failure.value_or(0);
}

int NORViSCSIIsSnapshotLocked(const _tag_iscsi_snapshot_ *snapshot, bool *locked)
{
    const Snapshot *known = byUUID(snapshot->uuid);
    NOTE_CALL_ON(known, snapshot->uuid);
    *locked = answerOf(__func__, known->is_locked) != 0;
    return 0;
}

int NORViSCSISnapshotLockedAppKeysGet(const _tag_iscsi_snapshot_ *snapshot, NLIBC_SZ_LIST *keys)
{
    const Snapshot *known = byUUID(snapshot->uuid);
    NOTE_CALL_ON(known, snapshot->uuid);
    for (const auto &key : known->app_keys)
        pushText(*keys, key);
    return 0;
}

int NORViSCSISnapshotLockByAppKey(const _tag_iscsi_snapshot_ *snapshot, const char *key)
{
    Snapshot *known = byUUID(snapshot->uuid);
    NOTE_CALL_ON(known, snapshot->uuid, key);
    if (*key == '\0')
        return NORV_ERR_APP_KEY;
    known->app_keys.insert(key);
    return 0;
}

int NORViSCSISnapshotUnlockByAppKey(const _tag_iscsi_snapshot_ *snapshot, const char *key)
{
    Snapshot *known = byUUID(snapshot->uuid);
    NOTE_CALL_ON(known, snapshot->uuid, key);
    known->app_keys.erase(key);
    return 0;
}

int NORViSCSIUnusedSnapshotNameFind(int lid, char *name, int size)
{
    NOTE_CALL(lid, size);
    int number = 1;
    do
        snprintf(name, static_cast<size_t>(size), "auto-%d", number++);
    while (byName(lid, name));
    return 0;
}

int NORViSCSISnapshotCreate(const _tag_iscsi_lun_ *lun, _tag_iscsi_snapshot_ *snapshot)
{
    NOTE_CALL(lun->uuid, snapshot->name, snapshot->desc, snapshot->taken_by, snapshot->snap_time, snapshot->flags,
              int(snapshot->app_consistent), int(snapshot->user_locked));
    const LUN *known = findLUN(lun->uuid);
    if (!known)
        return NORV_ERR_NO_SUCH_LUN;
    const int lid = known->record.lid;
    if (known->record.type == NORV_LUN_TYPE_BLOCK || known->record.type == NORV_LUN_TYPE_FILE)
        return NORV_ERR_LUN_TYPE;
    if (known->record.options & NORV_LUN_OPTION_TRASH)
        return NORV_ERR_LUN_NOT_LOADED;
    if (!isName(snapshot->name, sizeof(snapshot->name) - 1) || byName(lid, snapshot->name))
        return NORV_ERR_SNAPSHOT_NAME;
    const int number = freeNumber(lid);
    snapshot->snap_id = number;
    makeUUID(snapshot->uuid);
    makeUUID(snapshot->version);
    Snapshot &taken = model().snapshots[{lid, number}];
    taken.record = *snapshot;
    taken.record.lid = lid;
    taken.record.total_size = known->record.size;
    put(taken.record.status, "Healthy");
    put(taken.record.root_path, textOf(known->record.location));
    return 0;
}

int NORViSCSISnapshotDelete(const _tag_iscsi_snapshot_ *snapshot, const char *who)
{
    const Snapshot *known = byUUID(snapshot->uuid);
    NOTE_CALL_ON(known, snapshot->uuid, who);
    if (known->record.user_locked)
        return NORV_ERR_SNAPSHOT_USER_LOCKED;
    if (known->is_locked || !known->app_keys.empty())
        return NORV_ERR_SNAPSHOT_LOCKED;
    model().snapshots.erase({known->record.lid, known->record.snap_id});
    return 0;
}

int NORViSCSISnapshotRestore(const _tag_iscsi_snapshot_ *snapshot, const _tag_iscsi_lun_ *lun)
{
    NOTE_CALL(snapshot->uuid, lun->uuid);
    const Snapshot *known = byUUID(snapshot->uuid);
    LUN *restored = findLUN(lun->uuid);
    if (!known || !restored || known->record.lid != restored->record.lid)
        return NORV_ERR_NO_SUCH_SNAPSHOT;
    restored->record.restored_time = 1700000000;
    return 0;
}

int NORViSCSISnapshotLoad(const _tag_iscsi_snapshot_ *snapshot)
{
    return setLoaded(__func__, *snapshot, true);
}

int NORViSCSISnapshotUnload(const _tag_iscsi_snapshot_ *snapshot)
{
    return setLoaded(__func__, *snapshot, false);
}

int NORViSCSISnapshotClone(const _tag_iscsi_snapshot_ *snapshot, _tag_iscsi_lun_ *clone)
{
    const Snapshot *known = byUUID(snapshot->uuid);
    NOTE_CALL_ON(known, snapshot->uuid, clone->name, clone->type, clone->location, clone->extent_size);
    clone->size = known->record.total_size;
    return createLUN(*clone);
}

int NORViSCSILunClone(const _tag_iscsi_lun_ *source, _tag_iscsi_lun_ *clone)
{
    const LUN *known = findLUN(source->uuid);
    NOTE_CALL_ON(known, source->uuid, clone->name, clone->type, clone->location, clone->extent_size);
    clone->size = known->record.size;
    return createLUN(*clone);
}

int NORViSCSILunWaitUntilUnlock(const _tag_iscsi_lun_ *lun, int limit)
{
    return waitFor(findLUN(lun->uuid), __func__, lun->uuid, limit);
}

int NORViSCSISnapshotWaitUntilUnlock(const _tag_iscsi_snapshot_ *snapshot, int limit)
{
    return waitFor(byUUID(snapshot->uuid), __func__, snapshot->uuid, limit);
}

int NORViSCSISnapshotExport(const _tag_iscsi_snapshot_ *snapshot, const char *destination)
{
    const Snapshot *known = byUUID(snapshot->uuid);
    NOTE_CALL_ON(known, snapshot->uuid, destination);
    if (*destination != '/')
        return NORV_ERR_EXPORT_LOCATION;
    if (model().exports.count(destination) != 0)
        return NORV_ERR_FILE_EXISTS;
    _tag_iscsi_export_config_ &config = model().exports[destination];
    put(config.desc, textOf(known->record.desc));
    put(config.taken_by, textOf(known->record.taken_by));
    config.snap_time = known->record.snap_time;
    config.app_consistent = known->record.app_consistent;
    config.user_locked = known->record.user_locked;
    return 0;
}

int NORViSCSISnapshotExportCancel(const _tag_iscsi_snapshot_ *snapshot)
{
    Snapshot *known = byUUID(snapshot->uuid);
    NOTE_CALL_ON(known, snapshot->uuid);
    if (!known->is_locked)
        return NORV_ERR_NOT_EXPORTING;
    known->is_locked = false;
    return 0;
}

int NORViSCSILunImport(const _tag_iscsi_lun_ *lun, const char *source)
{
    const LUN *known = findLUN(lun->uuid);
    NOTE_CALL_ON(known, lun->uuid, source);
    if (model().exports.count(source) == 0)
        return NORV_ERR_FILE_NOT_FOUND;
    return known->is_locked ? NORV_ERR_LUN_LOCKED : 0;
}

int NORViSCSILunImportCancel(const _tag_iscsi_lun_ *lun)
{
    LUN *known = findLUN(lun->uuid);
    NOTE_CALL_ON(known, lun->uuid);
    if (!known->is_locked)
        return NORV_ERR_NOT_IMPORTING;
    known->is_locked = false;
    return 0;
}

int NORViSCSISnapshotExportConfigGet(const char *directory, _tag_iscsi_export_config_ *config)
{
    NOTE_CALL(directory);
    const auto *found = valueOf(model().exports, directory);
    return found ? copyRecord(*found, config) : NORV_ERR_FILE_NOT_FOUND;
}
