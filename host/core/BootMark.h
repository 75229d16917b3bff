/// Whether the service came up since the machine started.
#pragma once

namespace norvhost {

/// Leaves a mark in the run folder that holds until the machine starts again. 0, else an error code.
int markBooted();

bool isMarkedBooted();

} // namespace norvhost
