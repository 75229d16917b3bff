/// The paths under which tgtd opens the data of LUNs: links in the run folder.
///
/// tgtd splits its requests at commas and cuts long paths, and data paths may be long and hold commas;
/// a link's name never does. It also holds the LUN's size, so that the path that a daemon tells says
/// with which size it opened the data.
#pragma once

#include "host/target/TargetStore.h"

#include <string>

namespace norvhost {

/// The link's path for the LUN as the store has it.
std::string exportLink(const MappedLun &lun);

/// Makes the link lead to the LUN's data.
int placeExportLink(const MappedLun &lun);

/// Removes every link that no mapped LUN has.
int removeUnusedExportLinks();

} // namespace norvhost
