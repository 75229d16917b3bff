/// Replication tasks: one half of a pair of LUNs, kept on each side; sending snapshots; role change.
#pragma once

#include "platform/iscsi_lun.h"
#include "platform/iscsi_snapshot.h"
#include "platform/sdk.h"

#include <stdbool.h>
#include <stddef.h>
#include <stdint.h>

/// The SDK's task record. Owned by the caller and zeroed before every call, unless it came in a
/// queue; texts end with NUL.
typedef struct _tag_iscsi_task_ {
    char uuid[37];
    uint8_t is_source;
    char src_lun_uuid[37];
    char dst_lun_uuid[37];
    char src_node_uuid[37];
    char dst_node_uuid[37];
    char root_path[320];
    char parent_task_uuid[37];
    char padding_543[1];
    struct _tag_iscsi_task_ *forward; ///< links of a queue: the next record and the previous one
    struct _tag_iscsi_task_ *backward;
} _tag_iscsi_task_;

#ifdef __cplusplus
static_assert(offsetof(_tag_iscsi_task_, is_source) == 37, "SDK layout");
static_assert(offsetof(_tag_iscsi_task_, src_lun_uuid) == 38, "SDK layout");
static_assert(offsetof(_tag_iscsi_task_, dst_lun_uuid) == 75, "SDK layout");
static_assert(offsetof(_tag_iscsi_task_, src_node_uuid) == 112, "SDK layout");
static_assert(offsetof(_tag_iscsi_task_, dst_node_uuid) == 149, "SDK layout");
static_assert(offsetof(_tag_iscsi_task_, root_path) == 186, "SDK layout");
static_assert(offsetof(_tag_iscsi_task_, parent_task_uuid) == 506, "SDK layout");
static_assert(offsetof(_tag_iscsi_task_, forward) == 544, "SDK layout");
static_assert(sizeof(_tag_iscsi_task_) == 544 + 2 * sizeof(void *), "SDK layout");
#endif

/// Which tasks NORViSCSIReplicationTaskConfLoad returns; all zero is all of them.
typedef struct _tag_iscsi_task_selection_ {
    char reserved[32];
} _tag_iscsi_task_selection_;

/// How the last sending of a task stands.
typedef struct _tag_iscsi_task_progress_ {
    uint64_t sent_size;       ///< bytes
    uint64_t send_total_size; ///< bytes
    uint64_t progress_value;
    int32_t error; ///< 0, a negative errno value, or an error code
    char task_uuid[37];
    char reserved_65[87];
} _tag_iscsi_task_progress_;

#ifdef __cplusplus
static_assert(offsetof(_tag_iscsi_task_progress_, sent_size) == 0, "SDK layout");
static_assert(offsetof(_tag_iscsi_task_progress_, send_total_size) == 8, "SDK layout");
static_assert(offsetof(_tag_iscsi_task_progress_, progress_value) == 16, "SDK layout");
static_assert(offsetof(_tag_iscsi_task_progress_, error) == 24, "SDK layout");
static_assert(sizeof(_tag_iscsi_task_progress_) == 152, "SDK layout");
#endif

NORV_BEGIN_DECLS

// Every function below returns 0 on success, else an error code.

NORV_API int NORViSCSIReplicationTaskConfGetByUUID(const char *uuid, _tag_iscsi_task_ *task);

/// Links the tasks into the queue behind `head`, whose own fields are not used, and counts them. Each
/// element is from the C allocator; the caller unlinks and frees it, also after a failure.
NORV_API int NORViSCSIReplicationTaskConfLoad(const _tag_iscsi_task_selection_ *selection, int *count,
                                              _tag_iscsi_task_ *head, int flags);

/// Stores the task; on the source side it is given its UUID here.
NORV_API int NORViSCSIReplicationTaskCreate(_tag_iscsi_task_ *task);
NORV_API int NORViSCSIReplicationTaskDelete(const _tag_iscsi_task_ *task);

/// Whether a connection for sending to the given address and port can be made with the ROD key.
NORV_API int NORViSCSIReplicationTaskCheckConnection(const char *address, unsigned int port, const char *rod_key);

/// Starts sending a snapshot of the source LUN in the background. `base_version` is the version that
/// both sides hold, null for none; `address` is the peer's data address (empty: its registered
/// portal), `port` its port; `encrypted` sends inside TLS; `last_try` says that the caller will not
/// try again.
NORV_API int NORViSCSIReplicationTaskSendSnapshot(const _tag_iscsi_task_ *task, const char *address,
                                                  const char *rod_key, const char *snapshot_uuid,
                                                  const char *base_version, unsigned int port, bool full_sync,
                                                  bool encrypted, bool last_try);
NORV_API int NORViSCSIReplicationTaskStopSendingSnapshot(const _tag_iscsi_task_ *task);

NORV_API int NORViSCSIReplicationTaskProgressGetByTask(const _tag_iscsi_task_ *task,
                                                       _tag_iscsi_task_progress_ *progress);
NORV_API int NORViSCSIReplicationTaskProgressAdd(const _tag_iscsi_task_progress_ *progress);

/// Starts counting the bytes that differ between the base (null: everything) and the snapshot.
NORV_API int NORViSCSIReplicationTaskUnsyncSizeComputeStart(const _tag_iscsi_task_ *task,
                                                            const _tag_iscsi_snapshot_ *base,
                                                            const _tag_iscsi_snapshot_ *snapshot);
/// Bytes counted so far, and whether that is all.
NORV_API int NORViSCSIReplicationTaskUnsyncSizeGet(const _tag_iscsi_task_ *task, uint64_t *size, bool *completed);

NORV_API int NORViSCSIReplicationTaskConvertDstToSrc(const _tag_iscsi_task_ *task);
NORV_API int NORViSCSIReplicationTaskConvertSrcToDst(const _tag_iscsi_task_ *task);

/// Turns a sink LUN into an ordinary extent-pool LUN with the same data.
NORV_API int NORViSCSILunConvertSinkToAdv(const _tag_iscsi_lun_ *lun);

NORV_END_DECLS
