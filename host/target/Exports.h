/// What the running iSCSI service shows of a LUN. Call without an open transaction.
#pragma once

#include <functional>

namespace norvhost {

/// Makes the daemons that run show what the store says about the LUN: whether it is there, and its data.
/// A daemon that does not run is no failure: it learns all of it at its start.
int syncLunExports(int lid);

/// Runs `grow`, which grows the data and stores the new size, and makes the running units show that
/// size. Commands of initiators, those under way included, see no failure. A failure of `grow` is
/// returned and changes nothing; after any other failure the next command or start brings the size.
int resizeLunExports(int lid, const std::function<int()> &grow);

/// NORV_ERR_LUN_LOCKED while a peer writes to the LUN, a sink. One that its peer left open is closed.
int refuseOpenSink(int lid);

} // namespace norvhost
