/// Control of the fake platform: its model, the journal of calls, and the script of failures and
/// answers. A test program has one platform; reset() makes it new.
#pragma once

#include "platform/extent_pool.h"
#include "platform/iscsi_config.h"
#include "platform/iscsi_lun.h"
#include "platform/iscsi_target.h"

#include <cstdint>
#include <map>
#include <set>
#include <string>
#include <utility>
#include <vector>

namespace fake {

/// What extent-pool calls answer for a LUN's map file.
struct MapFile {
    std::string base_version = NORV_ZERO_UUID;
    std::string current_version = NORV_ZERO_UUID;
    uint64_t mapped_size = 0; ///< bytes
    uint64_t total_count = 0, synced_count = 0;
    uint64_t copied = 0, to_copy = 0; ///< of the copy that fills the file
};

struct LUN {
    _tag_iscsi_lun_ record{};
    bool is_loaded = true;
    bool is_locked = false;
    int progress = NORV_LUN_IDLE;
    std::string health = "Healthy";
    MapFile map_file;
};

struct Target {
    _tag_iscsi_target_ record{};
    std::vector<std::pair<std::string, int>> masking; ///< IQN and permission, in listing order
};

struct Job {
    std::string lun_name; ///< of a snapshot task, else empty
    int lid;              ///< of a scheduled-snapshot task, else 0
};

/// What the platform knows. Tests read it and change it as they like, into states that no call could
/// reach too.
struct Model {
    std::set<std::string> volumes = {"/volume1"};
    std::map<int, LUN> luns;
    std::map<int, Target> targets;
    std::vector<_tag_iscsi_mapping_> mappings; ///< links unused; any target ID
    std::map<long, Job> jobs;
    std::set<std::pair<std::string, std::string>> retention_policies; ///< kind and key
    int exit_status = 0;                                              ///< of every program run
    unsigned int uuids_made = 0;
};

Model &model();

/// Forgets everything: model, journal, script. Answers that were not freed stay counted.
void reset();

/// Where a LUN's map file is, by the platform's own naming rule.
std::string mapFilePath(const _tag_iscsi_lun_ &lun);

/// A call as it was made: the function and its key arguments, separated by ", ".
struct Call {
    std::string name;
    std::string arguments;
};

/// Every call since reset() or forgetCalls(), by this process and its children.
std::vector<Call> calls();

/// Empties the journal, and with it the script, whose numbers count calls.
void forgetCalls();

/// Makes the n-th call from now on (counted from 1, over all functions or of one) return `value` and
/// do nothing else.
void failCall(uint32_t n, long value);
void failCall(const std::string &name, uint32_t n, long value);

/// Makes the next calls of a function answer these values instead of the model's: the lock flag, the
/// progress state, a count, an exit status, or a job's ID. After the last value the model speaks again.
void answer(const std::string &name, const std::vector<long> &values);

/// Answers of NORViSCSIConfGet and NORViSCSIConfTargetLoad that were not freed yet.
int unfreedAnswers();

} // namespace fake
