/// Snapshots: the SDK's snapshot record, its configuration, locks and actions; clone, export, import.
#pragma once

#include "platform/core.h"
#include "platform/iscsi_lun.h"
#include "platform/sdk.h"

#include <stdbool.h>
#include <stddef.h>
#include <stdint.h>

enum {
    NORV_SNAPSHOT_ID_MAX = 256, ///< snapshot numbers run from 1 to this, per LUN
};

/// Bits of `_tag_iscsi_snapshot_::flags`.
enum {
    NORV_SNAPSHOT_TRASH = 1,       ///< the snapshot lies in the LUN's trash
    NORV_SNAPSHOT_UNSYNC_SIZE = 2, ///< load or unload for computing the unsynchronised size
    NORV_SNAPSHOT_SCHEDULED = 8,   ///< taken by a schedule
};

/// The SDK's snapshot record. Owned by the caller and zeroed before every call, unless it came in a
/// list; texts end with NUL.
typedef struct _tag_iscsi_snapshot_ {
    int32_t lid;     ///< of the LUN it belongs to
    int32_t snap_id; ///< 1 to NORV_SNAPSHOT_ID_MAX when filled
    uint32_t reserved_8;
    uint32_t flags;       ///< NORV_SNAPSHOT_...
    uint64_t total_size;  ///< bytes
    uint64_t mapped_size; ///< bytes
    int32_t create_time;  ///< seconds since the epoch
    int32_t snap_time;    ///< seconds since the epoch
    uint8_t app_consistent;
    uint8_t user_locked;
    char name[256];
    char status[32];
    char desc[1024];
    char root_path[4095];
    char taken_by[32];
    char uuid[37];
    char version[37];
    struct _tag_iscsi_snapshot_ *next;
    struct _tag_iscsi_snapshot_ *previous;
    uint32_t reserved_5564;
} _tag_iscsi_snapshot_;

#ifdef __cplusplus
static_assert(offsetof(_tag_iscsi_snapshot_, lid) == 0, "SDK layout");
static_assert(offsetof(_tag_iscsi_snapshot_, snap_id) == 4, "SDK layout");
static_assert(offsetof(_tag_iscsi_snapshot_, flags) == 12, "SDK layout");
static_assert(offsetof(_tag_iscsi_snapshot_, total_size) == 16, "SDK layout");
static_assert(offsetof(_tag_iscsi_snapshot_, mapped_size) == 24, "SDK layout");
static_assert(offsetof(_tag_iscsi_snapshot_, create_time) == 32, "SDK layout");
static_assert(offsetof(_tag_iscsi_snapshot_, snap_time) == 36, "SDK layout");
static_assert(offsetof(_tag_iscsi_snapshot_, app_consistent) == 40, "SDK layout");
static_assert(offsetof(_tag_iscsi_snapshot_, user_locked) == 41, "SDK layout");
static_assert(offsetof(_tag_iscsi_snapshot_, name) == 42, "SDK layout");
static_assert(offsetof(_tag_iscsi_snapshot_, status) == 298, "SDK layout");
static_assert(offsetof(_tag_iscsi_snapshot_, desc) == 330, "SDK layout");
static_assert(offsetof(_tag_iscsi_snapshot_, root_path) == 1354, "SDK layout");
static_assert(offsetof(_tag_iscsi_snapshot_, taken_by) == 5449, "SDK layout");
static_assert(offsetof(_tag_iscsi_snapshot_, uuid) == 5481, "SDK layout");
static_assert(offsetof(_tag_iscsi_snapshot_, version) == 5518, "SDK layout");
static_assert(sizeof(void *) != 4 || offsetof(_tag_iscsi_snapshot_, next) == 5556, "SDK layout on the appliance");
static_assert(sizeof(void *) != 4 || offsetof(_tag_iscsi_snapshot_, previous) == 5560, "SDK layout on the appliance");
static_assert(sizeof(void *) != 4 || sizeof(_tag_iscsi_snapshot_) == 5568, "SDK layout on the appliance");
#endif

/// Bits of `_tag_iscsi_snapshot_query_::query_flags`.
enum {
    NORV_SNAPSHOT_QUERY_LID = 0x02,  ///< only the LUN in query_lid
    NORV_SNAPSHOT_QUERY_TIME = 0x40, ///< only snapshots taken at query_time or later
};

typedef struct _tag_iscsi_snapshot_query_ {
    uint32_t query_flags;
    int32_t query_lid;
    char reserved_8[16];
    int32_t query_time; ///< seconds since the epoch
} _tag_iscsi_snapshot_query_;

#ifdef __cplusplus
static_assert(offsetof(_tag_iscsi_snapshot_query_, query_lid) == 4, "SDK layout");
static_assert(offsetof(_tag_iscsi_snapshot_query_, query_time) == 24, "SDK layout");
#endif

/// Head of a list of snapshot records, linked both ways; each record is from the C allocator.
typedef struct _tag_iscsi_snapshot_list_ {
    int32_t count;
    _tag_iscsi_snapshot_ *first;
    _tag_iscsi_snapshot_ *last;
} _tag_iscsi_snapshot_list_;

/// What an export directory says of the snapshot it holds.
typedef struct _tag_iscsi_export_config_ {
    char reserved_0[36];
    char desc[1024];
    char taken_by[32];
    int32_t snap_time; ///< seconds since the epoch
    uint8_t app_consistent;
    uint8_t user_locked;
    char reserved_1098[6];
} _tag_iscsi_export_config_;

