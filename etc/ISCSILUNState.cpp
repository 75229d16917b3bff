// Live state of a LUN: its locks, mappings, allocation, status, and the versions of its data.
#include "iscsiwebapi/ISCSILUNInfo.h"

#include "etc/Failure.h"
#include "etc/PlatformAnswers.h"
#include "etc/Text.h"
#include "platform/core.h"
#include "platform/extent_pool.h"

#include <algorithm>
#include <cstdio>
#include <cstring>
#include <glob.h>
#include <memory>
#include <sys/stat.h>

namespace ISCSI {
namespace {

bool hasTypeBits(const _tag_iscsi_lun_ &record, int bits)
{
    return (record.type & bits) == bits;
}

/// Fills the record of the LUN unless it holds one.
int loadRecord(const ISCSILUNInfo &info, _tag_iscsi_lun_ &record, Site site)
{
    if (record.lid >= 1 && record.lid <= NORV_LUN_ID_MAX)
        return 0;
    record = {};
    if (int err = NORViSCSILunConfigGetByUUID(info.uuid.c_str(), &record, 0))
        return failText(site, err, "Failed to load LUN info from SDK. LUN UUID: %s", info.uuid.c_str());
    return 0;
}

BoundedText<256> mapFileName(const _tag_iscsi_lun_ &record)
{
    constexpr int LONG_NUMBER_BITS = 71;
    const int width = hasTypeBits(record, LONG_NUMBER_BITS) ? 5 : 3;
    const std::string name = fieldText(record.name);
    if (hasTypeBits(record, NORV_LUN_EXTENT_POOL_BITS))
        return BoundedText<256>("iSCSI_%d_Extent_%s_%0*d", record.lid, name.c_str(), width, 0);
    return BoundedText<256>("iSCSI_%d_%s_%0*d", record.lid, name.c_str(), width, 0);
}

/// The path of a LUN's map file; what does not fit the platform's limits is cut.
BoundedText<320> mapFilePath(const _tag_iscsi_lun_ &record)
{
    const char *folder = record.options & NORV_LUN_OPTION_TRASH ? "@EP_trash" : "@iSCSITrg";
    return BoundedText<320>("%s/%s/%s", fieldText(record.location).c_str(), folder, mapFileName(record).c_str());
}

struct GlobResult : glob_t {
    GlobResult() : glob_t{} {}
    GlobResult(const GlobResult &) = delete;
    ~GlobResult() { globfree(this); }
};

bool sameVersion(const _tag_map_file_version_ &version)
{
    return strncmp(version.base_version, version.current_version, sizeof(version.base_version)) == 0;
}

/// The status word of a progress state, null when there is none.
const char *progressStatus(int state)
{
    static const char *const words[] = {
        nullptr,   "processing", "moving",     "creating",     "expanding",         "deleting", "cloning",
        "cloning", "restoring",  "be_cloning", "snapshotting", "snapshot_deleting", "creating",
    };
    return state > 0 && state < static_cast<int>(sizeof(words) / sizeof(words[0])) ? words[state] : nullptr;
}

} // namespace

int ISCSILUNInfo::loadIsActionLocked(_tag_iscsi_lun_ &record)
{
    if (int err = loadRecord(*this, record, here()))
        return err;
    if (int err = NORViSCSILunIsLocked(&record, &is_action_locked))
        return failText(here(), err, "Failed to check if LUN is locked. err: %s, info: %s", ErrorCodeToString(err),
                        toString().c_str());
    return 0;
}

int ISCSILUNInfo::loadIsMapped(_tag_iscsi_lun_ &record)
{
    if (int err = loadRecord(*this, record, here()))
        return err;
    if (queryIsMapped(record.lid, is_mapped))
        return failText(here(), ERR_FAILED_TO_LIST_LUN, "Failed to list LUN's mapping targets. LUN ID: %d", record.lid);
    return 0;
}

int ISCSILUNInfo::loadExtentSize(_tag_iscsi_lun_ &record)
{
    if (int err = loadRecord(*this, record, here()))
        return err;
    extent_size = record.extent_size;
    return 0;
}

int ISCSILUNInfo::loadAllocatedSize(_tag_iscsi_lun_ &record)
{
    if (int err = loadRecord(*this, record, here()))
        return err;
    if (hasTypeBits(record, NORV_LUN_EXTENT_POOL_BITS)) {
        const auto path = mapFilePath(record);
        uint64_t bytes = 0;
        if (int err = NORVExtentPoolMapFileMappedSizeGet(path.c_str(), record.location, &bytes))
            return failText(here(), err, "Failed to get mapped size from %s", path.c_str());
        allocated_size = bytes;
        return 0;
    }
    if (hasTypeBits(record, NORV_LUN_TYPE_FILE)) {
        allocated_size = 0;
        char pattern[4095];
        const int length = snprintf(pattern, sizeof(pattern), "%s/%s/*_%s_*", fieldText(record.location).c_str(),
                                    "@iSCSITrg", fieldText(record.name).c_str());
        if (length < 0 || static_cast<size_t>(length) >= sizeof(pattern))
            return failText(here(), ERR_FAILED_TO_COPY_STRING, "Failed to copy file path");
        GlobResult found;
        if (glob(pattern, GLOB_DOOFFS, nullptr, &found))
            return failText(here(), ERR_FAILED_TO_GLOB, "Failed to copy file path");
        if (found.gl_pathc == 0)
            return failText(here(), ERR_FILE_NOT_FOUND, "No map file found");
        for (size_t i = 0; i < found.gl_pathc; ++i) {
            struct stat file;
            if (stat(found.gl_pathv[i], &file) == 0)
                allocated_size += static_cast<unsigned long long>(file.st_blocks) * 512;
        }
        allocated_size = std::min<unsigned long long>(allocated_size, record.size);
        return 0;
    }
    if (record.type == NORV_LUN_TYPE_BLOCK) {
        allocated_size = record.size;
        return 0;
    }
    return ERR_BAD_LUN_TYPE;
}

int ISCSILUNInfo::loadStatus(_tag_iscsi_lun_ &record)
{
    if (int err = loadRecord(*this, record, here()))
        return err;
    if (NLIBCExec("/usr/norv/sbin/epck", "--vaaick", "nolog", nullptr, nullptr)) {
        status = "unavailabling";
        return 0;
    }
    _tag_iscsi_lun_progress_ progress{};
    if (NORViSCSILunProgressGet(&record, &progress) == 0 && progress.st != NORV_LUN_IDLE) {
        if (const char *word = progressStatus(progress.st)) {
            status = word;
            return 0;
        }
        failText(here(), ERR_FAILED_TO_GET_LUN_STATUS,
                 "Failed to get LUN's status. progress.st: %d info: %s. error: %d (%s)", progress.st,
                 toString().c_str(), ERR_FAILED_TO_GET_LUN_STATUS, ErrorCodeToString(ERR_FAILED_TO_GET_LUN_STATUS));
        return 0;
    }
    _tag_iscsi_family_ family{};
    const bool unhealthy =
        NORViSCSIFamilyConfGetByLID(record.lid, &family) == 0 && fieldText(family.status) == "Unhealthy";
    status = unhealthy ? "Unhealthy" : "normal";
    return 0;
}

int ISCSILUNInfo::getBaseVersion(std::string &out)
{
    _tag_iscsi_lun_ record{};
    if (int err = loadFromConfig(record, 0))
        return failText(here(), err, "Failed to load LUN info. LUN UUID: %s", uuid.c_str());
    char version[40] = {};
    if (int err = NORVExtentPoolMapFileBaseVersionGet(mapFilePath(record).c_str(), version))
        return failText(here(), err, "Failed to get LUN base version. LUN UUID: %s", uuid.c_str());
    out = fieldText(version);
    return 0;
}

int ISCSILUNInfo::isModified(bool &out)
{
    _tag_iscsi_lun_ record{};
    if (int err = loadFromConfig(record, 0))
        return failText(here(), err, "Failed to load LUN info. LUN UUID: %s", uuid.c_str());
    _tag_map_file_version_ version{};
    if (int err = NORVExtentPoolMapFileVersionInfoGet(mapFilePath(record).c_str(), &version))
        return failText(here(), err, "Failed to get LUN version info. LUN UUID: %s", uuid.c_str());
    out = !sameVersion(version);
    return 0;
}

int ISCSILUNInfo::isSnapshotSentFailed(bool &out)
{
    _tag_iscsi_lun_ record{};
    if (int err = loadFromConfig(record, 0))
        return failText(here(), err, "Failed to load LUN info. LUN UUID: %s", uuid.c_str());
    const auto path = mapFilePath(record);
    _tag_map_file_version_ version{};
    uint64_t total = 0;
    uint64_t synced = 0;
    if (int err = NORVExtentPoolMapFileVersionInfoGet(path.c_str(), &version))
        return failText(here(), err, "Failed to get LUN's version info. LUN UUID: %s", uuid.c_str());
    if (int err = NORVExtentPoolMapFileTotalCountGet(path.c_str(), &total))
        return failText(here(), err, "Failed to get LUN's total count. LUN UUID: %s", uuid.c_str());
    if (int err = NORVExtentPoolMapFileSyncedCountGet(path.c_str(), &synced))
        return failText(here(), err, "Failed to get LUN's synced count. LUN UUID: %s", uuid.c_str());
    out = !sameVersion(version) && total != 0 && total != synced;
    return 0;
}

int ISCSILUNInfo::loadSyncProgress(_tag_iscsi_lun_ &record, unsigned long long &first, unsigned long long &second)
{
    if (int err = loadRecord(*this, record, here()))
        return err;
    uint64_t done = 0;
    uint64_t total = 0;
    if (hasTypeBits(record, NORV_LUN_EXTENT_POOL_BITS)) {
        if (int err = NORViSCSIChildLunSyncProgressGet(mapFilePath(record).c_str(), &done, &total))
            return fail(err, *this, "Failed to get LUN sync progress");
    }
    first = done;
    second = total;
    return 0;
}

} // namespace ISCSI
