/// Opening the data of a unit anew while initiators use it.
#pragma once

#include "host/target/Tgtd.h"
#include "platform/iscsi_target.h"

#include <string>

namespace norvhost {

/// Makes tgtd open `path` for the unit, so that it shows the size that the data has now. Initiators
/// notice nothing: their commands wait in the daemon for the moment that it takes. After a failure the
/// unit shows what it showed; NORV_ERR_TIMEOUT when commands did not finish in time.
///
/// tgtd closes the old descriptor before it opens the new one; a command that its worker threads start
/// in between would fail, or worse. So no command may run meanwhile. A session of our own holds them back:
/// a command with the attribute "head of queue" stops the unit's queue until its answer has been sent
/// off, and ours never is, because it stands behind pings whose answers we do not read. Whatever ends
/// this process closes the session, and the queue goes on.
int reopenUnit(const Tgtd &daemon, const _tag_iscsi_target_ &target, uint64_t lun, const std::string &path);

} // namespace norvhost
