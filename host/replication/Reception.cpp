/// What arrives at a destination.
///
/// The version in the file's attributes and the place in the task's row belong together: a place counts only while its
/// state is the one that arrives. Both change in this order: data flushed, place stored.
#include "host/core/LastError.h"
#include "host/replication/Roles.h"
#include "host/replication/TaskStore.h"
#include "host/state/Fields.h"
#include "host/storage/FileClone.h"
#include "host/storage/LunStore.h"
#include "host/storage/MapFile.h"
#include "host/storage/SnapshotStore.h"
#include "host/storage/Versions.h"
#include "host/target/Sinks.h"
#include "iscsihost/replication.h"
#include "platform/error.h"
#include "platform/iscsi_snapshot.h"

#include <algorithm>
#include <cerrno>
#include <fcntl.h>
#include <iterator>
#include <string>
#include <utility>

using namespace norvhost;
using iscsihost::Holding;
using iscsihost::Incoming;
using iscsihost::Reception;

namespace {

/// Initiators may write to any other: it is not to be set back.
int requireSink(const LunRow &lun)
{
    return lun.record.type == NORV_LUN_TYPE_SINK
               ? 0
               : fail(NORV_ERR_LUN_TYPE, "the LUN '%s' receives nothing any more: its replication can only be removed",
                      lun.record.name);
}

/// A task's destination LUN.
struct Destination {
    NamedLock lock;
    TaskRow task;
    LunRow lun;
    std::string path;
    Versions versions;
    Arrival arrival;

    int load(const std::string &task_uuid);
    int checkArriving(const std::string &version) const;
};

int Destination::load(const std::string &task_uuid)
{
    if (int err = lockArrival(task_uuid, lock))
        return err;
    if (int err = loadTask(task_uuid, task))
        return err;
    if (task.record.is_source)
        return fail(NORV_ERR_NOT_A_DESTINATION_TASK, "the task %s is a source here", task.record.uuid);
    if (int err = loadLunByUuid(task.localLun(), lun))
        return err;
    if (int err = requireSink(lun))
        return err;
    path = dataPath(lun.record);
    if (int err = readVersions(path, versions))
        return err;
    return loadArrival(task.record.uuid, arrival);
}

int Destination::checkArriving(const std::string &version) const
{
    if (versions.current != version || arrival.version != version)
        return fail(NORV_ERR_BASE_SNAPSHOT, "the version %s is not the one that arrives at the LUN '%s'",
                    version.c_str(), lun.record.name);
    return 0;
}

constexpr std::pair<Holding, const char *> words[] = {
    {Holding::zeros, "zeros"}, {Holding::base, "base"}, {Holding::unknown, "unknown"}};

const char *wordOf(Holding holding)
{
    return std::find_if(std::begin(words), std::end(words), [&](auto &pair) { return pair.first == holding; })->second;
}

/// Whether the same sending was begun before and can go on.
bool goOn(const Destination &destination, const Incoming &incoming, Reception &reception)
{
    const Arrival &arrival = destination.arrival;
    if (arrival.version != incoming.version || arrival.base != incoming.base ||
        destination.versions.current != incoming.version)
        return false;
    const auto found =
        std::find_if(std::begin(words), std::end(words), [&](auto &pair) { return arrival.holding == pair.second; });
    if (found == std::end(words))
        return false;
    reception.holding = found->first;
    reception.offset = arrival.offset;
    return true;
}

int isDestinationBlank(const Destination &destination, bool &blank)
{
    const FileDescriptor file(open(destination.path.c_str(), O_RDONLY | O_NOFOLLOW | O_CLOEXEC));
    if (!file)
        return failErrno(NORV_ERR_OPEN_FILE, errno, "cannot open the LUN's file %s", destination.path.c_str());
    return isBlank(file.get(), destination.lun.record.size, blank);
}

/// The state that arrived last stays as a snapshot when the next one overwrites it: whoever sends took none, or it was
/// deleted.
int keepArrivedState(const Destination &destination)
{
    if (!isSynchronised(destination.versions) || destination.arrival.name.empty())
        return 0;
    std::vector<SnapshotRow> rows;
    if (int err = loadSnapshotsOfLun(destination.lun.record.lid, rows))
        return err;
    if (std::any_of(rows.begin(), rows.end(), [&](const SnapshotRow &row) {
            return row.record.version == destination.versions.base && !isInTrash(row.record);
        }))
        return 0;
    _tag_iscsi_snapshot_ snapshot = {};
    if (int err = NORViSCSIUnusedSnapshotNameFind(destination.lun.record.lid, snapshot.name, sizeof snapshot.name))
        return err;
    return NORViSCSISnapshotCreate(&destination.lun.record, &snapshot);
}

/// Finds out what the LUN holds, and makes that the base where it can.
int prepare(const Destination &destination, const Incoming &incoming, Reception &reception)
{
    const Versions &versions = destination.versions;
    if (incoming.base.empty()) {
        bool blank = false;
        if (int err = isDestinationBlank(destination, blank))
            return err;
        reception.holding = blank ? Holding::zeros : Holding::unknown;
        return 0;
    }
    reception.holding = Holding::base;
    if (versions.base == incoming.base && versions.current == versions.base)
        return 0;
    const int err = setBackTo(destination.lun, incoming.base);
    if (err != NORV_ERR_NO_SUCH_SNAPSHOT)
        return err;
    reception.holding = Holding::unknown;
    return 0;
}

} // namespace

