/// Setting a LUN's data back to a snapshot, in the file that the LUN has: initiators keep their LUN.
///
/// A kill can cut it short, so the LUN's row says from which snapshot before the data changes, until it is whole. A LUN
/// that is found so with its lock free is set back in full before anything else is done to it.
#pragma once

#include "host/core/Lock.h"
#include "host/storage/LunStore.h"

namespace norvhost {

/// Completes the restore that the LUN's row tells of. The caller holds the LUN's lock.
int completeRestore(LunRow &row, LunLock &lock);

/// Completes an interrupted restore unless an action holds the LUN, which knows of it; failures are logged.
void mendRestore(LunRow &row);
/// Of every LUN.
int mendRestores();

} // namespace norvhost
