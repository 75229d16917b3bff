/// Map files: the files that hold the data of LUNs, their allocation and their versions.
///
/// A version is a UUID text. The base version names the last state received in full from a peer,
/// the current version the state now; they differ while data arrives and after a local write. A
/// file that never received anything has the all-zero UUID as its base.
#pragma once

#include "platform/sdk.h"

#include <stddef.h>
#include <stdint.h>

#define NORV_ZERO_UUID "00000000-0000-0000-0000-000000000000"

typedef struct _tag_map_file_version_ {
    char reserved_0[78];
    char base_version[37];
    char current_version[37];
    char reserved_152[4];
} _tag_map_file_version_;

#ifdef __cplusplus
static_assert(offsetof(_tag_map_file_version_, base_version) == 78, "SDK layout");
static_assert(offsetof(_tag_map_file_version_, current_version) == 115, "SDK layout");
static_assert(sizeof(_tag_map_file_version_) == 156, "SDK layout");
#endif

NORV_BEGIN_DECLS

// Every function below returns 0 on success, else an error code; outputs are set on success only.

/// Bytes allocated to the map file on the volume at `location`.
NORV_API int NORVExtentPoolMapFileMappedSizeGet(const char *path, const char *location, uint64_t *size);

/// `version` takes 37 bytes, its NUL included.
NORV_API int NORVExtentPoolMapFileBaseVersionGet(const char *path, char *version);
NORV_API int NORVExtentPoolMapFileVersionInfoGet(const char *path, _tag_map_file_version_ *info);

/// Units that the sending in progress, or the last one, has to move, and has moved.
NORV_API int NORVExtentPoolMapFileTotalCountGet(const char *path, uint64_t *count);
NORV_API int NORVExtentPoolMapFileSyncedCountGet(const char *path, uint64_t *count);

/// Progress of the copy that fills a map file, or the snapshot in a folder: bytes done and bytes in all.
NORV_API int NORViSCSIChildLunSyncProgressGet(const char *path, uint64_t *done, uint64_t *total);

/// This appliance's ROD key, the secret that lets two appliances exchange data, into `key` of `size`
/// bytes.
NORV_API int NORVExtentPoolRODKeyGet(char *key, int size);

NORV_END_DECLS
