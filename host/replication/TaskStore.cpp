#include "host/replication/TaskStore.h"

#include "host/core/LastError.h"
#include "host/state/Database.h"
#include "host/state/Fields.h"
#include "platform/error.h"

namespace norvhost {
namespace {

#define TASK_COLUMNS                                                                                                   \
    "uuid, is_source, src_lun, dst_lun, src_node, dst_node, root_path, parent_task, sent, total, progress, error"

TaskRow readRow(const Query &query)
{
    TaskRow row;
    _tag_iscsi_task_ &task = row.record;
    copyText(task.uuid, query.text(0));
    task.is_source = query.number(1) != 0;
    copyText(task.src_lun_uuid, query.text(2));
    copyText(task.dst_lun_uuid, query.text(3));
    copyText(task.src_node_uuid, query.text(4));
    copyText(task.dst_node_uuid, query.text(5));
    copyText(task.root_path, query.text(6));
    copyText(task.parent_task_uuid, query.text(7));
    copyText(row.progress.task_uuid, query.text(0));
    row.progress.sent_size = static_cast<uint64_t>(query.number(8));
    row.progress.send_total_size = static_cast<uint64_t>(query.number(9));
    row.progress.progress_value = static_cast<uint64_t>(query.number(10));
    row.progress.error = query.integer(11);
    return row;
}

int noSuchTask(std::string_view uuid)
{
    return fail(NORV_ERR_NO_SUCH_TASK, "there is no replication task %.*s", static_cast<int>(uuid.size()), uuid.data());
}

/// Runs a change of one task.
int change(Query &query, std::string_view uuid)
{
    if (int err = query.run())
        return err;
    return changedRows() == 1 ? 0 : noSuchTask(uuid);
}

} // namespace

int loadTask(std::string_view uuid, TaskRow &row)
{
    Query query("SELECT " TASK_COLUMNS " FROM replication_tasks WHERE uuid = ?1");
    if (!query.bind(uuid).next())
        return query.error() ? query.error() : noSuchTask(uuid);
    row = readRow(query);
    return 0;
}

int forEachTask(const std::function<int(const TaskRow &)> &visit)
{
    Query query("SELECT " TASK_COLUMNS " FROM replication_tasks ORDER BY id");
    while (query.next())
        if (int err = visit(readRow(query)))
            return err;
    return query.error();
}

int loadTaskOfSink(std::string_view lun_uuid, TaskRow &row)
{
    Query query("SELECT " TASK_COLUMNS " FROM replication_tasks WHERE dst_lun = ?1 AND NOT is_source");
    if (!query.bind(lun_uuid).next())
        return query.error() ? query.error()
                             : fail(NORV_ERR_NO_SUCH_TASK, "no replication task has the LUN as its destination");
    row = readRow(query);
    return 0;
}

int isReplicated(std::string_view lun_uuid, bool &replicated)
{
    Query query("SELECT 1 FROM replication_tasks WHERE (CASE WHEN is_source THEN src_lun ELSE dst_lun END) = ?1");
    replicated = query.bind(lun_uuid).next();
    return query.error();
}

int insertTask(const TaskRow &row)
{
    const _tag_iscsi_task_ &task = row.record;
    Query query("INSERT INTO replication_tasks (uuid, is_source, src_lun, dst_lun, src_node, dst_node, root_path,"
                " parent_task) VALUES (?1, ?2, ?3, ?4, ?5, ?6, ?7, ?8)");
    query.bind(task.uuid).bind(task.is_source != 0).bind(task.src_lun_uuid).bind(task.dst_lun_uuid);
    query.bind(task.src_node_uuid).bind(task.dst_node_uuid).bind(task.root_path).bind(task.parent_task_uuid);
    const int err = query.run();
    if (query.violates("replication_tasks.uuid"))
        return fail(NORV_ERR_TASK_UUID, "there is a replication task %s already", task.uuid);
    if (query.violates("replication_tasks.dst_lun"))
        return fail(NORV_ERR_TASK_LUN, "another replication task has the LUN %s as its destination", task.dst_lun_uuid);
    return err;
}

int updateTask(const TaskRow &row)
{
    const _tag_iscsi_task_ &task = row.record;
    Query query("UPDATE replication_tasks SET is_source = ?2, src_lun = ?3, dst_lun = ?4, src_node = ?5, dst_node = ?6"
                " WHERE uuid = ?1");
    query.bind(task.uuid).bind(task.is_source != 0).bind(task.src_lun_uuid).bind(task.dst_lun_uuid);
    query.bind(task.src_node_uuid).bind(task.dst_node_uuid);
    return change(query, task.uuid);
}

int updateProgress(const _tag_iscsi_task_progress_ &progress)
{
    Query query("UPDATE replication_tasks SET sent = ?2, total = ?3, progress = ?4, error = ?5 WHERE uuid = ?1");
    query.bind(progress.task_uuid).bind(progress.sent_size).bind(progress.send_total_size);
    query.bind(progress.progress_value).bind(progress.error);
    return change(query, progress.task_uuid);
}

int removeTask(std::string_view uuid)
{
    Query query("DELETE FROM replication_tasks WHERE uuid = ?1");
    return change(query.bind(uuid), uuid);
}

int requestStop(std::string_view task_uuid, bool stop)
{
    Query query("UPDATE replication_tasks SET stop = ?2 WHERE uuid = ?1");
    return change(query.bind(task_uuid).bind(stop), task_uuid);
}

int stopRequested(std::string_view task_uuid, bool &stop)
{
    Query query("SELECT stop FROM replication_tasks WHERE uuid = ?1");
    if (!query.bind(task_uuid).next())
        return query.error() ? query.error() : noSuchTask(task_uuid);
    stop = query.number(0) != 0;
    return 0;
}

int loadReason(std::string_view task_uuid, std::string &reason)
{
    Query query("SELECT reason FROM replication_tasks WHERE uuid = ?1");
    if (!query.bind(task_uuid).next())
        return query.error() ? query.error() : noSuchTask(task_uuid);
    reason = query.text(0);
    return 0;
}

int updateReason(std::string_view task_uuid, const std::string &reason)
{
    Query query("UPDATE replication_tasks SET reason = ?2 WHERE uuid = ?1");
    return change(query.bind(task_uuid).bind(reason), task_uuid);
}

int lockArrival(std::string_view task_uuid, NamedLock &lock)
{
    return lock.take("arrival-" + lowerCase(task_uuid));
}

int loadArrival(std::string_view task_uuid, Arrival &arrival)
{
    Query query(
        "SELECT arriving, arriving_base, arriving_on, arriving_name, arrived FROM replication_tasks WHERE uuid = ?1");
    if (!query.bind(task_uuid).next())
        return query.error() ? query.error() : noSuchTask(task_uuid);
    arrival.version = query.text(0);
    arrival.base = query.text(1);
    arrival.holding = query.text(2);
    arrival.name = query.text(3);
    arrival.offset = static_cast<uint64_t>(query.number(4));
    return 0;
}

int updateArrival(std::string_view task_uuid, const Arrival &arrival)
{
    Query query("UPDATE replication_tasks SET arriving = ?2, arriving_base = ?3, arriving_on = ?4, arrived = ?5,"
                " arriving_name = ?6 WHERE uuid = ?1");
    query.bind(task_uuid).bind(arrival.version).bind(arrival.base).bind(arrival.holding).bind(arrival.offset);
    query.bind(arrival.name);
    return change(query, task_uuid);
}

int loadUnsyncCount(std::string_view task_uuid, UnsyncCount &count)
{
    Query query("SELECT unsync_bytes, unsync_completed, unsync_error FROM replication_tasks WHERE uuid = ?1");
    if (!query.bind(task_uuid).next())
        return query.error() ? query.error() : noSuchTask(task_uuid);
    count.bytes = static_cast<uint64_t>(query.number(0));
    count.completed = query.number(1) != 0;
    count.error = query.integer(2);
    return 0;
}

int updateUnsyncCount(std::string_view task_uuid, const UnsyncCount &count)
{
    Query query("UPDATE replication_tasks SET unsync_bytes = ?2, unsync_completed = ?3, unsync_error = ?4"
                " WHERE uuid = ?1");
    return change(query.bind(task_uuid).bind(count.bytes).bind(count.completed).bind(count.error), task_uuid);
}

} // namespace norvhost
