#include "host/services/Retention.h"

#include "host/core/LastError.h"
#include "host/core/Lock.h"
#include "host/state/Database.h"
#include "platform/error.h"
#include "platform/retention.h"

#include <algorithm>
#include <cstdlib>
#include <ctime>
#include <memory>
#include <syslog.h>

namespace norvhost {
namespace {

/// Deletes what the policy does not keep, the oldest first; goes on after a failure, whose code is returned.
int deleteExpired(const char *key, const std::vector<const _tag_retention_target_ *> &targets,
                  const std::vector<RetentionDecision> &decisions, NORV_RETENTION_TARGET_DELETE remove)
{
    std::vector<const _tag_retention_target_ *> expired;
    for (size_t i = 0; i < targets.size(); ++i)
        if (!decisions[i].kept)
            expired.push_back(targets[i]);
    std::sort(expired.begin(), expired.end(), [](const auto *a, const auto *b) { return a->time < b->time; });
    int first = 0;
    for (const _tag_retention_target_ *target : expired) {
        const int err = remove(key, target);
        if (err)
            syslog(LOG_WARNING, "retention could not delete %s: %s", target->uuid, lastError());
        if (!first)
            first = err;
    }
    return first;
}

int runPolicy(const char *kind, const char *key, NORV_RETENTION_TARGET_GET get, NORV_RETENTION_TARGET_DELETE remove)
{
    bool found;
    RetentionPolicy policy;
    if (int err = loadRetentionPolicy(kind, key, found, policy))
        return err;
    if (!found)
        return 0;
    // One run at a time: two that list the same things would both want to delete them.
    NamedLock running;
    if (int err = running.take("retention"))
        return err;
    _tag_retention_target_ *list = nullptr;
    const int err = get(key, &list);
    const RetentionTargets owner(list);
    if (err)
        return err;
    std::vector<const _tag_retention_target_ *> targets;
    std::vector<RetentionCandidate> candidates;
    for (const _tag_retention_target_ *target = list; target; target = target->next) {
        targets.push_back(target);
        candidates.push_back({target->time, target->protected_ ? "locked" : ""});
    }
    return deleteExpired(key, targets, decideRetention(candidates, policy, time(nullptr)), remove);
}

} // namespace

int setRetentionPolicy(std::string_view kind, std::string_view key, const RetentionPolicy &policy)
{
    if (int err = checkRetention(policy))
        return err;
    const std::string text = retentionText(policy);
    Query query("INSERT INTO retention_policies (kind, key, policy) VALUES (?1, ?2, ?3) "
                "ON CONFLICT (kind, key) DO UPDATE SET policy = excluded.policy");
    return query.bind(kind).bind(key).bind(text).run();
}

int loadRetentionPolicy(std::string_view kind, std::string_view key, bool &found, RetentionPolicy &policy)
{
    Query query("SELECT policy FROM retention_policies WHERE kind = ?1 AND key = ?2");
    found = query.bind(kind).bind(key).next();
    if (query.error())
        return query.error();
    return found ? parseRetention(query.text(0), policy) : 0;
}

int removeRetentionPolicy(std::string_view kind, std::string_view key)
{
    Query query("DELETE FROM retention_policies WHERE kind = ?1 AND key = ?2");
    return query.bind(kind).bind(key).run();
}

} // namespace norvhost

using namespace norvhost;

int NORVRETENTIONRemovePolicy(const char *kind, const char *key)
{
    return kind && key && removeRetentionPolicy(kind, key) == 0 ? 0 : -1;
}

int NORVRETENTIONRunPolicy(const char *kind, const char *key, NORV_RETENTION_TARGET_GET get,
                           NORV_RETENTION_TARGET_DELETE remove, int)
{
    if (!kind || !key || !get || !remove) {
        fail(NORV_ERR_NULL_POINTER, "no kind, key or function to run a retention policy with");
        return -1;
    }
    return runPolicy(kind, key, get, remove) == 0 ? 0 : -1;
}
