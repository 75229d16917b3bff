#include "webapi/handlers/Handlers.h"

#include "iscsihost/host.h"
#include "iscsihost/read_view.h"
#include "iscsihost/replication.h"
#include "iscsiwebapi/ISCSIErrorCode.h"
#include "iscsiwebapi/ISCSILIBLUN.h"

#include <pwd.h>
#include <unistd.h>

#include <ctime>
#include <map>

namespace webapi {

using namespace ISCSI;
using LIB::LIBLUN::ISCSILIBLUN;

namespace {

constexpr int ALL_FACTS = ISCSISnapshotInfo::LOAD_ACTION_LOCK | ISCSISnapshotInfo::LOAD_LOCKED_APP_KEYS;

/// The snapshot's JSON form with its lock facts, "lun_name", "sync_progress" and "loaded_number".
Result describe(const std::string &uuid)
{
    ISCSISnapshotInfo snapshot(uuid);
    if (int err = snapshot.loadFromConfig(ALL_FACTS))
        return failed(err);
    Result result;
    if (int err = snapshot.toJsonFormat(result.value))
        return failed(err);
    ISCSILUNInfo lun;
    _tag_iscsi_lun_ record{};
    if (int err = ISCSILUNInfo::GetUUIDByLID(snapshot.parent_lun_id, lun.uuid))
        return failed(err);
    if (int err = lun.loadFromConfig(record, 0))
        return failed(err);
    result.value["lun_name"] = lun.name;
    unsigned long long done = 0, total = 0;
    if (snapshot.loadSyncProgress(done, total))
        done = total = 0; // its data is missing, which "status" tells: it can be shown and deleted all the same
    result.value["sync_progress"] = static_cast<Json::UInt64>(done < total ? done : 0);
    int loaded_number = 0;
    if (int err = iscsihost::snapshotLunNumber(uuid, loaded_number))
        return failed(err);
    result.value["loaded_number"] = loaded_number;
    return result;
}

/// Resolves the request's snapshot, lets `act` do something with it, and describes it as it is then.
template <class Act>
Result changeSnapshot(const Request &request, Act act)
{
    ISCSISnapshotInfo snapshot;
    std::string lun_uuid;
    if (Result bad = selectSnapshot(request, snapshot, lun_uuid); bad.code)
        return bad;
    ISCSILIBLUN lun(lun_uuid);
    if (int err = act(lun, snapshot))
        return failed(err);
    return describe(snapshot.uuid);
}

/// The name of the machine's user that this process belongs to, or the number of one without a name.
std::string userName()
{
    const passwd *user = getpwuid(geteuid());
    return user ? user->pw_name : std::to_string(geteuid());
}

/// Who is said to act: whom the request names, else the session's account, or the machine's user without a session.
std::string actor(const Request &request, const char *field)
{
    constexpr size_t ACTOR_MAX_BYTES = 31; // what fits the SDK's record
    const std::string named = request.input[field].asString();
    if (!named.empty())
        return named;
    return (request.token.empty() ? userName() : request.account).substr(0, ACTOR_MAX_BYTES);
}

/// The lock of the user, or of an application when the request names its key.
Result setLock(const Request &request, bool locked)
{
    const std::string key = request.input["app_key"].asString();
    return changeSnapshot(request, [&](ISCSILIBLUN &, const ISCSISnapshotInfo &snapshot) {
        if (key.empty())
            return iscsihost::setSnapshotUserLock(snapshot.uuid, locked);
        return locked ? snapshot.lockSnapshotByAppKey(key) : snapshot.unlockSnapshotByAppKey(key);
    });
}

/// The names of all LUNs by their IDs.
int lunNames(std::map<int, std::string> &names)
{
    std::vector<ISCSILUNInfo> luns;
    if (int err = ISCSILUNInfo::ListLUN(luns, 0))
        return err;
    for (const ISCSILUNInfo &lun : luns)
        names[lun.lun_id] = lun.name;
    return 0;
}

} // namespace

Result selectSnapshot(const Request &request, ISCSISnapshotInfo &snapshot, std::string &lun_uuid)
{
    const std::string &selector = request.path.at("snapshot");
    if (int err = ISCSISnapshotInfo::GetSnapshotUUID(selector, snapshot.uuid))
        return failed(err, err == ERR_BAD_SNAPSHOT_UUID
                               ? "no snapshot has the UUID, index or LUN_SNAPSHOT name '" + selector + "'"
                               : iscsi_host_last_error());
    if (int err = snapshot.loadFromConfig(ALL_FACTS))
        return failed(err);
    if (int err = ISCSILUNInfo::GetUUIDByLID(snapshot.parent_lun_id, lun_uuid))
        return failed(err);
    return {};
}

Result listSnapshots(const Request &request)
{
    ISCSILIBLUN lun;
    if (request.input.isMember("lun")) {
        if (Result bad = selectLun(request.input["lun"].asString(), lun.info.uuid); bad.code)
            return bad;
    }
    std::vector<ISCSISnapshotInfo> snapshots;
    std::map<int, std::string> names;
    {
        const iscsihost::ReadView view;
        if (int err = lun.listSnapshot(snapshots, ALL_FACTS))
            return failed(err);
        if (int err = lunNames(names))
            return failed(err);
    }
    Result result;
    result.value = Json::arrayValue;
    for (ISCSISnapshotInfo &snapshot : snapshots) {
        // Its data may have been moved or removed since it was listed.
        const int err = snapshot.status == "Unhealthy" ? snapshot.loadFromConfig(ALL_FACTS) : 0;
        if (err == ERR_NO_SUCH_SNAPSHOT)
            continue;
        if (err)
            return failed(err);
        Json::Value &out = result.value.append(Json::Value());
        snapshot.toJsonFormat(out);
        out["lun_name"] = names[snapshot.parent_lun_id];
    }
    return result;
}

Result takeSnapshot(const Request &request)
{
    const Json::Value &in = request.input;
    ISCSILIBLUN lun;
    if (Result bad = selectLun(request.path.at("lun"), lun.info.uuid); bad.code)
        return bad;
    const long point_in_time = static_cast<long>(in["snapshot_time"].asInt64());
    std::string uuid;
    int id = 0;
    if (point_in_time && in["name"].asString().empty()) { // a peer, which asks again when it did not hear the answer
        if (int err = iscsihost::findArrivedSnapshot(lun.info.uuid, point_in_time, uuid))
            return failed(err);
        if (!uuid.empty())
            return describe(uuid);
    }
    if (int err =
            lun.takeSnapshot(in["is_app_consistent"].asBool(), in["is_user_locked"].asBool(), in["name"].asString(),
                             in["description"].asString(), actor(request, "taken_by"),
                             point_in_time ? point_in_time : time(nullptr), in["is_scheduled"].asBool(), uuid, id))
        return failed(err);
    return describe(uuid);
}

Result showSnapshot(const Request &request)
{
    return changeSnapshot(request, [](ISCSILIBLUN &, const ISCSISnapshotInfo &) { return 0; });
}

Result deleteSnapshot(const Request &request)
{
    ISCSISnapshotInfo snapshot;
    std::string lun_uuid;
    if (Result bad = selectSnapshot(request, snapshot, lun_uuid); bad.code)
        return bad;
    ISCSILIBLUN lun(lun_uuid);
    if (int err = lun.deleteSnapshot(snapshot.uuid, actor(request, "deleted_by")))
        return failed(err);
    return {};
}

Result restoreSnapshot(const Request &request)
{
    return changeSnapshot(request, [](ISCSILIBLUN &lun, const ISCSISnapshotInfo &snapshot) {
        return lun.restoreSnapshot(snapshot.uuid);
    });
}

Result lockSnapshot(const Request &request)
{
    return setLock(request, true);
}

Result unlockSnapshot(const Request &request)
{
    return setLock(request, false);
}

Result stopSnapshot(const Request &request)
{
    return changeSnapshot(
        request, [](ISCSILIBLUN &lun, const ISCSISnapshotInfo &snapshot) { return lun.stopSnapshot(snapshot.uuid); });
}

Result loadSnapshot(const Request &request)
{
    const bool trash = request.input["is_for_trash"].asBool();
    return changeSnapshot(request, [=](ISCSILIBLUN &lun, const ISCSISnapshotInfo &snapshot) {
        return lun.loadSnapshot(snapshot.uuid, trash, false);
    });
}

Result unloadSnapshot(const Request &request)
{
    const bool trash = request.input["is_for_trash"].asBool();
    return changeSnapshot(request, [=](ISCSILIBLUN &lun, const ISCSISnapshotInfo &snapshot) {
        return lun.unloadSnapshot(snapshot.uuid, trash, false);
    });
}

} // namespace webapi
