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

/// Keeps what opening a session on a node gave, before the node is paired; replaces an earlier one, also that of a
/// paired node.
ISCSI_HOST_API int keepNodeSession(const PairedNode &node);

/// Pairs with a node: from now on it is in the DR-node database. Empty fields are filled from what keepNodeSession()
/// kept. NORV_ERR_NODE_UUID_EXISTS when it is paired already, and for the local node; nothing changes then.
ISCSI_HOST_API int addPairedNode(const PairedNode &node);

/// A node as it is paired or kept.
ISCSI_HOST_API int describePairedNode(const std::string &uuid, PairedNode &node);

/// This appliance as `peer` (name or address) reaches it: the set web address, else the address from which packets to
/// the peer leave. Without a token.
ISCSI_HOST_API int describeLocalNode(const std::string &peer, PairedNode &node);

/// Forgets a node, its key, its pin and its session here; the node itself is not told.
ISCSI_HOST_API int removePairedNode(const std::string &uuid);

} // namespace iscsihost
