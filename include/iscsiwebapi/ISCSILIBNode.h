/// The operations on nodes: the state of this appliance, and the group of paired appliances.
#pragma once

#include "iscsiwebapi/ISCSIExport.h"
#include "iscsiwebapi/ISCSINodeInfo.h"

#include <string>
#include <vector>

namespace ISCSI::LIB::LIBNode {

/// What keeps an appliance from serving iSCSI copy work: bits of ISCSILIBNode::getStatus.
enum NodeStatus : unsigned int {
    NODE_OK = 0,
    NODE_MODULES_NOT_LOADED = 1,
    NODE_NOT_BOOT_DONE = 4,
};

/// The texts that callers show: ready, modules missing, task handler dead, not booted, unknown.
inline constexpr const char *const NODE_STATUS_TEXTS[] = {
    "OK",
    "iSCSI kernel modules are not loaded",
    "iSCSI task handler's daemon is dead",
    "system is not in BOOT_DONE status",
    "unknown node status",
};

class ISCSIWEBAPI_EXPORT ISCSILIBNode {
public:
    ISCSINodeInfo info; ///< the node acted on

    ISCSILIBNode() = default;
    ISCSILIBNode(const std::string &uuid, const std::string &hostname, unsigned short port, const std::string &protocol,
                 const std::string &rod_key, const std::string &account, const std::string &password,
                 const std::string &otp_code);
    virtual ~ISCSILIBNode();

    /// NodeStatus bits of this appliance, not an error code; 0 is ready.
    unsigned int getStatus() const;

    /// Joins the node to the group: opens a session on it and makes every node know every other one.
    /// Nothing is undone on failure.
    int createNode();

    /// ISCSINodeInfo::ListNodesFromDRNode.
    static int ListNode(std::vector<ISCSINodeInfo> &out);
};

} // namespace ISCSI::LIB::LIBNode
