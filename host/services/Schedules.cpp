#include "host/services/Schedules.h"

#include "host/core/LastError.h"
#include "host/core/Process.h"
#include "host/services/Events.h"
#include "host/services/ScheduleRule.h"
#include "host/state/Database.h"
#include "host/storage/LunStore.h"
#include "platform/error.h"
#include "platform/event_log.h"
#include "platform/iscsi_lun.h"
#include "platform/schedule.h"

#include <ctime>
#include <syslog.h>

namespace norvhost {
namespace {

/// Taking a snapshot is a matter of seconds; a hanging one must not keep the other jobs from running.
constexpr int run_limit_seconds = 600;

#define SCHEDULE_COLUMNS "schedules.id, kind, lid, luns.name, rule, next_run, last_run"

iscsihost::Schedule readRow(const Query &query)
{
    iscsihost::Schedule schedule;
    schedule.id = query.number(0);
    schedule.kind = query.text(1);
    schedule.lid = query.integer(2);
    schedule.lun_name = query.text(3);
    schedule.rule = query.text(4);
    schedule.next_run = query.number(5);
    schedule.last_run = query.number(6);
    return schedule;
}

int loadSnapshotSchedules(std::vector<iscsihost::Schedule> &schedules)
{
    Query query("SELECT " SCHEDULE_COLUMNS " FROM schedules JOIN luns USING (lid) "
                "WHERE kind = ?1 AND (luns.options & ?2) = 0 ORDER BY schedules.id");
    query.bind(snapshot_schedule).bind(static_cast<int>(NORV_LUN_OPTION_TRASH));
    while (query.next())
        schedules.push_back(readRow(query));
    return query.error();
}

long idOrNone(Query &query)
{
    return query.next() ? static_cast<long>(query.number(0)) : -1;
}

int parsedNextRun(const iscsihost::Schedule &schedule, int64_t now, int64_t &next)
{
    ScheduleRule rule;
    if (int err = parseScheduleRule(schedule.rule, rule))
        return err;
    const auto time = nextRun(rule, schedule.next_run, now);
    if (!time)
        return fail(NORV_ERR_BAD_PARAMETER, "the time '%s' never comes", schedule.rule.c_str());
    next = *time;
    return 0;
}

int storeTimes(const iscsihost::Schedule &schedule)
{
    Query query("UPDATE schedules SET next_run = ?2, last_run = ?3 WHERE id = ?1");
    return query.bind(schedule.id).bind(schedule.next_run).bind(schedule.last_run).run();
}

int takeSnapshot(const iscsihost::Schedule &schedule)
{
    LunRow lun;
    if (int err = loadLunByLid(schedule.lid, lun))
        return err;
    ProgramRun run;
    run.arguments = {"iscsictl", "snapshot", "take", lun.record.uuid, "--scheduled", "--taken-by", "schedule"};
    run.timeout_seconds = run_limit_seconds;
    ProgramResult result;
    if (int err = runProgram(run, result))
        return err;
    if (result.status == 0)
        return 0;
    const std::string reason = lastLine(result.errors);
    return fail(NORV_ERR_UNKNOWN, "%s",
                reason.empty() ? ("iscsictl ended with " + std::to_string(result.status)).c_str() : reason.c_str());
}

} // namespace

int addSchedule(std::string_view kind, int lid, std::string_view rule, int64_t &id)
{
    if (kind != backup_schedule && kind != snapshot_schedule)
        return fail(NORV_ERR_BAD_PARAMETER, "a schedule's kind is '%s' or '%s'", backup_schedule, snapshot_schedule);
    const int64_t now = time(nullptr);
    iscsihost::Schedule schedule;
    schedule.rule = rule;
    schedule.next_run = now; // what an interval is counted from
    if (int err = parsedNextRun(schedule, now, schedule.next_run))
        return err;
    Query query("INSERT INTO schedules (kind, lid, rule, next_run) VALUES (?1, ?2, ?3, ?4)");
    const int err = query.bind(kind).bind(lid).bind(rule).bind(schedule.next_run).run();
    if (query.violatesReference())
        return fail(NORV_ERR_NO_SUCH_LUN, "there is no LUN %d", lid);
    if (query.violates("schedules.lid"))
        return fail(NORV_ERR_FILE_EXISTS, "LUN %d has a schedule of this kind already", lid);
    if (err)
        return err;
    id = lastInsertId();
    return 0;
}

int listSchedules(std::vector<iscsihost::Schedule> &schedules)
{
    std::vector<iscsihost::Schedule> found;
    Query query("SELECT " SCHEDULE_COLUMNS " FROM schedules JOIN luns USING (lid) ORDER BY schedules.id");
    while (query.next())
        found.push_back(readRow(query));
    if (query.error())
        return query.error();
    schedules = std::move(found);
    return 0;
}

int removeSchedule(int64_t id)
{
    Query query("DELETE FROM schedules WHERE id = ?1");
    if (int err = query.bind(id).run())
        return err;
    return changedRows() != 0 ? 0
                              : fail(NORV_ERR_BAD_PARAMETER, "there is no schedule %lld", static_cast<long long>(id));
}

int claimDueSchedules(int64_t now, std::vector<iscsihost::Schedule> &due)
{
    Transaction transaction;
    if (transaction.error())
        return transaction.error();
    std::vector<iscsihost::Schedule> schedules, claimed;
    if (int err = loadSnapshotSchedules(schedules))
        return err;
    for (iscsihost::Schedule &schedule : schedules) {
        int64_t next = 0;
        if (parsedNextRun(schedule, now, next) != 0) {
            syslog(LOG_WARNING, "schedule %lld: %s", static_cast<long long>(schedule.id), lastError());
            continue;
        }
        // A next run that is further away than the rule says was stored under another clock or time zone, or, as 0,
        // by an older version.
        const bool is_due = schedule.next_run != 0 && schedule.next_run <= now;
        if (next == schedule.next_run)
            continue;
        schedule.next_run = next;
        if (is_due)
            schedule.last_run = now;
        if (int err = storeTimes(schedule))
            return err;
        if (is_due)
            claimed.push_back(schedule);
    }
    if (int err = transaction.commit())
        return err;
    due = std::move(claimed);
    return 0;
}

int runDueSchedules(std::vector<iscsihost::ScheduleRun> &runs)
{
    std::vector<iscsihost::Schedule> due;
    if (int err = claimDueSchedules(time(nullptr), due))
        return err;
    runs.clear();
    int first = 0;
    for (const iscsihost::Schedule &schedule : due) {
        const int err = takeSnapshot(schedule);
        runs.push_back({schedule, err, err ? lastError() : ""});
        if (err)
            NORVLogSet1(9, 3, scheduled_snapshot_failed, schedule.lun_name.c_str(), runs.back().reason.c_str(), nullptr,
                        nullptr);
        if (!first)
            first = err;
    }
    return first;
}

} // namespace norvhost

using namespace norvhost;

long NORViSCSILunTaskGetSchIDByName(const char *lun_name)
{
    if (!lun_name)
        return -1;
    Query query("SELECT schedules.id FROM schedules JOIN luns USING (lid) WHERE luns.name = ?1 AND kind = ?2");
    return idOrNone(query.bind(lun_name).bind(backup_schedule));
}

long ScheduleSnapshotTaskGetIDByLid(int lid)
{
    Query query("SELECT id FROM schedules WHERE lid = ?1 AND kind = ?2");
    return idOrNone(query.bind(lid).bind(snapshot_schedule));
}

int NORVSchedTaskRemove(long id)
{
    return removeSchedule(id) == 0 ? 0 : -1;
}
