/// The scheduler: looking up and removing the jobs of a LUN.
#pragma once

#include "platform/sdk.h"

NORV_BEGIN_DECLS

/// The ID of the schedule of the named LUN's snapshot task, -1 for none.
NORV_API long NORViSCSILunTaskGetSchIDByName(const char *lun_name);

/// The ID of the scheduled-snapshot task of the LUN with this ID, -1 for none.
NORV_API long ScheduleSnapshotTaskGetIDByLid(int lid);

/// Removes a job. 0 on success, negative on failure, an unknown ID included.
NORV_API int NORVSchedTaskRemove(long id);

NORV_END_DECLS
