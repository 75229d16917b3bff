/// Targets: the SDK's target record and the actions on a target.
#pragma once

#include "platform/sdk.h"

#include <stddef.h>
#include <stdint.h>

enum {
    NORV_TARGET_ID_MAX = 256, ///< target IDs run from 1 to this
};

/// `_tag_iscsi_target_::auth_type`.
enum {
    NORV_TARGET_AUTH_NONE = 0,
    NORV_TARGET_AUTH_CHAP = 1,        ///< the initiator proves itself
    NORV_TARGET_AUTH_MUTUAL_CHAP = 2, ///< and so does the target
};

/// The SDK's target record. Owned by the caller unless it came in an answer list; texts end with
/// NUL. The links at the end are the SDK's.
typedef struct _tag_iscsi_target_ {
    int32_t tid; ///< 1 to NORV_TARGET_ID_MAX when filled
    uint8_t enabled;
    uint8_t reserved_5;
    uint8_t header_digest;
    uint8_t data_digest;
    uint8_t reserved_8;
    char name[256];
    char iqn[256];
    char padding_521[3];
    uint32_t max_recv_seg_bytes;
    uint32_t max_send_seg_bytes;
    uint32_t max_sessions; ///< 0 = no limit
    uint32_t auth_type;
    char user[64];
    char password[64];
    char mutual_user[64];
    char mutual_password[64];
    struct _tag_iscsi_target_ *next;
    struct _tag_iscsi_target_ *previous;
} _tag_iscsi_target_;

#ifdef __cplusplus
static_assert(offsetof(_tag_iscsi_target_, tid) == 0, "SDK layout");
static_assert(offsetof(_tag_iscsi_target_, enabled) == 4, "SDK layout");
static_assert(offsetof(_tag_iscsi_target_, header_digest) == 6, "SDK layout");
static_assert(offsetof(_tag_iscsi_target_, data_digest) == 7, "SDK layout");
static_assert(offsetof(_tag_iscsi_target_, reserved_8) == 8, "SDK layout");
static_assert(offsetof(_tag_iscsi_target_, name) == 9, "SDK layout");
static_assert(offsetof(_tag_iscsi_target_, iqn) == 265, "SDK layout");
static_assert(offsetof(_tag_iscsi_target_, max_recv_seg_bytes) == 524, "SDK layout");
static_assert(offsetof(_tag_iscsi_target_, max_send_seg_bytes) == 528, "SDK layout");
static_assert(offsetof(_tag_iscsi_target_, max_sessions) == 532, "SDK layout");
static_assert(offsetof(_tag_iscsi_target_, auth_type) == 536, "SDK layout");
static_assert(offsetof(_tag_iscsi_target_, user) == 540, "SDK layout");
static_assert(offsetof(_tag_iscsi_target_, password) == 604, "SDK layout");
static_assert(offsetof(_tag_iscsi_target_, mutual_user) == 668, "SDK layout");
static_assert(offsetof(_tag_iscsi_target_, mutual_password) == 732, "SDK layout");
static_assert(sizeof(void *) != 4 || sizeof(_tag_iscsi_target_) == 804, "SDK layout on the appliance");
#endif

NORV_BEGIN_DECLS

// Every function below returns 0 on success, else an error code.

/// Creates the target, disabled or enabled as the record says, with no masking; fills in its ID.
NORV_API int NORViSCSITargetCreate(_tag_iscsi_target_ *target);

/// Removes the target with its mappings and masking and ends its sessions; the LUNs stay.
NORV_API int NORViSCSITargetRemove(const _tag_iscsi_target_ *target);

/// Lets initiators in, and sets the record's enabled flag.
NORV_API int NORViSCSITargetEnable(_tag_iscsi_target_ *target);

/// Sets the default masking entry: the permission (ISCSI_TARGET_AUTHORITY) of every initiator that
/// the target's masking does not name. It is listed under NORV_DEFAULT_MASKING_IQN.
NORV_API int NORViSCSIDefaultACLSet(const _tag_iscsi_target_ *target, int permission);

NORV_END_DECLS
