/// The platform's replication tasks: storing, listing, roles.
#include "host/core/LastError.h"
#include "host/core/OwnFile.h"
#include "host/replication/Roles.h"
#include "host/replication/Sending.h"
#include "host/replication/TaskStore.h"
#include "host/state/Database.h"
#include "host/state/Fields.h"
#include "host/storage/LunStore.h"
#include "host/storage/MapFile.h"
#include "iscsihost/replication.h"
#include "platform/error.h"
#include "platform/replication.h"

#include <cstdlib>
#include <cstring>
#include <string>

using namespace norvhost;

namespace {

/// A copy of the caller's task whose texts are good, with UUIDs in lower case.
int checkTask(const _tag_iscsi_task_ *task, _tag_iscsi_task_ &out)
{
    if (!task)
        return fail(NORV_ERR_NULL_POINTER, "no task record");
    out = *task;
    out.forward = out.backward = nullptr;
    if (!out.is_source && !isUuid(fieldText(out.uuid)))
        return fail(NORV_ERR_TASK_UUID, "uuid: a destination task takes the UUID of its source task");
    if (!isUuid(fieldText(out.src_lun_uuid)))
        return fail(NORV_ERR_TASK_SOURCE_LUN, "src_lun_uuid: is no UUID");
    if (!isUuid(fieldText(out.dst_lun_uuid)))
        return fail(NORV_ERR_TASK_LUN, "dst_lun_uuid: is no UUID");
    if (!isUuid(fieldText(out.src_node_uuid)))
        return fail(NORV_ERR_TASK_SOURCE_NODE, "src_node_uuid: is no UUID");
    if (!isUuid(fieldText(out.dst_node_uuid)))
        return fail(NORV_ERR_TASK_NODE, "dst_node_uuid: is no UUID");
    if (!memchr(out.root_path, '\0', sizeof out.root_path) ||
        !memchr(out.parent_task_uuid, '\0', sizeof out.parent_task_uuid))
        return fail(NORV_ERR_BAD_PARAMETER, "a text of the task record has no end");
    for (char(*field)[37] : {&out.uuid, &out.src_lun_uuid, &out.dst_lun_uuid, &out.src_node_uuid, &out.dst_node_uuid})
        copyText(*field, lowerCase(*field));
    return 0;
}

/// The LUN that the task has on this appliance fits its role.
int checkLocalLun(const TaskRow &row)
{
    LunRow lun;
    if (int err = loadLunByUuid(row.localLun(), lun))
        return err;
    if (row.record.is_source && !isExtentPool(lun.record.type))
        return fail(NORV_ERR_LUN_TYPE, "the LUN '%s' has no snapshots to send", lun.record.name);
    if (!row.record.is_source && lun.record.type != NORV_LUN_TYPE_SINK)
        return fail(NORV_ERR_LUN_TYPE, "the LUN '%s' is no sink", lun.record.name);
    return 0;
}

/// The stored task of a caller's record, which may be old.
int loadCallersTask(const _tag_iscsi_task_ *task, TaskRow &row)
{
    if (!task)
        return fail(NORV_ERR_NULL_POINTER, "no task record");
    return loadTask(fieldText(task->uuid), row);
}

} // namespace

int iscsihost::isTaskLocked(const std::string &lock_file, bool &is_locked)
{
    return fileLockHeld(lock_file.c_str(), is_locked) == 0 ? 0 : NORV_ERR_LOCK_FILE;
}

int NORViSCSIReplicationTaskConfGetByUUID(const char *uuid, _tag_iscsi_task_ *task)
{
    if (!uuid || !task)
        return fail(NORV_ERR_NULL_POINTER, "a UUID and a record are needed");
    TaskRow row;
    if (int err = loadTask(uuid, row))
        return err;
    *task = row.record;
    return 0;
}

int NORViSCSIReplicationTaskConfLoad(const _tag_iscsi_task_selection_ *, int *count, _tag_iscsi_task_ *head, int)
{
    if (!count || !head)
        return fail(NORV_ERR_NULL_POINTER, "a count and a queue are needed");
    head->forward = head->backward = nullptr;
    _tag_iscsi_task_ *last = head;
    *count = 0;
    return forEachTask([&](const TaskRow &row) {
        auto *element = static_cast<_tag_iscsi_task_ *>(malloc(sizeof(_tag_iscsi_task_)));
        if (!element)
            return fail(NORV_ERR_OUT_OF_MEMORY, "no memory for the list of tasks");
        *element = row.record;
        element->forward = nullptr;
        element->backward = last;
        last->forward = element;
        last = element;
        ++*count;
        return 0;
    });
}

int NORViSCSIReplicationTaskCreate(_tag_iscsi_task_ *task)
{
    TaskRow row;
    if (int err = checkTask(task, row.record))
        return err;
    if (row.record.is_source)
        copyText(row.record.uuid, newUuid());
    Transaction transaction;
    if (transaction.error())
        return transaction.error();
    if (int err = checkLocalLun(row))
        return err;
    if (int err = insertTask(row))
        return err;
    if (int err = transaction.commit())
        return err;
    _tag_iscsi_task_ *const forward = task->forward, *const backward = task->backward;
    *task = row.record;
    task->forward = forward;
    task->backward = backward;
    return 0;
}

int NORViSCSIReplicationTaskDelete(const _tag_iscsi_task_ *task)
{
    TaskRow row;
    if (int err = loadCallersTask(task, row))
        return err;
    if (int err = stopSending(row))
        return err;
    return removeTask(row.record.uuid);
}

int NORViSCSIReplicationTaskConvertDstToSrc(const _tag_iscsi_task_ *task)
{
    TaskRow row;
    if (int err = loadCallersTask(task, row))
        return err;
    return becomeSource(row);
}

int NORViSCSIReplicationTaskConvertSrcToDst(const _tag_iscsi_task_ *task)
{
    TaskRow row;
    if (int err = loadCallersTask(task, row))
        return err;
    return becomeDestination(row);
}

int NORViSCSILunConvertSinkToAdv(const _tag_iscsi_lun_ *lun)
{
    if (!lun)
        return fail(NORV_ERR_NULL_POINTER, "no LUN record");
    LunRow row;
    if (int err = loadLunByLid(lun->lid, row))
        return err;
    return releaseSink(row);
}

int NORViSCSIReplicationTaskProgressGetByTask(const _tag_iscsi_task_ *task, _tag_iscsi_task_progress_ *progress)
{
    if (!progress)
        return fail(NORV_ERR_NULL_POINTER, "no progress record");
    TaskRow row;
    if (int err = loadCallersTask(task, row))
        return err;
    return readProgress(row, *progress);
}

int NORViSCSIReplicationTaskProgressAdd(const _tag_iscsi_task_progress_ *progress)
{
    if (!progress)
        return fail(NORV_ERR_NULL_POINTER, "no progress record");
    return updateProgress(*progress);
}
