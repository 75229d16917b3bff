/// Making the daemons what the store says.
///
/// Callers hold the service lock. All functions are idempotent: they compare what a daemon shows with
/// what the store says and send the difference. 0, NORV_ERR_START_SERVICE when a daemon does not run,
/// or another error code; the daemons may then be anywhere in between.
#pragma once

#include "host/target/Tgtd.h"

#include <vector>

namespace norvhost {

/// These targets, on one daemon.
int reconcileTargets(const Tgtd &daemon, const std::vector<int> &tids);

/// Every target of one daemon.
int reconcileDaemon(const Tgtd &daemon);

} // namespace norvhost
