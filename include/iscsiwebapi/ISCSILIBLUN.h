/// The operations on one LUN.
#pragma once

#include "iscsiwebapi/ISCSIExport.h"
#include "iscsiwebapi/ISCSILUNInfo.h"
#include "iscsiwebapi/ISCSINodeInfo.h"
#include "iscsiwebapi/ISCSISnapshotInfo.h"

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

    // Snapshots. Taking, restoring and cloning start a platform action and return; a detached worker
    // waits for its end and does the follow-up work, whose failures reach only the log. The lock state
    // of the LUN tells when it is over. ERR_FAILED_TO_FORK leaves the action running.

    /// Takes a snapshot. An empty `name` lets the platform choose one, an empty `taken_by` is
    /// "webapi"; `snapshot_time` is in seconds since the epoch. The outputs are set as soon as the
    /// snapshot exists. The worker runs the LUN's retention policy.
    int takeSnapshot(bool is_app_consistent, bool is_user_locked, const std::string &name,
                     const std::string &description, const std::string &taken_by, long snapshot_time, bool is_scheduled,
                     std::string &snapshot_uuid, int &snapshot_id);

    /// Deletes a snapshot on behalf of `deleted_by` (empty: "webapi").
    int deleteSnapshot(const std::string &uuid, const std::string &deleted_by);

    /// ISCSISnapshotInfo::ListSnapshot of this LUN, or of every LUN when none is selected.
    int listSnapshot(std::vector<ISCSISnapshotInfo> &out, int filter);

    /// Sets the LUN back to a snapshot; the end is also written to the system event log.
    int restoreSnapshot(const std::string &uuid);

    /// Stops the action that holds both the snapshot and the LUN; nothing to stop is success.
    int stopSnapshot(const std::string &uuid);

    /// Puts a snapshot's data into the running iSCSI service, read-only, or takes it out;
    /// `is_for_trash` wins over `is_for_unsync_size`.
    int loadSnapshot(const std::string &uuid, bool is_for_trash, bool is_for_unsync_size);
    int unloadSnapshot(const std::string &uuid, bool is_for_trash, bool is_for_unsync_size);

    /// Makes a new LUN beside this one from a snapshot. `new_lun_uuid` is set as soon as the platform
    /// has accepted the clone; its start and end are written to the system event log.
    int cloneSnapshot(const std::string &snapshot_uuid, const std::string &new_lun_name, std::string &new_lun_uuid);

    /// Makes a new LUN from this one as it is now, and returns when it is complete. Extent-pool LUNs
    /// only, else ERR_BAD_LUN_TYPE.
    int localClone(const std::string &new_lun_name, std::string &new_lun_uuid);

    /// Starts the export of a snapshot into a directory; ISCSISnapshotInfo::getExportProgress follows it.
    int exportLUN(const std::string &snapshot_uuid, const std::string &destination);

    /// Stops a running export and returns when it has stopped.
    int exportCancel(const std::string &snapshot_uuid);

    /// Starts the import of an export directory into this LUN. When it has succeeded, the worker takes
    /// a snapshot that carries the exported one's note, author, time and flags.
    int importLUN(const std::string &source);

    /// Stops a running import and returns when it has stopped.
    int importCancel();

    /// Progress of a running import in bytes; with none running, zeros and `step`
    /// ERR_NOW_IS_NOT_IMPORTING. ERR_FAILED_TO_GET_FILE_SESSION for an unreadable progress file, with
    /// the outputs before the unreadable one set.
    int getImportProgress(unsigned long long &done_bytes, unsigned long long &total_bytes, int &step);

    /// Copies this LUN to a LUN on another node. An empty `dst_lun_uuid` creates the destination there,
    /// named `dst_lun_name` at `dst_location`, and is set to it; a given one is used, and never
    /// deleted. Only the first of the node's portals is used. Returns when the transfer runs; with
    /// `watch`, a detached worker follows it to its end and cleans up (a failed copy's destination
    /// goes if it was created here), without, the virtual LUN `vlun_uuid` is the caller's to follow
    /// and delete. Extent-pool LUNs only, else ERR_CANNOT_CLONE_A_BLOCK_LUN.
    int remoteClone(const std::string &dst_lun_name, const ISCSINodeInfo &node, const std::string &dst_location,
                    const std::set<std::string> &portals, std::string &vlun_uuid, std::string &dst_lun_uuid,
                    bool watch);

    /// ISCSILUNInfo::loadSyncProgress.
    int getSyncProgress(unsigned long long &done, unsigned long long &total);
};

} // namespace ISCSI::LIB::LIBLUN
