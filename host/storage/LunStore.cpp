#include "host/storage/LunStore.h"

#include "host/core/LastError.h"
#include "host/services/Retention.h"
#include "host/state/Database.h"
#include "host/state/Fields.h"
#include "host/storage/MapFile.h"
#include "host/storage/SnapshotStore.h"
#include "host/storage/Volumes.h"
#include "platform/error.h"

#include <algorithm>
#include <sys/random.h>
#include <sys/stat.h>

namespace norvhost {
namespace {

#define LUN_COLUMNS "lid, uuid, name, type, location, size, extent_size, restored_time, options, loaded, restoring_uuid"

LunRow readRow(const Query &query)
{
    LunRow row;
    row.record.lid = query.integer(0);
    copyText(row.record.uuid, query.text(1));
    copyText(row.record.name, query.text(2));
    row.record.type = query.integer(3);
    copyText(row.record.location, query.text(4));
    row.record.size = static_cast<uint64_t>(query.number(5));
    row.record.extent_size = static_cast<uint32_t>(query.number(6));
    row.record.restored_time = query.integer(7);
    row.record.options = static_cast<uint32_t>(query.number(8));
    row.loaded = query.integer(9) != 0;
    row.restoring_uuid = query.text(10);
    return row;
}

int readOnlyRow(Query &query, const char *selector, std::string_view value, LunRow &row)
{
    if (!query.next())
        return query.error() ? query.error()
                             : fail(NORV_ERR_NO_SUCH_LUN, "there is no LUN with the %s '%.*s'", selector,
                                    static_cast<int>(value.size()), value.data());
    row = readRow(query);
    return 0;
}

int nameTaken(const LunRow &row)
{
    return fail(NORV_ERR_LUN_NAME_EXISTS, "another LUN is named '%s'", row.record.name);
}

/// Two paths may lead to one device.
int checkDeviceUnused(const LunRow &row)
{
    struct stat wanted, other;
    if (stat(row.record.location, &wanted) != 0)
        return 0; // gone since it was checked: nobody else can be using it
    Query query("SELECT location, name FROM luns WHERE type = ?1");
    query.bind(static_cast<int>(NORV_LUN_TYPE_BLOCK));
    while (query.next())
        if (stat(std::string(query.text(0)).c_str(), &other) == 0 && other.st_rdev == wanted.st_rdev)
            return fail(NORV_ERR_LUN_LOCATION, "the device %s is used by the LUN '%s'", row.record.location,
                        std::string(query.text(1)).c_str());
    return query.error();
}

int refuseMapped(int lid)
{
    int mappings = 0;
    if (int err = countMappings(lid, mappings))
        return err;
    if (mappings > 0)
        return fail(NORV_ERR_LUN_MAPPED, "the LUN is mapped to %d target(s): unmap it first", mappings);
    return 0;
}

int refuseSent(int lid)
{
    Query query("SELECT uuid FROM virtual_luns WHERE lid = ?1");
    if (query.bind(lid).next())
        return fail(NORV_ERR_LUN_LOCKED, "the virtual LUN %s sends the LUN to another node: remove that first",
                    std::string(query.text(0)).c_str());
    return query.error();
}

} // namespace

int loadLunByLid(int lid, LunRow &row)
{
    Query query("SELECT " LUN_COLUMNS " FROM luns WHERE lid = ?1");
    return readOnlyRow(query.bind(lid), "ID", std::to_string(lid), row);
}

int loadLunByUuid(std::string_view uuid, LunRow &row)
{
    const std::string lower_case = lowerCase(uuid);
    Query query("SELECT " LUN_COLUMNS " FROM luns WHERE uuid = ?1");
    return readOnlyRow(query.bind(lower_case), "UUID", uuid, row);
}

int loadLunByName(std::string_view name, LunRow &row)
{
    Query query("SELECT " LUN_COLUMNS " FROM luns WHERE name = ?1");
    return readOnlyRow(query.bind(name), "name", name, row);
}

int forEachLun(const std::function<void(const LunRow &)> &visit)
{
    Query query("SELECT " LUN_COLUMNS " FROM luns ORDER BY lid");
    while (query.next())
        visit(readRow(query));
    return query.error();
}

int isInUse(const LunRow &row, bool &in_use)
{
    int mappings;
    if (int err = countMappings(row.record.lid, mappings))
        return err;
    in_use = mappings > 0 && row.loaded;
    return 0;
}

int countMappings(int lid, int &count)
{
    Query query("SELECT count(*) FROM mappings WHERE lid = ?1");
    if (!query.bind(lid).next())
        return query.error();
    count = query.integer(0);
    return 0;
}

int insertLun(const LunRow &row)
{
    Transaction transaction;
    if (transaction.error())
        return transaction.error();
    const _tag_iscsi_lun_ &lun = row.record;
    VolumeRow volume;
    if (int err = isBlock(lun.type) ? checkDeviceUnused(row) : loadVolume(lun.location, volume))
        return err;

    Query query("INSERT INTO luns (" LUN_COLUMNS ") VALUES (?1, ?2, ?3, ?4, ?5, ?6, ?7, ?8, ?9, ?10, ?11)");
    query.bind(lun.lid).bind(lun.uuid).bind(lun.name).bind(lun.type).bind(lun.location);
    query.bind(lun.size)
        .bind(lun.extent_size)
        .bind(lun.restored_time)
        .bind(lun.options)
        .bind(row.loaded)
        .bind(row.restoring_uuid);
    if (int err = query.run())
        return query.violates("luns.name") ? nameTaken(row) : err;
    return transaction.commit();
}

int updateLun(const LunRow &row)
{
    Transaction transaction;
    if (transaction.error())
        return transaction.error();
    const _tag_iscsi_lun_ &lun = row.record;
    if (isInTrash(lun))
        if (int err = refuseMapped(lun.lid))
            return err;

    Query query("UPDATE luns SET name = ?2, size = ?3, options = ?4, loaded = ?5 WHERE lid = ?1");
    query.bind(lun.lid).bind(lun.name).bind(lun.size).bind(lun.options).bind(row.loaded);
    if (int err = query.run())
        return query.violates("luns.name") ? nameTaken(row) : err;
    return transaction.commit();
}

int updateLunType(int lid, int type)
{
    Query query("UPDATE luns SET type = ?2 WHERE lid = ?1");
    return query.bind(lid).bind(type).run();
}

int removeLun(int lid)
{
    Transaction transaction;
    if (transaction.error())
        return transaction.error();
    if (int err = refuseMapped(lid))
        return err;
    if (int err = refuseSent(lid))
        return err;
    if (int err = removeSnapshotsOfLun(lid))
        return err;
    if (int err = removeRetentionPolicy(lun_retention_kind, std::to_string(lid)))
        return err;
    Query query("DELETE FROM luns WHERE lid = ?1");
    if (int err = query.bind(lid).run())
        return err;
    return transaction.commit();
}

int markRestore(int lid, std::string_view snapshot_uuid)
{
    Query query("UPDATE luns SET restoring_uuid = ?2 WHERE lid = ?1");
    return query.bind(lid).bind(snapshot_uuid).run();
}

int endRestore(int lid, int64_t time)
{
    Query query("UPDATE luns SET restoring_uuid = '', restored_time = ?2 WHERE lid = ?1");
    return query.bind(lid).bind(time).run();
}

int loadInterruptedRestores(std::vector<LunRow> &rows)
{
    std::vector<LunRow> found;
    Query query("SELECT " LUN_COLUMNS " FROM luns WHERE restoring_uuid <> '' ORDER BY lid");
    while (query.next())
        found.push_back(readRow(query));
    if (query.error())
        return query.error();
    rows = std::move(found);
    return 0;
}

std::string newUuid()
{
    unsigned char bytes[16];
    while (getrandom(bytes, sizeof bytes, 0) != sizeof bytes)
        ;
    bytes[6] = static_cast<unsigned char>((bytes[6] & 0x0f) | 0x40); // version 4: random
    bytes[8] = static_cast<unsigned char>((bytes[8] & 0x3f) | 0x80);
    static const char digits[] = "0123456789abcdef";
    std::string text;
    for (size_t i = 0; i < sizeof bytes; ++i) {
        if (i == 4 || i == 6 || i == 8 || i == 10)
            text += '-';
        text += digits[bytes[i] >> 4];
        text += digits[bytes[i] & 15];
    }
    return text;
}

} // namespace norvhost
