/// The functions of the public header.
#include "host/core/LastError.h"
#include "host/core/Lock.h"
#include "host/services/Events.h"
#include "host/services/Identity.h"
#include "host/services/Retention.h"
#include "host/services/Schedules.h"
#include "host/state/Database.h"
#include "host/storage/DataFile.h"
#include "host/storage/LunStore.h"
#include "host/storage/Sweep.h"
#include "host/storage/Volumes.h"
#include "host/target/Portals.h"
#include "host/target/Service.h"
#include "host/target/TlsServer.h"
#include "iscsihost/host.h"

#include <sys/statvfs.h>

using namespace norvhost;

namespace {

int describe(const VolumeRow &row, iscsihost::Volume &volume)
{
    volume.path = row.path;
    volume.image = row.image;
    if (int err = countLuns(row.path, volume.luns))
        return err;
    struct statvfs file_system;
    volume.mounted = checkMounted(row) == 0 && statvfs(row.path.c_str(), &file_system) == 0;
    if (volume.mounted) {
        volume.read_only = file_system.f_flag & ST_RDONLY;
        volume.size_bytes = file_system.f_blocks * file_system.f_frsize;
        volume.free_bytes = file_system.f_bavail * file_system.f_frsize;
    }
    return 0;
}

int countTargets(int &count)
{
    Query query("SELECT count(*) FROM targets");
    if (!query.next())
        return query.error();
    count = query.integer(0);
    return 0;
}

/// Notes a step's failure and lets the others go on: as much as can be of a machine comes up.
void note(int err, int &first, std::vector<std::string> &failed)
{
    if (!err)
        return;
    failed.push_back(lastError());
    if (!first)
        first = err;
}

} // namespace

namespace iscsihost {

struct MaskingChange::Lock : NamedLock {};

MaskingChange::MaskingChange() : lock(std::make_unique<Lock>()) {}
MaskingChange::~MaskingChange() = default;

int MaskingChange::begin(int tid)
{
    return lock->take("masking-" + std::to_string(tid));
}

int addVolume(const std::string &folder)
{
    return norvhost::addVolume(folder);
}

int createVolume(const std::string &folder, uint64_t size, const std::string &image)
{
    return norvhost::createVolume(folder, size, image);
}

int removeVolume(const std::string &folder, std::string &kept_image)
{
    return norvhost::removeVolume(folder, kept_image);
}

int listVolumes(std::vector<Volume> &volumes)
{
    std::vector<VolumeRow> rows;
    if (int err = loadVolumes(rows))
        return err;
    std::vector<Volume> described(rows.size());
    for (size_t i = 0; i < rows.size(); ++i)
        if (int err = describe(rows[i], described[i]))
            return err;
    volumes = std::move(described);
    return 0;
}

int sweep(SweepReport &report)
{
    SweepResult result;
    if (int err = sweepVolumes(result))
        return err;
    report = {result.removed, result.mended, result.foreign, result.failed};
    return 0;
}

int init(std::string &node_uuid)
{
    if (int err = makeIdentity())
        return err;
    return localNodeId(node_uuid);
}

int boot(SweepReport &report)
{
    if (int err = makeIdentity())
        return err;
    std::vector<VolumeRow> rows;
    if (int err = loadVolumes(rows))
        return err;
    int first = 0;
    std::vector<std::string> failed;
    for (const VolumeRow &row : rows)
        note(mountVolume(row), first, failed);

    SweepReport swept;
    note(sweep(swept), first, failed);
    // The daemons take what is there: a LUN whose volume is missing must not keep the others from being served.
    const int started = startService();
    note(started, first, failed);
    if (!started)
        note(reconcileAll(), first, failed);

    swept.failed.insert(swept.failed.begin(), failed.begin(), failed.end());
    report = std::move(swept);
    return first;
}

int supervise()
{
    return superviseService();
}

int stop()
{
    return stopService();
}

int setPortal(const std::string &addresses)
{
    Transaction transaction;
    if (transaction.error())
        return transaction.error();
    if (int err = setSetting("portal", addresses))
        return err;
    // Read as the service will read it: what it would not take is not stored.
    std::vector<std::string> parsed;
    if (int err = portalAddresses(parsed))
        return err;
    return transaction.commit();
}

int getPortal(std::string &addresses)
{
    return getSetting("portal", "all", addresses);
}

int status(Status &status)
{
    Status now;
    if (int err = getPortal(now.portal))
        return err;
    if (int err = listVolumes(now.volumes))
        return err;
    if (int err = countTargets(now.targets))
        return err;
    std::vector<int> suspects;
    const auto look_at = [&](const LunRow &row) {
        ++now.luns;
        if (checkData(row.record) != 0)
            suspects.push_back(row.record.lid);
    };
    if (int err = forEachLun(look_at))
        return err;
    for (const int lid : suspects) {
        // What an action was just moving or removing is not missing.
        LunRow row;
        bool busy = false;
        if (lunLockHeld(lid, busy) == 0 && !busy && loadLunByLid(lid, row) == 0 && checkData(row.record) != 0)
            now.unhealthy.push_back({lid, row.record.name, lastError()});
    }
    now.service_alive = iscsiServiceAlive();
    now.tls_problem = tlsProblem();
    now.tls_port = now.tls_problem.empty() ? tls_port : 0;
    status = std::move(now);
    return 0;
}

int addSchedule(const std::string &kind, int lid, const std::string &rule, int64_t &id)
{
    return norvhost::addSchedule(kind, lid, rule, id);
}

int listSchedules(std::vector<Schedule> &schedules)
{
    return norvhost::listSchedules(schedules);
}

int removeSchedule(int64_t id)
{
    return norvhost::removeSchedule(id);
}

int runDueSchedules(std::vector<ScheduleRun> &runs)
{
    return norvhost::runDueSchedules(runs);
}

int setRetentionPolicy(int lid, const RetentionPolicy &policy)
{
    LunRow lun;
    if (int err = loadLunByLid(lid, lun))
        return err;
    return norvhost::setRetentionPolicy(lun_retention_kind, std::to_string(lid), policy);
}

int getRetentionPolicy(int lid, RetentionPolicy &policy)
{
    LunRow lun;
    if (int err = loadLunByLid(lid, lun))
        return err;
    bool found;
    RetentionPolicy stored;
    if (int err = loadRetentionPolicy(lun_retention_kind, std::to_string(lid), found, stored))
        return err;
    policy = stored;
    return 0;
}

int removeRetentionPolicy(int lid)
{
    return norvhost::removeRetentionPolicy(lun_retention_kind, std::to_string(lid));
}

int tryRetention(int lid, const RetentionPolicy *policy, std::vector<RetentionVerdict> &verdicts)
{
    LunRow lun;
    if (int err = loadLunByLid(lid, lun))
        return err;
    return norvhost::tryRetention(lid, policy, verdicts);
}

int listEvents(int64_t since, int64_t count, std::vector<Event> &events)
{
    return norvhost::listEvents(since, count, events);
}

} // namespace iscsihost
