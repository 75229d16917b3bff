/// The record of one iSCSI target.
#pragma once

#include "iscsiwebapi/ISCSIExport.h"
#include "platform/iscsi_target.h"

#include <json/value.h>

#include <string>
#include <vector>

namespace ISCSI {

/// A value object. Methods that return int return an error code (ISCSIErrorCode.h), log what failed
/// to the system log, and throw nothing. Output arguments are written only on success.
class ISCSIWEBAPI_EXPORT ISCSITargetInfo {
public:
    /// Stands for a CHAP mode that the library does not know.
    static constexpr unsigned int AUTH_UNKNOWN = 0xFFFFFFFF;

    unsigned int tid = 0;  ///< 1 to 256, 0 = not created yet
    std::string name;      ///< at most 255 bytes
    std::string iqn;       ///< at most 255 bytes
    int mapping_index = 0; ///< when listed for a LUN: its LUN number in this target; -1 in a full list
    bool is_enabled = false;
    bool has_header_checksum = false;
    bool has_data_checksum = false;
    unsigned int max_recv_seg_bytes = 0;
    unsigned int max_send_seg_bytes = 0;
    unsigned int max_sessions = 0; ///< 0 = no limit
    unsigned int auth_type = 0;    ///< 0 none, 1 CHAP, 2 mutual CHAP, or AUTH_UNKNOWN
    std::string user;              ///< this and the three below: at most 63 bytes
    std::string password;
    std::string mutual_user;
    std::string mutual_password;

    ISCSITargetInfo() = default;
    explicit ISCSITargetInfo(unsigned int tid);
    ISCSITargetInfo(const std::string &name, const std::string &iqn, bool is_enabled, bool has_header_checksum,
                    bool has_data_checksum, unsigned int max_recv_seg_bytes, unsigned int max_send_seg_bytes,
                    unsigned int max_sessions, unsigned int auth_type, const std::string &user,
                    const std::string &password, const std::string &mutual_user, const std::string &mutual_password);
    ISCSITargetInfo(unsigned int tid, const std::string &name, const std::string &iqn, int mapping_index,
                    bool is_enabled, bool has_header_checksum, bool has_data_checksum, unsigned int max_recv_seg_bytes,
                    unsigned int max_send_seg_bytes, unsigned int max_sessions, unsigned int auth_type,
                    const std::string &user, const std::string &password, const std::string &mutual_user,
                    const std::string &mutual_password);
    ISCSITargetInfo(const ISCSITargetInfo &) = default;
    ISCSITargetInfo &operator=(const ISCSITargetInfo &) = default;
    ISCSITargetInfo(ISCSITargetInfo &&) = default;
    ISCSITargetInfo &operator=(ISCSITargetInfo &&) = default;
    virtual ~ISCSITargetInfo();

    /// One line for the log; secrets are not in it.
    std::string toString() const;

    /// Writes this target into `out`. A text that does not fit gives ERR_FAILED_TO_COPY_STRING and
    /// leaves the fields behind it as they were. An auth_type above 2 is written as AUTH_UNKNOWN.
    int fillISCSITARGET(_tag_iscsi_target_ &out) const;

    /// Loads the target named by `tid` into this object and copies its SDK record to `out`.
    /// ERR_FAILED_TO_LOAD_TARGET when there is none. `mutual_password` receives the CHAP secret.
    int loadFromConfig(_tag_iscsi_target_ &out);

    /// Replaces `value` by this target's keys, secrets included. Returns 3328, and leaves `value`
    /// untouched, when the name is empty.
    int toJsonFormat(Json::Value &value) const;

    /// ERR_NO_SUCH_TARGET when no target bears the name; else the platform's code.
    static int GetTIDByTargetName(const std::string &name, int &tid);

    /// Replaces `out` by every target (empty `lun_uuid`), or by those that the LUN is mapped to.
    /// `out` is emptied first, also on failure.
    static int ListTarget(std::vector<ISCSITargetInfo> &out, const std::string &lun_uuid);

    /// Resolves a selector: a target ID from 1 to 256 (its existence is not checked), "tg#" and a
    /// 1-based index into the list, or a name. ERR_BAD_TARGET_ID for none of these.
    static int GetTID(const std::string &selector, int &tid);

private:
    ISCSITargetInfo(const _tag_iscsi_target_ &record, int mapping_index);
};

} // namespace ISCSI
