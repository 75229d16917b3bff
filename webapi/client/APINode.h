/// Requests about nodes.
#pragma once

#include "webapi/client/Client.h"

#include <vector>

namespace ISCSI::WebAPI::APINode {

/// Opens a session on the node for this appliance: logs in with the node record's account, password and
/// code, asks for a session that lasts, logs out again, and keeps what the node answered, its ROD key
/// included, in the DR-node database.
class WebAPIClientNodeCreateSession : public Client {
public:
    explicit WebAPIClientNodeCreateSession(const ISCSINodeInfo &node);

    int send() override;
};

/// Makes the node record the listed nodes. The local node needs no request: what it is told it records
/// itself. A listed local node is told about with a session of its own making.
class WebAPIClientNodeAddNode : public Client {
public:
    WebAPIClientNodeAddNode(const ISCSINodeInfo &node, const std::vector<ISCSINodeInfo> &nodes);

    int send() override;

private:
    std::vector<ISCSINodeInfo> nodes;
};

/// The node's own record.
class WebAPIClientNodeGet : public Client {
public:
    explicit WebAPIClientNodeGet(const ISCSINodeInfo &node);

    const std::string &rodKey() const { return rod_key; }

protected:
    bool readResponse(const Json::Value &response) override;

private:
    std::string rod_key;
};

} // namespace ISCSI::WebAPI::APINode
