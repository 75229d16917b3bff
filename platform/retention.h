/// Retention policies.
#pragma once

#include "platform/sdk.h"

/// One thing that a policy can keep or let go.
typedef struct _tag_retention_target_ {
    char uuid[37];
    long time;      ///< seconds since the epoch: its age decides
    int protected_; ///< not 0: locked, never goes
    struct _tag_retention_target_ *next;
} _tag_retention_target_;

/// Lists the things of the object with this key, each from the C allocator. 0 on success.
typedef int (*NORV_RETENTION_TARGET_GET)(const char *key, _tag_retention_target_ **targets);
/// Deletes one of them. 0 on success.
typedef int (*NORV_RETENTION_TARGET_DELETE)(const char *key, const _tag_retention_target_ *target);

NORV_BEGIN_DECLS

/// Removes the policy of an object, named by its kind ("Lun#") and its key (the LUN ID in decimal).
/// 0 on success, also when there is none; negative on failure.
NORV_API int NORVRETENTIONRemovePolicy(const char *kind, const char *key);

/// Runs the policy of an object: lists its things through `get` and deletes through `remove` what the
/// policy does not keep. `flags` is 0. Negative on failure; an object without a policy keeps all.
NORV_API int NORVRETENTIONRunPolicy(const char *kind, const char *key, NORV_RETENTION_TARGET_GET get,
                                    NORV_RETENTION_TARGET_DELETE remove, int flags);

/// The hooks for the snapshots of a LUN; the key is the LUN ID in decimal.
NORV_API int NORVRETAINERiSCSIRetentionTargetGet(const char *key, _tag_retention_target_ **targets);
NORV_API int NORVRETAINERiSCSIRetentionTargetDelete(const char *key, const _tag_retention_target_ *target);

NORV_END_DECLS
