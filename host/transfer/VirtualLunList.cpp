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

/// The counters of a transfer that runs move outside of the state store. False for one that was removed meanwhile.
bool addCounters(iscsihost::VirtualLun &vlun)
{
    vlun.running = !vlun.ended && !vlun.dst_lun_uuid.empty();
    if (!vlun.running)
        return true;
    _tag_viscsi_virtual_lun_stats_ stats{};
    if (NORViSCSIVirtualLunStatsGet(vlun.uuid.c_str(), &stats, 0) != 0)
        return false;
    vlun.moved = stats.first;
    vlun.total = stats.second;
    vlun.state = stats.state;
    vlun.running = stats.state == 0;
    return true;
}

/// The latest transfer of a LUN, or the given one, that is there or `removed`.
int loadTransfer(const std::string &lun, const std::string &one, iscsihost::VirtualLun &found, bool &removed)
{
    Query query("SELECT vluns.uuid, luns.uuid, node, sink, portal, moved, total, ended, state, removed FROM "
                "(SELECT id, uuid, lid, node, sink, portal, moved, total, ended, state, 0 AS removed "
                "FROM virtual_luns UNION ALL "
                "SELECT id, uuid, lid, node, sink, portal, moved, total, ended, state, 1 FROM removed_transfers) "
                "AS vluns JOIN luns USING (lid) "
                "WHERE luns.uuid = ?1 AND sink <> '' AND ?2 IN (vluns.uuid, '') ORDER BY id DESC LIMIT 1");
    if (!query.bind(lun).bind(one).next())
        return query.error() ? query.error() : fail(BAD_VLUN_UUID, "the LUN was never sent to another node");
    found = readRow(query);
    removed = query.integer(9) != 0;
    return 0;
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

int findTransfer(const std::string &src_lun_uuid, const std::string &vlun_uuid, VirtualLun &vlun)
{
    const std::string lun = lowerCase(src_lun_uuid), one = lowerCase(vlun_uuid);
    VirtualLun found;
    bool removed = false;
    if (int err = loadTransfer(lun, one, found, removed))
        return err;
    if (!removed && !addCounters(found)) // it has ended and is removed now
        if (int err = loadTransfer(lun, one, found, removed))
            return err;
    vlun = std::move(found);
    return 0;
}

} // namespace iscsihost
