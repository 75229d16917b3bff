#include "host/storage/SnapshotStore.h"

#include "host/core/LastError.h"
#include "host/state/Database.h"
#include "host/state/Fields.h"
#include "platform/error.h"

namespace norvhost {
namespace {

/// Room of the lists that callers pass.
constexpr int most_app_keys = 512;

#define SNAPSHOT_COLUMNS                                                                                               \
    "lid, snap_id, uuid, name, description, taken_by, version, create_time, snap_time, flags, app_consistent, "        \
    "user_locked, total_size, mapped_size, loaded_number"

#define SELECT_SNAPSHOTS                                                                                               \
    "SELECT s.lid, s.snap_id, s.uuid, s.name, s.description, s.taken_by, s.version, s.create_time, s.snap_time, "      \
    "s.flags, s.app_consistent, s.user_locked, s.total_size, s.mapped_size, s.loaded_number, l.location "              \
    "FROM snapshots s JOIN luns l ON l.lid = s.lid "

void readRow(const Query &query, SnapshotRow &row)
{
    row = SnapshotRow();
    _tag_iscsi_snapshot_ &snapshot = row.record;
    snapshot.lid = query.integer(0);
    snapshot.snap_id = query.integer(1);
    copyText(snapshot.uuid, query.text(2));
    copyText(snapshot.name, query.text(3));
    copyText(snapshot.desc, query.text(4));
    copyText(snapshot.taken_by, query.text(5));
    copyText(snapshot.version, query.text(6));
    snapshot.create_time = query.integer(7);
    snapshot.snap_time = query.integer(8);
    snapshot.flags = static_cast<uint32_t>(query.number(9));
    snapshot.app_consistent = query.integer(10) != 0;
    snapshot.user_locked = query.integer(11) != 0;
    snapshot.total_size = static_cast<uint64_t>(query.number(12));
    snapshot.mapped_size = static_cast<uint64_t>(query.number(13));
    row.loaded_number = query.integer(14);
    copyText(snapshot.root_path, query.text(15));
}

int readOnlyRow(Query &query, const std::string &selector, SnapshotRow &row)
{
    if (!query.next())
        return query.error() ? query.error()
                             : fail(NORV_ERR_NO_SUCH_SNAPSHOT, "there is no snapshot %s", selector.c_str());
    readRow(query, row);
    return 0;
}

int visitRows(Query &query, const std::function<int(const SnapshotRow &)> &visit)
{
    SnapshotRow row;
    while (query.next()) {
        readRow(query, row);
        if (int err = visit(row))
            return err;
    }
    return query.error();
}

Query &bindLoadedNumber(Query &query, int number)
{
    return number ? query.bind(number) : query.bindNull();
}

/// For one snapshot by its UUID, or with an empty UUID for all of a LUN.
int refuseKept(int lid, std::string_view uuid)
{
    Query query("SELECT s.name, s.user_locked, (SELECT key FROM snapshot_app_keys k WHERE k.uuid = s.uuid LIMIT 1), "
                "l.restoring_uuid = s.uuid FROM snapshots s JOIN luns l ON l.lid = s.lid "
                "WHERE s.lid = ?1 AND (?2 = '' OR s.uuid = ?2) ORDER BY s.snap_id");
    query.bind(lid).bind(uuid);
    while (query.next()) {
        const std::string name(query.text(0)), key(query.text(2));
        if (query.integer(1))
            return fail(NORV_ERR_SNAPSHOT_USER_LOCKED, "the snapshot '%s' is locked by its user", name.c_str());
        if (!query.isNull(2))
            return fail(NORV_ERR_SNAPSHOT_LOCKED, "the snapshot '%s' is locked by the application key '%s'",
                        name.c_str(), key.c_str());
        if (query.integer(3) && !uuid.empty())
            return fail(NORV_ERR_SNAPSHOT_LOCKED, "an unfinished restore depends on the snapshot '%s'", name.c_str());
    }
    return query.error();
}

/// The lowest number from `number` on that the query, ascending, does not return.
int lowestFree(Query &query, int &number)
{
    while (query.next() && query.integer(0) == number)
        ++number;
    return query.error();
}

int nameTaken(const SnapshotRow &row)
{
    return fail(NORV_ERR_SNAPSHOT_NAME, "another snapshot of the LUN is named '%s'", row.record.name);
}

} // namespace

int loadSnapshotByUuid(std::string_view uuid, SnapshotRow &row)
{
    const std::string lower_case = lowerCase(uuid);
    Query query(SELECT_SNAPSHOTS "WHERE s.uuid = ?1");
    return readOnlyRow(query.bind(lower_case), "with the UUID '" + lower_case + "'", row);
}

int loadSnapshotByName(int lid, std::string_view name, SnapshotRow &row)
{
    Query query(SELECT_SNAPSHOTS "WHERE s.lid = ?1 AND s.name = ?2");
    const std::string selector = "of LUN " + std::to_string(lid) + " with the name '" + std::string(name) + "'";
    return readOnlyRow(query.bind(lid).bind(name), selector, row);
}

int forEachSnapshot(int lid, int64_t since, const std::function<int(const SnapshotRow &)> &visit)
{
    // In two texts, for an index to serve each.
    Query query(lid ? SELECT_SNAPSHOTS "WHERE s.lid = ?2 AND s.snap_time >= ?1 ORDER BY s.lid, s.snap_id"
                    : SELECT_SNAPSHOTS "WHERE s.snap_time >= ?1 ORDER BY s.lid, s.snap_id");
    query.bind(since);
    if (lid)
        query.bind(lid);
    return visitRows(query, visit);
}

int forEachLoadedSnapshot(int tid, const std::function<int(const SnapshotRow &)> &visit)
{
    Query query(SELECT_SNAPSHOTS "JOIN mappings m ON m.lid = s.lid "
                                 "WHERE m.tid = ?1 AND s.loaded_number IS NOT NULL ORDER BY s.loaded_number");
    return visitRows(query.bind(tid), visit);
}

int loadSnapshotsOfLun(int lid, std::vector<SnapshotRow> &rows)
{
    std::vector<SnapshotRow> found;
    if (int err = forEachSnapshot(lid, INT64_MIN, [&](const SnapshotRow &row) { return found.push_back(row), 0; }))
        return err;
    rows = std::move(found);
    return 0;
}

int findFreeSnapshotId(int lid, int &snap_id)
{
    Query query("SELECT snap_id FROM snapshots WHERE lid = ?1 ORDER BY snap_id");
    int free_id = 1;
    if (int err = lowestFree(query.bind(lid), free_id))
        return err;
    if (free_id > NORV_SNAPSHOT_ID_MAX)
        return fail(NORV_ERR_MAX_SNAPSHOTS, "the LUN has %d snapshots: that is the most", NORV_SNAPSHOT_ID_MAX);
    snap_id = free_id;
    return 0;
}

int findFreeLoadedNumber(int &number)
{
    Query query("SELECT loaded_number FROM snapshots WHERE loaded_number IS NOT NULL "
                "UNION SELECT mapping_index FROM mappings WHERE mapping_index >= ?1 ORDER BY 1");
    int free_number = first_loaded_number;
    if (int err = lowestFree(query.bind(first_loaded_number), free_number))
        return err;
    if (free_number > last_loaded_number)
        return fail(NORV_ERR_MAX_SNAPSHOTS, "%d snapshots are loaded: that is the most",
                    last_loaded_number - first_loaded_number + 1);
    number = free_number;
    return 0;
}

int loadArrivedName(std::string_view lun_uuid, std::string &name)
{
    Query query("SELECT arriving_name FROM replication_tasks WHERE dst_lun = ?1 AND NOT is_source");
    std::string found;
    if (query.bind(lun_uuid).next())
        found = query.text(0);
    if (!query.error())
        name = found;
    return query.error();
}

int insertSnapshot(const SnapshotRow &row)
{
    const _tag_iscsi_snapshot_ &snapshot = row.record;
    Query query("INSERT INTO snapshots (" SNAPSHOT_COLUMNS
                ") VALUES (?1, ?2, ?3, ?4, ?5, ?6, ?7, ?8, ?9, ?10, ?11, ?12, ?13, ?14, ?15)");
    query.bind(snapshot.lid).bind(snapshot.snap_id).bind(snapshot.uuid).bind(snapshot.name).bind(snapshot.desc);
    query.bind(snapshot.taken_by).bind(snapshot.version).bind(snapshot.create_time).bind(snapshot.snap_time);
    query.bind(snapshot.flags).bind(snapshot.app_consistent != 0).bind(snapshot.user_locked != 0);
    query.bind(snapshot.total_size).bind(snapshot.mapped_size);
    if (int err = bindLoadedNumber(query, row.loaded_number).run())
        return query.violates("snapshots.name") ? nameTaken(row) : err;
    return 0;
}

int updateSnapshot(const SnapshotRow &row)
{
    const _tag_iscsi_snapshot_ &snapshot = row.record;
    Query query("UPDATE snapshots SET name = ?2, description = ?3, flags = ?4, user_locked = ?5, loaded_number = ?6 "
                "WHERE uuid = ?1");
    query.bind(snapshot.uuid).bind(snapshot.name).bind(snapshot.desc).bind(snapshot.flags);
    if (int err = bindLoadedNumber(query.bind(snapshot.user_locked != 0), row.loaded_number).run())
        return query.violates("snapshots.name") ? nameTaken(row) : err;
    return 0;
}

int removeSnapshot(std::string_view uuid)
{
    Transaction transaction;
    if (transaction.error())
        return transaction.error();
    SnapshotRow row;
    if (int err = loadSnapshotByUuid(uuid, row))
        return err;
    if (int err = refuseKept(row.record.lid, row.record.uuid))
        return err;
    Query query("DELETE FROM snapshots WHERE uuid = ?1");
    if (int err = query.bind(row.record.uuid).run())
        return err;
    return transaction.commit();
}

int removeSnapshotsOfLun(int lid)
{
    if (int err = refuseKept(lid, ""))
        return err;
    Query query("DELETE FROM snapshots WHERE lid = ?1");
    return query.bind(lid).run();
}

int loadAppKeys(std::string_view uuid, std::vector<std::string> &keys)
{
    std::vector<std::string> found;
    Query query("SELECT key FROM snapshot_app_keys WHERE uuid = ?1 ORDER BY key");
    query.bind(uuid);
    while (query.next())
        found.emplace_back(query.text(0));
    if (query.error())
        return query.error();
    keys = std::move(found);
    return 0;
}

int addAppKey(std::string_view uuid, std::string_view key)
{
    Transaction transaction;
    if (transaction.error())
        return transaction.error();
    Query query("INSERT OR IGNORE INTO snapshot_app_keys (uuid, key) VALUES (?1, ?2)");
    if (int err = query.bind(uuid).bind(key).run())
        return err;
    Query count("SELECT count(*) FROM snapshot_app_keys WHERE uuid = ?1");
    if (!count.bind(uuid).next())
        return count.error();
    if (count.integer(0) > most_app_keys)
        return fail(NORV_ERR_APP_KEY, "%d application keys lock the snapshot: that is the most", most_app_keys);
    return transaction.commit();
}

int removeAppKey(std::string_view uuid, std::string_view key)
{
    Query query("DELETE FROM snapshot_app_keys WHERE uuid = ?1 AND key = ?2");
    return query.bind(uuid).bind(key).run();
}

} // namespace norvhost
