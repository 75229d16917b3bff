#include "host/transfer/VirtualLunStore.h"

#include "host/core/LastError.h"
#include "host/state/Database.h"
#include "host/state/Fields.h"
#include "platform/error.h"

namespace norvhost {
namespace {

int noSuchVirtualLun(std::string_view uuid)
{
    return fail(NORV_ERR_VLUN_UUID, "there is no virtual LUN with the UUID '%.*s'", static_cast<int>(uuid.size()),
                uuid.data());
}

} // namespace

int loadVirtualLun(std::string_view uuid, VirtualLunRow &row)
{
    const std::string lower_case = lowerCase(uuid);
    Query query("SELECT uuid, lid, kind, node, portal, sink, sink_iqn, moved, total, ended, state FROM virtual_luns "
                "WHERE uuid = ?1");
    if (!query.bind(lower_case).next())
        return query.error() ? query.error() : noSuchVirtualLun(uuid);
    row.uuid = query.text(0);
    row.lid = query.integer(1);
    row.kind = query.integer(2);
    row.node = query.text(3);
    row.portal = query.text(4);
    row.sink = query.text(5);
    row.sink_iqn = query.text(6);
    row.moved = static_cast<uint64_t>(query.number(7));
    row.total = static_cast<uint64_t>(query.number(8));
    row.ended = query.integer(9) != 0;
    row.state = query.integer(10);
    return 0;
}

int insertVirtualLun(const VirtualLunRow &row)
{
    Query query("INSERT INTO virtual_luns (uuid, lid, kind) VALUES (?1, ?2, ?3)");
    return query.bind(row.uuid).bind(row.lid).bind(row.kind).run();
}

int bindVirtualLun(const VirtualLunRow &row)
{
    Query query("UPDATE virtual_luns SET node = ?2, portal = ?3, sink = ?4, sink_iqn = ?5, moved = 0, total = ?6, "
                "ended = 0, state = 0 WHERE uuid = ?1");
    query.bind(row.uuid).bind(row.node).bind(row.portal).bind(row.sink).bind(row.sink_iqn);
    if (int err = query.bind(row.total).run())
        return err;
    return changedRows() > 0 ? 0 : noSuchVirtualLun(row.uuid);
}

int endVirtualLun(const std::string &uuid, int state, uint64_t moved, uint64_t total)
{
    Query query("UPDATE virtual_luns SET ended = 1, state = ?2, moved = ?3, total = ?4 "
                "WHERE uuid = ?1 AND sink <> '' AND NOT ended");
    return query.bind(uuid).bind(state).bind(moved).bind(total).run();
}

int forgetSink(const std::string &uuid, const std::string &sink_iqn)
{
    Query query("UPDATE virtual_luns SET sink_iqn = '' WHERE uuid = ?1 AND sink_iqn = ?2");
    return query.bind(uuid).bind(sink_iqn).run();
}

int deleteVirtualLun(const std::string &uuid)
{
    Query query("DELETE FROM virtual_luns WHERE uuid = ?1");
    return query.bind(uuid).run();
}

} // namespace norvhost
