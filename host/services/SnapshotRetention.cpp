/// Retention of a LUN's snapshots: what they are to a policy, and the hooks that a run of it calls.
#include "host/core/LastError.h"
#include "host/services/Retention.h"
#include "platform/error.h"
#include "platform/iscsi_snapshot.h"
#include "platform/retention.h"

#include <algorithm>
#include <charconv>
#include <cstdlib>
#include <ctime>
#include <memory>

namespace norvhost {
namespace {

/// A LUN's snapshot, as retention sees it.
struct Snapshot {
    std::string uuid;
    int id = 0;
    std::string name;
    RetentionCandidate candidate;
};

/// What NORViSCSISnapshotConfLoad appends to; frees the records.
struct SnapshotList : _tag_iscsi_snapshot_list_ {
    SnapshotList() : _tag_iscsi_snapshot_list_{} {}
    SnapshotList(const SnapshotList &) = delete;
    SnapshotList &operator=(const SnapshotList &) = delete;
    ~SnapshotList()
    {
        while (first) {
            _tag_iscsi_snapshot_ *const next = first->next;
            free(first);
            first = next;
        }
    }
};

/// Why nobody may delete the snapshot, empty when everybody may.
int describeLock(const _tag_iscsi_snapshot_ &snapshot, std::string &lock)
{
    lock.clear();
    if (snapshot.user_locked)
        lock = "locked by the user";
    const std::unique_ptr<NLIBC_SZ_LIST, void (*)(NLIBC_SZ_LIST *)> keys(NLIBCSzListAlloc(16), NLIBCSzListFree);
    if (!keys)
        return NORV_ERR_OUT_OF_MEMORY;
    if (int err = NORViSCSISnapshotLockedAppKeysGet(&snapshot, keys.get()))
        return err;
    for (int i = 0; i < keys->count; ++i)
        lock += (lock.empty() ? "locked by " : ", ") + std::string(NLIBCSzListGet(keys.get(), i));
    bool busy;
    if (int err = NORViSCSIIsSnapshotLocked(&snapshot, &busy))
        return err;
    if (busy)
        lock += std::string(lock.empty() ? "" : ", ") + "in use by an action";
    return 0;
}

/// The snapshots of a LUN, ascending by their numbers. Those in the trash are not retention's.
int loadSnapshots(int lid, std::vector<Snapshot> &snapshots)
{
    _tag_iscsi_snapshot_query_ query = {};
    query.query_flags = NORV_SNAPSHOT_QUERY_LID;
    query.query_lid = lid;
    SnapshotList list;
    if (int err = NORViSCSISnapshotConfLoad(&query, &list))
        return err;
    for (const _tag_iscsi_snapshot_ *record = list.first; record; record = record->next) {
        if (record->flags & NORV_SNAPSHOT_TRASH)
            continue;
        Snapshot snapshot = {record->uuid, record->snap_id, record->name, {record->snap_time, {}}};
        if (int err = describeLock(*record, snapshot.candidate.lock))
            return err;
        snapshots.push_back(std::move(snapshot));
    }
    return 0;
}

/// Of two with the same time the one with the higher number is taken for the newer; see decideRetention().
std::vector<RetentionDecision> decide(const std::vector<Snapshot> &snapshots, const RetentionPolicy &policy)
{
    std::vector<RetentionCandidate> candidates;
    for (const Snapshot &snapshot : snapshots)
        candidates.push_back(snapshot.candidate);
    return decideRetention(candidates, policy, time(nullptr));
}

int parseLunKey(const char *key, int &lid)
{
    const std::string_view text = key ? key : "";
    const auto [rest, error] = std::from_chars(text.data(), text.data() + text.size(), lid);
    if (error != std::errc() || rest != text.data() + text.size() || lid < 1 || lid > NORV_LUN_ID_MAX)
        return fail(NORV_ERR_LUN_ID, "'%s' is no LUN ID", key ? key : "");
    return 0;
}

} // namespace

int tryRetention(int lid, const RetentionPolicy *policy, std::vector<iscsihost::RetentionVerdict> &verdicts)
{
    RetentionPolicy stored;
    bool found = policy != nullptr;
    if (!policy)
        if (int err = loadRetentionPolicy(lun_retention_kind, std::to_string(lid), found, stored))
            return err;
    if (policy)
        if (int err = checkRetention(*policy))
            return err;
    std::vector<Snapshot> snapshots;
    if (int err = loadSnapshots(lid, snapshots))
        return err;
    const std::vector<RetentionDecision> decisions =
        found ? decide(snapshots, policy ? *policy : stored)
              : std::vector<RetentionDecision>(snapshots.size(), {true, "the LUN has no retention policy"});

    std::vector<iscsihost::RetentionVerdict> result;
    for (size_t i = snapshots.size(); i-- > 0;) {
        const Snapshot &snapshot = snapshots[i];
        result.push_back({snapshot.uuid, snapshot.id, snapshot.name, snapshot.candidate.time, decisions[i].kept,
                          decisions[i].reason});
    }
    std::stable_sort(result.begin(), result.end(), [](const auto &a, const auto &b) { return a.time > b.time; });
    verdicts = std::move(result);
    return 0;
}

} // namespace norvhost

using namespace norvhost;

int NORVRETAINERiSCSIRetentionTargetGet(const char *key, _tag_retention_target_ **targets)
{
    if (!targets)
        return fail(NORV_ERR_NULL_POINTER, "no place for a list of snapshots");
    int lid = 0;
    if (int err = parseLunKey(key, lid))
        return err;
    std::vector<Snapshot> snapshots;
    if (int err = loadSnapshots(lid, snapshots))
        return err;
    RetentionTargets list;
    for (auto snapshot = snapshots.rbegin(); snapshot != snapshots.rend(); ++snapshot) {
        auto *target = static_cast<_tag_retention_target_ *>(calloc(1, sizeof(_tag_retention_target_)));
        if (!target)
            return fail(NORV_ERR_OUT_OF_MEMORY, "no memory for a list of snapshots");
        snapshot->uuid.copy(target->uuid, sizeof target->uuid - 1);
        target->time = static_cast<long>(snapshot->candidate.time);
        target->protected_ = !snapshot->candidate.lock.empty();
        target->next = list.release();
        list.reset(target);
    }
    *targets = list.release();
    return 0;
}

int NORVRETAINERiSCSIRetentionTargetDelete(const char *, const _tag_retention_target_ *target)
{
    if (!target)
        return fail(NORV_ERR_NULL_POINTER, "no snapshot to delete");
    _tag_iscsi_snapshot_ snapshot = {};
    const int err = NORViSCSISnapshotConfGetByUUID(target->uuid, &snapshot);
    if (err == NORV_ERR_NO_SUCH_SNAPSHOT)
        return 0; // somebody was faster
    return err ? err : NORViSCSISnapshotDelete(&snapshot, "retention");
}
