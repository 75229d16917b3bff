/// The system event log: what administrators read of finished and failed actions.
#pragma once

#include "iscsihost/host.h"

namespace norvhost {

/// An event of this platform's own, above the numbers of the snapshot family that its callers use.
constexpr unsigned scheduled_snapshot_failed = 0x13d000f1;

/// Older events go when newer ones come.
constexpr int64_t kept_events = 10000;

/// As iscsihost::listEvents().
int listEvents(int64_t since, int64_t count, std::vector<iscsihost::Event> &events);

} // namespace norvhost
