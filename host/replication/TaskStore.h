/// Rows of replication tasks in the state store.
#pragma once

#include "host/core/Lock.h"
#include "platform/replication.h"

#include <cstdint>
#include <functional>
#include <string>
#include <string_view>

namespace norvhost {

struct TaskRow {
    _tag_iscsi_task_ record = {}; ///< without links
    _tag_iscsi_task_progress_ progress = {};

    const char *localLun() const { return record.is_source ? record.src_lun_uuid : record.dst_lun_uuid; }
    const char *localNode() const { return record.is_source ? record.src_node_uuid : record.dst_node_uuid; }
    const char *remoteNode() const { return record.is_source ? record.dst_node_uuid : record.src_node_uuid; }
};

/// How far the state that arrives at a destination is flushed there: what lies below `offset` in its LUN.
struct Arrival {
    std::string version; ///< of the state; empty for none
    std::string base;    ///< what the peer takes as its base
    std::string holding; ///< what the LUN held before: iscsihost::Holding in words
    std::string name;    ///< of its snapshot on the peer
    uint64_t offset = 0; ///< bytes
};

// Each returns 0, NORV_ERR_NO_SUCH_TASK or another error code. Outputs are written on success only.

int loadTask(std::string_view uuid, TaskRow &row);

/// Shows every task, in the order of their creation.
int forEachTask(const std::function<int(const TaskRow &)> &visit);

/// The task whose destination LUN this is here: NORV_ERR_NO_SUCH_TASK when it is none's.
int loadTaskOfSink(std::string_view lun_uuid, TaskRow &row);

/// Whether a task has the LUN as its local one.
int isReplicated(std::string_view lun_uuid, bool &replicated);

/// NORV_ERR_TASK_UUID when there is such a task, NORV_ERR_TASK_LUN when another task writes to the destination LUN.
int insertTask(const TaskRow &row);

/// Stores role, LUNs and nodes.
int updateTask(const TaskRow &row);

int updateProgress(const _tag_iscsi_task_progress_ &progress);

/// Asks the sender of a task to stop, or takes that back; a sender looks at it.
int requestStop(std::string_view task_uuid, bool stop);
int stopRequested(std::string_view task_uuid, bool &stop);
int removeTask(std::string_view uuid);

/// Why the latest sending failed, in words; empty when it did not.
int loadReason(std::string_view task_uuid, std::string &reason);
int updateReason(std::string_view task_uuid, const std::string &reason);

/// Locks what arrives for a task, and its role, until the lock's end: the steps of either belong together.
int lockArrival(std::string_view task_uuid, NamedLock &lock);
int loadArrival(std::string_view task_uuid, Arrival &arrival);
int updateArrival(std::string_view task_uuid, const Arrival &arrival);

/// The latest count of unsynchronised bytes.
struct UnsyncCount {
    uint64_t bytes = 0;
    bool completed = false;
    int error = 0; ///< what ended the count
};
int loadUnsyncCount(std::string_view task_uuid, UnsyncCount &count);
int updateUnsyncCount(std::string_view task_uuid, const UnsyncCount &count);

} // namespace norvhost
