// Virtual LUNs, and clones of LUNs to other nodes.
#include "webapi/handlers/Handlers.h"

#include "iscsihost/vlun.h"
#include "iscsiwebapi/ISCSIErrorCode.h"
#include "iscsiwebapi/ISCSILIBLUN.h"
#include "iscsiwebapi/ISCSILIBVLUN.h"

#include <algorithm>
#include <cstring>
#include <set>

namespace webapi {

using namespace ISCSI;
using iscsihost::VirtualLun;
using LIB::LIBLUN::ISCSILIBLUN;
using LIB::LIBVLUN::ISCSILIBVLUN;

namespace {

const char *statusOf(const VirtualLun &vlun)
{
    if (vlun.dst_lun_uuid.empty())
        return "unbound";
    if (vlun.state != 0)
        return "failed";
    return vlun.running ? "sending" : vlun.ended ? "complete" : "stopped";
}

/// "first" and "second" are the transfer's two counters, bytes moved and bytes in all.
Json::Value describe(const VirtualLun &vlun)
{
    Json::Value out(Json::objectValue);
    out["uuid"] = vlun.uuid;
    out["type"] = static_cast<int>(VLUN_TYPE_1);
    out["src_lun_uuid"] = vlun.src_lun_uuid;
    out["node_uuid"] = vlun.node_uuid;
    out["dst_lun_uuid"] = vlun.dst_lun_uuid;
    out["portal"] = vlun.portal;
    out["first"] = static_cast<Json::UInt64>(vlun.moved);
    out["second"] = static_cast<Json::UInt64>(vlun.total);
    out["state"] = vlun.state;
    out["status"] = statusOf(vlun);
    if (vlun.state != 0)
        out["reason"] = strerror(vlun.state);
    return out;
}

/// Finds the virtual LUN of the request's path.
Result selectVlun(const Request &request, VirtualLun &vlun)
{
    std::vector<VirtualLun> vluns;
    if (int err = iscsihost::listVirtualLuns(vluns))
        return failed(err);
    const std::string &uuid = request.path.at("uuid");
    const auto found = std::find_if(vluns.begin(), vluns.end(), [&](const auto &one) { return one.uuid == uuid; });
    if (found == vluns.end())
        return failed(ERR_BAD_VLUN_UUID, "no virtual LUN has the UUID '" + uuid + "'");
    vlun = *found;
    return {};
}

/// Where a transfer goes, as a request names it.
struct Destination {
    ISCSINodeInfo node;
    std::set<std::string> portals; ///< those given, else the node's own address
    std::string lun_uuid;          ///< may be empty
};

Result selectDestination(const Json::Value &in, Destination &destination)
{
    if (Result bad = selectNode(in["node"].asString(), destination.node); bad.code)
        return bad;
    if (destination.node.is_local_node)
        return failed(ERR_BAD_NODE_UUID, "node: is the appliance itself");
    for (const Json::Value &portal : in["portals"])
        destination.portals.insert(portal.asString());
    if (destination.portals.empty())
        destination.portals.insert(destination.node.hostname);
    destination.lun_uuid = in["dst_lun_uuid"].asString();
    if (!destination.lun_uuid.empty() && !isUuid(destination.lun_uuid))
        return failed(ERR_BAD_DESTINATION_LUN_UUID, "dst_lun_uuid: must be a UUID");
    return {};
}

} // namespace

Result listVluns(const Request &)
{
    std::vector<VirtualLun> vluns;
    if (int err = iscsihost::listVirtualLuns(vluns))
        return failed(err);
    Result result;
    result.value = Json::arrayValue;
    for (const VirtualLun &vlun : vluns)
        result.value.append(describe(vlun));
    return result;
}

Result createVlun(const Request &request)
{
    std::string lun_uuid;
    if (Result bad = selectLun(request.input["lun"].asString(), lun_uuid); bad.code)
        return bad;
    ISCSILIBVLUN vlun(VLUN_TYPE_1, lun_uuid);
    if (int err = vlun.createVLUN())
        return failed(err);
    return showVlun({{{"uuid", vlun.info.uuid}}, {}, {}});
}

Result showVlun(const Request &request)
{
    VirtualLun found;
    if (Result bad = selectVlun(request, found); bad.code)
        return bad;
    Result result;
    result.value = describe(found);
    return result;
}

Result bindVlun(const Request &request)
{
    VirtualLun found;
    if (Result bad = selectVlun(request, found); bad.code)
        return bad;
    Destination destination;
    if (Result bad = selectDestination(request.input, destination); bad.code)
        return bad;
    ISCSILIBVLUN vlun(found.uuid);
    if (int err = vlun.bind(destination.lun_uuid, destination.node.uuid, destination.portals))
        return failed(err);
    return showVlun(request);
}

Result deleteVlun(const Request &request)
{
    VirtualLun found;
    if (Result bad = selectVlun(request, found); bad.code)
        return bad;
    if (int err = ISCSILIBVLUN(found.uuid).deleteVLUN())
        return failed(err);
    return {};
}

Result remoteCloneLun(const Request &request)
{
    const Json::Value &in = request.input;
    ISCSILIBLUN lun;
    if (Result bad = selectLun(request.path.at("lun"), lun.info.uuid); bad.code)
        return bad;
    Destination destination;
    if (Result bad = selectDestination(in, destination); bad.code)
        return bad;
    if (destination.lun_uuid.empty()) {
        for (const char *key : {"name", "location"}) {
            if (!in.isMember(key))
                return failed(ERR_INVALID_INPUT, std::string(key) + ": is missing");
        }
    }
    const bool watch = !in.isMember("watch") || in["watch"].asBool();
    std::string vlun_uuid;
    if (int err = lun.remoteClone(in["name"].asString(), destination.node, in["location"].asString(),
                                  destination.portals, vlun_uuid, destination.lun_uuid, watch)) {
        // What the library refuses by itself has no reason of the platform's.
        const bool wrong_type = err == ERR_CANNOT_CLONE_A_BLOCK_LUN;
        return wrong_type ? failed(err, "only an adv or sink LUN can be cloned to another node") : failed(err);
    }
    Result result;
    result.value["vlun_uuid"] = vlun_uuid;
    result.value["dst_lun_uuid"] = destination.lun_uuid;
    return result;
}

Result showRemoteClone(const Request &request)
{
    std::string lun_uuid;
    if (Result bad = selectLun(request.path.at("lun"), lun_uuid); bad.code)
        return bad;
    VirtualLun found;
    if (int err = iscsihost::findTransfer(lun_uuid, request.input["vlun_uuid"].asString(), found))
        return err == ERR_BAD_VLUN_UUID ? failed(err, "there is no such clone of it to another node") : failed(err);
    Result result;
    result.value = describe(found);
    result.value["is_running"] = found.running;
    return result;
}

} // namespace webapi
