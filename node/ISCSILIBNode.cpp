#include "iscsiwebapi/ISCSILIBNode.h"

#include "etc/Failure.h"
#include "platform/system.h"
#include "webapi/client/APINode.h"

namespace ISCSI::LIB::LIBNode {

using WebAPI::APINode::WebAPIClientNodeAddNode;
using WebAPI::APINode::WebAPIClientNodeCreateSession;

ISCSILIBNode::ISCSILIBNode(const std::string &uuid, const std::string &hostname, unsigned short port,
                           const std::string &protocol, const std::string &rod_key, const std::string &account,
                           const std::string &password, const std::string &otp_code)
    : info(uuid, hostname, port, protocol, rod_key, account, password, otp_code)
{
}

ISCSILIBNode::~ISCSILIBNode() = default;

unsigned int ISCSILIBNode::getStatus() const
{
    static const char *const modules[] = {
        "iscsi_target_mod", "target_core_mod", "iscsi_extent_pool", "iscsi_rodsp", "configfs",
    };
    unsigned int status = NODE_OK;
    for (const char *module : modules) {
        if (NORVCheckModule(module) != 1) {
            status |= NODE_MODULES_NOT_LOADED;
            break;
        }
    }
    if (NORVSystemGetBootStep() != NORV_BOOT_DONE)
        status |= NODE_NOT_BOOT_DONE;
    return status;
}

int ISCSILIBNode::createNode()
{
    if (int err = WebAPIClientNodeCreateSession(info).send())
        return failText(here(), err, "Failed to create session. node: %s", logText(info).c_str());
    std::vector<ISCSINodeInfo> joined;
    if (int err = ListNode(joined))
        return failText(here(), err, "Failed to list node.");
    for (const auto &node : joined) {
        if (int err = WebAPIClientNodeAddNode(node, {info}).send())
            return failText(here(), err, "Failed to add new node to: %s.", logText(node).c_str());
    }
    joined.push_back(info);
    const int err = WebAPIClientNodeAddNode(info, joined).send();
    if (err != 0 && err != ERR_NODE_UUID_EXISTS)
        return failText(here(), err, "Failed to add all of joined nodes to: %s.", logText(info).c_str());
    return 0;
}

int ISCSILIBNode::ListNode(std::vector<ISCSINodeInfo> &out)
{
    return ISCSINodeInfo::ListNodesFromDRNode(out);
}

} // namespace ISCSI::LIB::LIBNode
