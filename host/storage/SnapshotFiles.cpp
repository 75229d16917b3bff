#include "host/storage/SnapshotFiles.h"

#include "host/core/LastError.h"
#include "host/state/Fields.h"
#include "host/storage/DataFile.h"
#include "host/storage/FileClone.h"
#include "host/storage/MapFile.h"
#include "host/storage/Versions.h"
#include "platform/error.h"

#include <cerrno>
#include <fcntl.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

namespace norvhost {
namespace {

int makeSnapshotFolder(const std::string &folder)
{
    if (int err = makeDataFolder(parentOf(folder)))
        return err;
    if (mkdir(folder.c_str(), 0700) != 0)
        return failErrno(errno == EEXIST ? NORV_ERR_FILE_EXISTS : NORV_ERR_MAKE_DIRECTORY, errno,
                         "cannot make the folder %s", folder.c_str());
    return 0;
}

/// Fills a nameless file with the LUN's data and says whose it is.
int fill(int fd, int source, const LunRow &lun, const _tag_iscsi_snapshot_ &snapshot, LunLock &action)
{
    if (int err = writeFileMark(fd, lun.record.uuid, snapshot.uuid))
        return err;
    const auto progress = [&](int percent) { return action.tell(percent), 0; };
    if (int err = cloneLunData(lun, source, fd, progress))
        return err;
    // A growth that failed may have left the LUN's file longer than the LUN.
    if (ftruncate(fd, static_cast<off_t>(lun.record.size)) != 0)
        return failErrno(NORV_ERR_TRUNCATE_FILE, errno, "cannot set the size of a snapshot");
    return copyVersions(source, fd, true);
}

int describe(_tag_iscsi_snapshot_ &snapshot)
{
    const std::string path = snapshotDataPath(snapshot);
    struct stat status;
    if (lstat(path.c_str(), &status) != 0)
        return failErrno(NORV_ERR_STAT_PATH, errno, "cannot look at %s", path.c_str());
    Versions versions;
    if (int err = readVersions(path, versions))
        return err;
    snapshot.mapped_size = static_cast<uint64_t>(status.st_blocks) * 512;
    copyText(snapshot.version, isSynchronised(versions) ? versions.base : snapshot.uuid);
    return 0;
}

} // namespace

int createSnapshotData(const LunRow &lun, _tag_iscsi_snapshot_ &snapshot, LunLock &action)
{
    const std::string source_path = dataPath(lun.record), folder = snapshotFolder(snapshot);
    const FileDescriptor source(open(source_path.c_str(), O_RDONLY | O_NOFOLLOW | O_CLOEXEC));
    if (!source)
        return failErrno(NORV_ERR_OPEN_FILE, errno, "cannot open the LUN's file %s", source_path.c_str());
    if (int err = makeSnapshotFolder(folder))
        return err;

    int err = makeFile(snapshotDataPath(folder), [&](int fd) { return fill(fd, source.get(), lun, snapshot, action); });
    if (!err)
        err = flushFolder(parentOf(folder));
    if (!err)
        err = describe(snapshot);
    if (err) {
        const KeptError kept;
        dropSnapshotData(snapshot);
    }
    return err;
}

int moveSnapshotData(const _tag_iscsi_snapshot_ &from, const _tag_iscsi_snapshot_ &to,
                     const std::function<int()> &commit)
{
    const std::string old_folder = snapshotFolder(from), new_folder = snapshotFolder(to);
    if (int err = makeDataFolder(parentOf(new_folder)))
        return err;
    if (renameat2(AT_FDCWD, old_folder.c_str(), AT_FDCWD, new_folder.c_str(), RENAME_NOREPLACE) != 0)
        return failErrno(errno == EEXIST   ? NORV_ERR_FILE_EXISTS
                         : errno == ENOENT ? NORV_ERR_FILE_NOT_FOUND
                                           : NORV_ERR_RENAME_FILE,
                         errno, "cannot rename %s to %s", old_folder.c_str(), new_folder.c_str());
    int err = flushFolder(parentOf(new_folder));
    if (!err && parentOf(old_folder) != parentOf(new_folder))
        err = flushFolder(parentOf(old_folder));
    if (!err)
        err = commit();
    if (err)
        renameat2(AT_FDCWD, new_folder.c_str(), AT_FDCWD, old_folder.c_str(), RENAME_NOREPLACE);
    return err;
}

int removeSnapshotFolder(const std::string &folder)
{
    if (int err = removeDataFile(snapshotDataPath(folder)))
        return err;
    if (rmdir(folder.c_str()) == 0)
        return flushFolder(parentOf(folder));
    if (errno == ENOENT)
        return 0;
    return failErrno(NORV_ERR_WRITE_FILE, errno, "cannot remove the folder %s", folder.c_str());
}

void dropSnapshotData(const _tag_iscsi_snapshot_ &snapshot)
{
    if (removeSnapshotFolder(snapshotFolder(snapshot)) != 0)
        syslog(LOG_WARNING, "left to the next sweep: %s", lastError());
}

int checkSnapshotData(const _tag_iscsi_snapshot_ &snapshot)
{
    const std::string path = snapshotDataPath(snapshot);
    struct stat status;
    if (lstat(path.c_str(), &status) != 0)
        return failErrno(NORV_ERR_FILE_NOT_FOUND, errno, "the snapshot's data %s is not there", path.c_str());
    if (!S_ISREG(status.st_mode))
        return fail(NORV_ERR_BAD_FILE_TYPE, "%s is no regular file", path.c_str());
    if (static_cast<uint64_t>(status.st_size) != snapshot.total_size)
        return fail(NORV_ERR_LUN_SIZE, "%s has %llu bytes, the snapshot %llu", path.c_str(),
                    static_cast<unsigned long long>(status.st_size),
                    static_cast<unsigned long long>(snapshot.total_size));
    return 0;
}

int openSnapshotData(const _tag_iscsi_snapshot_ &snapshot, FileDescriptor &file)
{
    if (int err = checkSnapshotData(snapshot))
        return err;
    const std::string path = snapshotDataPath(snapshot);
    file.reset(open(path.c_str(), O_RDONLY | O_NOFOLLOW | O_CLOEXEC));
    return file ? 0 : failErrno(NORV_ERR_OPEN_FILE, errno, "cannot open the snapshot's data %s", path.c_str());
}

int checkRemovable(const std::string &path)
{
    const std::string folder = parentOf(path);
    if (access(folder.c_str(), W_OK) == 0 || errno == ENOENT)
        return 0;
    return failErrno(NORV_ERR_NO_PERMISSION, errno, "cannot remove files from %s", folder.c_str());
}

} // namespace norvhost
