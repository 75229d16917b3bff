/// The platform's making of new LUNs from snapshots and from LUNs.
#include "host/core/LastError.h"
#include "host/state/Fields.h"
#include "host/storage/DataFile.h"
#include "host/storage/FileClone.h"
#include "host/storage/LunActions.h"
#include "host/storage/LunChecks.h"
#include "host/storage/MapFile.h"
#include "host/storage/SnapshotActions.h"
#include "host/storage/SnapshotFiles.h"
#include "platform/error.h"
#include "platform/iscsi_snapshot.h"

#include <cerrno>
#include <fcntl.h>
#include <unistd.h>

using namespace norvhost;

namespace {

/// What the caller's record asks for; the rest of it may be another LUN's, that it was copied from.
int checkClone(const _tag_iscsi_lun_ &wanted, uint64_t size, LunRow &row)
{
    if (int err = checkTerminated(wanted))
        return err;
    copyText(row.record.name, wanted.name);
    copyText(row.record.location, wanted.location);
    row.record.extent_size = wanted.extent_size;
    row.record.size = size;
    // A sink is made for a peer that fills it.
    row.record.type = wanted.type == NORV_LUN_TYPE_SINK ? NORV_LUN_TYPE_ADV : wanted.type;
    if (isBlock(row.record.type))
        return fail(NORV_ERR_CLONE_BLOCK_LUN, "a block device cannot be cloned");
    if (!isSparse(row.record.type))
        return fail(NORV_ERR_LUN_TYPE, "a LUN of this kind cannot be cloned: its space is its own");
    return checkNewLun(row.record);
}

/// Fills a new LUN's file by `clone`.
int addClone(LunRow &row, int action, LunLock &lock, const std::function<int(int fd)> &clone, _tag_iscsi_lun_ *result)
{
    const auto make_data = [&](const LunRow &made) {
        return createDataFile(made.record, [&](int fd) {
            if (int err = clone(fd))
                return err;
            if (ftruncate(fd, static_cast<off_t>(made.record.size)) != 0)
                return failErrno(NORV_ERR_TRUNCATE_FILE, errno, "cannot set the size of the clone");
            return 0;
        });
    };
    if (int err = addLun(row, action, lock, make_data))
        return err;
    *result = row.record;
    return 0;
}

} // namespace

int NORViSCSISnapshotClone(const _tag_iscsi_snapshot_ *snapshot, _tag_iscsi_lun_ *clone)
{
    if (!clone)
        return fail(NORV_ERR_NULL_POINTER, "no LUN record");
    SnapshotLock snapshot_lock;
    SnapshotRow source;
    if (int err = lockSnapshot(snapshot, NORV_LUN_BE_CLONING, snapshot_lock, source))
        return err;
    LunRow row;
    if (int err = checkClone(*clone, source.record.total_size, row))
        return err;
    FileDescriptor data;
    if (int err = openSnapshotData(source.record, data))
        return err;

    LunLock lock;
    const auto progress = [&](int percent) {
        lock.tell(percent);
        return snapshot_lock.stopRequested() ? fail(-ECANCELED, "the clone was stopped") : 0;
    };
    const auto fill = [&](int fd) {
        bool shared;
        const int err = shareBlocks(data.get(), fd, shared);
        return err || shared ? err : copySparsely(data.get(), fd, progress);
    };
    return addClone(row, NORV_LUN_CLONING_SNAPSHOT, lock, fill, clone);
}

int NORViSCSILunClone(const _tag_iscsi_lun_ *source, _tag_iscsi_lun_ *clone)
{
    if (!clone)
        return fail(NORV_ERR_NULL_POINTER, "no LUN record");
    LunLock source_lock;
    LunRow source_row;
    if (int err = lockLun(source, NORV_LUN_BE_CLONING, source_lock, source_row))
        return err;
    if (isBlock(source_row.record.type))
        return fail(NORV_ERR_CLONE_BLOCK_LUN, "a block device cannot be cloned");
    if (int err = checkData(source_row.record))
        return err;
    if (int err = requireWhole(source_row, source_lock))
        return err;
    LunRow row;
    if (int err = checkClone(*clone, source_row.record.size, row))
        return err;
    const std::string path = dataPath(source_row.record);
    const FileDescriptor data(open(path.c_str(), O_RDONLY | O_NOFOLLOW | O_CLOEXEC));
    if (!data)
        return failErrno(NORV_ERR_OPEN_FILE, errno, "cannot open the LUN's file %s", path.c_str());

    LunLock lock;
    const auto progress = [&](int percent) { return lock.tell(percent), 0; };
    const auto fill = [&](int fd) { return cloneLunData(source_row, data.get(), fd, progress); };
    return addClone(row, NORV_LUN_CLONING, lock, fill, clone);
}
