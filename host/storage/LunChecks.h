/// What a LUN or a snapshot may be: names, kinds, sizes and places that this platform accepts.
#pragma once

#include "platform/iscsi_lun.h"
#include "platform/iscsi_snapshot.h"

#include <string>
#include <string_view>

namespace norvhost {

/// 1 to 255 bytes of valid UTF-8: letters, digits, non-ASCII letters, space inside, and . _ - : @ + = ( ). Not "."
/// or "..", not the shape of a UUID. NORV_ERR_LUN_NAME with what is wrong.
int checkLunName(std::string_view name);

/// The same rules; and the path of the snapshot's folder in its root path fits its readers, whatever its number.
/// NORV_ERR_SNAPSHOT_NAME.
int checkSnapshotName(const _tag_iscsi_snapshot_ &snapshot);

/// The longest snapshot name on a volume, in bytes.
size_t snapshotNameRoom(const std::string &root_path);

/// Whether the LUN's map file can be named and reached by its readers, whatever its ID.
int checkMapFileLength(const _tag_iscsi_lun_ &lun);

/// At least 1 MiB, whole 512-byte blocks, below 2^63: NORV_ERR_LUN_SIZE.
int checkLunSize(uint64_t size);

/// The texts of a caller's record end within their fields.
int checkTerminated(const _tag_iscsi_lun_ &lun);
int checkTerminated(const _tag_iscsi_snapshot_ &snapshot);

/// Everything about a LUN to be made, its volume included. Sets the size of a BLOCK LUN to its device's, and the
/// extent size of an extent-pool LUN that asks for none to the volume's block size.
int checkNewLun(_tag_iscsi_lun_ &lun);

} // namespace norvhost
