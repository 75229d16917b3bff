/// Requests about nodes.
#pragma once

#include "webapi/client/Client.h"

#include <vector>

namespace ISCSI::WebAPI::APINode {

/// Opens a session on the node for this appliance, with the node record's account, password and code.
class WebAPIClientNodeCreateSession : public Client {
public:
    explicit WebAPIClientNodeCreateSession(const ISCSINodeInfo &node);
};

/// Makes the node record the listed nodes.
class WebAPIClientNodeAddNode : public Client {
public:
    WebAPIClientNodeAddNode(const ISCSINodeInfo &node, const std::vector<ISCSINodeInfo> &nodes);
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
