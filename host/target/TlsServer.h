/// The process that takes sendings in inside TLS and hands them to the read-write daemon: stunnel, on tls_port of the
/// portal's addresses. The service is whole without it; only encrypted sendings to this appliance wait for it.
#pragma once

#include <string>
#include <sys/types.h>

namespace norvhost {

/// The running one, 0 when there is none.
pid_t tlsProcess();

/// Starts it unless it runs, and waits until it serves. To be called under the service lock.
int startTls();

/// Why it does not run; empty while it does.
std::string tlsProblem();

} // namespace norvhost
