#include "host/target/Exports.h"

#include "host/target/Change.h"
#include "host/target/ServiceLock.h"
#include "host/target/TargetStore.h"

namespace norvhost {

int syncLunExports(int lid)
{
    return resizeLunExports(lid, [] { return 0; });
}

int resizeLunExports(int lid, const std::function<int()> &grow)
{
    std::vector<Mapping> mappings;
    ServiceLock lock;
    if (int err = lock.take())
        return err;
    if (int err = loadMappingsOfLun(lid, mappings))
        return err;
    if (mappings.empty())
        return grow();

    const bool was_marked = daemonsMarked();
    if (int err = lock.mark())
        return err;
    if (int err = grow()) {
        if (!was_marked)
            lock.clear();
        return err;
    }
    std::vector<int> tids;
    for (const Mapping &mapping : mappings)
        tids.push_back(mapping.tid);
    return reconcileRunning(lock, was_marked, tids);
}

} // namespace norvhost
