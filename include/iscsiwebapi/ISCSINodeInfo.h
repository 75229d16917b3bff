/// The record of one appliance: this one, or a peer.
#pragma once

#include "iscsiwebapi/ISCSIExport.h"

#include <json/value.h>

#include <string>
#include <vector>

namespace ISCSI {

/// A value object. Peers that this appliance logged in to are kept in the node configuration file,
/// paired nodes in the platform's DR-node database. Methods that return int return an error code
/// (ISCSIErrorCode.h), log what failed to the system log, and throw nothing.
class ISCSIWEBAPI_EXPORT ISCSINodeInfo {
public:
    std::string uuid;
    std::string hostname; ///< name or address
    unsigned short port = 0;
    std::string protocol; ///< "http" or "https"
    std::string rod_key;  ///< secret: lets two appliances exchange data
    std::string account;
    std::string password;   ///< held until a log-in succeeds, never stored
    std::string otp_code;   ///< one-time code for the log-in, never stored
    std::string session_id; ///< the peer's access token, or a local session for a peer
    bool is_local_node = false;
    bool logged_in = false; ///< by login() of this object

    ISCSINodeInfo() = default;
    explicit ISCSINodeInfo(const std::string &uuid);
    ISCSINodeInfo(const std::string &hostname, const std::string &account);
    ISCSINodeInfo(const std::string &hostname, const std::string &account, const std::string &session_id);
    ISCSINodeInfo(const std::string &uuid, const std::string &session_id, const std::string &hostname,
                  unsigned short port, const std::string &protocol, const std::string &rod_key,
                  const std::string &account, bool is_local_node);
    /// For logging in to a new peer.
    ISCSINodeInfo(const std::string &uuid, const std::string &hostname, unsigned short port,
                  const std::string &protocol, const std::string &rod_key, const std::string &account,
                  const std::string &password, const std::string &otp_code);
    ISCSINodeInfo(const ISCSINodeInfo &) = default;
    ISCSINodeInfo &operator=(const ISCSINodeInfo &) = default;
    ISCSINodeInfo(ISCSINodeInfo &&) = default;
    ISCSINodeInfo &operator=(ISCSINodeInfo &&) = default;
    virtual ~ISCSINodeInfo();

    /// One line: the ROD key and the session are in it, the password and the one-time code are not. In log lines both
    /// are masked.
    std::string toString() const;

    /// Replaces `value` by the node's JSON form; ERR_NO_NODE_UUID, with `value` untouched, when the
    /// UUID is empty.
    int toJsonFormat(Json::Value &value) const;

    /// Whether the record cannot name a node or, when `full`, cannot log in to one.
    bool isInvalid(bool full) const;

    // The node configuration file: one section per node, guarded by a lock file.

    /// ERR_FILE_NOT_FOUND without a file, ERR_NO_SUCH_NODE without a section of this node.
    int loadFromConfig();
    /// Writes the section. ERR_NODE_UUID_EXISTS when it is there and not to be updated,
    /// ERR_NO_SUCH_NODE when it is not there and not to be created; without a file it is created.
    int updateConfig(bool create, bool update);
    bool isInConfig() const;
    /// A section that is not there is success.
    int deleteFromNodeConfig() const;
    /// Replaces `out`; when a section cannot be read, `out` holds those before it.
    static int ListNodeFromConfig(std::vector<ISCSINodeInfo> &out);

    // The DR-node database.

    int loadFromDRNode();
    /// Appends the local node first, then the paired ones; when a node cannot be read, `out` holds
    /// those before it.
    static int ListNodesFromDRNode(std::vector<ISCSINodeInfo> &out);
    /// ERR_NO_SUCH_NODE when no node has exactly this host name.
    static int GetNodeInfoByHostname(const std::string &hostname, ISCSINodeInfo &out);
    /// Resolves a selector: a UUID (whose node need not exist), "node#" and a 1-based index into the
    /// list (1 is the local node), or a host name. An empty selector gives an empty UUID.
    /// ERR_BAD_NODE_UUID for none of these.
    static int GetNodeUUID(const std::string &selector, std::string &uuid);

    /// Sets `rod_key` here and stores it with the node.
    int insertRODKey(const std::string &key);
    /// This appliance's own key, whatever node the record is.
    int loadLocalRODKey(std::string &out) const;

    // Sessions.

    /// Logs in to the node and adds it to the configuration file; the password is dropped then.
    /// ERR_NODE_UUID_EXISTS for a node that is configured already, ERR_BAD_PARAMETER when something
    /// to log in with is missing, ERR_FAILED_TO_LOGIN when the node refuses.
    int login();
    /// Ends the session that login() of this object opened.
    int logout();
    /// Opens a session on this appliance for a peer, on behalf of `account`; `session_id` receives it.
    int createSession();
    int deleteSession() const;
};

} // namespace ISCSI
