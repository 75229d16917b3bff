/// Control of the fake platform: its model, the journal of calls, and the script of failures and
/// answers. A test program has one platform; reset() makes it new.
#pragma once

#include "platform/dr_node.h"
#include "platform/error.h"
#include "platform/extent_pool.h"
#include "platform/iscsi_config.h"
#include "platform/iscsi_lun.h"
#include "platform/iscsi_snapshot.h"
#include "platform/iscsi_target.h"
#include "platform/replication.h"
#include "platform/virtual_lun.h"

#include <cstdint>
#include <map>
#include <set>
#include <string>
#include <utility>
#include <vector>

namespace fake {

/// What extent-pool calls answer for a LUN's map file.
struct MapFile {
    static constexpr int MISSING = NORV_ERR_FILE_NOT_FOUND; ///< what is answered when there is none

    std::string base_version = NORV_ZERO_UUID;
    std::string current_version = NORV_ZERO_UUID;
    uint64_t mapped_size = 0; ///< bytes
    uint64_t total_count = 0, synced_count = 0;
    uint64_t copied = 0, to_copy = 0; ///< of the copy that fills the file
};

struct LUN {
    static constexpr int MISSING = NORV_ERR_NO_SUCH_LUN;

    _tag_iscsi_lun_ record{};
    bool is_locked = false;
    int progress = NORV_LUN_IDLE;
    std::string health = "Healthy";
    MapFile map_file;
};

struct Snapshot {
    static constexpr int MISSING = NORV_ERR_NO_SUCH_SNAPSHOT;

    _tag_iscsi_snapshot_ record{};
    bool is_locked = false; ///< by an action
    std::set<std::string> app_keys;
    uint64_t copied = 0, to_copy = 0; ///< of the replication that fills it
};

struct Target {
    static constexpr int MISSING = NORV_ERR_NO_SUCH_TARGET;

    _tag_iscsi_target_ record{};
    std::vector<std::pair<std::string, int>> masking; ///< IQN and permission, in listing order
};

struct Job {
    std::string lun_name; ///< of a snapshot task, else empty
    int lid;              ///< of a scheduled-snapshot task, else 0
};

/// What polls are answered, one after the other; the last value stays.
template <class Value>
struct Answers {
    std::vector<Value> values;
    size_t next = 0;

    Value take()
    {
        if (values.empty())
            return Value{};
        return values[next + 1 < values.size() ? next++ : values.size() - 1];
    }
};

/// A section of a section file, its keys in the order in which they were set.
struct Section {
    std::string name;
    std::vector<std::pair<std::string, std::string>> keys;
};

struct VirtualLUN {
    static constexpr int MISSING = NORV_ERR_VLUN_UUID;

    _tag_viscsi_virtual_lun_ record{};
    Answers<_tag_viscsi_virtual_lun_stats_> stats;
};

struct Task {
    static constexpr int MISSING = NORV_ERR_NO_SUCH_TASK;

    _tag_iscsi_task_ record{};
    Answers<_tag_iscsi_task_progress_> progress;
    uint64_t unsync_size = 0; ///< bytes
};

/// What polls of a peer's LUN, snapshot or task see.
struct PeerState {
    bool is_locked = false;
    unsigned long long sync_progress = 0;
};

/// The other appliance, as its web API shows it.
struct Peer {
    std::string account = "admin", password = "peer-password", otp_code = "123456"; ///< that a log-in is let in with
    std::string token = "peer-token";                                               ///< that it is given
    std::string rod_key = "peer-rod-key";
    std::string lun_uuid = "22222222-0000-4000-8000-000000000001"; ///< of the next LUN created there
    std::string snapshot_uuid = "22222222-0000-4000-8000-000000000002";
    Answers<PeerState> states;
    std::string base_version;
    bool need_full_sync = false, not_aligned = false;
};

/// What the platform knows. Tests read it and change it as they like, into states that no call could
/// reach too.
struct Model {
    std::set<std::string> volumes = {"/volume1"};
    std::map<int, LUN> luns;
    std::map<std::pair<int, int>, Snapshot> snapshots;        ///< by LUN ID and number
    std::map<std::string, _tag_iscsi_export_config_> exports; ///< by directory
    int held_by = -1; ///< a descriptor to be read before any wait for a lock ends; -1 for none
    std::map<int, Target> targets;
    std::vector<_tag_iscsi_mapping_> mappings; ///< links unused; any target ID
    std::map<long, Job> jobs;
    std::set<std::pair<std::string, std::string>> retention_policies; ///< kind and key
    int exit_status = 0;                                              ///< of every program run
    unsigned int uuids_made = 0;

    /// Files below /usr/norv exist here only.
    std::map<std::string, std::vector<Section>> section_files;
    std::string local_node = "11111111-0000-4000-8000-000000000001";
    std::vector<NorvDRNode::DRNode> nodes; ///< in listing order, the local one too
    std::vector<NorvDRNode::DRNodeAttr> node_attributes;
    std::string rod_key = "local-rod-key";
    std::map<std::string, std::pair<unsigned int, unsigned int>> account_ids; ///< user and group
    std::set<std::string> cgi_sessions;
    std::set<std::string> missing_modules;
    std::map<std::string, VirtualLUN> virtual_luns;        ///< by UUID
    Answers<_tag_viscsi_virtual_lun_stats_> next_transfer; ///< of virtual LUNs made from now on
    std::vector<Task> tasks;                               ///< in listing order
    Peer peer;
};

Model &model();

/// Forgets everything: model, journal, script. Answers that were not freed stay counted.
void reset();

/// Where a LUN's map file is, by the platform's own naming rule.
std::string mapFilePath(const _tag_iscsi_lun_ &lun);

/// The same of a snapshot's data.
std::string dataPath(const _tag_iscsi_snapshot_ &snapshot);

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
/// progress state, a count, an exit status, a job's ID, or the outcome of a check. After the last value the model
/// speaks again.
void answer(const std::string &name, const std::vector<long> &values);

/// Waits until no detached child is left, children of children included. Returns their exit statuses,
/// 128 + n for one that signal n ended.
std::vector<int> waitForChildren();

/// Paths of the lock files that anyone holds.
std::vector<std::string> lockedFiles();

/// Answers of NORViSCSIConfGet and NORViSCSIConfTargetLoad, records of snapshot and task listings, lists and hashes of
/// texts, credentials and CGI handles that were not freed yet; the records are counted down in programs with
/// fake_process.
int unfreedAnswers();
void noteFreed(const void *memory);

} // namespace fake
