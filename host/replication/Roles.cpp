#include "host/replication/Roles.h"

#include "host/core/LastError.h"
#include "host/replication/Sending.h"
#include "host/state/Fields.h"
#include "host/storage/LunActions.h"
#include "host/storage/MapFile.h"
#include "host/storage/SnapshotStore.h"
#include "host/storage/Versions.h"
#include "host/target/Change.h"
#include "host/target/TargetStore.h"
#include "iscsihost/sink.h"
#include "platform/error.h"
#include "platform/iscsi_snapshot.h"

#include <algorithm>

namespace norvhost {
namespace {

/// Swaps the sides of a task.
void turn(TaskRow &task)
{
    std::swap(task.record.src_lun_uuid, task.record.dst_lun_uuid);
    std::swap(task.record.src_node_uuid, task.record.dst_node_uuid);
    task.record.is_source = !task.record.is_source;
}

/// Stores the LUN's new kind and, with it, what `also` changes; who may write to it in its targets follows.
template <class Change>
int changeKind(const LunRow &lun, int type, Change also)
{
    LunLock lock;
    LunRow current;
    if (int err = lockLun(lun.record.lid, NORV_LUN_PROCESSING, lock, current))
        return err;
    return changeRunning([&](std::vector<int> &tids) {
        std::vector<Mapping> mappings;
        if (int err = loadMappingsOfLun(current.record.lid, mappings))
            return err;
        for (const Mapping &mapping : mappings)
            tids.push_back(mapping.tid);
        if (int err = updateLunType(current.record.lid, type))
            return err;
        return also();
    });
}

/// Leaves a sink's LUN with a whole state.
int settle(const LunRow &lun)
{
    if (int err = shutSink(lun.record.uuid))
        return err;
    const std::string path = dataPath(lun.record);
    Versions versions;
    if (int err = readVersions(path, versions))
        return err;
    if (versions.base != versions.current) {
        if (versions.base == NORV_ZERO_UUID)
            return fail(NORV_ERR_CONVERT_TASK, "the LUN '%s' has received its first state only in part",
                        lun.record.name);
        if (int err = setBackTo(lun, versions.base))
            return err == NORV_ERR_NO_SUCH_SNAPSHOT
                       ? fail(
                             NORV_ERR_CONVERT_TASK,
                             "the LUN '%s' has received its latest state in part, and its snapshot of the one before is"
                             " gone",
                             lun.record.name)
                       : err;
    }
    return writeTransferCount(path, Transfer::sending, {});
}

} // namespace

int shutSink(const std::string &lun_uuid)
{
    const int err = iscsihost::closeSink(lun_uuid, "", false);
    return err == NORV_ERR_NO_SUCH_TARGET ? 0 : err;
}

int setBackTo(const LunRow &lun, std::string_view version)
{
    std::vector<SnapshotRow> snapshots;
    if (int err = loadSnapshotsOfLun(lun.record.lid, snapshots))
        return err;
    const auto found = std::find_if(snapshots.begin(), snapshots.end(),
                                    [&](const SnapshotRow &row) { return row.record.version == version; });
    if (found == snapshots.end())
        return fail(NORV_ERR_NO_SUCH_SNAPSHOT, "the LUN '%s' has no snapshot of the version %.*s", lun.record.name,
                    static_cast<int>(version.size()), version.data());
    if (int err = NORViSCSISnapshotRestore(&found->record, &lun.record))
        return err;
    // The snapshot's own file may bear no version: one that was taken here, of a LUN that never received any.
    const std::string path = dataPath(lun.record);
    if (int err = beginSynchronisation(path, std::string(version)))
        return err;
    return finishSynchronisation(path);
}

int releaseSink(const LunRow &lun)
{
    if (lun.record.type != NORV_LUN_TYPE_SINK)
        return 0;
    TaskRow task;
    NamedLock lock;
    if (int err = loadTaskOfSink(lun.record.uuid, task); err && err != NORV_ERR_NO_SUCH_TASK)
        return err;
    else if (!err)
        if (int failed = lockArrival(task.record.uuid, lock))
            return failed;
    if (int err = settle(lun))
        return err;
    return changeKind(lun, NORV_LUN_TYPE_ADV, [] { return 0; });
}

int becomeSource(TaskRow &task)
{
    LunRow lun;
    NamedLock lock;
    if (int err = lockArrival(task.record.uuid, lock))
        return err;
    const std::string uuid = task.record.uuid;
    if (int err = loadTask(uuid, task))
        return err;
    if (task.record.is_source)
        return fail(NORV_ERR_NOT_A_DESTINATION_TASK, "the task %s is a source already", task.record.uuid);
    if (int err = loadLunByUuid(task.localLun(), lun))
        return err;
    if (int err = settle(lun))
        return err;
    return changeKind(lun, NORV_LUN_TYPE_ADV, [&] {
        turn(task);
        if (int err = updateArrival(task.record.uuid, {}))
            return err;
        return updateTask(task);
    });
}

int becomeDestination(TaskRow &task)
{
    LunRow lun;
    if (!task.record.is_source)
        return fail(NORV_ERR_NOT_A_SOURCE_TASK, "the task %s is a destination already", task.record.uuid);
    if (isSending(task.record.uuid))
        return fail(NORV_ERR_TASK_LOCKED, "the task %s is sending a snapshot", task.record.uuid);
    if (int err = loadLunByUuid(task.localLun(), lun))
        return err;
    bool other_source = false;
    if (int err = forEachTask([&](const TaskRow &row) {
            other_source = other_source || (row.record.is_source && lun.record.uuid == std::string(row.localLun()) &&
                                            row.record.uuid != std::string(task.record.uuid));
            return 0;
        }))
        return err;
    if (other_source)
        return fail(NORV_ERR_CONVERT_TASK, "another task sends the LUN '%s'", lun.record.name);

    const std::string path = dataPath(lun.record);
    Versions versions;
    if (int err = readVersions(path, versions))
        return err;
    if (versions.base == NORV_ZERO_UUID) {
        // It has data: without a version of its own its peer would take it for an empty sink.
        if (int err = beginSynchronisation(path, newUuid()))
            return err;
        if (int err = finishSynchronisation(path))
            return err;
    }
    if (int err = writeTransferCount(path, Transfer::sending, {}))
        return err;
    return changeKind(lun, NORV_LUN_TYPE_SINK, [&] {
        turn(task);
        return updateTask(task);
    });
}

} // namespace norvhost
