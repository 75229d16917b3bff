/// iscsi-portald: the public iSCSI portal.
#include "host/core/LastError.h"
#include "host/target/portal/Server.h"
#include "host/target/Portals.h"
#include "host/target/ProcessLock.h"

#include <cstdio>
#include <syslog.h>

using namespace norvhost;

int main()
{
    openlog("iscsi-portald", LOG_PID, LOG_DAEMON);
    std::vector<portal::ListenAddress> addresses;
    int err = 0;
    std::vector<std::string> configured;
    if (!(err = portalAddresses(configured)))
        for (const std::string &address : configured)
            addresses.push_back({address, public_port});
    if (!err)
        err = portal::serve(addresses, [] { holdProcessLock(portalLockPath()); });
    if (err) {
        syslog(LOG_ERR, "%s", lastError());
        fprintf(stderr, "%s\n", lastError());
    }
    return err != 0;
}
