/// One change of targets, mappings or masking: in the store and in the daemons, or in neither.
#pragma once

#include "host/target/ServiceLock.h"

#include <functional>
#include <vector>

namespace norvhost {

/// Runs `rows`, which changes rows and names the targets it touched, in one transaction; brings the
/// daemons to the new rows and commits. After a failure rows and daemons are as before.
/// NORV_ERR_START_SERVICE, before anything is changed, when a daemon does not run.
int changeTargets(const std::function<int(std::vector<int> &tids)> &rows);

/// The same for what must be possible without daemons: rows are committed first, and a daemon that does not run learns
/// of them at its start. A failure of `rows` changes nothing; after any other the daemons follow at the next change.
int changeRunning(const std::function<int(std::vector<int> &tids)> &rows);

/// The second half of such a change: brings the daemons that run to the rows and takes the mark away. `was_marked` says
/// that they differed before, so that everything is to be looked at.
int reconcileRunning(const ServiceLock &lock, bool was_marked, const std::vector<int> &tids);

} // namespace norvhost
