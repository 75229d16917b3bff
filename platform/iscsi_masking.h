/// ACL masking of a target: which initiators may use it, and how.
#pragma once

#include "platform/sdk.h"

#include <cstddef>
#include <cstdint>
#include <vector>

/// What an initiator may do.
enum ISCSI_TARGET_AUTHORITY : int32_t {
    NORV_AUTHORITY_NONE = 0,
    NORV_AUTHORITY_READ = 1,
    NORV_AUTHORITY_READ_WRITE = 3,
};

/// The IQN under which the default masking entry is listed, created, updated and removed.
#define NORV_DEFAULT_MASKING_IQN "iqn.2001-01.norv:default"

/// One masking entry; the IQN ends with NUL, the last 8 bytes are zero.
struct _tag_struct_iscsi_acl_ {
    int32_t tid;
    char iqn[256];
    int32_t permission; ///< ISCSI_TARGET_AUTHORITY
    char reserved_264[8];
};

static_assert(offsetof(_tag_struct_iscsi_acl_, tid) == 0, "SDK layout");
static_assert(offsetof(_tag_struct_iscsi_acl_, iqn) == 4, "SDK layout");
static_assert(offsetof(_tag_struct_iscsi_acl_, permission) == 260, "SDK layout");
static_assert(sizeof(_tag_struct_iscsi_acl_) == 272, "SDK layout");

// Every function below returns 0 on success, else an error code.

/// The target's masking, the default entry included; `entries` is replaced, on success only.
NORV_API int NORViSCSITargetMaskingGet(int tid, std::vector<_tag_struct_iscsi_acl_> &entries);

/// All of the entries take effect or, on failure, none. Initiators that lose a permission are
/// logged out.
NORV_API int NORViSCSIMaskingsCreate(const std::vector<_tag_struct_iscsi_acl_> &entries);
NORV_API int NORViSCSIMaskingsUpdate(const std::vector<_tag_struct_iscsi_acl_> &entries);
NORV_API int NORViSCSIMaskingsRemove(const std::vector<_tag_struct_iscsi_acl_> &entries);
