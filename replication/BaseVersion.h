/// Choosing what a sending starts from. No I/O.
#pragma once

#include "iscsiwebapi/ISCSISnapshotInfo.h"

#include <map>
#include <optional>
#include <string>
#include <vector>

namespace ISCSI::LIB::LIBReplication {

struct Base {
    std::string version; ///< of the snapshot that both sides hold; empty for none
    bool need_full_sync = false;
    bool not_aligned = false; ///< the destination has to be set back to that snapshot first
    std::string restore_uuid; ///< then: the destination's own snapshot with that version
};

using SnapshotsByVersion = std::map<std::string, ISCSISnapshotInfo>;

/// The base that the destination LUN's own data is: none at all before the first sending, the version
/// it holds unchanged, or the one that a failed sending started from. No value: its snapshots decide.
std::optional<Base> baseOfLUN(const SnapshotsByVersion &source, const std::string &lun_base, bool is_modified,
                              bool is_sending_failed);

/// The newest of the destination's snapshots (newest first) that the source holds too.
Base baseOfSnapshots(const SnapshotsByVersion &source, const std::vector<ISCSISnapshotInfo> &destination);

} // namespace ISCSI::LIB::LIBReplication