#ifdef __cplusplus
static_assert(offsetof(_tag_iscsi_export_config_, desc) == 36, "SDK layout");
static_assert(offsetof(_tag_iscsi_export_config_, taken_by) == 1060, "SDK layout");
static_assert(offsetof(_tag_iscsi_export_config_, snap_time) == 1092, "SDK layout");
static_assert(offsetof(_tag_iscsi_export_config_, app_consistent) == 1096, "SDK layout");
static_assert(offsetof(_tag_iscsi_export_config_, user_locked) == 1097, "SDK layout");
static_assert(sizeof(_tag_iscsi_export_config_) == 1104, "SDK layout");
#endif

NORV_BEGIN_DECLS

// Every function below returns 0 on success, else an error code. Records are filled only on success.

NORV_API int NORViSCSISnapshotConfGetByUUID(const char *uuid, _tag_iscsi_snapshot_ *snapshot);
NORV_API int NORViSCSISnapshotConfGetByLIDAndName(int lid, const char *name, _tag_iscsi_snapshot_ *snapshot);

/// Appends the snapshots that the query asks for to the list, by LUN ID and snapshot number. The
/// caller unlinks every record and frees it with free(), also after a failure.
NORV_API int NORViSCSISnapshotConfLoad(const _tag_iscsi_snapshot_query_ *query, _tag_iscsi_snapshot_list_ *list);

/// Whether an action holds the snapshot now.
NORV_API int NORViSCSIIsSnapshotLocked(const _tag_iscsi_snapshot_ *snapshot, bool *locked);

/// Appends the application keys that lock the snapshot to a list of NLIBCSzListAlloc.
NORV_API int NORViSCSISnapshotLockedAppKeysGet(const _tag_iscsi_snapshot_ *snapshot, NLIBC_SZ_LIST *keys);

/// Locks the snapshot against deletion under a key of at most 127 bytes, or takes that lock back;
/// locking twice under one key is one lock, and taking back one that is not there no failure.
NORV_API int NORViSCSISnapshotLockByAppKey(const _tag_iscsi_snapshot_ *snapshot, const char *key);
NORV_API int NORViSCSISnapshotUnlockByAppKey(const _tag_iscsi_snapshot_ *snapshot, const char *key);

/// A name that no snapshot of the LUN bears, into `name` of `size` bytes.
NORV_API int NORViSCSIUnusedSnapshotNameFind(int lid, char *name, int size);

/// Starts taking a snapshot of the LUN as the record describes (name, desc, taken_by, snap_time,
/// flags, app_consistent, user_locked); fills in its number, UUID and version. The point in time is
/// fixed when the call returns; the LUN stays locked until the snapshot is complete.
NORV_API int NORViSCSISnapshotCreate(const _tag_iscsi_lun_ *lun, _tag_iscsi_snapshot_ *snapshot);

/// Deletes the snapshot on behalf of `who`. Refused while the user, an application key or an action
/// locks it.
NORV_API int NORViSCSISnapshotDelete(const _tag_iscsi_snapshot_ *snapshot, const char *who);

/// Starts setting the LUN's data back to the snapshot; the LUN stays mapped, and locked until done.
NORV_API int NORViSCSISnapshotRestore(const _tag_iscsi_snapshot_ *snapshot, const _tag_iscsi_lun_ *lun);

/// Puts the snapshot's data, read-only, into the running iSCSI service, or takes it out; unloading
/// also stops an action that holds the snapshot. With NORV_SNAPSHOT_TRASH in the record's flags the
/// snapshot is moved out of the trash or into it.
NORV_API int NORViSCSISnapshotLoad(const _tag_iscsi_snapshot_ *snapshot);
NORV_API int NORViSCSISnapshotUnload(const _tag_iscsi_snapshot_ *snapshot);

/// Starts making a new LUN with the snapshot's data; takes name, location, type and extent size from
/// the record and fills in LUN ID and UUID. The new LUN stays locked until complete.
NORV_API int NORViSCSISnapshotClone(const _tag_iscsi_snapshot_ *snapshot, _tag_iscsi_lun_ *clone);

/// Makes a new LUN with the source's data of now, as NORViSCSISnapshotClone but complete on return.
NORV_API int NORViSCSILunClone(const _tag_iscsi_lun_ *source, _tag_iscsi_lun_ *clone);

/// Wait until no action holds the LUN or the snapshot; `limit` in seconds, 0 for none. Returns a
/// time-out code when it is still held then.
NORV_API int NORViSCSILunWaitUntilUnlock(const _tag_iscsi_lun_ *lun, int limit);
NORV_API int NORViSCSISnapshotWaitUntilUnlock(const _tag_iscsi_snapshot_ *snapshot, int limit);

/// Starts copying the snapshot into the directory `destination`; the snapshot stays locked, and its
/// progress file exists, until done; a failure's code can be read there for a while longer. Cancelling ends the copy
/// and removes what it made.
NORV_API int NORViSCSISnapshotExport(const _tag_iscsi_snapshot_ *snapshot, const char *destination);
NORV_API int NORViSCSISnapshotExportCancel(const _tag_iscsi_snapshot_ *snapshot);

/// Starts copying the export directory `source` into the LUN, which stays locked until done. How it ended can be read
/// in its progress file for a while longer.
NORV_API int NORViSCSILunImport(const _tag_iscsi_lun_ *lun, const char *source);
NORV_API int NORViSCSILunImportCancel(const _tag_iscsi_lun_ *lun);

NORV_API int NORViSCSISnapshotExportConfigGet(const char *directory, _tag_iscsi_export_config_ *config);

NORV_END_DECLS
