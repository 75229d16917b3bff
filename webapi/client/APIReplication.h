/// Requests about replication tasks.
#pragma once

#include "iscsiwebapi/ISCSISnapshotInfo.h"
#include "webapi/client/Client.h"

#include <vector>

namespace ISCSI::WebAPI::APIReplication {

/// Creates the peer's half of a pair.
class WebAPIClientReplicationCreateTask : public Client {
public:
    WebAPIClientReplicationCreateTask(const ISCSINodeInfo &node, const std::string &task_uuid, bool is_source,
                                      const std::string &src_lun_uuid, const std::string &dst_lun_uuid,
                                      const std::string &src_node_uuid, const std::string &dst_node_uuid);
};

/// The state of the peer's half.
class WebAPIClientReplicationGet : public Client {
public:
    WebAPIClientReplicationGet(const ISCSINodeInfo &node, const std::string &task_uuid, bool additional);

    bool isLocked() const { return is_locked; }

protected:
    bool readResponse(const Json::Value &response) override;

private:
    bool is_locked = false;
};

/// What the peer's destination LUN can be sent from, given the source's snapshots.
class WebAPIClientReplicationGetBaseVersion : public Client {
public:
    WebAPIClientReplicationGetBaseVersion(const ISCSINodeInfo &node, const std::string &task_uuid,
                                          const std::vector<ISCSISnapshotInfo> &snapshots);

    const std::string &baseVersion() const { return base_version; }
    bool needFullSync() const { return need_full_sync; }
    bool notAligned() const { return not_aligned; }

protected:
    bool readResponse(const Json::Value &response) override;

private:
    std::string base_version;
    bool need_full_sync = false;
    bool not_aligned = false;
};

} // namespace ISCSI::WebAPI::APIReplication
