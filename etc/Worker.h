/// Detached workers: child processes that finish what a method has started.
#pragma once

#include "iscsiwebapi/ISCSIErrorCode.h"
#include "platform/core.h"

#include <unistd.h>

namespace ISCSI {

/// Forks a worker that runs `work` and ends with exit status 0, whatever comes of it, without running
/// destructors or exit handlers of the caller. Returns 0 in the caller at once, ERR_FAILED_TO_FORK
/// when there is no worker; the caller logs that.
template <class Work>
int startWorker(Work work)
{
    const int pid = NLIBCProcForkChildNoWait();
    if (pid < 0)
        return ERR_FAILED_TO_FORK;
    if (pid > 0)
        return 0;
    try {
        work();
    } catch (...) {
        // Nobody is left to tell; the state of the LUN shows what is missing.
    }
    _exit(0);
}

} // namespace ISCSI
