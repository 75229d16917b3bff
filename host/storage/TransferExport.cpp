/// The platform's export of snapshots.
#include "host/core/LastError.h"
#include "host/state/Fields.h"
#include "host/storage/ExportFolder.h"
#include "host/storage/FileClone.h"
#include "host/storage/SnapshotActions.h"
#include "host/storage/SnapshotFiles.h"
#include "host/storage/Transfers.h"
#include "platform/error.h"
#include "platform/iscsi_snapshot.h"

#include <cerrno>
#include <cstring>
#include <syslog.h>
#include <unistd.h>

using namespace norvhost;

namespace {

/// An export: prepared in the caller's process, carried out in a worker.
struct SnapshotExport {
    SnapshotLock lock; ///< the first, so that it goes last
    SnapshotRow row;
    ExportFacts facts;
    uint64_t data_bytes = 0;
    FileDescriptor source, data;
    NewExport target;
    TransferJob job;

    int prepare(const _tag_iscsi_snapshot_ *snapshot, const char *destination);
    void undo();
    void run();

private:
    int begin();
    int copy();
    int complete();
};

int SnapshotExport::prepare(const _tag_iscsi_snapshot_ *snapshot, const char *destination)
{
    if (int err = lockSnapshot(snapshot, NORV_LUN_PROCESSING, lock, row))
        return err;
    LunRow lun;
    if (int err = loadLunByLid(row.record.lid, lun))
        return err;
    facts = {lun.record.name, lun.record.type, row.record.total_size};
    if (int err = openSnapshotData(row.record, source))
        return err;
    if (int err = countData(source.get(), data_bytes))
        return err;
    int err = target.open(destination);
    if (!err)
        err = begin();
    if (err) {
        const KeptError kept;
        undo();
    }
    return err;
}

int SnapshotExport::begin()
{
    if (int err = job.begin({row.record.lid, row.record.snap_id}, target.path(), target.madeFolder(), data_bytes))
        return err;
    return target.createData(facts.size, source, data_bytes, data);
}

void SnapshotExport::undo()
{
    target.remove();
    job.drop();
}

int SnapshotExport::copy()
{
    bool shared;
    if (int err = shareBlocks(source.get(), data.get(), shared))
        return err;
    if (shared)
        return 0;
    return copyData(source.get(), data.get(), [this](uint64_t done) {
        job.tell(done);
        return lock.stopRequested() ? transferStopped() : 0;
    });
}

int SnapshotExport::complete()
{
    if (fsync(data.get()) != 0)
        return failErrno(NORV_ERR_WRITE_FILE, errno, "cannot flush the export");
    _tag_iscsi_export_config_ config = {};
    memcpy(config.reserved_0, row.record.uuid, sizeof config.reserved_0);
    copyText(config.desc, row.record.desc);
    copyText(config.taken_by, row.record.taken_by);
    config.snap_time = row.record.snap_time;
    config.app_consistent = row.record.app_consistent;
    config.user_locked = row.record.user_locked;
    if (int err = target.writeRecord(facts, config))
        return err;
    if (int err = job.finishing([] { return 0; }))
        return err;
    return target.publish();
}

void SnapshotExport::run()
{
    int err = copy();
    if (!err)
        err = complete();
    if (err) {
        syslog(err == -ECANCELED ? LOG_INFO : LOG_ERR, "export of the snapshot '%s' of the LUN '%s' to %s ended: %s",
               row.record.name, facts.lun_name.c_str(), target.path().c_str(), lastError());
        target.remove();
    }
    job.end(err);
}

} // namespace

int NORViSCSISnapshotExport(const _tag_iscsi_snapshot_ *snapshot, const char *destination)
{
    if (!destination)
        return fail(NORV_ERR_NULL_POINTER, "no folder to export to");
    if (int err = sweepTransfers())
        return err;
    SnapshotExport work;
    if (int err = work.prepare(snapshot, destination))
        return err;
    return startWorker(work);
}

int NORViSCSISnapshotExportCancel(const _tag_iscsi_snapshot_ *snapshot)
{
    SnapshotRow row;
    if (int err = loadCallersSnapshot(snapshot, row))
        return err;
    if (int err = cancelTransfer({row.record.lid, row.record.snap_id}))
        return err;
    return requestSnapshotStop(row.record.lid, row.record.snap_id);
}

int NORViSCSISnapshotExportConfigGet(const char *directory, _tag_iscsi_export_config_ *config)
{
    if (!directory || !config)
        return fail(NORV_ERR_NULL_POINTER, "no folder or no place for its record");
    return readExportRecord(directory, *config);
}
