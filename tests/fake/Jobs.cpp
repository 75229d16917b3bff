// Scheduled jobs and retention policies on the fake's model.
#include "platform/error.h"
#include "platform/retention.h"
#include "platform/schedule.h"
#include "tests/fake/Script.h"

#include <algorithm>
#include <cstdlib>
#include <vector>

using namespace fake;

namespace {

constexpr long NO_JOB = -1;

template <class Test>
long findJob(Test test)
{
    for (const auto &[id, job] : model().jobs) {
        if (test(job))
            return id;
    }
    return NO_JOB;
}

} // namespace

long NORViSCSILunTaskGetSchIDByName(const char *lun_name)
{
    NOTE_CALL(lun_name);
    return answerOf(__func__, findJob([&](const Job &job) { return job.lun_name == lun_name; }));
}

long ScheduleSnapshotTaskGetIDByLid(int lid)
{
    NOTE_CALL(lid);
    return answerOf(__func__, findJob([&](const Job &job) { return job.lid == lid; }));
}

int NORVSchedTaskRemove(long id)
{
    NOTE_CALL(id);
    return model().jobs.erase(id) == 1 ? 0 : -1;
}

int NORVRETENTIONRemovePolicy(const char *kind, const char *key)
{
    NOTE_CALL(kind, key);
    model().retention_policies.erase({kind, key});
    return 0;
}

int NORVRETENTIONRunPolicy(const char *kind, const char *key, NORV_RETENTION_TARGET_GET get,
                           NORV_RETENTION_TARGET_DELETE remove, int flags)
{
    const bool has_hooks =
        get == NORVRETAINERiSCSIRetentionTargetGet && remove == NORVRETAINERiSCSIRetentionTargetDelete;
    NOTE_CALL(kind, key, has_hooks ? "snapshot hooks" : "other hooks", flags);
    if (model().retention_policies.count({kind, key}) == 0)
        return 0;
    std::vector<_tag_retention_target_> targets;
    _tag_retention_target_ *list = nullptr;
    get(key, &list);
    while (_tag_retention_target_ *target = list) {
        targets.push_back(*target);
        list = target->next;
        free(target);
    }
    std::sort(targets.begin(), targets.end(), [](const auto &a, const auto &b) { return a.time > b.time; });
    for (size_t i = 1; i < targets.size(); ++i) { // every policy keeps the newest
        if (!targets[i].protected_)
            remove(key, &targets[i]);
    }
    return 0;
}

int NORVRETAINERiSCSIRetentionTargetGet(const char *key, _tag_retention_target_ **targets)
{
    NOTE_CALL(key);
    *targets = nullptr;
    for (const auto &[place, snapshot] : model().snapshots) {
        if (std::to_string(place.first) != key)
            continue;
        auto *target = static_cast<_tag_retention_target_ *>(calloc(1, sizeof(_tag_retention_target_)));
        put(target->uuid, textOf(snapshot.record.uuid));
        target->time = snapshot.record.snap_time;
        target->protected_ = snapshot.record.user_locked || snapshot.is_locked || !snapshot.app_keys.empty();
        target->next = *targets;
        *targets = target;
    }
    return 0;
}

int NORVRETAINERiSCSIRetentionTargetDelete(const char *key, const _tag_retention_target_ *target)
{
    NOTE_CALL(key, target->uuid);
    const auto is_meant = [&](const auto &record) { return strcmp(record.uuid, target->uuid) == 0; };
    if (const Snapshot *known = firstOf(model().snapshots, is_meant))
        model().snapshots.erase({known->record.lid, known->record.snap_id});
    return 0;
}
