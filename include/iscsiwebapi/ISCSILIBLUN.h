/// The operations on one LUN.
#pragma once

#include "iscsiwebapi/ISCSIExport.h"
#include "iscsiwebapi/ISCSILUNInfo.h"

#include <set>
#include <string>
#include <vector>

namespace ISCSI::LIB::LIBLUN {

/// Built around a creation request or a selection by UUID; one method per operation. Every method
/// that needs the LUN loads it anew, so one object serves several calls. Methods return an error
/// code (ISCSIErrorCode.h), log what failed to the system log, and throw nothing.
class ISCSIWEBAPI_EXPORT ISCSILIBLUN {
public:
    ISCSILUNInfo info;        ///< the LUN acted on
    _tag_iscsi_lun_ record{}; ///< buffer of the platform calls

    ISCSILIBLUN() = default;
    explicit ISCSILIBLUN(const std::string &uuid);
    ISCSILIBLUN(const std::string &name, _tag_iscsi_lun_type type, const std::string &location, unsigned long long size,
                unsigned int extent_size);
    virtual ~ISCSILIBLUN();

    /// Refreshes `info` and `record`; `flags` are ISCSILUNInfo::LoadFlags.
    int loadLUNInfo(int flags);

    /// Creates the LUN that `info` describes; `info` receives its ID and UUID. ERR_BAD_LUN_NAME,
    /// ERR_BAD_LUN_TYPE or ERR_BAD_LUN_LOCATION for input that cannot be; the size is the platform's
    /// to judge.
    int createLUN();

    /// Deletes the LUN, its data, and its schedules and retention policy. ERR_FAILED_TO_DELETE_LUN
    /// when the platform refuses; the LUN then stays, its schedules do not.
    int deleteLUN();

    int isLUNLocked(bool &out);

    /// Whether the LUN is mapped to any target.
    int isLUNMapped(bool &out);

    /// Puts the LUN into the running iSCSI service, or takes it out; `is_for_trash` also moves it out
    /// of the trash or into it, and wins over `is_for_unsync_size`.
    int loadLUN(bool is_for_trash, bool is_for_unsync_size);
    int unloadLUN(bool is_for_trash, bool is_for_unsync_size);

    /// Renames (unless `new_name` is empty) and grows (unless `new_size`, in bytes, is 0) the LUN.
    /// ERR_BAD_LUN_SIZE for a smaller size, ERR_DUPLICATED_LUN_NAME for a name in use, the LUN's own
    /// included, ERR_BAD_LUN_TYPE for a BLOCK LUN. `info` is not refreshed.
    int updateLUN(const std::string &new_name, unsigned long long new_size);

    /// Maps the LUN to 1 to 256 targets, or removes the mappings. When the platform refuses,
    /// mapTarget gives ERR_FAILED_TO_MAP_TARGET and unmapTarget ERR_BAD_TARGET_ID.
    int mapTarget(const std::set<int> &target_ids);
    int unmapTarget(const std::set<int> &target_ids);

    /// ISCSILUNInfo::ListLUN.
    static int ListLUN(std::vector<ISCSILUNInfo> &out, int filter);
};

} // namespace ISCSI::LIB::LIBLUN
