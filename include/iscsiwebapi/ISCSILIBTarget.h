/// The operations on one target, and ACL masking.
#pragma once

#include "iscsiwebapi/ISCSIExport.h"
#include "iscsiwebapi/ISCSITargetInfo.h"
#include "platform/iscsi_masking.h"

#include <map>
#include <string>
#include <vector>

namespace ISCSI::LIB::LIBTarget {

/// Methods return an error code (ISCSIErrorCode.h), log what failed to the system log, and throw
/// nothing. Nothing is rolled back: what was done before a failing step stays done.
class ISCSIWEBAPI_EXPORT ISCSILIBTarget {
public:
    ISCSITargetInfo info;        ///< the target acted on
    _tag_iscsi_target_ record{}; ///< buffer of the platform calls

    ISCSILIBTarget() = default;
    explicit ISCSILIBTarget(unsigned int tid);
    ISCSILIBTarget(const std::string &name, const std::string &iqn, bool is_enabled, bool has_header_checksum,
                   bool has_data_checksum, unsigned int max_recv_seg_bytes, unsigned int max_send_seg_bytes,
                   unsigned int max_sessions, unsigned int auth_type, const std::string &user,
                   const std::string &password, const std::string &mutual_user, const std::string &mutual_password);
    virtual ~ISCSILIBTarget();

    /// Creates the target that `info` describes, with a default masking entry that lets every
    /// initiator read and write, and enables it; `info.tid` receives its ID.
    /// ERR_FAILED_TO_CREATE_TARGET when nothing was made; ERR_FAILED_TO_CREATE_ACL_MASKING or
    /// ERR_FAILED_TO_ENABLE_TARGET when the target was, and stays.
    int createTarget();

    /// Deletes the target named by `info.tid`. ERR_FAILED_TO_LOAD_TARGET when there is none,
    /// ERR_FAILED_TO_DELETE_TARGET when the platform refuses.
    int deleteTarget();

    /// ISCSITargetInfo::ListTarget.
    static int ListTarget(std::vector<ISCSITargetInfo> &out, const std::string &lun_uuid);

    /// "rw", "r" or "-", in lower case; ERR_BAD_TARGET_AUTH_INFO for anything else.
    static int GetMaskingPermission(const std::string &text, ISCSI_TARGET_AUTHORITY &out);

    /// Replaces `out` by the target's masking: initiator IQN to permission. The entry of
    /// NORV_DEFAULT_MASKING_IQN is for all initiators that have none of their own.
    static int GetTargetMasking(int tid, std::map<std::string, ISCSI_TARGET_AUTHORITY> &out);

    /// Converts a masking to SDK entries. ERR_BAD_TARGET_ACL for an IQN of more than 255 bytes.
    static int TargetMaskMap2Vec(int tid, const std::map<std::string, ISCSI_TARGET_AUTHORITY> &masking,
                                 std::vector<_tag_struct_iscsi_acl_> &out);

    /// Makes the target's masking what `acls` describes: an array of {"iqn": ..., "permission": ...}.
    /// Entries are created, then updated, then those that the array does not name removed; a failure
    /// stops the sequence. ERR_INVALID_INPUT for JSON of another shape and
    /// ERR_BAD_TARGET_AUTH_INFO for an unknown permission, with nothing changed.
    static int ACLMasksSet(int tid, const Json::Value &acls);
};

} // namespace ISCSI::LIB::LIBTarget
