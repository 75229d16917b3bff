#include "iscsiwebapi/ISCSILIBVLUN.h"

#include "etc/Failure.h"
#include "etc/Text.h"
#include "iscsiwebapi/ISCSINodeInfo.h"

#include <algorithm>
#include <iterator>

namespace ISCSI::LIB::LIBVLUN {

ISCSILIBVLUN::ISCSILIBVLUN(const std::string &uuid) : info(uuid) {}

ISCSILIBVLUN::ISCSILIBVLUN(_tag_iscsi_vlun_type type, const std::string &src_lun_uuid) : info(type, src_lun_uuid) {}

ISCSILIBVLUN::~ISCSILIBVLUN() = default;

int ISCSILIBVLUN::createVLUN()
{
    switch (info.type) {
    case VLUN_TYPE_NONE:
        return failText(here(), ERR_BAD_VLUN_TYPE, "Bad vLUN type. vLUN: %s", info.toString().c_str());
    case VLUN_TYPE_1:
        break;
    case VLUN_TYPE_2:
    case VLUN_TYPE_3:
        return failText(here(), ERR_BAD_PARAMETER, "doCreate: Coming soooooooooooon T_T");
    default:
        return failText(here(), ERR_BAD_VLUN_TYPE, "No such type. vLUN: %s.", info.toString().c_str());
    }
    char uuid[37] = {};
    if (int err = NORViSCSIVirtualLunCreate(info.src_lun_uuid.c_str(), NORV_VLUN_MODE_SEND, uuid, 0))
        return failText(here(), ERR_FAILED_TO_CREATE_VLUN, "Failed to create vLUN. vLUN: %s. error: %d",
                        info.toString().c_str(), err);
    if (std::all_of(std::begin(uuid), std::end(uuid), [](char c) { return c == 0; }))
        return failText(here(), ERR_BAD_VLUN_UUID, "Failed to get vLUN UUID. vLUN: %s.", info.toString().c_str());
    info.uuid = fieldText(uuid);
    return 0;
}

int ISCSILIBVLUN::deleteVLUN()
{
    if (int err = NORViSCSIVirtualLunRemove(info.uuid.c_str()))
        return failText(here(), ERR_FAILED_TO_DELETE_VLUN, "Failed to delete vLUN. vLUN: %s. error: %d",
                        info.toString().c_str(), err);
    return 0;
}

int ISCSILIBVLUN::loadStatus(int &state, unsigned long long &first, unsigned long long &second)
{
    _tag_viscsi_virtual_lun_stats_ stats{};
    if (int err = NORViSCSIVirtualLunStatsGet(info.uuid.c_str(), &stats, 0))
        return failText(here(), ERR_FAILED_TO_LOAD_VLUN_STATUS, "Failed to load status. vLUN: %s. error: %d",
                        info.toString().c_str(), err);
    state = stats.state;
    first = stats.first;
    second = stats.second;
    return 0;
}

int ISCSILIBVLUN::bind(const std::string &dst_lun_uuid, const std::string &node_uuid,
                       const std::set<std::string> &portals)
{
    ISCSINodeInfo node(node_uuid);
    if (int err = node.loadFromDRNode())
        return failText(here(), err, "Failed to load destination node info. node: %s", logText(node).c_str());
    if (portals.empty())
        return failText(here(), ERR_NO_PORTAL, "No portal. vLUN: %s", info.toString().c_str());
    if (int err = NORViSCSIVirtualLunBindSink(info.uuid.c_str(), portals.begin()->c_str(), node_uuid.c_str(),
                                              dst_lun_uuid.c_str()))
        return failText(here(), ERR_FAILED_TO_BIND, "Failed to bind vLUN. vLUN: %s. error: %d", info.toString().c_str(),
                        err);
    return 0;
}

} // namespace ISCSI::LIB::LIBVLUN
