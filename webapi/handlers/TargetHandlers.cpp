#include "webapi/handlers/Handlers.h"

#include "iscsihost/host.h"
#include "iscsiwebapi/ISCSIErrorCode.h"
#include "iscsiwebapi/ISCSILIBLUN.h"
#include "iscsiwebapi/ISCSILIBTarget.h"
#include "webapi/handlers/TargetIqn.h"

#include <cstdlib>
#include <map>
#include <unistd.h>

namespace webapi {

using namespace ISCSI;
using LIB::LIBTarget::ISCSILIBTarget;

namespace {

using Masking = std::map<std::string, ISCSI_TARGET_AUTHORITY>;

/// The target's JSON form without its secrets.
int toJson(const ISCSITargetInfo &target, Json::Value &out)
{
    if (int err = target.toJsonFormat(out))
        return err;
    out.removeMember("password");
    out.removeMember("mutual_password");
    return 0;
}

const char *permissionText(ISCSI_TARGET_AUTHORITY permission)
{
    switch (permission) {
    case NORV_AUTHORITY_READ_WRITE:
        return "rw";
    case NORV_AUTHORITY_READ:
        return "r";
    case NORV_AUTHORITY_NONE:
        break;
    }
    return "-";
}

std::string shownIqn(const std::string &iqn)
{
    return iqn == NORV_DEFAULT_MASKING_IQN ? DEFAULT_MASKING : iqn;
}

std::string realIqn(const std::string &shown)
{
    return shown == DEFAULT_MASKING ? NORV_DEFAULT_MASKING_IQN : shown;
}

/// A masking as the library's list of entries; with `shown`, in the words of our callers.
Json::Value toJson(const Masking &masking, bool shown)
{
    Json::Value list(Json::arrayValue);
    for (const auto &[iqn, permission] : masking) {
        Json::Value &entry = list.append(Json::objectValue);
        entry["iqn"] = shown ? shownIqn(iqn) : iqn;
        entry["permission"] = permissionText(permission);
    }
    return list;
}

Result maskingOf(int tid)
{
    Masking masking;
    if (int err = ISCSILIBTarget::GetTargetMasking(tid, masking))
        return failed(err);
    return {0, "", toJson(masking, true)};
}

/// Enters a list of masks into a masking; an IQN that stands twice in the list is refused.
Result enter(const Json::Value &masks, const char *field, Masking &masking)
{
    Masking entered;
    for (const Json::Value &mask : masks) {
        const std::string iqn = mask["iqn"].asString();
        ISCSI_TARGET_AUTHORITY permission;
        if (int err = ISCSILIBTarget::GetMaskingPermission(mask["permission"].asString(), permission))
            return failed(err, "");
        if (!entered.emplace(realIqn(iqn), permission).second)
            return failed(ERR_INVALID_INPUT, std::string(field) + ": holds " + iqn + " twice");
    }
    for (const auto &[iqn, permission] : entered)
        masking[iqn] = permission;
    return {};
}

Result applyMasking(int tid, const Masking &masking)
{
    if (int err = ISCSILIBTarget::ACLMasksSet(tid, toJson(masking, false)))
        return failed(err);
    return maskingOf(tid);
}

/// The LUNs that the target shows, each with its LUN number in it as "mapping_index".
Result lunsOf(unsigned int tid)
{
    std::vector<ISCSILUNInfo> luns;
    if (int err = ISCSILUNInfo::ListLUN(luns, ISCSILUNInfo::LOAD_MAPPED))
        return failed(err);
    Json::Value list(Json::arrayValue);
    std::vector<ISCSITargetInfo> targets;
    for (const ISCSILUNInfo &lun : luns) {
        if (!lun.is_mapped)
            continue;
        if (int err = ISCSILIBTarget::ListTarget(targets, lun.uuid))
            return failed(err);
        for (const ISCSITargetInfo &target : targets) {
            if (target.tid != tid)
                continue;
            Json::Value &out = list.append(Json::objectValue);
            out["uuid"] = lun.uuid;
            out["name"] = lun.name;
            out["size"] = static_cast<Json::UInt64>(lun.size);
            out["mapping_index"] = target.mapping_index;
        }
    }
    return {0, "", list};
}

/// The target's JSON form without secrets, with "luns" and "masks".
Result describe(int tid)
{
    ISCSITargetInfo target(static_cast<unsigned int>(tid));
    _tag_iscsi_target_ record;
    if (int err = target.loadFromConfig(record))
        return failed(err, "no target has the ID " + std::to_string(tid));
    Result result;
    if (int err = toJson(target, result.value))
        return failed(err);
    Result luns = lunsOf(target.tid);
    if (luns.code)
        return luns;
    Result masks = maskingOf(tid);
    if (masks.code)
        return masks;
    result.value["luns"] = luns.value;
    result.value["masks"] = masks.value;
    return result;
}

std::string hostName()
{
    char name[256] = "";
    return gethostname(name, sizeof(name) - 1) == 0 ? name : "";
}

/// Fills in the CHAP mode and texts: a user wants a secret, mutual CHAP wants CHAP.
Result readChap(const Json::Value &in, ISCSITargetInfo &target)
{
    if (in.isMember("user") != in.isMember("password"))
        return failed(ERR_BAD_TARGET_AUTH_INFO, "user and password belong together");
    if (in.isMember("mutual_user") != in.isMember("mutual_password"))
        return failed(ERR_BAD_TARGET_AUTH_INFO, "mutual_user and mutual_password belong together");
    if (in.isMember("mutual_user") && !in.isMember("user"))
        return failed(ERR_BAD_TARGET_AUTH_INFO, "mutual_user: mutual CHAP needs user and password too");
    target.user = in["user"].asString();
    target.password = in["password"].asString();
    target.mutual_user = in["mutual_user"].asString();
    target.mutual_password = in["mutual_password"].asString();
    target.auth_type = in.isMember("mutual_user") ? NORV_TARGET_AUTH_MUTUAL_CHAP
                       : in.isMember("user")      ? NORV_TARGET_AUTH_CHAP
                                                  : NORV_TARGET_AUTH_NONE;
    return {};
}

} // namespace

Result selectTarget(const std::string &selector, int &tid)
{
    // GetTID reads a leading number as an ID, whatever follows it; here "7up" is a name, not target 7.
    char *rest = nullptr;
    const bool number = std::strtol(selector.c_str(), &rest, 10) != 0;
    const bool name = number && *rest != '\0';
    const int err = name ? ISCSITargetInfo::GetTIDByTargetName(selector, tid) : ISCSITargetInfo::GetTID(selector, tid);
    if (err == ERR_BAD_TARGET_ID || err == ERR_NO_SUCH_TARGET)
        return failed(err, "no target has the ID, name or index '" + selector + "'");
    return err ? failed(err) : Result{};
}

Result listTargets(const Request &request)
{
    std::string uuid;
    if (request.input.isMember("lun")) {
        if (Result bad = selectLun(request.input["lun"].asString(), uuid); bad.code)
            return bad;
    }
    std::vector<ISCSITargetInfo> targets;
    if (int err = ISCSILIBTarget::ListTarget(targets, uuid))
        return failed(err);
    Result result;
    result.value = Json::arrayValue;
    for (const ISCSITargetInfo &target : targets) {
        if (int err = toJson(target, result.value.append(Json::objectValue)))
            return failed(err);
    }
    return result;
}

Result createTarget(const Request &request)
{
    constexpr unsigned int SEGMENT_BYTES = 262144;
    const Json::Value &in = request.input;
    ISCSILIBTarget target;
    target.info.name = in["name"].asString();
    target.info.iqn = in.isMember("iqn") ? in["iqn"].asString() : targetIqn(hostName(), target.info.name);
    if (target.info.iqn.empty())
        return failed(ERR_BAD_TARGET_IQN, "iqn: none can be made from this name, give one");
    target.info.is_enabled = true;
    target.info.has_header_checksum = in["has_header_checksum"].asBool();
    target.info.has_data_checksum = in["has_data_checksum"].asBool();
    target.info.max_recv_seg_bytes = in.get("max_recv_seq_bytes", SEGMENT_BYTES).asUInt();
    target.info.max_send_seg_bytes = in.get("max_send_seq_bytes", SEGMENT_BYTES).asUInt();
    target.info.max_sessions = in["max_sessions"].asUInt();
    if (Result bad = readChap(in, target.info); bad.code)
        return bad;
    if (int err = target.createTarget()) {
        Result result = failed(err);
        if (target.info.tid != 0)
            result.reason += (result.reason.empty() ? "" : "; ") + std::string("the target itself was made, with ID ") +
                             std::to_string(target.info.tid);
        return result;
    }
    return describe(static_cast<int>(target.info.tid));
}

Result showTarget(const Request &request)
{
    int tid = 0;
    if (Result bad = selectTarget(request.path.at("target"), tid); bad.code)
        return bad;
    return describe(tid);
}

Result deleteTarget(const Request &request)
{
    int tid = 0;
    if (Result bad = selectTarget(request.path.at("target"), tid); bad.code)
        return bad;
    if (int err = ISCSILIBTarget(static_cast<unsigned int>(tid)).deleteTarget())
        return failed(err);
    return {};
}

Result showMasks(const Request &request)
{
    int tid = 0;
    if (Result bad = selectTarget(request.path.at("target"), tid); bad.code)
        return bad;
    return maskingOf(tid);
}

Result setMasks(const Request &request)
{
    int tid = 0;
    if (Result bad = selectTarget(request.path.at("target"), tid); bad.code)
        return bad;
    Masking masking;
    if (Result bad = enter(request.input["masks"], "masks", masking); bad.code)
        return bad;
    iscsihost::MaskingChange change;
    if (int err = change.begin(tid))
        return failed(err);
    return applyMasking(tid, masking);
}

Result changeMasks(const Request &request)
{
    int tid = 0;
    if (Result bad = selectTarget(request.path.at("target"), tid); bad.code)
        return bad;
    iscsihost::MaskingChange change;
    if (int err = change.begin(tid))
        return failed(err);
    Masking masking;
    if (int err = ISCSILIBTarget::GetTargetMasking(tid, masking))
        return failed(err);
    for (const Json::Value &iqn : request.input["remove"]) {
        if (masking.erase(realIqn(iqn.asString())) == 0)
            return failed(ERR_BAD_TARGET_IQN, "remove: the masking does not hold " + iqn.asString());
    }
    if (Result bad = enter(request.input["add"], "add", masking); bad.code)
        return bad;
    return applyMasking(tid, masking);
}

} // namespace webapi
