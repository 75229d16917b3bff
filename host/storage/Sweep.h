/// Putting right what a killed process left behind.
///
/// Only map files and snapshot folders in their folders of mounted volumes are looked at, each under its LUN's lock, so
/// that no creation or move in progress is disturbed. One goes only when it provably is ours and nobody's: it bears
/// this store's mark and no row has its UUID, it is a second name of a LUN's file, or it is a snapshot folder without
/// any file. What lacks our mark (another store's, or this one's after its state was lost) is reported and stays.
#pragma once

#include <string>
#include <vector>

namespace norvhost {

struct SweepResult {
    std::vector<std::string> removed; ///< files of no LUN
    std::vector<std::string> mended;  ///< files that got back the name that their LUN's row says
    std::vector<std::string> foreign; ///< map files that belong to no LUN and are not ours to remove
    std::vector<std::string> failed;  ///< reasons why something could not be done
};

/// Sweeps all mounted volumes and completes interrupted restores.
int sweepVolumes(SweepResult &result);

/// Sweeps what belongs to one LUN ID, whose lock the caller holds.
int sweepLun(int lid);

} // namespace norvhost
