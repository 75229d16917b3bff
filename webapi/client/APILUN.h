/// Requests about LUNs and snapshots.
#pragma once

#include "webapi/client/Client.h"

#include "platform/iscsi_lun.h"

#include <vector>

namespace ISCSI::WebAPI::APILUN {

class WebAPIClientLUNCreate : public Client {
public:
    /// `size` and `extent_size` in bytes.
    WebAPIClientLUNCreate(const ISCSINodeInfo &node, const std::string &name, _tag_iscsi_lun_type type,
                          const std::string &location, unsigned long long size, unsigned int extent_size);

    const std::string &lunUUID() const { return lun_uuid; }

protected:
    bool readResponse(const Json::Value &response) override;

private:
    std::string lun_uuid;
};

class WebAPIClientLUNDelete : public Client {
public:
    WebAPIClientLUNDelete(const ISCSINodeInfo &node, const std::string &lun_uuid);
};

/// Renames (unless `name` is empty) and grows (unless `size`, in bytes, is 0) a LUN.
class WebAPIClientLUNSet : public Client {
public:
    WebAPIClientLUNSet(const ISCSINodeInfo &node, const std::string &lun_uuid, const std::string &name,
                       unsigned long long size);
};

/// The fields of a LUN or a snapshot that a wait looks at; those not asked for are false and 0.
class StateClient : public Client {
public:
    bool isActionLocked() const { return is_action_locked; }
    unsigned long long syncProgress() const { return sync_progress; }

protected:
    StateClient(const ISCSINodeInfo &node, std::string path, const std::vector<std::string> &additional);

    bool readResponse(const Json::Value &response) override;

private:
    std::vector<std::string> additional;
    bool is_action_locked = false;
    unsigned long long sync_progress = 0;
};

/// `additional` names the extra fields: "is_action_locked", "sync_progress".
class WebAPIClientLUNGet : public StateClient {
public:
    WebAPIClientLUNGet(const ISCSINodeInfo &node, const std::string &lun_uuid,
                       const std::vector<std::string> &additional);
};

class WebAPIClientLUNGetSnapshot : public StateClient {
public:
    WebAPIClientLUNGetSnapshot(const ISCSINodeInfo &node, const std::string &snapshot_uuid,
                               const std::vector<std::string> &additional);
};

class WebAPIClientLUNTakeSnapshot : public Client {
public:
    WebAPIClientLUNTakeSnapshot(const ISCSINodeInfo &node, const std::string &lun_uuid, bool is_app_consistent,
                                bool is_user_locked, const std::string &name, const std::string &description,
                                const std::string &taken_by, long snapshot_time, bool is_scheduled);

    const std::string &snapshotUUID() const { return snapshot_uuid; }

protected:
    bool readResponse(const Json::Value &response) override;

private:
    std::string snapshot_uuid;
};

} // namespace ISCSI::WebAPI::APILUN
