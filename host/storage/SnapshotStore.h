/// Rows of snapshots in the state store.
#pragma once

#include "platform/iscsi_snapshot.h"

#include <cstdint>
#include <functional>
#include <string>
#include <string_view>
#include <vector>

namespace norvhost {

/// LUN numbers of loaded snapshots: the first ones are below 256, which every initiator reaches, and they end where
/// SCSI's flat numbering does. LUNs get the lowest free ones from 1, and no number that a loaded snapshot has.
constexpr int first_loaded_number = 128;
constexpr int last_loaded_number = 0x3fff;

struct SnapshotRow {
    _tag_iscsi_snapshot_ record = {}; ///< without the status, which is not stored
    int loaded_number = 0;            ///< the LUN number under which initiators read it, 0 while they may not
};

// Each returns 0, NORV_ERR_NO_SUCH_SNAPSHOT or another error code. Outputs are written on success only.

int loadSnapshotByUuid(std::string_view uuid, SnapshotRow &row);
int loadSnapshotByName(int lid, std::string_view name, SnapshotRow &row);

/// Shows the snapshots taken at `since` or later, of one LUN or with `lid` 0 of all, by LUN ID and number. A visitor's
/// code other than 0 ends it.
int forEachSnapshot(int lid, int64_t since, const std::function<int(const SnapshotRow &)> &visit);
/// The loaded ones of the LUNs that are mapped to a target, by LUN number.
int forEachLoadedSnapshot(int tid, const std::function<int(const SnapshotRow &)> &visit);
int loadSnapshotsOfLun(int lid, std::vector<SnapshotRow> &rows);

/// The lowest number that the LUN has no snapshot under: NORV_ERR_MAX_SNAPSHOTS when there is none.
int findFreeSnapshotId(int lid, int &snap_id);

/// The name that the peer of a replication gave its snapshot of the state that arrived at the LUN last; empty for none.
int loadArrivedName(std::string_view lun_uuid, std::string &name);

/// The lowest of them that neither a loaded snapshot nor a LUN in any target has: NORV_ERR_MAX_SNAPSHOTS when there is
/// none.
int findFreeLoadedNumber(int &number);

/// NORV_ERR_SNAPSHOT_NAME when another snapshot of the LUN bears the name.
int insertSnapshot(const SnapshotRow &row);

/// Stores name, description, flags, user lock and loaded number.
int updateSnapshot(const SnapshotRow &row);

/// Removes the row: NORV_ERR_SNAPSHOT_USER_LOCKED and NORV_ERR_SNAPSHOT_LOCKED (application keys) while somebody wants
/// it kept, or while a restore depends on it.
int removeSnapshot(std::string_view uuid);
/// All of a LUN's or, when one of them is to be kept, none. For the caller's transaction.
int removeSnapshotsOfLun(int lid);

/// Ascending.
int loadAppKeys(std::string_view uuid, std::vector<std::string> &keys);
/// Idempotent. NORV_ERR_APP_KEY when the snapshot has as many as its readers have room for.
int addAppKey(std::string_view uuid, std::string_view key);
int removeAppKey(std::string_view uuid, std::string_view key);

} // namespace norvhost
