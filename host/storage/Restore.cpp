#include "host/storage/Restore.h"

#include "host/core/LastError.h"
#include "host/storage/DataFile.h"
#include "host/storage/FileClone.h"
#include "host/storage/LunActions.h"
#include "host/storage/LunChecks.h"
#include "host/storage/MapFile.h"
#include "host/storage/SnapshotFiles.h"
#include "host/storage/SnapshotStore.h"
#include "host/storage/Versions.h"
#include "platform/error.h"
#include "platform/iscsi_snapshot.h"

#include <cerrno>
#include <ctime>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>
#include <vector>

namespace norvhost {
namespace {

/// Both files and the snapshot's lock.
struct Restoration {
    SnapshotRow snapshot;
    SnapshotLock lock;
    FileDescriptor source, target;

    int open(const LunRow &lun, std::string_view snapshot_uuid);
    int setBack(const LunRow &lun, LunLock &action) const;
};

int Restoration::open(const LunRow &lun, std::string_view snapshot_uuid)
{
    if (int err = loadSnapshotByUuid(snapshot_uuid, snapshot))
        return err;
    if (snapshot.record.lid != lun.record.lid)
        return fail(NORV_ERR_NO_SUCH_SNAPSHOT, "the snapshot '%s' is not one of LUN %d", snapshot.record.name,
                    lun.record.lid);
    if (int err = lock.take(snapshot.record.lid, snapshot.record.snap_id, NORV_LUN_RESTORING))
        return err;
    if (int err = openSnapshotData(snapshot.record, source))
        return err;
    const std::string path = dataPath(lun.record);
    target.reset(::open(path.c_str(), O_RDWR | O_NOFOLLOW | O_CLOEXEC));
    if (!target)
        return failErrno(errno == ENOENT ? NORV_ERR_FILE_NOT_FOUND : NORV_ERR_OPEN_FILE, errno,
                         "cannot open the LUN's file %s", path.c_str());
    return 0;
}

int Restoration::setBack(const LunRow &lun, LunLock &action) const
{
    const auto progress = [&](int percent) { return action.tell(percent), 0; };
    if (int err = cloneLunData(lun, source.get(), target.get(), progress))
        return err;
    struct stat status;
    if (fstat(target.get(), &status) != 0)
        return failErrno(NORV_ERR_STAT_PATH, errno, "cannot look at the LUN's file");
    const off_t end = static_cast<off_t>(snapshot.record.total_size);
    if (status.st_size > end &&
        fallocate(target.get(), FALLOC_FL_PUNCH_HOLE | FALLOC_FL_KEEP_SIZE, end, status.st_size - end) != 0)
        return failErrno(NORV_ERR_WRITE_FILE, errno, "cannot clear the LUN behind the snapshot's size");
    bool in_use;
    if (int err = isInUse(lun, in_use))
        return err;
    const bool quiet = !in_use || lun.record.type == NORV_LUN_TYPE_SINK; // a sink is written by its peer alone
    if (int err = copyVersions(source.get(), target.get(), quiet))
        return err;
    if (fsync(target.get()) != 0)
        return failErrno(NORV_ERR_WRITE_FILE, errno, "cannot flush the LUN's file");
    return 0;
}

int run(const Restoration &restoration, LunRow &lun, LunLock &action)
{
    if (int err = restoration.setBack(lun, action))
        return err;
    const time_t now = time(nullptr);
    if (int err = endRestore(lun.record.lid, now))
        return err;
    lun.restoring_uuid.clear();
    lun.record.restored_time = static_cast<int32_t>(now);
    return 0;
}

} // namespace

int completeRestore(LunRow &row, LunLock &lock)
{
    Restoration restoration;
    if (int err = restoration.open(row, row.restoring_uuid))
        return err;
    return run(restoration, row, lock);
}

void mendRestore(LunRow &row)
{
    LunLock lock;
    LunRow current;
    if (!row.restoring_uuid.empty() && lockLun(row.record.lid, NORV_LUN_RESTORING, lock, current) == 0)
        row = current;
}

int mendRestores()
{
    std::vector<LunRow> marked;
    if (int err = loadInterruptedRestores(marked))
        return err;
    for (LunRow &row : marked)
        mendRestore(row);
    return 0;
}

} // namespace norvhost

using namespace norvhost;

int NORViSCSISnapshotRestore(const _tag_iscsi_snapshot_ *snapshot, const _tag_iscsi_lun_ *lun)
{
    if (!snapshot)
        return fail(NORV_ERR_NULL_POINTER, "no snapshot record");
    if (int err = checkTerminated(*snapshot))
        return err;
    LunLock lock;
    LunRow row;
    if (int err = lockLun(lun, NORV_LUN_RESTORING, lock, row))
        return err;
    Restoration restoration;
    if (int err = restoration.open(row, snapshot->uuid))
        return err;
    const std::string interrupted = row.restoring_uuid; // an earlier one, which could not be completed yet
    if (int err = markRestore(row.record.lid, restoration.snapshot.record.uuid))
        return err;
    const int err = run(restoration, row, lock);
    if (err == NORV_ERR_LUN_MAPPED) // refused before anything changed
        markRestore(row.record.lid, interrupted);
    return err;
}
