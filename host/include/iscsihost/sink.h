/// Sink LUNs as their peers open them.
#pragma once

#include <cstdint>
#include <iscsihost/host.h>
#include <string>
#include <vector>

namespace iscsihost {

/// An open sink.
struct Sink {
    std::vector<std::string> portals; ///< "address:port", or ":port" when this appliance listens on all its addresses
    std::string iqn;                  ///< of the target that exists until the sink is closed; names this opening
    int lun = 0;                      ///< LUN number in it
    int tls_port = 0;                 ///< of the same addresses, which leads there inside TLS; 0 when there is none
    uint64_t size = 0;                ///< bytes
    bool blank = false;               ///< reads as zeros
};

/// Lets the holder of this appliance's ROD key write to the LUN, which must be of the sink kind. Whoever had it open
/// before loses it: a sender that comes back after a failure need not wait. While it is open, other actions on the LUN
/// find it locked, unless nobody has a session there any more: that closes it, as incomplete, and so does the service's
/// supervisor after a minute.
/// NORV_ERR_NO_SUCH_LUN, NORV_ERR_LUN_TYPE, NORV_ERR_LUN_LOCKED, NORV_ERR_START_SERVICE.
ISCSI_HOST_API int openSink(const std::string &lun_uuid, Sink &sink);

/// Ends the opening that bears this name, or whichever there is when the name is empty; its sessions end. With
/// `complete`, what was written is flushed first, and the LUN becomes an ordinary extent-pool LUN, writable for its
/// initiators, unless a replication task has it as its destination; asked again, that is no failure.
/// NORV_ERR_NO_SUCH_TARGET when it is not open (any
/// more); after another failure it may be open still. `volume_full`, unless it is null, tells whether the LUN's volume
/// has no room left: iSCSI does not tell its peer why a write failed.
ISCSI_HOST_API int closeSink(const std::string &lun_uuid, const std::string &iqn, bool complete,
                             bool *volume_full = nullptr);

} // namespace iscsihost
