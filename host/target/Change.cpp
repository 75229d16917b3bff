#include "host/target/Change.h"

#include "host/core/LastError.h"
#include "host/state/Database.h"
#include "host/target/ExportLinks.h"
#include "host/target/Reconcile.h"
#include "host/target/ServiceLock.h"

#include <string>

namespace norvhost {
namespace {

const Tgtd daemons[] = {Tgtd(Access::read_write), Tgtd(Access::read)};

int checkRunning()
{
    for (const Tgtd &daemon : daemons)
        if (int err = daemon.ping())
            return err;
    return 0;
}

int mendIfMarked(const ServiceLock &lock)
{
    if (!daemonsMarked())
        return 0;
    for (const Tgtd &daemon : daemons)
        if (int err = reconcileDaemon(daemon))
            return err;
    lock.clear();
    return 0;
}

int reconcile(const std::vector<int> &tids)
{
    for (const Tgtd &daemon : daemons)
        if (int err = reconcileTargets(daemon, tids))
            return err;
    return 0;
}

int apply(const ServiceLock &lock, const std::function<int(std::vector<int> &)> &rows, std::vector<int> &tids)
{
    Transaction transaction;
    if (transaction.error())
        return transaction.error();
    if (int err = rows(tids))
        return err;
    if (tids.empty())
        return 0;
    if (int err = lock.mark())
        return err;
    if (int err = reconcile(tids))
        return err;
    return transaction.commit();
}

int commitRows(const std::function<int(std::vector<int> &)> &rows, std::vector<int> &tids)
{
    Transaction transaction;
    if (transaction.error())
        return transaction.error();
    if (int err = rows(tids))
        return err;
    return transaction.commit();
}

} // namespace

int reconcileRunning(const ServiceLock &lock, bool was_marked, const std::vector<int> &tids)
{
    for (Access access : {Access::read_write, Access::read}) {
        const Tgtd daemon(access);
        if (daemon.processId() == 0)
            continue;
        if (int err = was_marked ? reconcileDaemon(daemon) : reconcileTargets(daemon, tids))
            return err;
    }
    lock.clear();
    return removeUnusedExportLinks();
}

int changeRunning(const std::function<int(std::vector<int> &)> &rows)
{
    ServiceLock lock;
    std::vector<int> tids;
    if (int err = lock.take())
        return err;
    const bool was_marked = daemonsMarked();
    if (int err = lock.mark())
        return err;
    if (int err = commitRows(rows, tids)) {
        if (!was_marked)
            lock.clear();
        return err;
    }
    return reconcileRunning(lock, was_marked, tids);
}

int changeTargets(const std::function<int(std::vector<int> &)> &rows)
{
    ServiceLock lock;
    if (int err = lock.take())
        return err;
    if (int err = checkRunning())
        return err;
    if (int err = mendIfMarked(lock))
        return err;

    std::vector<int> tids;
    const int err = apply(lock, rows, tids);
    if (!err) {
        lock.clear();
        return removeUnusedExportLinks();
    }
    const KeptError kept;
    if (!daemonsMarked() || reconcile(tids) == 0)
        lock.clear();
    return err;
}

} // namespace norvhost
