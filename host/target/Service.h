/// The running iSCSI service: two tgtd daemons and the portal, and beside them stunnel (TlsServer.h) where it is there.
///
/// Each function returns 0 or an error code.
#pragma once

namespace norvhost {

/// Starts what does not run, in the background, and waits until it serves: daemons first, then what the
/// store says, then the portal and stunnel. NORV_ERR_START_SERVICE when a port is taken or a program does not start.
int startService();

/// Ends them all and waits until they are gone. What tgtd acknowledged to an initiator is not lost.
int stopService();

/// Whether daemons and portal run.
bool iscsiServiceAlive();

/// Makes both daemons what the store says: NORV_ERR_START_SERVICE when one of them does not run.
int reconcileAll();

/// Starts the service and stays: restarts what dies, mends what a killed command left, until SIGTERM or
/// SIGINT, then stops the service. Blocks these signals in the calling process.
int superviseService();

} // namespace norvhost
