/// How actions on snapshots begin.
#pragma once

#include "host/core/Lock.h"
#include "host/storage/LunStore.h"
#include "host/storage/SnapshotStore.h"

namespace norvhost {

/// The row of the caller's record, which may be old.
int loadCallersSnapshot(const _tag_iscsi_snapshot_ *snapshot, SnapshotRow &row);

/// Locks the caller's snapshot, then reads its row. NORV_ERR_SNAPSHOT_LOCKED.
int lockSnapshot(const _tag_iscsi_snapshot_ *snapshot, int action, SnapshotLock &lock, SnapshotRow &row);

/// As lockSnapshot(), with its LUN locked first. NORV_ERR_LUN_LOCKED.
struct LockedSnapshot {
    LunLock lun_lock;
    SnapshotLock lock;
    LunRow lun;
    SnapshotRow row;

    int take(const _tag_iscsi_snapshot_ *snapshot, int action);
};

} // namespace norvhost
