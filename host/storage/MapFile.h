/// Where the data of LUNs and snapshots lies: the one place that knows the names of files and folders.
#pragma once

#include "platform/iscsi_lun.h"
#include "platform/iscsi_snapshot.h"

#include <string>
#include <string_view>

namespace norvhost {

/// The folders of a volume that hold LUNs in use, snapshots in use, and LUNs and snapshots in the trash.
constexpr const char *data_folder = "@iSCSITrg";
constexpr const char *snapshot_folder = "@Snapshot";
constexpr const char *trash_folder = "@EP_trash";

/// What the readers of these names reserve for them, the NUL included.
constexpr size_t map_file_path_size = 320;
constexpr size_t map_file_name_size = 256;

inline bool isBlock(int type)
{
    return type == NORV_LUN_TYPE_BLOCK;
}
inline bool isExtentPool(int type)
{
    return (type & NORV_LUN_EXTENT_POOL_BITS) == NORV_LUN_EXTENT_POOL_BITS;
}
/// Allocated in full; every other kind of file is sparse.
inline bool isFullyAllocated(int type)
{
    return type == NORV_LUN_TYPE_FILE;
}
/// Files that share blocks with others when they are cloned: not those allocated in full, whose space is promised.
inline bool isSparse(int type)
{
    return (type & NORV_LUN_TYPE_THIN) == NORV_LUN_TYPE_THIN;
}
inline bool isInTrash(const _tag_iscsi_lun_ &lun)
{
    return lun.options & NORV_LUN_OPTION_TRASH;
}
inline bool isInTrash(const _tag_iscsi_snapshot_ &snapshot)
{
    return snapshot.flags & NORV_SNAPSHOT_TRASH;
}

/// "iSCSI_<lid>_Extent_<name>_<zeros>" for extent-pool kinds, "iSCSI_<lid>_<name>_<zeros>" for others.
std::string mapFileName(const _tag_iscsi_lun_ &lun);

/// The folder of the LUN's map file, as its trash option says.
std::string mapFileFolder(const _tag_iscsi_lun_ &lun);

/// The file with the LUN's data, or the device itself for a BLOCK LUN.
std::string dataPath(const _tag_iscsi_lun_ &lun);

/// Where an import makes the LUN's new file, before it takes the place of the old one. No LUN can have this name.
std::string importPath(const _tag_iscsi_lun_ &lun);

/// Whether this is a map file's name, and of which LUN ID.
bool parseMapFileName(std::string_view file_name, int &lid);

/// "SNAPSHOT_L<lid>_S<number>_<name>", a folder of its own for each snapshot.
std::string snapshotFolderName(const _tag_iscsi_snapshot_ &snapshot);

/// Its path, in the folder that the snapshot's trash flag says.
std::string snapshotFolder(const _tag_iscsi_snapshot_ &snapshot);

/// The file in it that holds the snapshot's data.
std::string snapshotDataPath(const _tag_iscsi_snapshot_ &snapshot);
std::string snapshotDataPath(const std::string &folder);

/// Whether this is a snapshot folder's name, and of which LUN ID.
bool parseSnapshotFolderName(std::string_view folder_name, int &lid);

} // namespace norvhost
