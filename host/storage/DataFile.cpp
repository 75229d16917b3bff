#include "host/storage/DataFile.h"

#include "host/core/LastError.h"
#include "host/storage/MapFile.h"
#include "host/storage/Volumes.h"
#include "platform/error.h"

#include <algorithm>
#include <cerrno>
#include <fcntl.h>
#include <linux/fs.h>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <sys/xattr.h>
#include <syslog.h>

namespace norvhost {
namespace {

constexpr const char *store_attribute = "user.norv.store";
constexpr const char *uuid_attribute = "user.norv.lun";
constexpr const char *snapshot_attribute = "user.norv.snapshot";

/// Allocation goes in steps of this, so that its progress can be told.
constexpr uint64_t allocation_step = 1ull << 30;

/// Sets the size, for a sparse file.
int extendSparse(int fd, uint64_t size)
{
    if (ftruncate(fd, static_cast<off_t>(size)) == 0)
        return 0;
    if (errno == EFBIG || errno == EINVAL)
        return fail(NORV_ERR_LUN_SIZE, "%llu bytes are more than a file of this volume can hold",
                    static_cast<unsigned long long>(size));
    return failErrno(NORV_ERR_TRUNCATE_FILE, errno, "cannot set the size of the LUN's file");
}

/// Allocates everything between two sizes and sets the size.
int extendAllocated(int fd, uint64_t from, uint64_t to, LunLock &progress)
{
    struct statvfs volume;
    if (fstatvfs(fd, &volume) != 0)
        return failErrno(NORV_ERR_VOLUME_INFO, errno, "cannot ask for the volume's free space");
    // Asked first: a volume that is filled to the brim before the request fails hurts the other LUNs on it.
    const uint64_t available = volume.f_bavail * volume.f_frsize;
    if (to - from > available)
        return fail(NORV_ERR_OUT_OF_SPACE, "the volume has %llu bytes free, %llu are needed",
                    static_cast<unsigned long long>(available), static_cast<unsigned long long>(to - from));

    for (uint64_t at = from; at < to;) {
        const uint64_t length = std::min(allocation_step, to - at);
        if (fallocate(fd, 0, static_cast<off_t>(at), static_cast<off_t>(length)) != 0) {
            if (errno == EINTR)
                continue;
            return failErrno(NORV_ERR_ALLOCATE_FILE, errno, "cannot allocate the LUN's file");
        }
        at += length;
        progress.tell(static_cast<int>((at - from) / ((to - from) / 100 + 1)));
    }
    return 0;
}

std::string readTextAttribute(const std::string &path, const char *name)
{
    char text[64];
    const ssize_t length = lgetxattr(path.c_str(), name, text, sizeof text);
    return std::string(text, length < 0 ? 0 : static_cast<size_t>(length));
}

} // namespace

std::string parentOf(const std::string &path)
{
    return path.substr(0, path.rfind('/'));
}

int flushFolder(const std::string &folder)
{
    const FileDescriptor opened(open(folder.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (!opened || fsync(opened.get()) != 0)
        return failErrno(NORV_ERR_WRITE_FILE, errno, "cannot flush the folder %s", folder.c_str());
    return 0;
}

int makeDataFolder(const std::string &folder)
{
    if (mkdir(folder.c_str(), 0700) == 0)
        return flushFolder(parentOf(folder));
    if (errno == EEXIST)
        return 0;
    return failErrno(NORV_ERR_MAKE_DIRECTORY, errno, "cannot make the folder %s", folder.c_str());
}

int writeFileMark(int fd, const std::string &uuid, const std::string &snapshot)
{
    std::string store;
    if (int err = storeIdentity(store))
        return err;
    if (fsetxattr(fd, store_attribute, store.data(), store.size(), 0) != 0 ||
        fsetxattr(fd, uuid_attribute, uuid.data(), uuid.size(), 0) != 0 ||
        (!snapshot.empty() && fsetxattr(fd, snapshot_attribute, snapshot.data(), snapshot.size(), 0) != 0))
        return failErrno(NORV_ERR_WRITE_FILE, errno, "cannot mark a data file with extended attributes");
    return 0;
}

int sizeDataFile(int fd, const _tag_iscsi_lun_ &lun, uint64_t from, uint64_t to, LunLock &progress)
{
    return isFullyAllocated(lun.type) ? extendAllocated(fd, from, to, progress) : extendSparse(fd, to);
}

int makeFile(const std::string &path, const std::function<int(int fd)> &fill)
{
    const std::string folder = parentOf(path);
    // Without a name until it is complete: whoever is killed on the way leaves nothing.
    const FileDescriptor file(open(folder.c_str(), O_TMPFILE | O_RDWR | O_CLOEXEC, 0600));
    if (!file)
        return failErrno(NORV_ERR_OPEN_FILE, errno, "cannot make a file in %s", folder.c_str());
    if (int err = fill(file.get()))
        return err;
    if (fsync(file.get()) != 0)
        return failErrno(NORV_ERR_WRITE_FILE, errno, "cannot flush %s", path.c_str());

    const std::string nameless = "/proc/self/fd/" + std::to_string(file.get());
    if (linkat(AT_FDCWD, nameless.c_str(), AT_FDCWD, path.c_str(), AT_SYMLINK_FOLLOW) != 0)
        return failErrno(errno == EEXIST ? NORV_ERR_FILE_EXISTS : NORV_ERR_OPEN_FILE, errno, "cannot make the file %s",
                         path.c_str());
    if (int err = flushFolder(folder)) {
        unlink(path.c_str());
        return err;
    }
    return 0;
}

int createDataFile(const _tag_iscsi_lun_ &lun, const std::function<int(int fd)> &fill)
{
    if (int err = makeDataFolder(mapFileFolder(lun)))
        return err;
    return makeFile(dataPath(lun), [&](int fd) {
        const int err = writeFileMark(fd, lun.uuid, "");
        return err ? err : fill(fd);
    });
}

int createDataFile(const _tag_iscsi_lun_ &lun, LunLock &progress)
{
    return createDataFile(lun, [&](int fd) { return sizeDataFile(fd, lun, 0, lun.size, progress); });
}

int growDataFile(const _tag_iscsi_lun_ &lun, uint64_t size, LunLock &progress)
{
    const std::string path = dataPath(lun);
    const FileDescriptor file(open(path.c_str(), O_RDWR | O_NOFOLLOW | O_CLOEXEC));
    if (!file)
        return failErrno(NORV_ERR_OPEN_FILE, errno, "cannot open the LUN's file %s", path.c_str());
    int err = sizeDataFile(file.get(), lun, lun.size, size, progress);
    if (!err && fsync(file.get()) != 0)
        err = failErrno(NORV_ERR_WRITE_FILE, errno, "cannot flush the LUN's file");
    if (err)
        undoGrowth(lun);
    return err;
}

void undoGrowth(const _tag_iscsi_lun_ &lun)
{
    // What stays beyond the LUN's size after a failure here is never shown, and the next growth uses it.
    (void)!truncate(dataPath(lun).c_str(), static_cast<off_t>(lun.size));
}

int moveDataFile(const _tag_iscsi_lun_ &from, const _tag_iscsi_lun_ &to, const std::function<int()> &commit)
{
    const std::string old_path = dataPath(from), new_path = dataPath(to);
    if (int err = makeDataFolder(mapFileFolder(to)))
        return err;
    if (link(old_path.c_str(), new_path.c_str()) != 0)
        return failErrno(errno == EEXIST   ? NORV_ERR_FILE_EXISTS
                         : errno == ENOENT ? NORV_ERR_FILE_NOT_FOUND
                                           : NORV_ERR_RENAME_FILE,
                         errno, "cannot rename %s to %s", old_path.c_str(), new_path.c_str());
    int err = flushFolder(mapFileFolder(to));
    if (!err)
        err = commit();
    if (err) {
        unlink(new_path.c_str());
        return err;
    }
    dropDataFile(old_path);
    return 0;
}

int removeDataFile(const std::string &path)
{
    if (unlink(path.c_str()) == 0)
        return flushFolder(parentOf(path));
    if (errno == ENOENT || errno == ENOTDIR)
        return 0;
    return failErrno(NORV_ERR_WRITE_FILE, errno, "cannot remove %s", path.c_str());
}

void dropDataFile(const std::string &path)
{
    if (removeDataFile(path) != 0)
        syslog(LOG_WARNING, "left to the next sweep: %s", lastError());
}

int checkData(const _tag_iscsi_lun_ &lun)
{
    const std::string path = dataPath(lun);
    struct stat status;
    if ((isBlock(lun.type) ? stat(path.c_str(), &status) : lstat(path.c_str(), &status)) != 0)
        return failErrno(NORV_ERR_FILE_NOT_FOUND, errno, "the LUN's data %s is not there", path.c_str());

    uint64_t size = static_cast<uint64_t>(status.st_size);
    if (isBlock(lun.type)) {
        const FileDescriptor device(open(path.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC));
        if (!S_ISBLK(status.st_mode) || !device || ioctl(device.get(), BLKGETSIZE64, &size) != 0)
            return fail(NORV_ERR_BAD_FILE_TYPE, "%s is no readable block device", path.c_str());
    } else if (!S_ISREG(status.st_mode)) {
        return fail(NORV_ERR_BAD_FILE_TYPE, "%s is no regular file", path.c_str());
    }
    if (size < lun.size)
        return fail(NORV_ERR_LUN_SIZE, "%s has %llu bytes, the LUN %llu", path.c_str(),
                    static_cast<unsigned long long>(size), static_cast<unsigned long long>(lun.size));
    return 0;
}

FileMark readFileMark(const std::string &path)
{
    return {readTextAttribute(path, store_attribute), readTextAttribute(path, uuid_attribute),
            readTextAttribute(path, snapshot_attribute)};
}

int freeDeviceSize(const std::string &path, uint64_t &size)
{
    // O_EXCL on a device: the kernel refuses one that is mounted, swapped on or part of another device.
    const FileDescriptor device(open(path.c_str(), O_RDWR | O_EXCL | O_NONBLOCK | O_CLOEXEC));
    if (!device && errno == EBUSY)
        return fail(NORV_ERR_LUN_LOCATION, "the device %s is in use by the system", path.c_str());
    struct stat status;
    if (!device || fstat(device.get(), &status) != 0)
        return failErrno(NORV_ERR_LUN_LOCATION, errno, "cannot open the device %s", path.c_str());
    if (!S_ISBLK(status.st_mode) || ioctl(device.get(), BLKGETSIZE64, &size) != 0)
        return fail(NORV_ERR_LUN_LOCATION, "%s is no block device", path.c_str());
    if (size == 0)
        return fail(NORV_ERR_LUN_SIZE, "the device %s is empty", path.c_str());
    return 0;
}

} // namespace norvhost
