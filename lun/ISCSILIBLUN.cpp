#include "iscsiwebapi/ISCSILIBLUN.h"

#include "etc/Failure.h"
#include "etc/ISCSIWebAPIStringTool.h"
#include "etc/PlatformAnswers.h"
#include "etc/Text.h"
#include "platform/retention.h"
#include "platform/schedule.h"

namespace ISCSI::LIB::LIBLUN {
namespace {

void removeSchedule(long id, Site site)
{
    constexpr long NONE = -1;
    if (id == NONE)
        return;
    if (int err = NORVSchedTaskRemove(id); err < 0)
        failShort(site, err, "NORVSchedTaskRemove() fail, schedule id = %ld", id);
}

/// A LUN goes even when its schedules or its retention policy cannot.
void removeScheduledJobs(const _tag_iscsi_lun_ &record, Site site = here())
{
    removeSchedule(NORViSCSILunTaskGetSchIDByName(record.name), site);
    removeSchedule(ScheduleSnapshotTaskGetIDByLid(record.lid), site);
    char key[32];
    snprintf(key, sizeof(key), "%d", record.lid);
    NORVRETENTIONRemovePolicy("Lun#", key);
}

/// Loads the LUN and says in its record what loading or unloading is for. Moving it to or from the
/// trash wins over a computation.
int loadWithOptions(ISCSILIBLUN &lun, bool is_for_trash, bool is_for_unsync_size, Site site)
{
    if (int err = lun.info.loadFromConfig(lun.record, 0))
        return fail(err, lun.info, "Failed to load LUN config", site);
    if (is_for_trash)
        lun.record.options |= NORV_LUN_OPTION_TRASH;
    else if (is_for_unsync_size)
        lun.record.options |= NORV_LUN_OPTION_UNSYNC_SIZE;
    return 0;
}

/// Target IDs as the platform takes them: ascending, at the start of a zeroed array.
struct TargetIDs {
    int ids[NORV_TARGET_ID_MAX] = {};
    int count = 0;
};

/// Loads the LUN and takes 1 to NORV_TARGET_ID_MAX target IDs; the IDs are the platform's to judge.
int loadWithTargets(ISCSILIBLUN &lun, const std::set<int> &targets, TargetIDs &out, Site site)
{
    if (int err = lun.info.loadFromConfig(lun.record, 0))
        return fail(err, lun.info, "Failed to load LUN config", site);
    if (targets.empty() || targets.size() > NORV_TARGET_ID_MAX)
        return failText(site, ERR_BAD_TARGET_ID, "Invalid number of target ID: %zu info: %s. error: %d (%s)",
                        targets.size(), lun.info.toString().c_str(), ERR_BAD_TARGET_ID,
                        ErrorCodeToString(ERR_BAD_TARGET_ID));
    for (int tid : targets)
        out.ids[out.count++] = tid;
    return 0;
}

std::string joined(const std::set<int> &numbers)
{
    std::string text;
    for (int number : numbers)
        text += (text.empty() ? "" : " ") + std::to_string(number);
    return text;
}

} // namespace

ISCSILIBLUN::ISCSILIBLUN(const std::string &uuid) : info(uuid) {}

ISCSILIBLUN::ISCSILIBLUN(const std::string &name, _tag_iscsi_lun_type type, const std::string &location,
                         unsigned long long size, unsigned int extent_size)
    : info(type, size, name, location, extent_size)
{
}

ISCSILIBLUN::~ISCSILIBLUN() = default;

int ISCSILIBLUN::loadLUNInfo(int flags)
{
    if (int err = info.loadFromConfig(record, flags))
        return fail(err, info, "Failed to load LUN config");
    return 0;
}

int ISCSILIBLUN::createLUN()
{
    if (info.name.empty() || info.name.size() >= sizeof(record.name))
        return fail(ERR_BAD_LUN_NAME, info, "Invalid name to create LUN");
    if (info.type == NORV_LUN_TYPE_NONE)
        return fail(ERR_BAD_LUN_TYPE, info, "Invalid type to create LUN");
    if (info.location.empty() || info.location.size() >= sizeof(record.location))
        return fail(ERR_BAD_LUN_LOCATION, info, "Invalid location to create LUN");
    if (int err = info.fillISCSILUN(record))
        return fail(err, info, "Failed to fill ISCSI_LUN struct");
    if (int err = NORViSCSILunCreate(&record))
        return fail(err, info, "Failed to create LUN");
    info.lun_id = record.lid;
    info.uuid = fieldText(record.uuid);
    return 0;
}

int ISCSILIBLUN::deleteLUN()
{
    if (int err = info.loadFromConfig(record, 0))
        return fail(err, info, "Failed to load LUN config");
    if ((record.type & NORV_LUN_EXTENT_POOL_BITS) == NORV_LUN_EXTENT_POOL_BITS)
        removeScheduledJobs(record);
    if (int err = NORViSCSILunDelete(&record))
        return failText(here(), ERR_FAILED_TO_DELETE_LUN, "Failed to delete LUN: %s. error code: %d",
                        info.toString().c_str(), err);
    return 0;
}

int ISCSILIBLUN::isLUNLocked(bool &out)
{
    if (int err = info.loadFromConfig(record, 0))
        return failText(here(), err, "Failed to load LUN info from SDK info: %s. error: %d (%s)",
                        info.toString().c_str(), err, ErrorCodeToString(err));
    if (int err = NORViSCSILunIsLocked(&record, &out))
        return fail(err, info, "Failed to check if LUN is locked");
    return 0;
}

int ISCSILIBLUN::isLUNMapped(bool &out)
{
    if (int err = info.loadFromConfig(record, 0))
        return fail(err, info, "Failed to load LUN config");
    if (queryIsMapped(record.lid, out))
        return fail(ERR_FAILED_TO_LIST_LUN, info, "Failed to list LUN's mapping targets");
    return 0;
}

int ISCSILIBLUN::loadLUN(bool is_for_trash, bool is_for_unsync_size)
{
    if (int err = loadWithOptions(*this, is_for_trash, is_for_unsync_size, here()))
        return err;
    if (int err = NORViSCSILunLoad(&record))
        return failText(
            here(), err, "Failed to load LUN. is_for_trash: %s, is_for_unsync_size: %s info: %s. error: %d (%s)",
            boolText(is_for_trash), boolText(is_for_unsync_size), info.toString().c_str(), err, ErrorCodeToString(err));
    return 0;
}

int ISCSILIBLUN::unloadLUN(bool is_for_trash, bool is_for_unsync_size)
{
    if (int err = loadWithOptions(*this, is_for_trash, is_for_unsync_size, here()))
        return err;
    if (int err = NORViSCSILunUnload(&record))
        return failText(
            here(), err, "Failed to unload LUN. is_for_trash: %s, is_for_unsync_size: %s info: %s. error: %d (%s)",
            boolText(is_for_trash), boolText(is_for_unsync_size), info.toString().c_str(), err, ErrorCodeToString(err));
    return 0;
}

int ISCSILIBLUN::updateLUN(const std::string &new_name, unsigned long long new_size)
{
    if (int err = info.loadFromConfig(record, 0))
        return failText(here(), err, "Failed to load LUN info from SDK info: %s. error: %d (%s)",
                        info.toString().c_str(), err, ErrorCodeToString(err));
    if (record.type == NORV_LUN_TYPE_BLOCK)
        return failText(here(), ERR_BAD_LUN_TYPE, "Cannot update a block LUN info: %s. error: %d (%s)",
                        info.toString().c_str(), ERR_BAD_LUN_TYPE, ErrorCodeToString(ERR_BAD_LUN_TYPE));
    if (new_size != 0 && new_size < record.size)
        return failText(here(), ERR_BAD_LUN_SIZE, "Cannot shrink LUN size. new_size: %llu info: %s. error: %d (%s)",
                        new_size, info.toString().c_str(), ERR_BAD_LUN_SIZE, ErrorCodeToString(ERR_BAD_LUN_SIZE));
    bool exists = false;
    if (int err = NORViSCSILunIsNameExist(new_name.c_str(), &exists))
        return fail(err, info, "Failed to query if the LUN name exists");
    if (exists)
        return failText(here(), ERR_DUPLICATED_LUN_NAME, "Duplicated LUN name: %s info: %s. error: %d (%s)",
                        new_name.c_str(), info.toString().c_str(), ERR_DUPLICATED_LUN_NAME,
                        ErrorCodeToString(ERR_DUPLICATED_LUN_NAME));
    if (!new_name.empty()) {
        if (int err = StringCopy(record.name, new_name))
            return fail(err, info, "Failed to copy new LUN name");
    }
    if (new_size != 0)
        record.size = new_size;
    if (int err = NORViSCSILunUpdate(&record))
        return fail(err, info, "Failed to update LUN");
    return 0;
}

int ISCSILIBLUN::ListLUN(std::vector<ISCSILUNInfo> &out, int filter)
{
    return ISCSILUNInfo::ListLUN(out, filter);
}

int ISCSILIBLUN::mapTarget(const std::set<int> &target_ids)
{
    TargetIDs targets;
    if (int err = loadWithTargets(*this, target_ids, targets, here()))
        return err;
    if (int err = NORViSCSILunMappingsAdd(targets.ids, info.lun_id, targets.count))
        return failText(here(), ERR_FAILED_TO_MAP_TARGET,
                        "Failed to add mappings. targets: %s. info: %s. error: %d (%s)", joined(target_ids).c_str(),
                        info.toString().c_str(), err, ErrorCodeToString(err));
    return 0;
}

int ISCSILIBLUN::unmapTarget(const std::set<int> &target_ids)
{
    TargetIDs targets;
    if (int err = loadWithTargets(*this, target_ids, targets, here()))
        return err;
    if (int err = NORViSCSILunMappingsRemove(targets.ids, info.lun_id, targets.count))
        return failText(here(), ERR_BAD_TARGET_ID, "Failed to remove mappings. targets: %s. info: %s. error: %d (%s)",
                        joined(target_ids).c_str(), info.toString().c_str(), err, ErrorCodeToString(err));
    return 0;
}

} // namespace ISCSI::LIB::LIBLUN
