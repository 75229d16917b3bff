/// The record of one snapshot of one LUN.
#pragma once

#include "iscsiwebapi/ISCSIExport.h"
#include "platform/iscsi_snapshot.h"

#include <json/value.h>

#include <set>
#include <string>
#include <vector>

namespace ISCSI {

/// A value object. Methods that return int return an error code (ISCSIErrorCode.h), log what failed
/// to the system log, and throw nothing. Output arguments are written only on success unless a
/// method says otherwise.
class ISCSIWEBAPI_EXPORT ISCSISnapshotInfo {
public:
    /// Bits of the flags word of loadFromConfig and of the filter of ListSnapshot.
    enum LoadFlags : int {
        LOAD_ACTION_LOCK = 1,
        LOAD_LOCKED_APP_KEYS = 2,
    };

    int snapshot_id = 0; ///< number within its LUN, 1 to 256 once taken
    int parent_lun_id = 0;
    unsigned long long total_size = 0;  ///< bytes
    unsigned long long mapped_size = 0; ///< bytes allocated
    long create_time = 0;               ///< of the record; seconds since the epoch
    long snapshot_time = 0;             ///< the point in time it stands for; seconds since the epoch
    bool is_app_consistent = false;
    bool is_user_locked = false; ///< against deletion, by retention too
    std::string name;            ///< unique within its LUN, at most 255 bytes
    std::string status;
    std::string description; ///< at most 1023 bytes
    std::string root_path;   ///< the volume that holds the LUN's data
    std::string taken_by;    ///< at most 31 bytes
    std::string uuid;
    std::string version; ///< names the source snapshot that it stems from
    bool is_action_locked = false;
    std::set<std::string> locked_app_keys;

    ISCSISnapshotInfo() = default;
    /// Selects a snapshot.
    explicit ISCSISnapshotInfo(const std::string &uuid);
    /// Everything but the two lock facts.
    explicit ISCSISnapshotInfo(const _tag_iscsi_snapshot_ &record);
    ISCSISnapshotInfo(int snapshot_id, int parent_lun_id, unsigned long long total_size, unsigned long long mapped_size,
                      long create_time, long snapshot_time, bool is_app_consistent, bool is_user_locked,
                      const std::string &name, const std::string &status, const std::string &description,
                      const std::string &root_path, const std::string &taken_by, const std::string &uuid,
                      const std::string &version, bool is_action_locked, const std::set<std::string> &locked_app_keys);
    ISCSISnapshotInfo(const ISCSISnapshotInfo &) = default;
    ISCSISnapshotInfo &operator=(const ISCSISnapshotInfo &) = default;
    ISCSISnapshotInfo(ISCSISnapshotInfo &&) = default;
    ISCSISnapshotInfo &operator=(ISCSISnapshotInfo &&) = default;
    virtual ~ISCSISnapshotInfo();

    /// Reads the record's JSON form. ERR_INVALID_INPUT, and nothing changed, when a required key is
    /// missing or a value is of the wrong type or out of range. Application keys are added to those
    /// that the record holds.
    int loadFromJson(const Json::Value &in);

    /// Replaces `out` by the record's JSON form; ERR_INVALID_INPUT, with `out` untouched, when
    /// `snapshot_id` is negative.
    int toJsonFormat(Json::Value &out) const;

    /// One line for the log, times in local time.
    std::string toString() const;

    /// Loads the snapshot named by `uuid`, then the lock facts that `flags` (LoadFlags) asks for.
    /// ERR_INVALID_INPUT when none is selected, the platform's code when there is no such snapshot. A
    /// failing lock fact leaves what was loaded before it.
    int loadFromConfig(int flags);

    // The two lock facts. Each takes the SDK record of this snapshot, and fills it first, by `uuid`,
    // when it holds no snapshot yet.
    int loadActionLock(_tag_iscsi_snapshot_ &record);
    int loadLockedAppKeys(_tag_iscsi_snapshot_ &record);

    /// Locks the snapshot against deletion under an application's key of at most 127 bytes, or takes
    /// that lock back. `locked_app_keys` is not refreshed.
    int lockSnapshotByAppKey(const std::string &app_key) const;
    int unlockSnapshotByAppKey(const std::string &app_key) const;

    /// Bytes of the replication that fills this snapshot.
    int loadSyncProgress(unsigned long long &done, unsigned long long &total);

    /// Progress of a running export in bytes; with none running, zeros and `step`
    /// ERR_NOW_IS_NOT_EXPORTING. ERR_FAILED_TO_GET_FILE_SESSION for an unreadable progress file, with
    /// the outputs before the unreadable one set.
    int getExportProgress(unsigned long long &done_bytes, unsigned long long &total_bytes, int &step);

    /// Replaces `out` by the snapshots of the LUN `lid` (-1: of all LUNs) in the platform's order, with
    /// the lock facts that `filter` (LoadFlags) asks for; `time`, unless 0, restricts the platform's
    /// listing. When the list itself cannot be had, `out` is untouched; when a lock fact cannot, `out`
    /// keeps the snapshots before it.
    static int ListSnapshot(int lid, std::vector<ISCSISnapshotInfo> &out, long time, int filter);

    static int GetUUIDByLIDAndSnapshotName(int lid, const std::string &name, std::string &uuid);

    /// Resolves a selector: a UUID (whose snapshot need not exist), "sn#" and a 1-based index into the
    /// list of all snapshots, or LUN name, underscore and snapshot name (the LUN's name then holds no
    /// underscore). ERR_BAD_SNAPSHOT_UUID for none of these.
    static int GetSnapshotUUID(const std::string &input, std::string &uuid);

    /// Orders snapshots newest first.
    static bool CompareBySnapshotTime(ISCSISnapshotInfo first, ISCSISnapshotInfo second);
};

} // namespace ISCSI