int iscsihost::beginReception(const std::string &task_uuid, const Incoming &incoming, Reception &reception)
{
    if (!isUuid(incoming.version)) // it is stored beside others, with blanks between
        return fail(NORV_ERR_SENDING_SNAPSHOT, "version: is no UUID");
    Destination destination;
    Reception begun;
    if (int err = destination.load(task_uuid))
        return err;
    // Whoever was sending before is gone: the source lets one send at a time.
    if (int err = shutSink(destination.lun.record.uuid))
        return err;
    const bool arrived = isSynchronised(destination.versions) && destination.versions.base == incoming.version;
    if (arrived) { // and the sender did not hear it
        begun.holding = incoming.base.empty() ? Holding::unknown : Holding::base;
        begun.offset = destination.lun.record.size;
    } else if (!goOn(destination, incoming, begun)) {
        if (int err = keepArrivedState(destination))
            return err;
        if (int err = updateArrival(destination.task.record.uuid, {}))
            return err;
        if (int err = prepare(destination, incoming, begun))
            return err;
    }
    if (!arrived && begun.holding != Holding::base && destination.versions.base == incoming.version)
        if (int err = forgetBase(destination.path)) // else a part of the version would be taken for the whole
            return err;
    if (int err = updateArrival(destination.task.record.uuid,
                                {incoming.version, incoming.base, wordOf(begun.holding), incoming.name, begun.offset}))
        return err;
    if (int err = writeTransferCount(destination.path, Transfer::sending, {0, 1}))
        return err;
    if (!arrived)
        if (int err = beginSynchronisation(destination.path, incoming.version))
            return err;
    if (int err = openSinkFor(destination.lun, begun.sink))
        return err;
    reception = begun;
    return 0;
}

int iscsihost::breakReception(const std::string &task_uuid)
{
    TaskRow task;
    if (int err = loadTask(task_uuid, task))
        return err;
    if (task.record.is_source)
        return 0;
    LunRow lun;
    if (int err = loadLunByUuid(task.localLun(), lun))
        return err;
    if (int err = requireSink(lun))
        return err;
    return shutSink(lun.record.uuid);
}

int iscsihost::noteReception(const std::string &task_uuid, const std::string &version, const std::string &sink_iqn,
                             uint64_t offset, uint64_t moved, uint64_t total)
{
    Destination destination;
    if (int err = destination.load(task_uuid))
        return err;
    if (int err = destination.checkArriving(version))
        return err;
    // What an earlier sending says late must not hold for this one.
    if (int err = checkOpening(destination.lun.record.lid, sink_iqn))
        return err;
    // One more than there is until the end: the failed sending of nothing must not look complete.
    if (int err = writeTransferCount(destination.path, Transfer::sending, {moved, total + 1}))
        return err;
    destination.arrival.offset = offset;
    return updateArrival(destination.task.record.uuid, destination.arrival);
}

int iscsihost::endReception(const std::string &task_uuid, const std::string &version, const std::string &sink_iqn,
                            uint64_t total)
{
    Destination destination;
    if (int err = destination.load(task_uuid))
        return err;
    if (isSynchronised(destination.versions) && destination.versions.base == version &&
        destination.arrival.version.empty())
        return 0; // told twice
    if (int err = destination.checkArriving(version))
        return err;
    if (int err = closeSink(destination.lun.record.uuid, sink_iqn, true))
        return err;
    if (int err = finishSynchronisation(destination.path))
        return err;
    if (int err = writeTransferCount(destination.path, Transfer::sending, {total, total}))
        return err;
    Arrival arrived;
    arrived.name = destination.arrival.name;
    return updateArrival(destination.task.record.uuid, arrived);
}

int iscsihost::findArrivedSnapshot(const std::string &lun_uuid, int64_t snapshot_time, std::string &uuid)
{
    LunRow lun;
    Versions versions;
    std::vector<SnapshotRow> snapshots;
    uuid.clear();
    if (int err = loadLunByUuid(lun_uuid, lun))
        return err;
    if (lun.record.type != NORV_LUN_TYPE_SINK)
        return 0;
    if (int err = readVersions(dataPath(lun.record), versions))
        return err;
    if (versions.current != versions.base)
        return 0;
    if (int err = loadSnapshotsOfLun(lun.record.lid, snapshots))
        return err;
    for (const SnapshotRow &row : snapshots)
        if (row.record.version == versions.base && row.record.snap_time == snapshot_time && !isInTrash(row.record))
            uuid = row.record.uuid;
    return 0;
}

int iscsihost::arrivedBytes(const std::string &lun_uuid, uint64_t &bytes)
{
    LunRow lun;
    TransferCount count;
    if (int err = loadLunByUuid(lun_uuid, lun))
        return err;
    if (isExtentPool(lun.record.type)) {
        if (int err = readTransferCount(dataPath(lun.record), Transfer::sending, count))
            return err;
    }
    bytes = count.done < count.total ? count.done : 0;
    return 0;
}
