// Cloning a LUN to another node.
#include "iscsiwebapi/ISCSILIBLUN.h"

#include "etc/Failure.h"
#include "etc/Wait.h"
#include "etc/Worker.h"
#include "iscsiwebapi/ISCSILIBVLUN.h"
#include "webapi/client/APILUN.h"

#include <syslog.h>

namespace ISCSI::LIB::LIBLUN {

using LIBVLUN::ISCSILIBVLUN;
using WebAPI::APILUN::WebAPIClientLUNCreate;
using WebAPI::APILUN::WebAPIClientLUNDelete;

namespace {

/// One remote clone: what it has made, and so has to clean up.
class RemoteClone {
public:
    RemoteClone(const ISCSILUNInfo &lun, const ISCSINodeInfo &node, const std::string &dst_lun_uuid, Site site)
        : lun(lun), node(node), dst_lun_uuid(dst_lun_uuid), vlun(VLUN_TYPE_1, lun.uuid), site(site)
    {
    }

    int createVLUN()
    {
        if (int err = vlun.createVLUN())
            return failText(site, err, "Failed to create vLUN. local LUN: %s.", lun.toString().c_str());
        return 0;
    }

    /// A destination that the caller gave is used as it is.
    int createDestination(const std::string &name, const std::string &location)
    {
        constexpr unsigned int EXTENT_SIZE = 0x2000;
        if (!dst_lun_uuid.empty())
            return 0;
        WebAPIClientLUNCreate request(node, name, NORV_LUN_TYPE_SINK, location, lun.size, EXTENT_SIZE);
        if (int err = request.send())
            return failText(site, err, "Failed to create destination LUN. local LUN: %s.", lun.toString().c_str());
        dst_lun_uuid = request.lunUUID();
        created_destination = true;
        return 0;
    }

    int bind(const std::set<std::string> &portals)
    {
        if (int err = vlun.bind(dst_lun_uuid, node.uuid, portals))
            return failText(site, err, "Failed to bind vLUN: %s to dst LUN: %s.", vlun.info.uuid.c_str(),
                            dst_lun_uuid.c_str());
        return 0;
    }

    /// Watches the transfer until it is complete, fails, or stands still for too long.
    int watch()
    {
        constexpr unsigned int STALL_LIMIT = 1800;
        for (Wait wait(STALL_LIMIT);;) {
            int state = 0;
            unsigned long long moved = 0;
            unsigned long long total = 0;
            if (int err = vlun.loadStatus(state, moved, total))
                return failText(site, err, "Failed to vLUN state: %s.", vlun.info.uuid.c_str());
            if (state != 0)
                return failText(site, ERR_FAILED_TO_CLONE_LUN, "Failed to clone LUN. error: %s", strerror(state));
            if (total != 0 && total == moved) {
                syslog(LOG_INFO, "%s:%d:%s Sync completed. local LUN: %s, destination LUN: %s", site.file, site.line,
                       site.method, lun.toString().c_str(), dst_lun_uuid.c_str());
                return 0;
            }
            if (wait.stalled(moved))
                return failText(site, ERR_TIMEOUT, "Reach max retry count.");
        }
    }

    /// Removes the virtual LUN and, after a failure, the destination that was created here. Returns
    /// the result it is given.
    int finish(int result)
    {
        if (int err = vlun.deleteVLUN())
            failText(site, err, "Failed to delete vLUN: %s.", vlun.info.uuid.c_str());
        if (result != 0 && created_destination) {
            if (int err = WebAPIClientLUNDelete(node, dst_lun_uuid).send())
                failText(site, err, "Failed to delete dst LUN: %s.", dst_lun_uuid.c_str());
        }
        return result;
    }

    const std::string &vlunUUID() const { return vlun.info.uuid; }
    const std::string &destinationUUID() const { return dst_lun_uuid; }

private:
    const ISCSILUNInfo &lun;
    const ISCSINodeInfo &node;
    std::string dst_lun_uuid;
    ISCSILIBVLUN vlun;
    Site site;
    bool created_destination = false;
};

} // namespace

int ISCSILIBLUN::remoteClone(const std::string &dst_lun_name, const ISCSINodeInfo &node,
                             const std::string &dst_location, const std::set<std::string> &portals,
                             std::string &vlun_uuid, std::string &dst_lun_uuid, bool watch)
{
    RemoteClone clone(info, node, dst_lun_uuid, here());
    if (int err = info.loadFromConfig(record, 0))
        return clone.finish(
            failText(here(), err, "Failed to load LUN info from SDK. LUN: %s", info.toString().c_str()));
    if ((record.type & NORV_LUN_EXTENT_POOL_BITS) != NORV_LUN_EXTENT_POOL_BITS)
        return clone.finish(failText(here(), ERR_CANNOT_CLONE_A_BLOCK_LUN, "Cannot clone a non-ADV LUN. LUN: %s",
                                     info.toString().c_str()));
    if (int err = clone.createVLUN())
        return clone.finish(err);
    vlun_uuid = clone.vlunUUID();
    if (int err = clone.createDestination(dst_lun_name, dst_location))
        return clone.finish(err);
    dst_lun_uuid = clone.destinationUUID();
    if (int err = clone.bind(portals))
        return clone.finish(err);
    if (!watch)
        return 0;
    if (int err = startWorker([&clone] { clone.finish(clone.watch()); }))
        return clone.finish(failText(here(), err, "Failed to fork a process."));
    return 0;
}

} // namespace ISCSI::LIB::LIBLUN
