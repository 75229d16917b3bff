/// The record of one replication task: this appliance's half of a pair of LUNs.
#pragma once

#include "iscsiwebapi/ISCSIExport.h"
#include "iscsiwebapi/ISCSILUNInfo.h"
#include "iscsiwebapi/ISCSINodeInfo.h"
#include "platform/replication.h"

#include <json/value.h>

#include <string>
#include <vector>

namespace ISCSI {

/// A value object. Both halves of a pair bear the same UUID. Methods that return int return an error
/// code (ISCSIErrorCode.h), log what failed to the system log, and throw nothing.
class ISCSIWEBAPI_EXPORT ISCSITaskInfo {
public:
    std::string uuid;       ///< empty only on a source task that is not created yet
    bool is_source = false; ///< the side that sends
    ISCSILUNInfo src_lun;   ///< once loaded: the local one in full, the other by UUID only
    ISCSILUNInfo dst_lun;
    ISCSINodeInfo src_node;
    ISCSINodeInfo dst_node;
    std::string root_path; ///< volume of the local LUN, at most 319 bytes
    std::string parent_task_uuid;

    ISCSITaskInfo() = default;
    explicit ISCSITaskInfo(const std::string &uuid);
    ISCSITaskInfo(const std::string &uuid, bool is_source, const ISCSILUNInfo &src_lun, const ISCSILUNInfo &dst_lun,
                  const ISCSINodeInfo &src_node, const ISCSINodeInfo &dst_node, const std::string &root_path,
                  const std::string &parent_task_uuid);
    ISCSITaskInfo(const ISCSITaskInfo &) = default;
    ISCSITaskInfo &operator=(const ISCSITaskInfo &) = default;
    ISCSITaskInfo(ISCSITaskInfo &&) = default;
    ISCSITaskInfo &operator=(ISCSITaskInfo &&) = default;
    virtual ~ISCSITaskInfo();

    /// Loads the task named by `uuid` into `record` and this object, with its local LUN and both nodes.
    /// Unless `strict`, a LUN or node that is gone leaves its UUID alone and is no failure.
    /// ERR_BAD_REPLICATION_TASK_INFO when no task is selected. Partly filled after a failure.
    int loadFromConfig(_tag_iscsi_task_ &record, bool strict);

    /// Path of the task's lock file; empty when no task is selected.
    std::string getLockPath() const;

    /// One line for the log.
    std::string toString() const;

    /// Replaces `out` by the task's JSON form; ERR_BAD_REPLICATION_TASK_INFO, with `out` untouched, for
    /// an incomplete record.
    int toJsonFormat(Json::Value &out) const;

    /// Writes this task into `record`; ERR_BAD_REPLICATION_TASK_INFO for an incomplete record,
    /// ERR_FAILED_TO_COPY_STRING for a text that does not fit.
    int fillVISCSITask(_tag_iscsi_task_ &record);

    /// Appends every task; LUNs and nodes by UUID only.
    static int ListTask(std::vector<ISCSITaskInfo> &out);

    /// Resolves a selector: a UUID (whose task need not exist) or "rep#" and a 1-based index into the
    /// list. An empty selector gives an empty UUID. ERR_BAD_TASK_UUID for none of these.
    static int GetTaskUUID(const std::string &input, std::string &uuid);
};

} // namespace ISCSI
