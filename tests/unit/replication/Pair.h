/// One half of a replication pair in the fake's model.
#pragma once

#include "iscsiwebapi/ISCSIErrorCode.h"
#include "iscsiwebapi/ISCSILIBReplication.h"
#include "tests/unit/Library.h"

namespace unit {

const std::string TASK =
    "33333333-0000-4000-8000-" + std::to_string(100000000000 + privateLUNID()); // for its lock file
const std::string SOURCE = uuidOf(3), DESTINATION = uuidOf(4);
const std::string SNAPSHOT = snapshotUUIDOf(3, 2), BASE = snapshotUUIDOf(3, 1);
const std::string LOCK_FILE = "/tmp/iscsi/TASK_" + TASK + ".lock";

inline fake::Task &addTask(bool is_source, const std::string &uuid = TASK)
{
    fake::Task task;
    auto &record = task.record;
    record.is_source = is_source;
    uuid.copy(record.uuid, sizeof(record.uuid) - 1);
    SOURCE.copy(record.src_lun_uuid, sizeof(record.src_lun_uuid) - 1);
    DESTINATION.copy(record.dst_lun_uuid, sizeof(record.dst_lun_uuid) - 1);
    std::string(is_source ? LOCAL_NODE : PEER_NODE).copy(record.src_node_uuid, sizeof(record.src_node_uuid) - 1);
    std::string(is_source ? PEER_NODE : LOCAL_NODE).copy(record.dst_node_uuid, sizeof(record.dst_node_uuid) - 1);
    std::string("/volume1").copy(record.root_path, sizeof(record.root_path) - 1);
    fake::model().tasks.push_back(task);
    return fake::model().tasks.back();
}

inline _tag_iscsi_task_progress_ progressOf(uint64_t sent, uint64_t total, int error = 0, uint64_t value = 0)
{
    _tag_iscsi_task_progress_ progress{};
    progress.sent_size = sent;
    progress.send_total_size = total;
    progress.progress_value = value;
    progress.error = error;
    return progress;
}

/// The source's half: its LUN with two snapshots, and a peer that holds the first of them.
inline void sourceSide()
{
    addNodes();
    addLUN(3, "vol1");
    addSnapshot(3, 1, "base");
    auto &snapshot = addSnapshot(3, 2, "daily").record;
    snapshot.user_locked = 1;
    addTask(true).progress.values = {progressOf(1, 2), progressOf(2, 2)};
    fake::model().peer.base_version = BASE;
}

/// A source LUN that has no task yet.
inline void noTask()
{
    sourceSide();
    fake::model().tasks.clear();
}

/// The destination's half: a sink LUN whose snapshot stems from the source's first, modified since.
inline void destinationSide()
{
    addNodes();
    auto &lun = addLUN(4, "vol1copy", NORV_LUN_TYPE_SINK);
    lun.map_file.base_version = SNAPSHOT;
    lun.map_file.current_version = BASE;
    auto &snapshot = addSnapshot(4, 1, "base").record;
    BASE.copy(snapshot.version, sizeof(snapshot.version) - 1);
    addTask(false);
}

/// What a source sends to getBaseVersion.
inline std::map<std::string, ISCSI::ISCSISnapshotInfo> sourceSnapshots(const std::vector<std::string> &versions)
{
    std::map<std::string, ISCSI::ISCSISnapshotInfo> snapshots;
    for (const std::string &version : versions)
        snapshots[version].version = version;
    return snapshots;
}

/// A code as log lines show it.
inline std::string shown(int code)
{
    return std::to_string(code) + " (" + ISCSI::ErrorCodeToString(code) + ")";
}

} // namespace unit
