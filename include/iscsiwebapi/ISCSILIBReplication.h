/// The operations on replication: pairing a LUN with one on a peer, sending snapshots, role change.
#pragma once

#include "iscsiwebapi/ISCSIExport.h"
#include "iscsiwebapi/ISCSISnapshotInfo.h"
#include "iscsiwebapi/ISCSITaskInfo.h"

#include <map>
#include <string>
#include <vector>

namespace ISCSI::LIB::LIBReplication {

/// The texts that callers show for a task's state of synchronisation.
constexpr const char *TASK_SYNC_TEXTS[] = {
    "doing sync",
    "sync done",
    "not a sink task",
    "unknown task status",
};

/// Works on one task. Methods return an error code (ISCSIErrorCode.h), log what failed to the system
/// log, and throw nothing.
///
/// A task is locked between processes by a lock file. An operation with a worker takes the lock, forks
/// and returns 0 in the caller, which leaves the task locked; the worker unlocks it and ends. Its
/// outcome shows in getStatus, getSendingStatus and the log. Not for several threads.
class ISCSIWEBAPI_EXPORT ISCSILIBReplication {
public:
    ISCSITaskInfo task; ///< the task acted on
    std::string dst_lun_location;
    std::string dst_lun_name;
    _tag_iscsi_task_ task_record{}; ///< buffer of the platform calls
    int lock_depth = 0;             ///< how often the held lock was taken again
    int lock_fd = -1;               ///< of the held lock file
    bool is_child = false;          ///< in a worker

    ISCSILIBReplication() = default;
    explicit ISCSILIBReplication(const std::string &task_uuid);
    /// To start a replication, on the source side.
    ISCSILIBReplication(const std::string &src_lun_uuid, const std::string &src_node_uuid,
                        const std::string &dst_node_uuid, const std::string &dst_lun_location,
                        const std::string &dst_lun_name);
    /// One half of a pair whose LUNs exist.
    ISCSILIBReplication(const std::string &task_uuid, bool is_source, const std::string &src_lun_uuid,
                        const std::string &dst_lun_uuid, const std::string &src_node_uuid,
                        const std::string &dst_node_uuid);
    /// Does not release a held lock: the process's end does.
    virtual ~ISCSILIBReplication();

    // The lock of the task, recursive within one object.

    /// ERR_TASK_IS_LOCKED when another process holds it.
    int lockTask();
    /// Waits up to a day, then ERR_TIMEOUT.
    int blockingLockTask();
    /// Releases one level; always 0.
    int unlockTask();

    /// Splits off a worker unless this already is one; 0 in both, which `is_child` tells apart.
    int forkProcessIfNotChild();
    /// Ends a worker that no longer holds the lock; nothing otherwise.
    void childProcessExit();

    // Creating a pair.

    /// Creates the destination LUN on the peer and a task on both sides; what was made is removed
    /// again when a later step fails. Sends no data. ERR_INVALID_INPUT for missing input,
    /// ERR_BAD_LUN_TYPE for a source that is not of an extent pool.
    int createReplication();
    /// Creates this side's half, and exchanges ROD keys with the peer.
    int createTask();
    /// Whether a connection for sending to the node can be made; the last two arguments go to the
    /// platform's check as they are.
    int checkNode(const std::string &node_uuid, const std::string &connection_text, unsigned int connection_number);

    // Waits on the peer, in seconds; 0 is no limit. ERR_TIMEOUT when the limit is reached. Those on
    // sync count only seconds without progress.

    int waitUntilRemoteTaskUnlock(unsigned int timeout) const;
    int waitUntilRemoteLUNUnlock(unsigned int timeout) const;
    int waitUntilRemoteLUNSyncDone(unsigned int timeout) const;
    int waitUntilRemoteSnapshotSyncDone(const std::string &snapshot_uuid, unsigned int timeout) const;

    // Sending.

    /// Sends a snapshot of the source LUN, from a base that both sides hold; a worker follows the
    /// transfer, tries again up to three times, and takes the matching snapshot on the peer.
    /// `send_option`, `send_value` and `send_flag` go to the platform as they are; `ignored_flag` has
    /// no effect. ERR_BAD_SNAPSHOT_ID for a snapshot of another LUN.
    int sendSnapshot(const std::string &snapshot_uuid, const std::string &send_option, unsigned int send_value,
                     bool ignored_flag, bool send_flag);
    /// On the destination side: what the source (its snapshots by version) can send from. When the
    /// destination has to be set back to that base first (`not_aligned`), a worker does.
    int getBaseVersion(const std::map<std::string, ISCSISnapshotInfo> &source_snapshots, std::string &base_version,
                       bool &need_full_sync, bool &not_aligned);
    int startToComputeUnsyncSize(const std::string &base_version, const std::string &snapshot_uuid);
    /// Bytes counted so far, and whether that is all.
    int getCurrentUnsyncSize(unsigned long long &unsync_size, bool &is_completed);
    /// Bytes sent and to send; `error` is 0 or the failure of the last sending.
    int getSendingStatus(unsigned long long &sent_size, unsigned long long &send_total_size,
                         unsigned long long &progress_value, int &error);
    int stopSending();

    /// ERR_TRY_AGAIN, with one retry less, when the sending failed and may be tried again;
    /// ERR_STOP_SENDING_SNAPSHOT when it was stopped on purpose. `timeout` counts seconds without
    /// progress.
    int waitUntilSendingCompleted(int &retries_left, unsigned long long &progress_value, unsigned int timeout) const;
    int waitUntilSnapshotUnlock(const std::string &snapshot_uuid, unsigned int timeout) const;
    int waitUntilLocalLUNUnlock(unsigned int timeout) const;

    // Role, status, removal: of this half only.

    int getStatus(bool &is_locked, std::string &base_version);
    /// Destination to source, and source to destination. ERR_LUN_IS_MAPPED while the LUN is mapped.
    int promote();
    int demote();
    /// Removes the task; on the destination side the sink LUN is deleted, or made an ordinary LUN.
    int deleteReplication(bool delete_sink_lun);
    int deleteTask();
    /// ISCSITaskInfo::ListTask.
    static int ListTask(std::vector<ISCSITaskInfo> &out);

private:
    int loadTask(bool strict);
    const ISCSILUNInfo &localLUN() const;
    ISCSINodeInfo &localNode();
    ISCSINodeInfo &remoteNode();
};

} // namespace ISCSI::LIB::LIBReplication
