/// The record of one LUN: what callers pass in to create or select a LUN, and what listing returns.
#pragma once

#include "iscsiwebapi/ISCSIExport.h"
#include "platform/iscsi_lun.h"

#include <json/value.h>

#include <string>
#include <vector>

namespace ISCSI {

/// A value object. Methods that return int return an error code (ISCSIErrorCode.h), log what failed
/// to the system log, and throw nothing. Output arguments are written only on success.
class ISCSIWEBAPI_EXPORT ISCSILUNInfo {
public:
    /// Bits of the flags word of loadFromConfig and of the filter of ListLUN.
    enum LoadFlags : int {
        LOAD_QUIET = 1, ///< do not log a LUN that cannot be found
        LOAD_LOCKED = 2,
        LOAD_MAPPED = 4,
        LOAD_EXTENT_SIZE = 8,
        LOAD_ALLOCATED_SIZE = 16,
        LOAD_STATUS = 32,
    };

    int lun_id = 0; ///< 1 to 1024 once created
    _tag_iscsi_lun_type type = NORV_LUN_TYPE_NONE;
    long restored_time = 0;      ///< seconds since the epoch, 0 = never restored from a snapshot
    unsigned long long size = 0; ///< provisioned bytes
    std::string uuid;            ///< empty: no LUN is selected
    std::string name;            ///< at most 255 bytes
    std::string location;        ///< volume path, or device path of a BLOCK LUN; at most 4094 bytes

    // Live state: filled by the loaders below, or by the flags that ask for them.
    bool is_action_locked = false;
    bool is_mapped = false;
    unsigned int extent_size = 0;          ///< bytes
    unsigned long long allocated_size = 0; ///< bytes
    std::string status;                    ///< "normal", "creating", "Unhealthy" ...

    ISCSILUNInfo() = default;
    /// Selects a LUN.
    explicit ISCSILUNInfo(const std::string &uuid);
    /// A creation request.
    ISCSILUNInfo(_tag_iscsi_lun_type type, unsigned long long size, const std::string &name,
                 const std::string &location, unsigned int extent_size);
    ISCSILUNInfo(int lun_id, _tag_iscsi_lun_type type, long restored_time, unsigned long long size,
                 const std::string &uuid, const std::string &name, const std::string &location, bool is_action_locked,
                 bool is_mapped, unsigned int extent_size, unsigned long long allocated_size,
                 const std::string &status);
    /// Everything but the live state; the extent size is taken.
    explicit ISCSILUNInfo(const _tag_iscsi_lun_ &record);
    ISCSILUNInfo(const ISCSILUNInfo &) = default;
    ISCSILUNInfo &operator=(const ISCSILUNInfo &) = default;
    ISCSILUNInfo(ISCSILUNInfo &&) = default;
    ISCSILUNInfo &operator=(ISCSILUNInfo &&) = default;
    virtual ~ISCSILUNInfo();

    /// Whether no LUN is selected.
    bool isInvalid() const;

    /// One line for the log, times in local time.
    std::string toString() const;

    /// Writes this LUN into `record`, zeroed first. A text that does not fit gives
    /// ERR_FAILED_TO_COPY_STRING; the fields behind it are then left zero.
    int fillISCSILUN(_tag_iscsi_lun_ &record);

    /// Loads the LUN named by `uuid` into `record` and this object, then the live state that `flags`
    /// (LoadFlags) asks for. ERR_NO_LUN_UUID when none is selected, the platform's code when there is
    /// no such LUN. A failing live-state loader leaves what was loaded before it.
    int loadFromConfig(_tag_iscsi_lun_ &record, int flags);

    /// Sets this LUN's keys in `out`, other keys stay. Returns 3328, and writes nothing, when no LUN
    /// is selected.
    int toJsonFormat(Json::Value &out) const;

    /// Reads the record's JSON form. ERR_INVALID_INPUT, and nothing changed, when a required key is
    /// missing or a value is of the wrong type or out of range. An unknown type is read as 0.
    int loadFromJson(const Json::Value &in);

    // Live state. Each loader takes the SDK record of this LUN, and fills it first, by `uuid`, when
    // it holds no LUN yet.
    int loadIsActionLocked(_tag_iscsi_lun_ &record);
    int loadIsMapped(_tag_iscsi_lun_ &record);
    int loadExtentSize(_tag_iscsi_lun_ &record);
    int loadAllocatedSize(_tag_iscsi_lun_ &record);
    int loadStatus(_tag_iscsi_lun_ &record);

    /// The version UUID that the LUN's data was last synchronised to; all zeros for none.
    int getBaseVersion(std::string &out);
    /// Whether the data has changed since that version.
    int isModified(bool &out);
    /// Whether a sending to this LUN was left unfinished.
    int isSnapshotSentFailed(bool &out);
    /// The two counters of the copy that fills this LUN; both 0 for a LUN that is not of an extent pool.
    int loadSyncProgress(_tag_iscsi_lun_ &record, unsigned long long &first, unsigned long long &second);

    /// Replaces `out` by every LUN in the platform's order, with the live state that `filter`
    /// (LoadFlags) asks for. When the list itself cannot be had, `out` is untouched; when a LUN's
    /// live state cannot, `out` keeps the LUNs before it.
    static int ListLUN(std::vector<ISCSILUNInfo> &out, int filter);

    // Lookups; ERR_NO_SUCH_LUN whatever the platform's reason.
    static int GetUUIDByLID(int lun_id, std::string &uuid);
    static int GetUUIDByLUNName(const std::string &name, std::string &uuid);
    static int GetLIDByLUNName(const std::string &name, int &lun_id);

    /// Resolves a selector: a UUID (whose LUN need not exist), "lun#" and a 1-based index into the
    /// list, or a name. An empty selector gives an empty UUID. ERR_BAD_LUN_UUID for none of these.
    static int GetLUNUUID(const std::string &selector, std::string &uuid);
};

} // namespace ISCSI
