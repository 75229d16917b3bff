/// Making one file's data that of another.
#pragma once

#include "host/storage/LunStore.h"

#include <functional>

namespace norvhost {

/// Makes `to` begin with all of `from`'s data, in blocks that both share until either is written: at one point in time,
/// whoever is writing to `from`, and without copying. A longer `to` keeps its size and what it has behind. `shared` is
/// false, and nothing changed, where the file system cannot. After a failure `to` may hold parts of both.
int shareBlocks(int from, int to, bool &shared);

/// Hears how far a copy is, 0 to 100; a code other than 0 ends it.
using CopyProgress = std::function<int(int percent)>;

/// The same by copying what is not a hole.
int copySparsely(int from, int to, const CopyProgress &progress);

/// shareBlocks() between a LUN's data and a file of the same volume, in either direction, or copySparsely() where that
/// cannot be; then it is refused while initiators may use the LUN, with NORV_ERR_LUN_MAPPED and nothing changed.
int cloneLunData(const LunRow &lun, int from, int to, const CopyProgress &progress);

} // namespace norvhost
