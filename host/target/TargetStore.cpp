#include "host/target/TargetStore.h"

#include "host/core/LastError.h"
#include "host/state/Database.h"
#include "host/storage/LunStore.h"
#include "host/storage/MapFile.h"
#include "host/storage/SnapshotStore.h"
#include "host/target/Name.h"
#include "host/target/Sinks.h"
#include "platform/error.h"

#include <algorithm>
#include <cstring>

namespace norvhost {
namespace {

#define TARGET_COLUMNS                                                                                                 \
    "tid, name, iqn, enabled, header_digest, data_digest, max_recv_seg_bytes, max_send_seg_bytes, max_sessions, "      \
    "auth_type, user, password, mutual_user, mutual_password"

template <size_t size>
void copyText(char (&field)[size], std::string_view text)
{
    const size_t length = std::min(text.size(), size - 1);
    memcpy(field, text.data(), length);
    field[length] = '\0';
}

_tag_iscsi_target_ readTarget(const Query &query)
{
    _tag_iscsi_target_ target = {};
    target.tid = query.integer(0);
    copyText(target.name, query.text(1));
    copyText(target.iqn, query.text(2));
    target.enabled = query.integer(3) != 0;
    target.header_digest = query.integer(4) != 0;
    target.data_digest = query.integer(5) != 0;
    target.max_recv_seg_bytes = static_cast<uint32_t>(query.number(6));
    target.max_send_seg_bytes = static_cast<uint32_t>(query.number(7));
    target.max_sessions = static_cast<uint32_t>(query.number(8));
    target.auth_type = static_cast<uint32_t>(query.number(9));
    copyText(target.user, query.text(10));
    copyText(target.password, query.text(11));
    copyText(target.mutual_user, query.text(12));
    copyText(target.mutual_password, query.text(13));
    return target;
}

int readOnlyTarget(Query &query, const char *selector, std::string_view value, _tag_iscsi_target_ &target)
{
    if (!query.next())
        return query.error() ? query.error()
                             : fail(NORV_ERR_NO_SUCH_TARGET, "there is no target with the %s '%.*s'", selector,
                                    static_cast<int>(value.size()), value.data());
    target = readTarget(query);
    return 0;
}

int noSuchTarget(int tid)
{
    return fail(NORV_ERR_NO_SUCH_TARGET, "there is no target with the ID '%d'", tid);
}

/// The lowest number from 1 that the query, ascending, does not return.
int lowestFree(Query &query, int &number)
{
    number = 1;
    while (query.next() && query.integer(0) == number)
        ++number;
    return query.error();
}

} // namespace

int loadTarget(int tid, _tag_iscsi_target_ &target)
{
    Query query("SELECT " TARGET_COLUMNS " FROM targets WHERE tid = ?1");
    return readOnlyTarget(query.bind(tid), "ID", std::to_string(tid), target);
}

int loadTargetByName(std::string_view name, _tag_iscsi_target_ &target)
{
    Query query("SELECT " TARGET_COLUMNS " FROM targets WHERE name = ?1");
    return readOnlyTarget(query.bind(name), "name", name, target);
}

int loadTargetByIqn(const std::string &iqn, _tag_iscsi_target_ &target)
{
    Query query("SELECT " TARGET_COLUMNS " FROM targets WHERE iqn = ?1");
    return readOnlyTarget(query.bind(iqn), "IQN", iqn, target);
}

int loadTargets(std::vector<_tag_iscsi_target_> &targets)
{
    std::vector<_tag_iscsi_target_> found;
    Query query("SELECT " TARGET_COLUMNS " FROM targets ORDER BY tid");
    while (query.next())
        found.push_back(readTarget(query));
    if (query.error())
        return query.error();
    targets = std::move(found);
    return 0;
}

int insertTarget(_tag_iscsi_target_ &target)
{
    int tid;
    Query taken("SELECT tid FROM targets ORDER BY tid");
    if (int err = lowestFree(taken, tid))
        return err;
    if (tid > NORV_TARGET_ID_MAX)
        return fail(NORV_ERR_MAX_TARGETS, "there are %d targets: that is the most", NORV_TARGET_ID_MAX);

    Query query("INSERT INTO targets (" TARGET_COLUMNS
                ") VALUES (?1, ?2, ?3, ?4, ?5, ?6, ?7, ?8, ?9, ?10, ?11, ?12, ?13, ?14)");
    query.bind(tid).bind(target.name).bind(target.iqn).bind(target.enabled != 0);
    query.bind(target.header_digest != 0).bind(target.data_digest != 0);
    query.bind(target.max_recv_seg_bytes).bind(target.max_send_seg_bytes).bind(target.max_sessions);
    query.bind(target.auth_type).bind(target.user).bind(target.password);
    if (int err = query.bind(target.mutual_user).bind(target.mutual_password).run()) {
        if (query.violates("targets.name"))
            return fail(NORV_ERR_TARGET_NAME, "another target is named '%s'", target.name);
        if (query.violates("targets.iqn"))
            return fail(NORV_ERR_TARGET_IQN, "another target has the IQN '%s'", target.iqn);
        return err;
    }
    target.tid = tid;
    return 0;
}

int deleteTarget(int tid)
{
    Query query("DELETE FROM targets WHERE tid = ?1");
    if (int err = query.bind(tid).run())
        return err;
    return changedRows() > 0 ? 0 : noSuchTarget(tid);
}

int setTargetEnabled(int tid, bool enabled)
{
    Query query("UPDATE targets SET enabled = ?1 WHERE tid = ?2");
    if (int err = query.bind(enabled).bind(tid).run())
        return err;
    return changedRows() > 0 ? 0 : noSuchTarget(tid);
}

int loadMappedLuns(int tid, std::vector<MappedLun> &luns)
{
    std::vector<Mapping> mappings;
    {
        Query query("SELECT lid, mapping_index FROM mappings WHERE tid = ?1 ORDER BY mapping_index");
        query.bind(tid);
        while (query.next())
            mappings.push_back({tid, query.integer(0), query.integer(1)});
        if (query.error())
            return query.error();
    }
    std::vector<MappedLun> found;
    for (const Mapping &mapping : mappings) {
        LunRow row;
        if (int err = loadLunByLid(mapping.lid, row))
            return err;
        found.push_back({mapping.lid, mapping.index, row.record.type, row.record.uuid, row.record.size,
                         dataPath(row.record), row.loaded && !isInTrash(row.record), false});
    }
    const auto add_snapshot = [&](const SnapshotRow &row) {
        const _tag_iscsi_snapshot_ &snapshot = row.record;
        // Whoever writes its LUN, a snapshot is for all to read: a kind that both daemons show.
        found.push_back({snapshot.lid, row.loaded_number, NORV_LUN_TYPE_ADV, snapshot.uuid, snapshot.total_size,
                         snapshotDataPath(snapshot), true, true});
        return 0;
    };
    if (int err = forEachLoadedSnapshot(tid, add_snapshot))
        return err;
    luns = std::move(found);
    return 0;
}

int loadMappingsOfLun(int lid, std::vector<Mapping> &mappings)
{
    std::vector<Mapping> found;
    Query query("SELECT tid, mapping_index FROM mappings WHERE lid = ?1 ORDER BY tid");
    query.bind(lid);
    while (query.next())
        found.push_back({query.integer(0), lid, query.integer(1)});
    if (query.error())
        return query.error();
    mappings = std::move(found);
    return 0;
}

int insertMapping(int tid, int lid)
{
    int index;
    {
        Query taken("SELECT mapping_index FROM mappings WHERE tid = ?1 "
                    "UNION SELECT loaded_number FROM snapshots WHERE loaded_number IS NOT NULL ORDER BY 1");
        if (int err = lowestFree(taken.bind(tid), index))
            return err;
    }
    Query query("INSERT INTO mappings (tid, lid, mapping_index) VALUES (?1, ?2, ?3)");
    return query.bind(tid).bind(lid).bind(index).run();
}

int deleteMapping(int tid, int lid)
{
    Query query("DELETE FROM mappings WHERE tid = ?1 AND lid = ?2");
    if (int err = query.bind(tid).bind(lid).run())
        return err;
    return changedRows() > 0 ? 0 : fail(NORV_ERR_NO_SUCH_MAPPING, "LUN %d is not mapped to target %d", lid, tid);
}

int loadMaskingEntries(int tid, std::vector<_tag_struct_iscsi_acl_> &entries)
{
    std::vector<_tag_struct_iscsi_acl_> found;
    Query query("SELECT iqn, permission FROM maskings WHERE tid = ?1 ORDER BY iqn");
    query.bind(tid);
    while (query.next()) {
        _tag_struct_iscsi_acl_ entry = {};
        entry.tid = tid;
        copyText(entry.iqn, query.text(0));
        entry.permission = query.integer(1);
        found.push_back(entry);
    }
    if (query.error())
        return query.error();
    entries = std::move(found);
    return 0;
}

int loadMasking(int tid, Masking &masking)
{
    std::vector<_tag_struct_iscsi_acl_> entries;
    if (int err = loadMaskingEntries(tid, entries))
        return err;
    masking = Masking();
    for (const _tag_struct_iscsi_acl_ &entry : entries) {
        std::string name;
        if (strcmp(entry.iqn, NORV_DEFAULT_MASKING_IQN) == 0)
            masking.others = entry.permission;
        else if (normaliseName(entry.iqn, name))
            masking.named[name] = entry.permission;
    }
    return 0;
}

int storeMaskingEntry(const _tag_struct_iscsi_acl_ &entry)
{
    Query query("INSERT INTO maskings (tid, iqn, permission) VALUES (?1, ?2, ?3) "
                "ON CONFLICT (tid, iqn) DO UPDATE SET permission = excluded.permission");
    return query.bind(entry.tid).bind(entry.iqn).bind(entry.permission).run();
}

int deleteMaskingEntry(int tid, std::string_view iqn)
{
    Query query("DELETE FROM maskings WHERE tid = ?1 AND iqn = ?2");
    return query.bind(tid).bind(iqn).run();
}

int loadUsers(std::map<std::string, std::string> &users)
{
    std::vector<_tag_iscsi_target_> targets;
    if (int err = loadTargets(targets))
        return err;
    if (int err = loadSinkTargets(targets))
        return err;
    users.clear();
    for (const _tag_iscsi_target_ &target : targets) {
        if (target.auth_type != NORV_TARGET_AUTH_NONE)
            users.emplace(target.user, target.password);
        if (target.auth_type == NORV_TARGET_AUTH_MUTUAL_CHAP)
            users.emplace(target.mutual_user, target.mutual_password);
    }
    return 0;
}

} // namespace norvhost
