/// Virtual LUNs: a local LUN's data on its way to a sink LUN of another node.
#pragma once

#include "platform/sdk.h"

#include <stddef.h>
#include <stdint.h>

/// The SDK's virtual-LUN record. Owned by the caller, zeroed before every call.
typedef struct _tag_viscsi_virtual_lun_ {
    char reserved_0[8];
    int32_t src_lid; ///< LUN ID of the source LUN
    char reserved_12[5484];
    int32_t kind; ///< 1 to 3
    char reserved_5500[12];
} _tag_viscsi_virtual_lun_;

/// Counters of a transfer. The transfer is complete when both are equal and not 0.
typedef struct _tag_viscsi_virtual_lun_stats_ {
    uint64_t second; ///< bytes to move
    uint64_t first;  ///< bytes moved
    uint64_t reserved_16;
    int32_t state; ///< 0, or the errno value that ended the transfer
    uint32_t reserved_28;
} _tag_viscsi_virtual_lun_stats_;

#ifdef __cplusplus
static_assert(offsetof(_tag_viscsi_virtual_lun_, src_lid) == 8, "SDK layout");
static_assert(offsetof(_tag_viscsi_virtual_lun_, kind) == 5496, "SDK layout");
static_assert(sizeof(_tag_viscsi_virtual_lun_) == 5512, "SDK layout on every ABI: the record holds no pointer");
static_assert(offsetof(_tag_viscsi_virtual_lun_stats_, second) == 0, "SDK layout");
static_assert(offsetof(_tag_viscsi_virtual_lun_stats_, first) == 8, "SDK layout");
static_assert(offsetof(_tag_viscsi_virtual_lun_stats_, state) == 24, "SDK layout");
static_assert(sizeof(_tag_viscsi_virtual_lun_stats_) == 32, "SDK layout");
#endif

NORV_BEGIN_DECLS

// Every function below returns 0 on success, else an error code.

enum {
    NORV_VLUN_MODE_SEND = 2, ///< create mode: stream the source's data
};

/// Makes a virtual LUN over the LUN; its UUID goes into `uuid` of 37 bytes. `flags` is 0.
NORV_API int NORViSCSIVirtualLunCreate(const char *src_lun_uuid, int mode, char *uuid, int flags);

/// Removes it and ends its transfer.
NORV_API int NORViSCSIVirtualLunRemove(const char *uuid);

/// Attaches it to a sink LUN on a node and starts the transfer in the background.
NORV_API int NORViSCSIVirtualLunBindSink(const char *uuid, const char *portal, const char *node_uuid,
                                         const char *dst_lun_uuid);

/// `flags` is 0.
NORV_API int NORViSCSIVirtualLunStatsGet(const char *uuid, _tag_viscsi_virtual_lun_stats_ *stats, int flags);
NORV_API int NORViSCSIVirtualLunFillByUUID(const char *uuid, _tag_viscsi_virtual_lun_ *vlun, int flag);

NORV_END_DECLS
