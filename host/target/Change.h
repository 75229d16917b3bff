/// One change of targets, mappings or masking: in the store and in the daemons, or in neither.
#pragma once

#include <functional>
#include <vector>

namespace norvhost {

/// Runs `rows`, which changes rows and names the targets it touched, in one transaction; brings the
/// daemons to the new rows and commits. After a failure rows and daemons are as before.
/// NORV_ERR_START_SERVICE, before anything is changed, when a daemon does not run.
int changeTargets(const std::function<int(std::vector<int> &tids)> &rows);

} // namespace norvhost
