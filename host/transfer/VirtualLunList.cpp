#include "iscsihost/vlun.h"

#include "host/core/LastError.h"
#include "host/state/Database.h"
#include "host/state/Fields.h"
#include "platform/virtual_lun.h"

namespace norvhost {
namespace {

constexpr int BAD_VLUN_UUID = 18991001;

#define VLUN_COLUMNS "virtual_luns.uuid, luns.uuid, node, sink, portal, moved, total, ended, state"

iscsihost::VirtualLun readRow(const Query &query)
{
    iscsihost::VirtualLun vlun;
    vlun.uuid = query.text(0);
    vlun.src_lun_uuid = query.text(1);
    vlun.node_uuid = query.text(2);
    vlun.dst_lun_uuid = query.text(3);
    vlun.portal = query.text(4);
    vlun.moved = static_cast<uint64_t>(query.number(5));
    vlun.total = static_cast<uint64_t>(query.number(6));
    vlun.ended = query.number(7) != 0;
    vlun.state = query.integer(8);
    return vlun;
}

/// The counters of a transfer that runs move outside of the state store. One that was removed meanwhile keeps those of
/// its row.
void addCounters(iscsihost::VirtualLun &vlun)
{
    vlun.running = !vlun.ended && !vlun.dst_lun_uuid.empty();
    _tag_viscsi_virtual_lun_stats_ stats{};
    if (!vlun.running || NORViSCSIVirtualLunStatsGet(vlun.uuid.c_str(), &stats, 0) != 0)
        return;
    vlun.moved = stats.first;
    vlun.total = stats.second;
    vlun.state = stats.state;
    vlun.running = stats.state == 0;
}

int find(Query &query, const std::string &src_lun_uuid, iscsihost::VirtualLun &vlun)
{
    const std::string uuid = lowerCase(src_lun_uuid);
    query.bind(uuid);
    if (query.next()) {
        vlun = readRow(query);
        return 0;
    }
    return query.error() ? query.error() : fail(BAD_VLUN_UUID, "the LUN was never sent to another node");
}

} // namespace
} // namespace norvhost

namespace iscsihost {

using namespace norvhost;

int listVirtualLuns(std::vector<VirtualLun> &vluns)
{
    std::vector<VirtualLun> found;
    {
        Query query("SELECT " VLUN_COLUMNS " FROM virtual_luns JOIN luns USING (lid) ORDER BY virtual_luns.id");
        while (query.next())
            found.push_back(readRow(query));
        if (query.error())
            return query.error();
    }
    for (VirtualLun &vlun : found)
        addCounters(vlun);
    vluns = std::move(found);
    return 0;
}

int latestTransfer(const std::string &src_lun_uuid, VirtualLun &vlun)
{
    VirtualLun found;
    {
        Query query("SELECT " VLUN_COLUMNS " FROM virtual_luns JOIN luns USING (lid) "
                    "WHERE luns.uuid = ?1 AND sink <> '' ORDER BY ended, virtual_luns.id DESC LIMIT 1");
        const int err = find(query, src_lun_uuid, found);
        if (err && err != BAD_VLUN_UUID)
            return err;
        if (!err) {
            addCounters(found);
            vlun = found;
            return 0;
        }
    }
    Query query("SELECT removed_transfers.uuid, luns.uuid, node, sink, portal, moved, total, ended, state "
                "FROM removed_transfers JOIN luns USING (lid) WHERE luns.uuid = ?1");
    if (int err = find(query, src_lun_uuid, found))
        return err;
    vlun = found;
    return 0;
}

} // namespace iscsihost
