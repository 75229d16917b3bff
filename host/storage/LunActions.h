/// How actions on LUNs begin.
#pragma once

#include "host/core/Lock.h"
#include "host/storage/LunStore.h"
#include "platform/iscsi_lun.h"

#include <functional>

namespace norvhost {

/// Locks the caller's LUN, then reads its row: what the caller's record says may be old. What a killed action left is
/// put right first, as far as that can be done now (see requireWhole). NORV_ERR_LUN_LOCKED; by its record, also while a
/// peer writes to it.
int lockLun(const _tag_iscsi_lun_ *lun, int action, LunLock &lock, LunRow &row);
int lockLun(int lid, int action, LunLock &lock, LunRow &row);

/// For an action that reads the LUN's data: a code when an interrupted restore could not be completed.
int requireWhole(LunRow &row, LunLock &lock);

/// Makes a LUN as checkNewLun() found it: picks and locks its ID, makes its data by `make_data`, adds its row. Fills in
/// LUN ID and UUID. After a failure nothing of it is left. The lock is held on return.
int addLun(LunRow &row, int action, LunLock &lock, const std::function<int(const LunRow &)> &make_data);

} // namespace norvhost
