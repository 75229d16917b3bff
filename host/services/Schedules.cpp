#include "host/services/Schedules.h"

#include "host/core/LastError.h"
#include "host/state/Database.h"
#include "platform/error.h"
#include "platform/schedule.h"

namespace norvhost {
namespace {

long idOrNone(Query &query)
{
    return query.next() ? static_cast<long>(query.number(0)) : -1;
}

} // namespace

int addSchedule(std::string_view kind, int lid, std::string_view rule, int64_t &id)
{
    if (kind != backup_schedule && kind != snapshot_schedule)
        return fail(NORV_ERR_BAD_PARAMETER, "a schedule's kind is '%s' or '%s'", backup_schedule, snapshot_schedule);
    Query query("INSERT INTO schedules (kind, lid, rule) VALUES (?1, ?2, ?3)");
    const int err = query.bind(kind).bind(lid).bind(rule).run();
    if (query.violatesReference())
        return fail(NORV_ERR_NO_SUCH_LUN, "there is no LUN %d", lid);
    if (query.violates("schedules.lid"))
        return fail(NORV_ERR_FILE_EXISTS, "LUN %d has a schedule of this kind already", lid);
    if (err)
        return err;
    id = lastInsertId();
    return 0;
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
    Query query("DELETE FROM schedules WHERE id = ?1");
    if (query.bind(id).run() != 0)
        return -1;
    if (changedRows() != 0)
        return 0;
    fail(NORV_ERR_BAD_PARAMETER, "there is no schedule %ld", id);
    return -1;
}
