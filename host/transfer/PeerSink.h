/// Sinks of other appliances, and of this one.
#pragma once

#include "host/transfer/Sending.h"
#include "iscsihost/node.h"
#include "iscsihost/sink.h"

#include <json/value.h>
#include <string>

namespace norvhost {

/// A sink that a node has opened for us.
struct PeerSink {
    std::string node; ///< UUID
    std::string lun;  ///< UUID
    iscsihost::Sink sink;
    IscsiUnit unit; ///< how to get there
};

// Each returns 0, a code of this appliance (NORV_ERR_NO_SUCH_NODE, those of iscsihost/https.h) or the node's own.

/// `portal` ("host", "host:port", an address with or without brackets; without a port that of iSCSI) is used in place
/// of what the node answers, unless it is empty.
int openPeerSink(const std::string &node_uuid, const std::string &lun_uuid, const std::string &portal, PeerSink &sink);

/// The same of a sink that the node has opened already and describes in `answer`. The log-in is made with the caller's
/// key, not with the one that is stored with the node. NORV_ERR_BAD_RESPONSE.
int enterPeerSink(const iscsihost::PairedNode &node, const std::string &rod_key, const std::string &lun_uuid,
                  const Json::Value &answer, PeerSink &sink);

/// `volume_full`, unless it is null, tells whether the sink's volume has no room left, which iSCSI does not tell.
int closePeerSink(const std::string &node_uuid, const std::string &lun_uuid, const std::string &sink_iqn, bool complete,
                  bool *volume_full = nullptr);

} // namespace norvhost
