// Clones, exports and imports, and how far they are.
#include "webapi/handlers/Handlers.h"

#include "iscsiwebapi/ISCSIErrorCode.h"
#include "iscsiwebapi/ISCSILIBLUN.h"

namespace webapi {

using namespace ISCSI;
using LIB::LIBLUN::ISCSILIBLUN;

namespace {

Result describeLun(const std::string &uuid)
{
    return showLun({{{"lun", uuid}}, {}, {}});
}

/// `locked` was asked before the rest: when nothing holds the lock, the rest is how it ended.
Result describeProgress(bool locked, unsigned long long done, unsigned long long total, int step)
{
    Result result;
    result.value["is_action_locked"] = locked;
    result.value["done_bytes"] = static_cast<Json::UInt64>(done);
    result.value["total_bytes"] = static_cast<Json::UInt64>(total);
    result.value["step"] = step;
    return result;
}

} // namespace

Result cloneSnapshot(const Request &request)
{
    ISCSISnapshotInfo snapshot;
    std::string lun_uuid, clone_uuid;
    if (Result bad = selectSnapshot(request, snapshot, lun_uuid); bad.code)
        return bad;
    ISCSILIBLUN lun(lun_uuid);
    if (int err = lun.cloneSnapshot(snapshot.uuid, request.input["name"].asString(), clone_uuid))
        return failed(err);
    return describeLun(clone_uuid);
}

Result cloneLun(const Request &request)
{
    ISCSILIBLUN lun;
    std::string clone_uuid;
    if (Result bad = selectLun(request.path.at("lun"), lun.info.uuid); bad.code)
        return bad;
    if (int err = lun.localClone(request.input["name"].asString(), clone_uuid)) {
        // What the library refuses by itself has no reason of the platform's.
        const bool wrong_type = err == ERR_BAD_LUN_TYPE;
        return wrong_type ? failed(err, "only an adv or sink LUN can be cloned as it is; clone a snapshot of it")
                          : failed(err);
    }
    return describeLun(clone_uuid);
}

Result exportSnapshot(const Request &request)
{
    ISCSISnapshotInfo snapshot;
    std::string lun_uuid;
    if (Result bad = selectSnapshot(request, snapshot, lun_uuid); bad.code)
        return bad;
    ISCSILIBLUN lun(lun_uuid);
    if (int err = lun.exportLUN(snapshot.uuid, request.input["directory"].asString()))
        return failed(err);
    return showExport(request);
}

Result showExport(const Request &request)
{
    ISCSISnapshotInfo snapshot;
    std::string lun_uuid;
    if (Result bad = selectSnapshot(request, snapshot, lun_uuid); bad.code)
        return bad;
    unsigned long long done = 0, total = 0;
    int step = 0;
    if (int err = snapshot.getExportProgress(done, total, step))
        return failed(err);
    return describeProgress(snapshot.is_action_locked, done, total, step);
}

Result cancelExport(const Request &request)
{
    ISCSISnapshotInfo snapshot;
    std::string lun_uuid;
    if (Result bad = selectSnapshot(request, snapshot, lun_uuid); bad.code)
        return bad;
    ISCSILIBLUN lun(lun_uuid);
    if (int err = lun.exportCancel(snapshot.uuid))
        return failed(err);
    return {};
}

Result importLun(const Request &request)
{
    ISCSILIBLUN lun;
    if (Result bad = selectLun(request.path.at("lun"), lun.info.uuid); bad.code)
        return bad;
    if (int err = lun.importLUN(request.input["directory"].asString()))
        return failed(err);
    return showImport(request);
}

Result showImport(const Request &request)
{
    ISCSILIBLUN lun;
    if (Result bad = selectLun(request.path.at("lun"), lun.info.uuid); bad.code)
        return bad;
    bool locked = false;
    if (int err = lun.isLUNLocked(locked))
        return failed(err);
    unsigned long long done = 0, total = 0;
    int step = 0;
    if (int err = lun.getImportProgress(done, total, step))
        return failed(err);
    return describeProgress(locked, done, total, step);
}

Result cancelImport(const Request &request)
{
    ISCSILIBLUN lun;
    if (Result bad = selectLun(request.path.at("lun"), lun.info.uuid); bad.code)
        return bad;
    if (int err = lun.importCancel())
        return failed(err);
    return {};
}

} // namespace webapi
