/// Snapshot folders: what is done to the files behind a snapshot. The state's rows are the callers' matter.
#pragma once

#include "host/core/FileDescriptor.h"
#include "host/core/Lock.h"
#include "host/storage/LunStore.h"
#include "platform/iscsi_snapshot.h"

#include <functional>
#include <string>

namespace norvhost {

/// Makes the snapshot's folder with the LUN's data of now: the file in it appears only complete and durable. Fills in
/// version and mapped size. NORV_ERR_FILE_EXISTS when the folder's name is taken.
int createSnapshotData(const LunRow &lun, _tag_iscsi_snapshot_ &snapshot, LunLock &action);

/// Renames the folder; when `commit` fails it gets the old name back.
int moveSnapshotData(const _tag_iscsi_snapshot_ &from, const _tag_iscsi_snapshot_ &to,
                     const std::function<int()> &commit);

/// Removes a snapshot folder durably. Files in it that are not ours stay, and the folder with them.
int removeSnapshotFolder(const std::string &folder);

/// As removeSnapshotFolder(), for a snapshot without a row: what cannot be removed now is logged, and the next sweep
/// removes it.
void dropSnapshotData(const _tag_iscsi_snapshot_ &snapshot);

/// 0 when the snapshot's data is there and whole: NORV_ERR_FILE_NOT_FOUND, NORV_ERR_BAD_FILE_TYPE, NORV_ERR_LUN_SIZE.
int checkSnapshotData(const _tag_iscsi_snapshot_ &snapshot);

/// Opens the data read-only, after checkSnapshotData().
int openSnapshotData(const _tag_iscsi_snapshot_ &snapshot, FileDescriptor &file);

/// Whether files of the folder that holds this file or folder can be removed: NORV_ERR_NO_PERMISSION, also for a
/// read-only volume. For what is there no more it is 0.
int checkRemovable(const std::string &path);

} // namespace norvhost
