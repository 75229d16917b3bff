/// Counting what a sending would have to move.
#include "host/core/LastError.h"
#include "host/core/Lock.h"
#include "host/replication/Difference.h"
#include "host/replication/TaskStore.h"
#include "host/state/Fields.h"
#include "host/storage/SnapshotFiles.h"
#include "host/storage/SnapshotStore.h"
#include "platform/core.h"
#include "platform/error.h"
#include "platform/replication.h"

#include <cstring>
#include <unistd.h>

using namespace norvhost;

namespace {

int openByUuid(const _tag_iscsi_snapshot_ &snapshot, FileDescriptor &file, uint64_t &size)
{
    SnapshotRow row;
    if (int err = loadSnapshotByUuid(fieldText(snapshot.uuid), row))
        return err;
    size = row.record.total_size;
    return openSnapshotData(row.record, file);
}

std::string lockName(const char *task_uuid)
{
    return std::string("unsync-") + task_uuid;
}

/// `counting` is asked before the count: a worker that ends in between has written it.
int readCount(const std::string &uuid, UnsyncCount &count, bool &counting)
{
    if (int err = namedLockHeld(lockName(uuid.c_str()), counting))
        return err;
    return loadUnsyncCount(uuid, count);
}

} // namespace

int NORViSCSIReplicationTaskUnsyncSizeComputeStart(const _tag_iscsi_task_ *task, const _tag_iscsi_snapshot_ *base,
                                                   const _tag_iscsi_snapshot_ *snapshot)
{
    if (!task || !snapshot)
        return fail(NORV_ERR_NULL_POINTER, "a task and a snapshot are needed");
    FileDescriptor base_file, file;
    uint64_t base_size = 0, size = 0;
    if (base) {
        if (int err = openByUuid(*base, base_file, base_size))
            return err;
    }
    if (int err = openByUuid(*snapshot, file, size))
        return err;
    const std::string uuid = lowerCase(fieldText(task->uuid));
    NamedLock lock;
    if (int err = lock.tryTake(lockName(uuid.c_str())))
        return err;
    if (!lock.held())
        return fail(NORV_ERR_TASK_LOCKED, "the unsynchronised size of the task is being counted");
    if (int err = updateUnsyncCount(uuid, {}))
        return err;
    const int child = NLIBCProcForkChildNoWait();
    if (child < 0)
        return NORV_ERR_FORK;
    if (child > 0)
        return 0;

    std::vector<DataRange> ranges;
    UnsyncCount count;
    count.error = findDifference(base ? base_file.get() : -1, file.get(), size, ranges);
    count.bytes = dataBytes(ranges);
    count.completed = count.error == 0;
    updateUnsyncCount(uuid, count);
    _exit(0);
}

int NORViSCSIReplicationTaskUnsyncSizeGet(const _tag_iscsi_task_ *task, uint64_t *size, bool *completed)
{
    if (!task || !size || !completed)
        return fail(NORV_ERR_NULL_POINTER, "an argument is missing");
    const std::string uuid = lowerCase(fieldText(task->uuid));
    UnsyncCount count;
    bool counting = false;
    if (int err = readCount(uuid, count, counting))
        return err;
    if (!counting && !count.completed && !count.error) // it may have been begun, even ended, in between
        if (int err = readCount(uuid, count, counting))
            return err;
    if (count.error)
        return fail(count.error, "the unsynchronised size could not be counted");
    if (!count.completed && !counting)
        return fail(NORV_ERR_COMPUTE_UNSYNC_SIZE, "nobody counts the unsynchronised size of the task: start it again");
    *size = count.bytes;
    *completed = count.completed;
    return 0;
}
