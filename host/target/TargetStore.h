/// Rows of targets, mappings and masking in the state store.
#pragma once

#include "host/target/Masking.h"
#include "platform/iscsi_masking.h"
#include "platform/iscsi_target.h"

#include <map>
#include <string>
#include <string_view>
#include <vector>

namespace norvhost {

/// What the target's initiators see of one LUN, or of one snapshot that is loaded.
struct MappedLun {
    int lid = 0;
    int index = 0; ///< the LUN number
    int type = 0;
    std::string uuid;
    uint64_t size = 0;
    std::string path;       ///< of the data
    bool shown = false;     ///< loaded and not in the trash
    bool read_only = false; ///< for everybody: a snapshot
};

struct Mapping {
    int tid = 0;
    int lid = 0;
    int index = 0;
};

// Each returns 0 or an error code. Outputs are set on success only; what does not exist is
// NORV_ERR_NO_SUCH_TARGET for the functions that load or change one target.

int loadTarget(int tid, _tag_iscsi_target_ &target);
int loadTargetByName(std::string_view name, _tag_iscsi_target_ &target);
/// By its normal name.
int loadTargetByIqn(const std::string &iqn, _tag_iscsi_target_ &target);
/// Ascending by ID.
int loadTargets(std::vector<_tag_iscsi_target_> &targets);

/// Adds a row under the lowest free ID: NORV_ERR_MAX_TARGETS, NORV_ERR_TARGET_NAME and
/// NORV_ERR_TARGET_IQN for one that another target bears.
int insertTarget(_tag_iscsi_target_ &target);
/// With its mappings and masking.
int deleteTarget(int tid);
int setTargetEnabled(int tid, bool enabled);

/// Ascending by LUN number, with the loaded snapshots of these LUNs behind them.
int loadMappedLuns(int tid, std::vector<MappedLun> &luns);
/// Ascending by target ID.
int loadMappingsOfLun(int lid, std::vector<Mapping> &mappings);
/// Maps under the lowest LUN number from 1 that neither another LUN of the target nor a loaded snapshot has.
int insertMapping(int tid, int lid);
/// NORV_ERR_NO_SUCH_MAPPING when there is none.
int deleteMapping(int tid, int lid);

/// The entries as they were given, the default entry included.
int loadMaskingEntries(int tid, std::vector<_tag_struct_iscsi_acl_> &entries);
int loadMasking(int tid, Masking &masking);
int storeMaskingEntry(const _tag_struct_iscsi_acl_ &entry);
int deleteMaskingEntry(int tid, std::string_view iqn);

/// CHAP users of all targets and open sinks, in either direction, with their secrets.
int loadUsers(std::map<std::string, std::string> &users);

} // namespace norvhost
