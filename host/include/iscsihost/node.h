/// Paired appliances as the front ends and the peers' client classes see them.
#pragma once

#include <cstdint>
#include <iscsihost/host.h>
#include <string>

namespace iscsihost {

/// What one appliance knows of another to talk to it. Secrets: rod_key, token.
struct PairedNode {
    std::string uuid;
    std::string host; ///< name or address of its web API
    uint16_t port = 0;
    std::string protocol = "https";
    std::string rod_key; ///< from which the log-ins of its sinks are derived
    std::string token;   ///< session token for its web API, without expiry
    std::string pin;     ///< of its web server's key, as in https.h; empty: its certificate is checked instead
};

// A record that is stored must be complete but for the pin: otherwise the code of its bad field (18991100 to 18991104,
// 18990004 for token and pin) and its name in the reason. A pin other than that of the same host and port here is
// NORV_ERR_NO_PERMISSION: a changed key is trusted by this appliance's administrator only.

/// Keeps what opening a session on a node gave, before the node is paired; replaces an earlier one, also that of a
/// paired node. NORV_ERR_NODE_UUID_EXISTS for the local node.
ISCSI_HOST_API int keepNodeSession(const PairedNode &node);

/// Pairs with a node: from now on it is in the DR-node database. Empty fields are filled from what keepNodeSession()
/// kept. NORV_ERR_NODE_UUID_EXISTS when it is paired already, and for the local node; nothing changes then.
ISCSI_HOST_API int addPairedNode(const PairedNode &node);

/// A node as it is paired or kept. NORV_ERR_NO_SUCH_NODE.
ISCSI_HOST_API int describePairedNode(const std::string &uuid, PairedNode &node);

/// This appliance as `peer` (name or address) reaches it: the set address, else that which the web server listens on,
/// else the one from which packets to the peer leave. Without a token.
ISCSI_HOST_API int describeLocalNode(const std::string &peer, PairedNode &node);

/// Forgets a node, its key, its pin and its session here; the node itself is not told. NORV_ERR_NO_SUCH_NODE.
ISCSI_HOST_API int removePairedNode(const std::string &uuid);

/// Where peers are told to reach this appliance's web API: "HOST", "HOST:PORT", "[IPV6]:PORT", or "auto", which it is
/// unless set. Without a port it is the web server's. Holds for nodes that join from now on.
ISCSI_HOST_API int setNodeAddress(const std::string &address);
ISCSI_HOST_API int getNodeAddress(std::string &address);

} // namespace iscsihost
