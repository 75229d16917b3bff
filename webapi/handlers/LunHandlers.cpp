#include "webapi/handlers/Handlers.h"

#include "iscsihost/host.h"
#include "iscsihost/read_view.h"
#include "iscsihost/replication.h"
#include "iscsiwebapi/ISCSIErrorCode.h"
#include "iscsiwebapi/ISCSILIBLUN.h"
#include "iscsiwebapi/ISCSILIBTarget.h"

#include <set>

namespace webapi {

using namespace ISCSI;
using LIB::LIBLUN::ISCSILIBLUN;

Result failed(int code, const std::string &reason)
{
    return {code, reason, {}};
}

Result failed(int code)
{
    return failed(code, iscsi_host_last_error());
}

namespace {

/// Bytes on the volume, unless they cannot be told: a LUN whose data is missing or damaged is shown too.
void addAllocatedSize(ISCSILUNInfo &lun, _tag_iscsi_lun_ &record, Json::Value &out)
{
    if (lun.loadAllocatedSize(record) == 0)
        out["allocated_size"] = static_cast<Json::UInt64>(lun.allocated_size);
    else
        out.removeMember("allocated_size");
}

/// Tells which lock on one of the LUN's snapshots keeps it from being deleted, if any.
Result refuseLockedSnapshots(ISCSILIBLUN &lun)
{
    std::vector<ISCSISnapshotInfo> snapshots;
    if (int err = lun.listSnapshot(snapshots, ISCSISnapshotInfo::LOAD_LOCKED_APP_KEYS))
        return failed(err);
    for (const ISCSISnapshotInfo &snapshot : snapshots) {
        const std::string which = "its snapshot '" + snapshot.name + "' (" + snapshot.uuid + ") is locked by ";
        if (snapshot.is_user_locked)
            return failed(ERR_CANNOT_DELETE_LOCKED_SNAPSHOT, which + "its user");
        if (!snapshot.locked_app_keys.empty())
            return failed(ERR_SNAPSHOT_IS_LOCKED,
                          which + "the application key '" + *snapshot.locked_app_keys.begin() + "'");
    }
    return {};
}

/// The LUN's JSON form with all live state, "sync_progress", and "targets": where it is mapped.
Result describe(const std::string &uuid)
{
    using Flags = ISCSILUNInfo::LoadFlags;
    ISCSILIBLUN lun(uuid);
    if (int err =
            lun.loadLUNInfo(Flags::LOAD_LOCKED | Flags::LOAD_MAPPED | Flags::LOAD_EXTENT_SIZE | Flags::LOAD_STATUS))
        return failed(err);
    Result result;
    if (int err = lun.info.toJsonFormat(result.value))
        return failed(err);
    addAllocatedSize(lun.info, lun.record, result.value);
    uint64_t arrived = 0;
    iscsihost::arrivedBytes(uuid, arrived); // 0 where it cannot be told, too: the data is missing or damaged
    result.value["sync_progress"] = static_cast<Json::UInt64>(arrived);

    Json::Value &mappings = result.value["targets"] = Json::arrayValue;
    if (!lun.info.is_mapped)
        return result;
    std::vector<ISCSITargetInfo> targets;
    if (int err = LIB::LIBTarget::ISCSILIBTarget::ListTarget(targets, uuid))
        return failed(err);
    for (const ISCSITargetInfo &target : targets) {
        Json::Value &mapping = mappings.append(Json::objectValue);
        mapping["target_id"] = target.tid;
        mapping["name"] = target.name;
        mapping["iqn"] = target.iqn;
        mapping["mapping_index"] = target.mapping_index;
    }
    return result;
}

/// Resolves the request's LUN, lets `act` change it, and describes it as it is then.
template <class Act>
Result changeLun(const Request &request, Act act)
{
    std::string uuid;
    if (Result bad = selectLun(request.path.at("lun"), uuid); bad.code)
        return bad;
    ISCSILIBLUN lun(uuid);
    if (int err = act(lun))
        return failed(err);
    return describe(uuid);
}

Result selectTargets(const Json::Value &selectors, std::set<int> &tids)
{
    for (const Json::Value &selector : selectors) {
        int tid = 0;
        if (Result bad = selectTarget(selector.asString(), tid); bad.code)
            return bad;
        tids.insert(tid);
    }
    return {};
}

} // namespace

Result selectLun(const std::string &selector, std::string &uuid)
{
    if (selector.empty())
        return failed(ERR_NO_LUN_UUID, "");
    if (int err = ISCSILUNInfo::GetLUNUUID(selector, uuid))
        return failed(err, err == ERR_BAD_LUN_UUID ? "no LUN has the UUID, name or index '" + selector + "'"
                                                   : iscsi_host_last_error());
    return {};
}

Result listLuns(const Request &request)
{
    using Flags = ISCSILUNInfo::LoadFlags;
    const bool with_status = request.input["status"].asBool();
    std::vector<ISCSILUNInfo> luns;
    {
        const iscsihost::ReadView view;
        if (int err = ISCSILIBLUN::ListLUN(luns, Flags::LOAD_MAPPED | (with_status ? Flags::LOAD_LOCKED : 0)))
            return failed(err);
    }
    Result result;
    result.value = Json::arrayValue;
    for (ISCSILUNInfo &lun : luns) {
        _tag_iscsi_lun_ record{};
        const int err = with_status ? lun.loadStatus(record) : 0;
        if (err == ERR_NO_SUCH_LUN) // deleted since it was listed
            continue;
        if (err)
            return failed(err);
        Json::Value &out = result.value.append(Json::objectValue);
        lun.toJsonFormat(out);
        if (with_status) {
            addAllocatedSize(lun, record, out);
            continue;
        }
        // What was not asked for is left out rather than wrong.
        for (const char *key : {"status", "allocated_size", "is_action_locked"})
            out.removeMember(key);
    }
    return result;
}

Result createLun(const Request &request)
{
    const Json::Value &in = request.input;
    if (in["type"].asInt() != NORV_LUN_TYPE_BLOCK && !in.isMember("size"))
        return failed(ERR_INVALID_INPUT, "size: is missing");
    ISCSILIBLUN lun(in["name"].asString(), static_cast<_tag_iscsi_lun_type>(in["type"].asInt()),
                    in["location"].asString(), in["size"].asUInt64(), in["extent_size"].asUInt());
    if (int err = lun.createLUN())
        return failed(err);
    return describe(lun.info.uuid);
}

Result showLun(const Request &request)
{
    return changeLun(request, [](ISCSILIBLUN &) { return 0; });
}

Result updateLun(const Request &request)
{
    const Json::Value &in = request.input;
    if (in.empty())
        return failed(ERR_INVALID_INPUT, "nothing to change: neither name nor size is given");
    const unsigned long long size = in["size"].asUInt64();
    unsigned long long present_size = 0;
    Result result = changeLun(request, [&](ISCSILIBLUN &lun) {
        const int err = lun.updateLUN(in["name"].asString(), size);
        present_size = lun.info.size;
        return err;
    });
    // What the library refuses by itself has no reason of the platform's.
    if (result.code == ERR_BAD_LUN_SIZE && size < present_size)
        result.reason = "size: the LUN has " + std::to_string(present_size) + " bytes and cannot shrink";
    else if (result.code == ERR_DUPLICATED_LUN_NAME)
        result.reason = "name: a LUN bears it already";
    else if (result.code == ERR_BAD_LUN_TYPE)
        result.reason = "a block LUN takes its size from its device and keeps its name";
    return result;
}

Result deleteLun(const Request &request)
{
    using Flags = ISCSILUNInfo::LoadFlags;
    std::string uuid;
    if (Result bad = selectLun(request.path.at("lun"), uuid); bad.code)
        return bad;
    // The library drops the LUN's schedules before the platform can refuse: ask first.
    ISCSILIBLUN lun(uuid);
    if (int err = lun.loadLUNInfo(Flags::LOAD_LOCKED | Flags::LOAD_MAPPED))
        return failed(err);
    if (lun.info.is_mapped)
        return failed(ERR_LUN_IS_MAPPED, "");
    if (lun.info.is_action_locked)
        return failed(ERR_LUN_IS_LOCKED, "another action is at work on it");
    if (Result bad = refuseLockedSnapshots(lun); bad.code)
        return bad;
    if (int err = lun.deleteLUN())
        return failed(err);
    return {};
}

Result mapLun(const Request &request)
{
    std::set<int> tids;
    if (Result bad = selectTargets(request.input["targets"], tids); bad.code)
        return bad;
    return changeLun(request, [&](ISCSILIBLUN &lun) { return lun.mapTarget(tids); });
}

Result unmapLun(const Request &request)
{
    std::set<int> tids;
    if (Result bad = selectTargets(request.input["targets"], tids); bad.code)
        return bad;
    return changeLun(request, [&](ISCSILIBLUN &lun) { return lun.unmapTarget(tids); });
}

Result loadLun(const Request &request)
{
    const bool trash = request.input["is_for_trash"].asBool();
    return changeLun(request, [&](ISCSILIBLUN &lun) { return lun.loadLUN(trash, false); });
}

Result unloadLun(const Request &request)
{
    const bool trash = request.input["is_for_trash"].asBool();
    return changeLun(request, [&](ISCSILIBLUN &lun) { return lun.unloadLUN(trash, false); });
}

} // namespace webapi
