/// Rows of LUNs in the state store.
#pragma once

#include "platform/iscsi_lun.h"

#include <functional>
#include <string>
#include <string_view>
#include <vector>

namespace norvhost {

struct LunRow {
    _tag_iscsi_lun_ record = {};
    bool loaded = true;         ///< wanted in the running iSCSI service
    std::string restoring_uuid; ///< the snapshot that an unfinished restore sets the data back to, empty for none
};

// Each returns 0, NORV_ERR_NO_SUCH_LUN or another error code. `row` is written on success only.
int loadLunByLid(int lid, LunRow &row);
int loadLunByUuid(std::string_view uuid, LunRow &row);
int loadLunByName(std::string_view name, LunRow &row);

/// Shows every LUN, ascending by ID; there are at most NORV_LUN_ID_MAX.
int forEachLun(const std::function<void(const LunRow &)> &visit);

/// Targets that the LUN is mapped to.
int countMappings(int lid, int &count);

/// Whether initiators may be using the LUN: it is mapped and loaded.
int isInUse(const LunRow &row, bool &in_use);

/// Adds a row: NORV_ERR_LUN_NAME_EXISTS when another LUN bears the name, NORV_ERR_LUN_LOCATION when the volume was
/// removed meanwhile or another LUN has the device.
int insertLun(const LunRow &row);

/// Stores name, size, options and loaded mark of an existing row: NORV_ERR_LUN_NAME_EXISTS as above.
/// With the trash option newly set, NORV_ERR_LUN_MAPPED while it is mapped.
int updateLun(const LunRow &row);

/// Stores the kind of an existing row.
int updateLunType(int lid, int type);

/// Removes the row with the LUN's snapshots, schedules and retention policy; NORV_ERR_LUN_MAPPED while it is mapped,
/// NORV_ERR_LUN_LOCKED while a virtual LUN is over it, and the codes of removeSnapshot() while one of its snapshots is
/// locked.
int removeLun(int lid);

/// The beginning and the end of a restore. An empty UUID takes the mark back.
int markRestore(int lid, std::string_view snapshot_uuid);
int endRestore(int lid, int64_t time);
/// LUNs that are being restored now or whose restore was interrupted.
int loadInterruptedRestores(std::vector<LunRow> &rows);

/// A new random UUID.
std::string newUuid();

} // namespace norvhost
