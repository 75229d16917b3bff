// What the appliance does by itself: retention, schedules, and the log of events.
#include "webapi/handlers/Handlers.h"

#include "iscsihost/host.h"
#include "iscsiwebapi/ISCSIErrorCode.h"
#include "iscsiwebapi/ISCSILUNInfo.h"

namespace webapi {

using namespace ISCSI;

namespace {

/// Resolves a LUN selector to the ID of a LUN that exists.
Result selectLunId(const std::string &selector, int &lid)
{
    ISCSILUNInfo lun;
    if (Result bad = selectLun(selector, lun.uuid); bad.code)
        return bad;
    _tag_iscsi_lun_ record{};
    if (int err = lun.loadFromConfig(record, 0))
        return failed(err);
    lid = lun.lun_id;
    return {};
}

iscsihost::RetentionPolicy readPolicy(const Json::Value &in)
{
    iscsihost::RetentionPolicy policy;
    policy.newest = in["newest"].asInt();
    policy.hourly = in["hourly"].asInt();
    policy.daily = in["daily"].asInt();
    policy.weekly = in["weekly"].asInt();
    return policy;
}

Result describePolicy(int lid)
{
    iscsihost::RetentionPolicy policy;
    if (int err = iscsihost::getRetentionPolicy(lid, policy))
        return failed(err);
    Result result;
    result.value["newest"] = policy.newest;
    result.value["hourly"] = policy.hourly;
    result.value["daily"] = policy.daily;
    result.value["weekly"] = policy.weekly;
    return result;
}

Json::Value toJson(const iscsihost::Schedule &schedule)
{
    Json::Value out;
    out["schedule_id"] = static_cast<Json::Int64>(schedule.id);
    out["kind"] = schedule.kind;
    out["lun_id"] = schedule.lid;
    out["lun_name"] = schedule.lun_name;
    out["rule"] = schedule.rule;
    out["next_run"] = static_cast<Json::Int64>(schedule.next_run);
    out["last_run"] = static_cast<Json::Int64>(schedule.last_run);
    return out;
}

} // namespace

Result showRetention(const Request &request)
{
    int lid = 0;
    if (Result bad = selectLunId(request.path.at("lun"), lid); bad.code)
        return bad;
    return describePolicy(lid);
}

Result setRetention(const Request &request)
{
    int lid = 0;
    if (Result bad = selectLunId(request.path.at("lun"), lid); bad.code)
        return bad;
    if (int err = iscsihost::setRetentionPolicy(lid, readPolicy(request.input)))
        return failed(err);
    return describePolicy(lid);
}

Result removeRetention(const Request &request)
{
    int lid = 0;
    if (Result bad = selectLunId(request.path.at("lun"), lid); bad.code)
        return bad;
    if (int err = iscsihost::removeRetentionPolicy(lid))
        return failed(err);
    return {};
}

Result tryRetention(const Request &request)
{
    int lid = 0;
    if (Result bad = selectLunId(request.path.at("lun"), lid); bad.code)
        return bad;
    const iscsihost::RetentionPolicy policy = readPolicy(request.input);
    std::vector<iscsihost::RetentionVerdict> verdicts;
    if (int err = iscsihost::tryRetention(lid, request.input.empty() ? nullptr : &policy, verdicts))
        return failed(err);
    Result result;
    result.value = Json::arrayValue;
    for (const iscsihost::RetentionVerdict &verdict : verdicts) {
        Json::Value &out = result.value.append(Json::objectValue);
        out["uuid"] = verdict.uuid;
        out["snapshot_id"] = verdict.snapshot_id;
        out["name"] = verdict.name;
        out["snapshot_time"] = static_cast<Json::Int64>(verdict.time);
        out["is_kept"] = verdict.kept;
        out["reason"] = verdict.reason;
    }
    return result;
}

Result listSchedules(const Request &)
{
    std::vector<iscsihost::Schedule> schedules;
    if (int err = iscsihost::listSchedules(schedules))
        return failed(err);
    Result result;
    result.value = Json::arrayValue;
    for (const iscsihost::Schedule &schedule : schedules)
        result.value.append(toJson(schedule));
    return result;
}

Result addSchedule(const Request &request)
{
    int lid = 0;
    if (Result bad = selectLunId(request.input["lun"].asString(), lid); bad.code)
        return bad;
    int64_t id = 0;
    if (int err = iscsihost::addSchedule("snapshot", lid, request.input["rule"].asString(), id))
        return failed(err);
    Result result = listSchedules(request);
    for (const Json::Value &schedule : result.value) {
        if (schedule["schedule_id"].asInt64() == id)
            return {0, "", Json::Value(schedule)};
    }
    return result.code ? result : failed(ERR_NO_SUCH_LUN, "it was deleted meanwhile");
}

Result removeSchedule(const Request &request)
{
    constexpr size_t MAX_DIGITS = 18;
    const std::string &id = request.path.at("schedule");
    if (id.empty() || id.size() > MAX_DIGITS || id.find_first_not_of("0123456789") != std::string::npos)
        return failed(ERR_BAD_PARAMETER, "schedule: '" + id + "' is no ID of a schedule");
    if (int err = iscsihost::removeSchedule(std::stoll(id)))
        return failed(err);
    return {};
}

Result listEvents(const Request &request)
{
    constexpr int64_t DEFAULT_COUNT = 20;
    const Json::Value &in = request.input;
    const int64_t count = in.isMember("count") ? in["count"].asInt64() : DEFAULT_COUNT;
    std::vector<iscsihost::Event> events;
    if (int err = iscsihost::listEvents(in["since"].asInt64(), count, events))
        return failed(err);
    Result result;
    result.value = Json::arrayValue;
    for (const iscsihost::Event &event : events) {
        Json::Value &out = result.value.append(Json::objectValue);
        out["event_id"] = static_cast<Json::Int64>(event.id);
        out["time"] = static_cast<Json::Int64>(event.time);
        out["scope"] = event.scope;
        out["level"] = event.level;
        out["number"] = event.number;
        out["message"] = event.message;
    }
    return result;
}

} // namespace webapi
