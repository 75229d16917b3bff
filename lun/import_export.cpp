// Export of snapshots to directories, import of such directories, and progress.
#include "iscsiwebapi/ISCSILIBLUN.h"

#include "etc/Failure.h"
#include "etc/ProgressFile.h"
#include "etc/Text.h"
#include "etc/Worker.h"
#include "lun/Waits.h"
#include "platform/core.h"

#include <cstdlib>

namespace ISCSI::LIB::LIBLUN {
namespace {

BoundedText<320> importProgressPath(int lid)
{
    return BoundedText<320>("/tmp/iscsi/L%d.import_progress", lid);
}

/// What the worker of an import does: wait for its end and, when it has succeeded, take the snapshot
/// that closes it.
int finishImport(ISCSILIBLUN &lun, const std::string &source, Site site)
{
    const ISCSILUNInfo &info = lun.info;
    if (int err = NORViSCSILunWaitUntilUnlock(&lun.record, NO_LIMIT))
        return fail(err, info, "Failed to wait until LUN is unlocked", site);
    char value[32];
    const int found =
        NLIBCFileGetKeyValue(importProgressPath(info.lun_id).c_str(), "step", value, static_cast<int>(sizeof(value)));
    if (found <= 0)
        return fail(found, info, "Failed to get the status of import", site);
    if (int step = static_cast<int>(strtol(value, nullptr, 10)))
        return fail(step, info, "The status of import is not success", site);
    _tag_iscsi_export_config_ config{};
    if (int err = NORViSCSISnapshotExportConfigGet(source.c_str(), &config))
        return failText(site, err, "Failed to get export config from directory '%s' info: %s. error: %d (%s)",
                        source.c_str(), info.toString().c_str(), err, ErrorCodeToString(err));
    std::string snapshot_uuid;
    int snapshot_id = 0;
    if (int err = lun.takeSnapshot(config.app_consistent, config.user_locked, "", fieldText(config.desc),
                                   fieldText(config.taken_by), config.snap_time, false, snapshot_uuid, snapshot_id))
        return fail(err, info, "Failed to take snapshot when import done", site);
    return 0;
}

} // namespace

int ISCSILIBLUN::exportLUN(const std::string &snapshot_uuid, const std::string &destination)
{
    _tag_iscsi_snapshot_ snapshot{};
    if (int err = NORViSCSISnapshotConfGetByUUID(snapshot_uuid.c_str(), &snapshot))
        return failText(here(), err, "Failed to load snapshot config. UUID: %s.", snapshot_uuid.c_str());
    if (int err = NORViSCSISnapshotExport(&snapshot, destination.c_str()))
        return failText(here(), err, "Failed to export snapshot. UUID: %s.", snapshot_uuid.c_str());
    return 0;
}

int ISCSILIBLUN::exportCancel(const std::string &snapshot_uuid)
{
    _tag_iscsi_snapshot_ snapshot{};
    if (int err = NORViSCSISnapshotConfGetByUUID(snapshot_uuid.c_str(), &snapshot))
        return failText(here(), err, "Failed to load snapshot config. UUID: %s.", snapshot_uuid.c_str());
    if (int err = NORViSCSISnapshotExportCancel(&snapshot))
        return failText(here(), err, "Failed to cancel export snapshot. UUID: %s.", snapshot_uuid.c_str());
    if (int err = NORViSCSISnapshotWaitUntilUnlock(&snapshot, CANCEL_LIMIT))
        return failText(here(), err, "Failed to wait until cancel export completed. UUID: %s.", snapshot_uuid.c_str());
    return 0;
}

int ISCSILIBLUN::importLUN(const std::string &source)
{
    if (int err = info.loadFromConfig(record, 0))
        return fail(err, info, "Failed to load LUN info from SDK");
    if (int err = NORViSCSILunImport(&record, source.c_str()))
        return fail(err, info, "Failed to import to LUN");
    const auto finish = [this, &source, site = here()] {
        if (int err = finishImport(*this, source, site))
            failTagged(site, err, info.toString());
    };
    if (int err = startWorker(finish))
        return failText(here(), err, "Failed to fork a process. info info: %s. error: %d (%s)", info.toString().c_str(),
                        err, ErrorCodeToString(err));
    return 0;
}

int ISCSILIBLUN::importCancel()
{
    if (int err = info.loadFromConfig(record, 0))
        return fail(err, info, "Failed to load LUN info from SDK");
    if (int err = NORViSCSILunImportCancel(&record))
        return fail(err, info, "Failed to cancel import to LUN");
    if (int err = NORViSCSILunWaitUntilUnlock(&record, CANCEL_LIMIT))
        return fail(err, info, "Failed to wait until cancel import completed");
    return 0;
}

int ISCSILIBLUN::getImportProgress(unsigned long long &done_bytes, unsigned long long &total_bytes, int &step)
{
    constexpr int DECIMAL = 10;
    if (int err = info.loadFromConfig(record, 0))
        return failText(here(), err, "Failed to load LUN info from SDK info: %s. error: %d (%s)",
                        info.toString().c_str(), err, ErrorCodeToString(err));
    const auto path = importProgressPath(info.lun_id);
    if (!NLIBCFileExist(path.c_str())) {
        done_bytes = total_bytes = 0;
        step = ERR_NOW_IS_NOT_IMPORTING;
        return 0;
    }
    if (const char *key = readProgressFile(path.c_str(), DECIMAL, done_bytes, total_bytes, step))
        return failText(here(), ERR_FAILED_TO_GET_FILE_SESSION, "Failed to get import progress from '%s': key = %s",
                        path.c_str(), key);
    return 0;
}

int ISCSILIBLUN::getSyncProgress(unsigned long long &done, unsigned long long &total)
{
    if (int err = info.loadFromConfig(record, 0))
        return fail(err, info, "Failed to load LUN info from SDK");
    if (int err = info.loadSyncProgress(record, done, total))
        return fail(err, info, "Failed to load sync progress");
    return 0;
}

} // namespace ISCSI::LIB::LIBLUN
