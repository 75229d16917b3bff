// Virtual LUNs and replication tasks on the fake's model. A transfer moves as its scripted answers say.
#include "platform/replication.h"
#include "platform/virtual_lun.h"
#include "tests/fake/Script.h"

#include <cstdlib>

using namespace fake;

namespace {

VirtualLUN *findVirtualLUN(const char *uuid)
{
    return valueOf(model().virtual_luns, uuid);
}

Task *findTask(const char *uuid)
{
    for (Task &task : model().tasks) {
        if (textOf(task.record.uuid) == uuid)
            return &task;
    }
    return nullptr;
}

int convert(const char *name, const _tag_iscsi_task_ *record, bool to_source)
{
    Task *task = findTask(record->uuid);
    if (auto failure = calledOn(task, name, record->uuid))
        return *failure;
    task->record.is_source = to_source;
    return 0;
}

} // namespace

int NORViSCSIVirtualLunCreate(const char *src_lun_uuid, int mode, char *uuid, int flags)
{
    const LUN *source = findLUN(src_lun_uuid);
    NOTE_CALL_ON(source, src_lun_uuid, mode, flags);
    VirtualLUN vlun;
    char made[37];
    makeUUID(made);
    vlun.record.src_lid = source->record.lid;
    vlun.record.kind = 1;
    vlun.stats = model().next_transfer;
    model().virtual_luns[made] = vlun;
    memcpy(uuid, made, sizeof(made));
    return 0;
}

int NORViSCSIVirtualLunRemove(const char *uuid)
{
    NOTE_CALL(uuid);
    return model().virtual_luns.erase(uuid) == 1 ? 0 : NORV_ERR_VLUN_UUID;
}

int NORViSCSIVirtualLunBindSink(const char *uuid, const char *portal, const char *node_uuid, const char *dst_lun_uuid)
{
    return calledOn(findVirtualLUN(uuid), __func__, uuid, portal, node_uuid, dst_lun_uuid).value_or(0);
}

int NORViSCSIVirtualLunStatsGet(const char *uuid, _tag_viscsi_virtual_lun_stats_ *stats, int flags)
{
    VirtualLUN *vlun = findVirtualLUN(uuid);
    NOTE_CALL_ON(vlun, uuid, flags);
    *stats = vlun->stats.take();
    return 0;
}

int NORViSCSIVirtualLunFillByUUID(const char *uuid, _tag_viscsi_virtual_lun_ *vlun, int flag)
{
    return answerRecord(findVirtualLUN(uuid), vlun, __func__, uuid, flag);
}

int NORViSCSIReplicationTaskConfGetByUUID(const char *uuid, _tag_iscsi_task_ *record)
{
    return answerRecord(findTask(uuid), record, __func__, uuid);
}

int NORViSCSIReplicationTaskConfLoad(const _tag_iscsi_task_selection_ *selection, int *count, _tag_iscsi_task_ *head,
                                     int flags)
{
    static const _tag_iscsi_task_selection_ all{};
    const auto failure = called(__func__, memcmp(selection, &all, sizeof(all)) == 0 ? "all" : "some", flags);
    _tag_iscsi_task_ *last = head;
    for (const Task &task : model().tasks) {
        auto *record = noted(static_cast<_tag_iscsi_task_ *>(malloc(sizeof(_tag_iscsi_task_))));
        *record = task.record;
        record->forward = nullptr;
        record->backward = last;
        last = last->forward = record;
        ++*count;
        if (failure)
            break; // part of an answer is the caller's to free too
    }
    return failure.value_or(0);
}

int NORViSCSIReplicationTaskCreate(_tag_iscsi_task_ *record)
{
    NOTE_CALL(record->uuid, record->is_source ? "source" : "destination", record->src_lun_uuid, record->dst_lun_uuid,
              record->src_node_uuid, record->dst_node_uuid, record->root_path);
    if (record->is_source)
        makeUUID(record->uuid);
    Task task;
    task.record = *record;
    model().tasks.push_back(task);
    return 0;
}

int NORViSCSIReplicationTaskDelete(const _tag_iscsi_task_ *record)
{
    Task *task = findTask(record->uuid);
    NOTE_CALL_ON(task, record->uuid);
    model().tasks.erase(model().tasks.begin() + (task - model().tasks.data()));
    return 0;
}

int NORViSCSIReplicationTaskCheckConnection(const char *address, unsigned int port, const char *rod_key)
{
    return called(__func__, address, port, rod_key).value_or(0);
}

int NORViSCSIReplicationTaskSendSnapshot(const _tag_iscsi_task_ *record, const char *address, const char *rod_key,
                                         const char *snapshot_uuid, const char *base_version, unsigned int port,
                                         bool full_sync, bool encrypted, bool last_try)
{
    return calledOn(findTask(record->uuid), __func__, record->uuid, address, rod_key, snapshot_uuid,
                    base_version ? base_version : "(null)", port, full_sync ? "full" : "difference",
                    encrypted ? "encrypted" : "plain", last_try ? "last try" : "not the last try")
        .value_or(0);
}

int NORViSCSIReplicationTaskStopSendingSnapshot(const _tag_iscsi_task_ *record)
{
    return calledOn(findTask(record->uuid), __func__, record->uuid).value_or(0);
}

int NORViSCSIReplicationTaskProgressGetByTask(const _tag_iscsi_task_ *record, _tag_iscsi_task_progress_ *progress)
{
    Task *task = findTask(record->uuid);
    NOTE_CALL_ON(task, record->uuid);
    *progress = task->progress.take();
    put(progress->task_uuid, textOf(record->uuid));
    return 0;
}

int NORViSCSIReplicationTaskProgressAdd(const _tag_iscsi_task_progress_ *progress)
{
    Task *task = findTask(progress->task_uuid);
    NOTE_CALL_ON(task, progress->task_uuid, progress->error);
    task->progress = {{*progress}};
    return 0;
}

int NORViSCSIReplicationTaskUnsyncSizeComputeStart(const _tag_iscsi_task_ *record, const _tag_iscsi_snapshot_ *base,
                                                   const _tag_iscsi_snapshot_ *snapshot)
{
    return calledOn(findTask(record->uuid), __func__, record->uuid, base ? base->uuid : "(null)", snapshot->uuid)
        .value_or(0);
}

int NORViSCSIReplicationTaskUnsyncSizeGet(const _tag_iscsi_task_ *record, uint64_t *size, bool *completed)
{
    Task *task = findTask(record->uuid);
    NOTE_CALL_ON(task, record->uuid);
    *size = task->unsync_size;
    *completed = true;
    return 0;
}

int NORViSCSIReplicationTaskConvertDstToSrc(const _tag_iscsi_task_ *record)
{
    return convert(__func__, record, true);
}

int NORViSCSIReplicationTaskConvertSrcToDst(const _tag_iscsi_task_ *record)
{
    return convert(__func__, record, false);
}

int NORViSCSILunConvertSinkToAdv(const _tag_iscsi_lun_ *record)
{
    NOTE_CALL(record->uuid);
    LUN *lun = findLUN(record->uuid);
    if (!lun || lun->record.type != NORV_LUN_TYPE_SINK)
        return NORV_ERR_BAD_PARAMETER;
    lun->record.type = NORV_LUN_TYPE_ADV;
    return 0;
}
