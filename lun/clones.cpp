// Clones of a LUN on this appliance.
#include "iscsiwebapi/ISCSILIBLUN.h"

#include "etc/Failure.h"
#include "etc/ISCSIWebAPIStringTool.h"
#include "etc/LUNType.h"
#include "etc/Text.h"
#include "etc/Worker.h"
#include "lun/Waits.h"
#include "platform/event_log.h"

namespace ISCSI::LIB::LIBLUN {
namespace {

/// Events of a clone; each end is told once as a LUN's and once as a snapshot's.
enum Event : unsigned int {
    LUN_CLONE_STARTED = 0x13000027,
    LUN_CLONE_DONE = 0x13000037,
    LUN_CLONE_FAILED = 0x13000038,
    SNAPSHOT_CLONE_DONE = 0x13d0000b,
    SNAPSHOT_CLONE_FAILED = 0x13d0000c,
};

void logLUNEvent(int level, Event event, const _tag_iscsi_lun_ &clone)
{
    NORVLogSet1(1, level, event, fieldText(clone.name).c_str(), "Regular File", fieldText(clone.location).c_str(), "");
}

void logSnapshotEvent(int level, Event event, const _tag_iscsi_lun_ &clone, const _tag_iscsi_snapshot_ &snapshot,
                      const _tag_iscsi_lun_ &source)
{
    NORVLogSet1(9, level, event, fieldText(clone.name).c_str(), EventTime(snapshot.snap_time).c_str(),
                fieldText(source.name).c_str(), nullptr);
}

} // namespace

int ISCSILIBLUN::cloneSnapshot(const std::string &snapshot_uuid, const std::string &new_lun_name,
                               std::string &new_lun_uuid)
{
    if (int err = info.loadFromConfig(record, 0))
        return fail(err, info, "Failed to load LUN info from SDK");
    _tag_iscsi_lun_ clone = record;
    if (int err = StringCopy(clone.name, new_lun_name))
        return fail(err, info, "Failed to copy LUN name");
    _tag_iscsi_snapshot_ snapshot{};
    if (int err = NORViSCSISnapshotConfGetByUUID(snapshot_uuid.c_str(), &snapshot))
        return failShort(here(), err, "Failed to load snapshot config. UUID: %s, info: %s, error: %d (%s)",
                         snapshot_uuid.c_str(), info.toString().c_str(), err, ErrorCodeToString(err));
    logLUNEvent(1, LUN_CLONE_STARTED, clone);
    if (int err = NORViSCSISnapshotClone(&snapshot, &clone)) {
        failShort(here(), err, "Failed to clone snapshot. UUID: %s, info: %s, error: %d (%s)", snapshot_uuid.c_str(),
                  info.toString().c_str(), err, ErrorCodeToString(err));
        logLUNEvent(3, LUN_CLONE_FAILED, clone);
        logSnapshotEvent(3, SNAPSHOT_CLONE_FAILED, clone, snapshot, record);
        return err;
    }
    new_lun_uuid = fieldText(clone.uuid);

    const auto report = [this, &clone, &snapshot, site = here()] {
        if (int err = NORViSCSILunWaitUntilUnlock(&clone, ACTION_LIMIT)) {
            fail(err, info, "Failed to wait until restoring snapshot completed", site);
            return;
        }
        logLUNEvent(1, LUN_CLONE_DONE, clone);
        logSnapshotEvent(1, SNAPSHOT_CLONE_DONE, clone, snapshot, record);
    };
    if (int err = startWorker(report))
        return failText(here(), err, "Failed to fork a process. info info: %s. error: %d (%s)", info.toString().c_str(),
                        err, ErrorCodeToString(err));
    return 0;
}

int ISCSILIBLUN::localClone(const std::string &new_lun_name, std::string &new_lun_uuid)
{
    if (int err = info.loadFromConfig(record, 0))
        return fail(err, info, "Failed to load LUN config");
    if ((record.type & NORV_LUN_EXTENT_POOL_BITS) != NORV_LUN_EXTENT_POOL_BITS)
        return failText(here(), ERR_BAD_LUN_TYPE, "Bad LUN type: %s. info: %s. error: %d (%s)", LUNTypeName(info.type),
                        info.toString().c_str(), ERR_BAD_LUN_TYPE, ErrorCodeToString(ERR_BAD_LUN_TYPE));
    _tag_iscsi_lun_ clone = record;
    if (int err = StringCopy(clone.name, new_lun_name))
        return fail(err, info, "Failed to copy destination LUN name");
    if (int err = NORViSCSILunClone(&record, &clone))
        return failText(here(), err, "Failed to clone LUN to %s. info: %s. error: %d (%s)", new_lun_name.c_str(),
                        info.toString().c_str(), err, ErrorCodeToString(err));
    new_lun_uuid = fieldText(clone.uuid);
    return 0;
}

} // namespace ISCSI::LIB::LIBLUN
