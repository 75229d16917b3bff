/// LUNs: the SDK's LUN record, its configuration, state and actions.
#pragma once

#include "platform/sdk.h"

#include <stdbool.h>
#include <stddef.h>
#include <stdint.h>

/// Kind of a LUN, a bit set in which each kind adds a bit to the one before it. All of the bits 1,
/// 2, 4 and 8 mark an extent-pool LUN: sparse, snapshot-capable.
enum _tag_iscsi_lun_type
#ifdef __cplusplus
    : int32_t
#endif
{
    NORV_LUN_TYPE_NONE = 0,
    NORV_LUN_TYPE_BLOCK = 1, ///< a block device; the location is the device's path
    NORV_LUN_TYPE_FILE = 3,  ///< a file allocated in full
    NORV_LUN_TYPE_THIN = 7,  ///< a sparse file
    NORV_LUN_TYPE_ADV = 15,  ///< extent pool
    NORV_LUN_TYPE_SINK = 31, ///< extent pool, written by a peer
    NORV_LUN_TYPE_47 = 47,
    NORV_LUN_TYPE_71 = 71,
    NORV_LUN_TYPE_79 = 79,
};

enum {
    NORV_LUN_EXTENT_POOL_BITS = 15,
    NORV_LUN_ID_MAX = 1024, ///< LUN IDs run from 1 to this
};

/// Bits of `_tag_iscsi_lun_::options`.
enum {
    NORV_LUN_OPTION_TRASH = 1,       ///< the LUN lies in the trash; for load and unload: move it out of or into it
    NORV_LUN_OPTION_UNSYNC_SIZE = 4, ///< load or unload for computing the unsynchronised size
};

/// The SDK's LUN record. Owned by the caller, zeroed before every call; texts end with NUL.
typedef struct _tag_iscsi_lun_ {
    int32_t lid; ///< 1 to NORV_LUN_ID_MAX when filled
    uint32_t reserved_4;
    uint32_t options; ///< NORV_LUN_OPTION_...
    uint32_t reserved_12;
    uint32_t extent_size; ///< bytes
    uint32_t reserved_20;
    uint64_t size;         ///< bytes
    int32_t restored_time; ///< seconds since the epoch, 0 = never
    int32_t type;          ///< _tag_iscsi_lun_type
    uint32_t reserved_40;
    char uuid[37];
    char second_uuid[37];
    char location[4095];
    char name[256];
    char reserved_4469[11];
} _tag_iscsi_lun_;

#ifdef __cplusplus
static_assert(offsetof(_tag_iscsi_lun_, lid) == 0, "SDK layout");
static_assert(offsetof(_tag_iscsi_lun_, options) == 8, "SDK layout");
static_assert(offsetof(_tag_iscsi_lun_, extent_size) == 16, "SDK layout");
static_assert(offsetof(_tag_iscsi_lun_, size) == 24, "SDK layout");
static_assert(offsetof(_tag_iscsi_lun_, restored_time) == 32, "SDK layout");
static_assert(offsetof(_tag_iscsi_lun_, type) == 36, "SDK layout");
static_assert(offsetof(_tag_iscsi_lun_, uuid) == 44, "SDK layout");
static_assert(offsetof(_tag_iscsi_lun_, second_uuid) == 81, "SDK layout");
static_assert(offsetof(_tag_iscsi_lun_, location) == 118, "SDK layout");
static_assert(offsetof(_tag_iscsi_lun_, name) == 4213, "SDK layout");
static_assert(sizeof(_tag_iscsi_lun_) == 4480, "SDK layout on every ABI: the record holds no pointer");
#endif

/// What a LUN is doing; `st` 0 is nothing, see the status words of the LUN record.
typedef struct _tag_iscsi_lun_progress_ {
    int32_t st;
    int32_t percent; ///< 0 to 100, -1 when the action cannot tell
} _tag_iscsi_lun_progress_;

enum {
    NORV_LUN_IDLE = 0,
    NORV_LUN_PROCESSING = 1,
    NORV_LUN_MOVING = 2,
    NORV_LUN_CREATING = 3,
    NORV_LUN_EXPANDING = 4,
    NORV_LUN_DELETING = 5,
    NORV_LUN_CLONING = 6,
    NORV_LUN_CLONING_SNAPSHOT = 7,
    NORV_LUN_RESTORING = 8,
    NORV_LUN_BE_CLONING = 9,
    NORV_LUN_SNAPSHOTTING = 10,
    NORV_LUN_SNAPSHOT_DELETING = 11,
    NORV_LUN_CREATING_SINK = 12,
};

/// Health of a LUN with its snapshots.
typedef struct _tag_iscsi_family_ {
    int32_t lid;
    char status[32]; ///< "Healthy" or "Unhealthy"
} _tag_iscsi_family_;

NORV_BEGIN_DECLS

// Every function below returns 0 on success, else an error code, and does not wait for an action in
// progress unless it says so. Records are filled only on success.

/// The LUN with this UUID. `flags` is the caller's load-flags word; the SDK reads bit 1 (quiet) only.
NORV_API int NORViSCSILunConfigGetByUUID(const char *uuid, _tag_iscsi_lun_ *lun, int flags);

/// Every LUN, ascending by LUN ID, as one array of `*count` records. The caller frees `*luns` with
/// free(); with no LUNs it is null and the count 0.
NORV_API int NORViSCSILunConfigGetAll(_tag_iscsi_lun_ **luns, size_t *count);

NORV_API int NORViSCSILunGetByLunId(int lid, _tag_iscsi_lun_ *lun);
NORV_API int NORViSCSILunGetByLunName(const char *name, _tag_iscsi_lun_ *lun);

/// Whether any LUN bears this name (byte-wise comparison).
NORV_API int NORViSCSILunIsNameExist(const char *name, bool *exists);

/// Creates the LUN that the record describes (type, size, name, location, extent size); fills in the
/// LUN ID and the UUID. After a failure nothing of it is left.
NORV_API int NORViSCSILunCreate(_tag_iscsi_lun_ *lun);

/// Deletes the LUN and its data. Refused while it is mapped or locked.
NORV_API int NORViSCSILunDelete(_tag_iscsi_lun_ *lun);

/// Renames and grows the LUN to the record's name and size. A mapped LUN shows its new size at once.
NORV_API int NORViSCSILunUpdate(_tag_iscsi_lun_ *lun);

/// Puts the LUN into the running iSCSI service, or takes it out. With NORV_LUN_OPTION_TRASH in the
/// record's options, loading also moves the LUN out of the trash and unloading into it.
NORV_API int NORViSCSILunLoad(_tag_iscsi_lun_ *lun);
NORV_API int NORViSCSILunUnload(_tag_iscsi_lun_ *lun);

/// Whether an action holds the LUN now. The answer is the kernel's: a dead action holds nothing.
NORV_API int NORViSCSILunIsLocked(const _tag_iscsi_lun_ *lun, bool *locked);

NORV_API int NORViSCSILunProgressGet(const _tag_iscsi_lun_ *lun, _tag_iscsi_lun_progress_ *progress);

NORV_API int NORViSCSIFamilyConfGetByLID(int lid, _tag_iscsi_family_ *family);

/// Maps the LUN to `count` targets, or removes the mappings; all of them or, on failure, none.
NORV_API int NORViSCSILunMappingsAdd(const int target_ids[], int lid, int count);
NORV_API int NORViSCSILunMappingsRemove(const int target_ids[], int lid, int count);

NORV_END_DECLS
